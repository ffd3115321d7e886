#include "packages/archive_reader.h"

#include <archive.h>
#include <archive_entry.h>
#include <fmt/format.h>

#include <algorithm>
#include <array>
#include <cerrno>

#include "base/text.h"
#include "base/utf8_locale.h"

namespace appsync {
namespace {

constexpr std::size_t BlockSize = 64 << 10;
constexpr std::uint64_t MaximumEntries = 100'000;
/// Unpacked bytes walked over in search of the parts wanted.
constexpr std::int64_t MaximumUnpacked = std::int64_t{8} << 30;

}  // namespace

ArchiveReader::ArchiveReader(const std::filesystem::path& file)
    : archive_(::archive_read_new(), &::archive_read_free) {
  if (!archive_) {
    end("not enough memory");
    return;
  }
  // Only what the library unpacks itself: the others would start a program.
  ::archive_read_support_filter_gzip(archive_.get());
  ::archive_read_support_filter_bzip2(archive_.get());
  ::archive_read_support_filter_compress(archive_.get());
  ::archive_read_support_filter_lzma(archive_.get());
  ::archive_read_support_filter_xz(archive_.get());
  ::archive_read_support_filter_zstd(archive_.get());
  ::archive_read_support_filter_lz4(archive_.get());
  ::archive_read_support_format_zip(archive_.get());
  ::archive_read_support_format_tar(archive_.get());
  if (::archive_read_open_filename(archive_.get(), file.c_str(), BlockSize) < ARCHIVE_WARN) {
    end(openingReason());
  }
}

ArchiveReader::~ArchiveReader() = default;

void ArchiveReader::note(std::string reason) {
  if (!problem_) problem_ = std::move(reason);
}

bool ArchiveReader::end(std::string reason) {
  note(std::move(reason));
  ended_ = true;
  return false;
}

std::string ArchiveReader::libraryReason() const {
  const char* text = ::archive_error_string(archive_.get());
  return text ? printable(oneLine(text)) : "no reason given";
}

/// Why not even the first entry could be had.
std::string ArchiveReader::openingReason() const {
  const int code = ::archive_errno(archive_.get());
  // The library takes this value for "not a format that I know".
  if (code == EILSEQ) return "it is neither a zip nor a tar archive";
  if (code > 0) return systemText(code);
  return "damaged: " + libraryReason();
}

bool ArchiveReader::next() {
  if (ended_) return false;
  const Utf8Locale locale;
  const int status = ::archive_read_next_header(archive_.get(), &entry_);
  if (status == ARCHIVE_EOF) {
    recognised_ = true;
    return false;
  }
  if (status < ARCHIVE_WARN) {
    return end(recognised_ ? "damaged: " + libraryReason() : openingReason());
  }
  recognised_ = true;
  if (++entries_ > MaximumEntries) return end("too many entries");
  const bool huge =
      ::archive_entry_size_is_set(entry_) && ::archive_entry_size(entry_) > MaximumUnpacked;
  if (huge || ::archive_filter_bytes(archive_.get(), 0) > MaximumUnpacked) return end("too large");
  const char* name = ::archive_entry_pathname_utf8(entry_);
  if (!name) name = ::archive_entry_pathname(entry_);
  name_ = name ? name : "";
  while (name_.starts_with("./")) name_.erase(0, 2);
  return true;
}

bool ArchiveReader::isRegularFile() const {
  return ::archive_entry_filetype(entry_) == AE_IFREG && !::archive_entry_hardlink(entry_);
}

bool ArchiveReader::readAll(const std::function<bool(std::span<const std::byte>)>& take) {
  if (::archive_entry_is_data_encrypted(entry_)) {
    note(fmt::format("{} is encrypted", printable(name_)));
    return false;
  }
  std::array<std::byte, 16 << 10> block;
  while (true) {
    const auto count = ::archive_read_data(archive_.get(), block.data(), block.size());
    if (count == 0) return true;
    if (count < 0) {
      end(fmt::format("damaged: {}: {}", printable(name_), libraryReason()));
      return false;
    }
    if (!take(std::span(block).first(static_cast<std::size_t>(count)))) return false;
  }
}

std::optional<Bytes> ArchiveReader::contents(std::size_t limit) {
  Bytes bytes;
  const auto collect = [&](std::span<const std::byte> block) {
    bytes.insert(bytes.end(), block.begin(), block.end());
    if (bytes.size() <= limit) return true;
    note(fmt::format("{} is larger than {}", printable(name_), byteCount(limit)));
    return false;
  };
  return readAll(collect) ? std::optional(std::move(bytes)) : std::nullopt;
}

bool ArchiveReader::isReadable() {
  return readAll([](std::span<const std::byte>) { return true; });
}

}  // namespace appsync
