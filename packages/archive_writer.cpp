#include "packages/archive_writer.h"

#include <archive.h>
#include <archive_entry.h>
#include <fcntl.h>
#include <fmt/format.h>
#include <sys/stat.h>

#include <algorithm>
#include <array>
#include <cerrno>

#include "base/file_descriptor.h"
#include "base/text.h"
#include "base/utf8_locale.h"

namespace appsync {
namespace {

struct Format {
  std::string_view ending;
  int (*addFilter)(archive*);
  bool isZip = false;
};

constexpr std::array<Format, 10> Formats = {{
    {".zip", &::archive_write_add_filter_none, true},
    {".tar", &::archive_write_add_filter_none},
    {".tar.gz", &::archive_write_add_filter_gzip},
    {".tgz", &::archive_write_add_filter_gzip},
    {".tar.xz", &::archive_write_add_filter_xz},
    {".txz", &::archive_write_add_filter_xz},
    {".tar.zst", &::archive_write_add_filter_zstd},
    {".tzst", &::archive_write_add_filter_zstd},
    {".tar.bz2", &::archive_write_add_filter_bzip2},
    {".tbz2", &::archive_write_add_filter_bzip2},
}};

const Format* findFormat(std::string_view ending) {
  const auto found = std::find_if(Formats.begin(), Formats.end(),
                                  [&](const Format& format) { return format.ending == ending; });
  return found == Formats.end() ? nullptr : found;
}

}  // namespace

bool ArchiveWriter::knows(std::string_view ending) { return findFormat(ending) != nullptr; }

ArchiveWriter::ArchiveWriter(int fd, std::string_view ending)
    : archive_(::archive_write_new(), &::archive_write_free),
      entry_(::archive_entry_new(), &::archive_entry_free) {
  const Format* format = findFormat(ending);
  archive* target = archive_.get();
  if (!target || !entry_ || !format) {
    problem_ = "the archive library is not ready";
    return;
  }
  check(format->isZip ? ::archive_write_set_format_zip(target)
                      : ::archive_write_set_format_pax_restricted(target));
  check(format->addFilter(target));
  // A time of writing would make every package different.
  ::archive_write_set_filter_option(target, "gzip", "timestamp", nullptr);
  check(::archive_write_open_fd(target, fd));
}

ArchiveWriter::~ArchiveWriter() = default;

bool ArchiveWriter::check(int status) {
  if (status >= ARCHIVE_OK) return true;
  const char* text = ::archive_error_string(archive_.get());
  if (problem_.empty()) problem_ = text ? text : "the archive cannot be written";
  return false;
}

archive_entry* ArchiveWriter::beginEntry(const std::string& name, unsigned type, unsigned mode) {
  archive_entry* entry = ::archive_entry_clear(entry_.get());
  ::archive_entry_set_pathname_utf8(entry, name.c_str());
  ::archive_entry_set_filetype(entry, type);
  ::archive_entry_set_perm(entry, mode);
  // Before what a zip archive can tell, so that it stands there as the same time in every zone.
  ::archive_entry_set_mtime(entry, 0, 0);
  ::archive_entry_set_size(entry, 0);
  return entry;
}

void ArchiveWriter::addDirectory(const std::string& name) {
  if (!problem_.empty()) return;
  const Utf8Locale locale;
  check(::archive_write_header(archive_.get(), beginEntry(name + "/", AE_IFDIR, 0755)));
}

void ArchiveWriter::addFile(const std::string& name, const std::filesystem::path& source,
                            bool executable) {
  if (!problem_.empty()) return;
  const Utf8Locale locale;
  const FileDescriptor file(::open(source.c_str(), O_RDONLY | O_CLOEXEC | O_NOFOLLOW));
  struct stat status {};
  if (!file || ::fstat(file.get(), &status) != 0) {
    problem_ = fmt::format("{}: {}", source.string(), systemText(errno));
    return;
  }
  archive_entry* entry = beginEntry(name, AE_IFREG, executable ? 0755 : 0644);
  ::archive_entry_set_size(entry, status.st_size);
  if (check(::archive_write_header(archive_.get(), entry))) {
    copyFrom(file.get(), static_cast<std::uint64_t>(status.st_size), source);
  }
}

void ArchiveWriter::copyFrom(int fd, std::uint64_t size, const std::filesystem::path& source) {
  std::array<std::byte, 64 << 10> block;
  while (size > 0) {
    const auto most = static_cast<std::size_t>(std::min<std::uint64_t>(size, block.size()));
    const std::int64_t count = readSome(fd, std::span(block).first(most));
    if (count < 0) {
      problem_ = fmt::format("{}: {}", source.string(), systemText(errno));
      return;
    }
    if (count == 0) {
      problem_ = source.string() + " changed while it was being packed";
      return;
    }
    const auto length = static_cast<std::size_t>(count);
    if (::archive_write_data(archive_.get(), block.data(), length) != count) {
      check(ARCHIVE_FATAL);
      return;
    }
    size -= length;
  }
}

bool ArchiveWriter::finish() {
  if (problem_.empty()) check(::archive_write_close(archive_.get()));
  return problem_.empty();
}

}  // namespace appsync
