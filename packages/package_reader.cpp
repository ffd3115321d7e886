#include "packages/package_reader.h"

#include <archive.h>
#include <archive_entry.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <string_view>

#include "base/utf8_locale.h"
#include "packages/zip_directory.h"

namespace appsync {

namespace {

constexpr std::size_t BlockSize = std::size_t{128} << 10;
constexpr std::uint64_t TarBlock = 512;

std::uint64_t fileSize(int fd) {
  struct stat status {};
  return ::fstat(fd, &status) == 0 ? static_cast<std::uint64_t>(status.st_size) : 0;
}

/// A name that cannot be converted is no damage: it is judged as a name. So are those of users and
/// groups, which nobody looks at.
bool isOnlyAboutNames(const char* warning) {
  const std::string_view text = warning ? warning : "";
  return text.find("can't be converted") != std::string_view::npos ||
         text.find("cannot be converted") != std::string_view::npos;
}

ArchiveEntry::Kind kindOf(archive_entry* entry) {
  if (::archive_entry_hardlink(entry)) return ArchiveEntry::Kind::Link;
  switch (::archive_entry_filetype(entry)) {
    case AE_IFREG:
    case 0:  // some zip tools give permissions without a type
      return ArchiveEntry::Kind::File;
    case AE_IFDIR:
      return ArchiveEntry::Kind::Directory;
    case AE_IFLNK:
      return ArchiveEntry::Kind::Link;
    default:
      return ArchiveEntry::Kind::Special;
  }
}

ArchiveEntry announced(archive_entry* entry) {
  const char* name = ::archive_entry_pathname(entry);
  return {name ? name : "", kindOf(entry), static_cast<std::uint32_t>(::archive_entry_perm(entry)),
          ::archive_entry_is_encrypted(entry) != 0};
}

}  // namespace

void PackageReader::Free::operator()(archive* a) const { ::archive_read_free(a); }

PackageReader::PackageReader(int packageFd, const PackageLimits& limits)
    : fd_(packageFd),
      limits_(limits),
      rules_(limits, fileSize(packageFd)),
      archive_(::archive_read_new()) {}

PackageReader::~PackageReader() = default;

std::optional<Error> PackageReader::openZip() {
  std::vector<ZipMember> members;
  if (auto error = readZipDirectory(fd_, limits_.entries, members)) return error;
  members_ = std::make_unique<ZipMembers>(fd_, std::move(members), limits_.wholeFile);
  ::archive_read_support_format_zip_seekable(archive_.get());
  ::archive_read_set_format_option(archive_.get(), "zip", "hdrcharset", "UTF-8");
  ::lseek(fd_, 0, SEEK_SET);
  if (::archive_read_open_fd(archive_.get(), fd_, BlockSize) != ARCHIVE_OK) return failure();
  return std::nullopt;
}

void PackageReader::openTar() {
  stream_ = openPackageStream(fd_);
  ::archive_read_support_format_tar(archive_.get());
  ::archive_read_set_format_option(archive_.get(), "tar", "hdrcharset", "UTF-8");
  const auto read = [](archive* a, void* self, const void** block) -> la_ssize_t {
    return readStream(a, self, block);
  };
  // A failure shows again when the first header is read.
  ::archive_read_open(archive_.get(), this, nullptr, read, nullptr);
}

std::int64_t PackageReader::readStream(archive* a, void* self, const void** block) {
  auto& reader = *static_cast<PackageReader*>(self);
  ByteView& bytes = reader.block_;
  if (!reader.streamError_) reader.streamError_ = reader.stream_->next(bytes);
  if (!reader.streamError_) reader.streamError_ = reader.rules_.admitStreamBytes(bytes.size());
  if (reader.streamError_) {
    ::archive_set_error(a, EIO, "the stream failed");
    return ARCHIVE_FATAL;
  }
  reader.handed_ += bytes.size();
  *block = bytes.data();
  return static_cast<std::int64_t>(bytes.size());
}

bool PackageReader::next(PackageItem& item, std::optional<Error>& error) {
  const Utf8Locale utf8;
  if (!opened_) {
    opened_ = true;
    if (fileSize(fd_) == 0) {
      error = refusalError(PackageRefusal::NotAnArchive, "it is empty");
      return false;
    }
    if (!looksLikeZip(fd_)) {
      openTar();
    } else if ((error = openZip())) {
      return false;
    }
  } else if (::archive_read_data_skip(archive_.get()) < ARCHIVE_WARN) {
    error = failure();
    return false;
  }
  entryEnd_ = static_cast<std::uint64_t>(::archive_filter_bytes(archive_.get(), 0));
  const int result = ::archive_read_next_header(archive_.get(), &entry_);
  if (result == ARCHIVE_EOF) {
    error = finish();
    return false;
  }
  const bool readable =
      result == ARCHIVE_OK ||
      (result == ARCHIVE_WARN && isOnlyAboutNames(::archive_error_string(archive_.get())));
  if (!readable) {
    error = failure();
    return false;
  }
  const ArchiveEntry entry = announced(entry_);
  name_ = entry.name;
  ++entries_;
  error = rules_.admit(entry, item);
  return !error;
}

/// What the current entry holds, without the archive library: it walks through the members of a zip
/// archive in the order of the file too.
std::optional<ByteView> PackageReader::wholeFile() {
  if (!members_ || !::archive_entry_size_is_set(entry_)) return std::nullopt;
  const std::optional<ByteView> bytes = members_->contents(entries_ - 1, name_);
  const bool asAnnounced =
      bytes && static_cast<std::int64_t>(bytes->size()) == ::archive_entry_size(entry_);
  return asAnnounced ? bytes : std::nullopt;
}

std::optional<Error> PackageReader::readFile(const Sink& sink, std::uint64_t& size) {
  size = 0;
  if (const std::optional<ByteView> bytes = wholeFile()) {
    size = bytes->size();
    if (auto error = rules_.admitFileBytes(size)) return error;
    return sink(0, *bytes);
  }
  while (true) {
    const void* block = nullptr;
    std::size_t count = 0;
    la_int64_t offset = 0;
    const int result = ::archive_read_data_block(archive_.get(), &block, &count, &offset);
    if (result == ARCHIVE_EOF) break;
    if (result != ARCHIVE_OK) return failure();
    if (count == 0) continue;
    const auto begin = static_cast<std::uint64_t>(offset);
    if (offset < 0 || begin < size)
      return refusalError(PackageRefusal::Damaged, "pieces of a file overlap");
    // Holes count as well: what reads the file meets them as zeros.
    if (auto error = rules_.admitFileBytes(begin - size + count)) return error;
    if (auto error = sink(begin, {static_cast<const std::byte*>(block), count})) return error;
    size = begin + count;
  }
  if (!::archive_entry_size_is_set(entry_)) return std::nullopt;
  const auto announcedSize = static_cast<std::uint64_t>(::archive_entry_size(entry_));
  const bool holeAtEnd = size<announcedSize&& ::archive_entry_sparse_count(entry_)> 0;
  if (size != announcedSize && !holeAtEnd)
    return refusalError(PackageRefusal::Damaged, "a file is shorter or longer than announced");
  if (auto error = rules_.admitFileBytes(announcedSize - size)) return error;
  size = announcedSize;
  return std::nullopt;
}

std::optional<Error> PackageReader::finish() {
  if (stream_) {
    // The archive library takes an archive that is cut off between two entries for a whole one.
    const std::uint64_t blocksEnd = (entryEnd_ + TarBlock - 1) / TarBlock * TarBlock;
    if (static_cast<std::uint64_t>(::archive_filter_bytes(archive_.get(), 0)) <= blocksEnd)
      return refusalError(PackageRefusal::Damaged, "the archive is cut off");
    if (auto error = drain()) return error;
  }
  return rules_.finish();
}

std::optional<Error> PackageReader::drain() {
  // Only at the very end does the compression's checksum show whether all bytes were right.
  const auto used = static_cast<std::uint64_t>(::archive_filter_bytes(archive_.get(), 0));
  ByteView bytes = block_.last(std::min<std::size_t>(handed_ - used, block_.size()));
  while (true) {
    if (std::ranges::any_of(bytes, [](std::byte b) { return b != std::byte{0}; }))
      return refusalError(PackageRefusal::Damaged, "something follows the end of the archive");
    if (auto error = stream_->next(bytes)) return error;
    if (bytes.empty()) return std::nullopt;
    if (auto error = rules_.admitStreamBytes(bytes.size())) return error;
  }
}

Error PackageReader::failure() const {
  if (streamError_) return *streamError_;
  const char* text = ::archive_error_string(archive_.get());
  if (::archive_format(archive_.get()) == 0)
    return refusalError(PackageRefusal::NotAnArchive, "neither zip nor tar");
  return refusalError(PackageRefusal::Damaged, text ? text : "it cannot be read");
}

}  // namespace appsync
