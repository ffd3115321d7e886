#include <archive.h>
#include <archive_entry.h>
#include <fcntl.h>
#include <fmt/format.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <memory>
#include <string>
#include <vector>

#include "base/confined_directory.h"
#include "base/file_descriptor.h"
#include "base/text.h"
#include "packages/data_archive.h"

namespace appsync {
namespace {

constexpr std::size_t BlockSize = std::size_t{64} << 10;
constexpr std::uint64_t TarBlock = 512;

/// Names as they come: neither looked up in a locale nor cleaned up.
const char* text(const char* name) { return name ? name : ""; }

class DataArchiveReader {
 public:
  DataArchiveReader(const DataSource& source, int directory)
      : source_(source),
        target_(FileDescriptor(::fcntl(directory, F_DUPFD_CLOEXEC, 0)), Confinement::Beneath),
        buffer_(BlockSize),
        archive_(::archive_read_new()) {}

  std::optional<Error> read(std::uint64_t& entries) {
    if (!archive_ || !target_.isOpen()) return Error::posix(ENOMEM);
    unpack();
    entries = entries_;
    // Of a damaged archive the source may know more, at its end.
    if (!error_ || error_->code == EBADMSG) drain();
    if (sourceFailed_) return Error::posix(ECANCELED);
    return error_;
  }

 private:
  struct Free {
    void operator()(archive* a) const { ::archive_read_free(a); }
  };
  struct Folder {
    std::string path;
    mode_t mode = 0;
    timespec time{};
  };

  // Each returns false once there is an error.

  bool fail(Error error) {
    if (!error_) error_ = std::move(error);
    return false;
  }

  bool failSystem(const std::string& path) {
    const int reason = errno;
    return reason == EEXIST ? refuse(path, "comes twice") : fail(Error::posix(reason, path));
  }

  bool refuse(std::string_view entry, std::string_view why) {
    return damaged(fmt::format("\"{}\" {}", shown(entry), why));
  }

  bool damaged(std::string_view why) {
    return fail(Error::withDescription(POSIXErrorDomain, EBADMSG,
                                       fmt::format("the archive of the data is damaged: {}", why)));
  }

  bool damagedLibrary() {
    const char* reason = ::archive_error_string(archive_.get());
    return damaged(reason ? reason : "it cannot be read");
  }

  std::int64_t pull(const void** block) {
    const std::int64_t count = source_(buffer_.data(), buffer_.size());
    if (count <= 0) ended_ = true;
    if (count < 0) sourceFailed_ = true;
    *block = buffer_.data();
    if (count > 0) handed_ += static_cast<std::uint64_t>(count);
    last_ = count > 0 ? static_cast<std::size_t>(count) : 0;
    return count;
  }

  bool unpack() {
    archive* a = archive_.get();
    ::archive_read_support_format_tar(a);
    ::archive_read_support_format_empty(a);
    ::archive_read_support_filter_none(a);
    ::archive_read_set_format_option(a, "tar", "hdrcharset", "BINARY");
    const auto pullFor = [](archive*, void* self, const void** block) -> la_ssize_t {
      return static_cast<DataArchiveReader*>(self)->pull(block);
    };
    if (::archive_read_open(a, this, nullptr, pullFor, nullptr) != ARCHIVE_OK) {
      return damagedLibrary();
    }
    archive_entry* entry = nullptr;
    std::uint64_t entryEnd = 0;
    int result = ARCHIVE_OK;
    while ((result = ::archive_read_next_header(a, &entry)) == ARCHIVE_OK) {
      ++entries_;
      if (!add(entry) || ::archive_read_data_skip(a) != ARCHIVE_OK) return damagedLibrary();
      entryEnd = used();
    }
    if (result != ARCHIVE_EOF) return damagedLibrary();
    // The library takes an archive that is cut off between two entries for a whole one.
    const std::uint64_t blocksEnd = (entryEnd + TarBlock - 1) / TarBlock * TarBlock;
    if (entries_ > 0 && used() < blocksEnd + 2 * TarBlock) return damaged("it is cut off");
    return finishFolders();
  }

  std::uint64_t used() const {
    return static_cast<std::uint64_t>(::archive_filter_bytes(archive_.get(), 0));
  }

  /// What comes after the end must be nothing, and the source's own check comes at its end.
  bool drain() {
    std::size_t first = last_ - std::min<std::size_t>(last_, handed_ - used());
    while (true) {
      const auto rest = std::span(buffer_).first(last_).subspan(first);
      if (std::ranges::any_of(rest, [](std::uint8_t byte) { return byte != 0; })) {
        damaged("something follows its end");
      }
      const void* block = nullptr;
      if (ended_ || pull(&block) <= 0) return !error_;
      first = 0;
    }
  }

  bool add(archive_entry* entry) {
    std::string path = text(::archive_entry_pathname(entry));
    if (::archive_entry_hardlink(entry)) return refuse(path, "is a hard link");
    const auto type = ::archive_entry_filetype(entry);
    if (type == AE_IFDIR && path.ends_with('/')) path.pop_back();
    if (const std::string_view why = objectionTo(path); !why.empty()) return refuse(path, why);
    if (::archive_entry_sparse_count(entry) > 0) return refuse(path, "has holes");

    const std::size_t slash = path.rfind('/');
    const FileDescriptor& parent =
        openParent(slash == std::string::npos ? "." : path.substr(0, slash));
    if (!parent) return refuse(path, "lies in a folder that did not come before it");
    const std::string name = path.substr(slash + 1);
    switch (type) {
      case AE_IFREG:
        return addFile(parent.get(), name, path, entry);
      case AE_IFDIR:
        folders_.push_back({path, modeOf(entry), timeOf(entry)});
        return ::mkdirat(parent.get(), name.c_str(), 0700) == 0 || failSystem(path);
      case AE_IFLNK:
        return addLink(parent.get(), name, path, entry);
      default:
        return refuse(path, "is no file, folder or link");
    }
  }

  /// Empty for a name beneath the folder, made of plain components.
  static std::string_view objectionTo(std::string_view path) {
    if (path.empty()) return "has no name";
    if (path.starts_with('/')) return "has an absolute name";
    if (path.size() > LongestDataName) return "has too long a name";
    std::size_t depth = 0;
    for (std::size_t begin = 0; begin <= path.size(); ++depth) {
      const std::size_t end = std::min(path.find('/', begin), path.size());
      const std::string_view component = path.substr(begin, end - begin);
      if (component == "..") return "leads outside";
      if (component.empty() || component == ".") return "has an unusual name";
      begin = end + 1;
    }
    return depth > DeepestData ? "lies too deep" : "";
  }

  const FileDescriptor& openParent(const std::string& path) {
    if (!parent_ || parentPath_ != path) {
      parent_ = target_.openDirectoryAt(path);
      parentPath_ = path;
    }
    return parent_;
  }

  static mode_t modeOf(archive_entry* entry) { return ::archive_entry_perm(entry) & 0777; }

  static timespec timeOf(archive_entry* entry) { return {::archive_entry_mtime(entry), 0}; }

  static bool setTime(int directory, const char* name, timespec time) {
    const timespec times[2] = {time, time};
    return ::utimensat(directory, name, times, AT_SYMLINK_NOFOLLOW) == 0;
  }

  bool addLink(int parent, const std::string& name, const std::string& path, archive_entry* entry) {
    const char* target = text(::archive_entry_symlink(entry));
    return (::symlinkat(target, parent, name.c_str()) == 0 &&
            setTime(parent, name.c_str(), timeOf(entry))) ||
           failSystem(path);
  }

  bool addFile(int parent, const std::string& name, const std::string& path, archive_entry* entry) {
    const FileDescriptor file(
        ::openat(parent, name.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0600));
    if (!file) return failSystem(path);
    std::uint64_t size = 0;
    const void* block = nullptr;
    std::size_t count = 0;
    la_int64_t offset = 0;
    int result = ARCHIVE_OK;
    while ((result = ::archive_read_data_block(archive_.get(), &block, &count, &offset)) ==
           ARCHIVE_OK) {
      if (!writeAll(file.get(), {static_cast<const std::byte*>(block), count})) {
        return failSystem(path);
      }
      size += count;
    }
    if (result != ARCHIVE_EOF) return damagedLibrary();
    if (size != static_cast<std::uint64_t>(::archive_entry_size(entry))) {
      return refuse(path, "is shorter or longer than announced");
    }
    return (::fchmod(file.get(), modeOf(entry)) == 0 &&
            setTime(parent, name.c_str(), timeOf(entry))) ||
           failSystem(path);
  }

  /// Only now, and the inner ones first: filling a folder changes its time and needs its writing.
  bool finishFolders() {
    for (auto folder = folders_.rbegin(); folder != folders_.rend(); ++folder) {
      const FileDescriptor opened = target_.openDirectoryAt(folder->path);
      const timespec times[2] = {folder->time, folder->time};
      if (!opened || ::fchmod(opened.get(), folder->mode) != 0 ||
          ::futimens(opened.get(), times) != 0) {
        return failSystem(folder->path);
      }
    }
    return true;
  }

  const DataSource& source_;
  const ConfinedDirectory target_;
  std::vector<std::uint8_t> buffer_;
  std::size_t last_ = 0;      ///< bytes of the buffer that came last
  std::uint64_t handed_ = 0;  ///< bytes of the source so far
  std::uint64_t entries_ = 0;
  bool ended_ = false;
  bool sourceFailed_ = false;
  std::optional<Error> error_;
  std::unique_ptr<archive, Free> archive_;
  std::vector<Folder> folders_;
  std::string parentPath_;
  FileDescriptor parent_;
};

}  // namespace

std::optional<Error> readDataArchive(const DataSource& source, int directory,
                                     std::uint64_t& entries) {
  return DataArchiveReader(source, directory).read(entries);
}

}  // namespace appsync
