#include <archive.h>
#include <archive_entry.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <climits>
#include <memory>
#include <string>
#include <vector>

#include "base/directory_tree.h"
#include "base/file_descriptor.h"
#include "packages/data_archive.h"

namespace appsync {
namespace {

constexpr std::size_t BlockSize = std::size_t{64} << 10;

class DataArchiveWriter {
 public:
  DataArchiveWriter(const DataSink& sink, const std::function<void(std::string_view)>& skipped)
      : sink_(sink), skipped_(skipped), buffer_(BlockSize) {}

  std::optional<Error> write(int directory) {
    addFolder(directory, "", 0);
    if (!error_ && archive_) check(::archive_write_close(archive_.get()));
    return error_;
  }

 private:
  struct Free {
    void operator()(archive* a) const { ::archive_write_free(a); }
    void operator()(archive_entry* entry) const { ::archive_entry_free(entry); }
  };

  // Each returns false once there is an error.

  bool fail(int reason, std::string_view path = {}) { return fail(Error::posix(reason, path)); }

  bool fail(Error error) {
    if (!error_) error_ = std::move(error);
    return false;
  }

  bool failChanged(std::string_view path) {
    return fail(Error::withDescription(POSIXErrorDomain, EBUSY,
                                       std::string(path) + " changed while it was being saved"));
  }

  /// A warning tells that something would not come back as it was.
  bool check(int status, std::string_view path = {}) {
    return (status == ARCHIVE_OK && !error_) || fail(EIO, path);
  }

  /// Not before the first entry: empty data has no archive.
  bool open() {
    if (archive_) return true;
    archive_.reset(::archive_write_new());
    entry_.reset(::archive_entry_new());
    if (!archive_ || !entry_) return fail(ENOMEM);
    ::archive_write_set_format_pax_restricted(archive_.get());
    // Names are bytes, whatever the character set of who reads or writes them.
    ::archive_write_set_format_option(archive_.get(), "pax", "hdrcharset", "BINARY");
    ::archive_write_set_bytes_per_block(archive_.get(), BlockSize);
    ::archive_write_set_bytes_in_last_block(archive_.get(), 1);
    const auto pass = [](archive*, void* self, const void* bytes, std::size_t size) -> la_ssize_t {
      static_cast<DataArchiveWriter*>(self)->pass(bytes, size);
      return static_cast<la_ssize_t>(size);
    };
    return check(::archive_write_open(archive_.get(), this, nullptr, pass, nullptr));
  }

  /// The library never hears of a failure, since it would not free all it has then. What it still
  /// writes after one, up to an end, goes nowhere.
  void pass(const void* bytes, std::size_t size) {
    if (!error_ && !sink_({static_cast<const std::byte*>(bytes), size})) fail(ECANCELED);
  }

  bool addHeader(const std::string& path, const struct stat& status,
                 const char* linkTarget = nullptr) {
    if (!open()) return false;
    archive_entry* entry = ::archive_entry_clear(entry_.get());
    ::archive_entry_set_pathname(entry, path.c_str());
    ::archive_entry_set_filetype(entry, status.st_mode & S_IFMT);
    ::archive_entry_set_perm(entry, linkTarget ? 0777 : status.st_mode & 0777);
    ::archive_entry_set_mtime(entry, status.st_mtim.tv_sec, 0);
    ::archive_entry_set_size(entry, S_ISREG(status.st_mode) ? status.st_size : 0);
    if (linkTarget) ::archive_entry_set_symlink(entry, linkTarget);
    return check(::archive_write_header(archive_.get(), entry), path);
  }

  bool addFolder(int directory, const std::string& prefix, std::size_t depth) {
    std::vector<std::string> names;
    if (!listNames(directory, names)) return fail(errno, prefix);
    std::ranges::sort(names);
    for (const std::string& name : names) {
      if (!add(directory, name, prefix + name, depth + 1)) return false;
    }
    return true;
  }

  bool add(int directory, const std::string& name, const std::string& path, std::size_t depth) {
    if (depth > DeepestData || path.size() > LongestDataName) return fail(ENAMETOOLONG, path);
    struct stat status {};
    if (::fstatat(directory, name.c_str(), &status, AT_SYMLINK_NOFOLLOW) != 0) {
      return fail(errno, path);
    }
    if (S_ISLNK(status.st_mode)) return addLink(directory, name, path, status);
    if (!S_ISREG(status.st_mode) && !S_ISDIR(status.st_mode)) {
      skipped_(path);
      return true;
    }
    const int kind = S_ISDIR(status.st_mode) ? O_DIRECTORY : O_NONBLOCK;
    const FileDescriptor item(
        ::openat(directory, name.c_str(), O_RDONLY | O_NOFOLLOW | O_CLOEXEC | kind));
    const mode_t seen = status.st_mode & S_IFMT;
    if (!item || ::fstat(item.get(), &status) != 0) return fail(errno, path);
    if ((status.st_mode & S_IFMT) != seen) return failChanged(path);
    if (S_ISREG(seen)) return addHeader(path, status) && addContents(item.get(), path, status);
    return addHeader(path + "/", status) && addFolder(item.get(), path + "/", depth);
  }

  bool addLink(int directory, const std::string& name, const std::string& path,
               const struct stat& status) {
    std::array<char, PATH_MAX + 1> target;
    const ssize_t length = ::readlinkat(directory, name.c_str(), target.data(), target.size() - 1);
    if (length < 0) return fail(errno, path);
    target[static_cast<std::size_t>(length)] = '\0';
    return addHeader(path, status, target.data());
  }

  /// As many bytes as were announced.
  bool addContents(int file, const std::string& path, const struct stat& status) {
    auto left = static_cast<std::uint64_t>(status.st_size);
    while (left > 0) {
      const auto most = static_cast<std::size_t>(std::min<std::uint64_t>(left, BlockSize));
      const std::int64_t count = readSome(file, std::span(buffer_).first(most));
      if (count < 0) return fail(errno, path);
      if (count == 0) return failChanged(path);
      const auto size = static_cast<std::size_t>(count);
      const la_ssize_t written = ::archive_write_data(archive_.get(), buffer_.data(), size);
      if (!check(written == count ? ARCHIVE_OK : ARCHIVE_FATAL, path)) return false;
      left -= size;
    }
    return true;
  }

  const DataSink& sink_;
  const std::function<void(std::string_view)>& skipped_;
  std::vector<std::byte> buffer_;
  std::optional<Error> error_;
  std::unique_ptr<archive, Free> archive_;
  std::unique_ptr<archive_entry, Free> entry_;
};

}  // namespace

std::optional<Error> writeDataArchive(int directory, const DataSink& sink,
                                      const std::function<void(std::string_view path)>& skipped) {
  return DataArchiveWriter(sink, skipped).write(directory);
}

}  // namespace appsync
