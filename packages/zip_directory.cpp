#include "packages/zip_directory.h"

#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <string>
#include <string_view>

#include "base/file_descriptor.h"
#include "base/text.h"
#include "packages/package_entry_rules.h"
#include "packages/zip_format.h"

namespace appsync {

namespace {

using namespace zip;

/// How far from the end of the file the archive library looks for the end record.
constexpr std::uint64_t Tail = 16 << 10;
constexpr std::uint32_t InLargeField = 0xffffffff;
constexpr std::uint16_t LargeField = 0x0001;

std::optional<Error> damaged(std::string_view detail) {
  return refusalError(PackageRefusal::Damaged, detail);
}

struct Directory {
  std::uint64_t entries = 0;
  std::uint64_t size = 0;
  std::uint64_t offset = 0;
  std::uint64_t end = 0;  ///< where it must have ended
};

class ZipFile {
 public:
  ZipFile(int fd, std::uint64_t size) : fd_(fd), size_(size) {}

  std::optional<Error> read(std::uint64_t maximumEntries, std::vector<ZipMember>& members) const {
    Directory directory;
    if (auto error = findDirectory(directory)) return error;
    if (directory.offset > directory.end || directory.size != directory.end - directory.offset)
      return damaged("the table of contents is not where it should be");
    std::uint64_t entries = 0;
    for (std::uint64_t at = directory.offset; at < directory.end; ++entries) {
      if (entries == maximumEntries)
        return refusalError(PackageRefusal::TooManyEntries,
                            "more than " + std::to_string(maximumEntries) + " files and folders");
      ZipMember member;
      if (auto error = readEntry(directory.end, at, member)) return error;
      members.push_back(member);
    }
    if (entries != directory.entries) return damaged("the table of contents is cut off");
    if (entries == 0) return refusalError(PackageRefusal::NoApplication, "the archive is empty");
    return std::nullopt;
  }

 private:
  /// Empty when the file does not hold all of it.
  std::string read(std::uint64_t at, std::size_t count) const {
    if (at > size_ || count > size_ - at) return {};
    std::string bytes(count, '\0');
    const std::int64_t found = readAt(fd_, std::as_writable_bytes(std::span(bytes)), at);
    return found == static_cast<std::int64_t>(count) ? bytes : std::string();
  }

  std::optional<Error> findDirectory(Directory& directory) const {
    const std::uint64_t tailSize = std::min(size_, Tail);
    const std::string tail = read(size_ - tailSize, static_cast<std::size_t>(tailSize));
    const std::size_t found = tail.rfind(std::string_view("PK\x05\x06", 4));
    if (found == std::string::npos || tail.size() - found < EndSize)
      return damaged("the archive is cut off");
    const std::string_view end = std::string_view(tail).substr(found);
    if (end.size() != EndSize + number(end, 20, 2))
      return damaged("something follows the end of the archive");
    const std::uint64_t disk = number(end, 4, 2);
    directory = {number(end, 10, 2), number(end, 12, 4), number(end, 16, 4),
                 size_ - tailSize + found};
    if (auto error = readLargeEnd(directory)) return error;
    if ((disk != 0 && disk != 0xffff) || number(end, 8, 2) != number(end, 10, 2))
      return damaged("it is one part of an archive in several parts");
    return std::nullopt;
  }

  /// Archives past 4 GiB or 65,535 entries have a larger end record in front of the usual one.
  std::optional<Error> readLargeEnd(Directory& directory) const {
    if (directory.end < LocatorSize) return std::nullopt;
    const std::string locator = read(directory.end - LocatorSize, LocatorSize);
    if (locator.empty() || number(locator, 0, 4) != LocatorSignature) return std::nullopt;
    const std::uint64_t at = number(locator, 8, 8);
    const std::string record = read(at, LargeEndSize);
    if (record.empty() || number(record, 0, 4) != LargeEndSignature)
      return damaged("its end record is not where it should be");
    if (number(locator, 4, 4) != 0 || number(record, 16, 4) != 0 || number(record, 20, 4) != 0)
      return damaged("it is one part of an archive in several parts");
    directory = {number(record, 32, 8), number(record, 40, 8), number(record, 48, 8), at};
    return std::nullopt;
  }

  std::optional<Error> readEntry(std::uint64_t end, std::uint64_t& at, ZipMember& member) const {
    const std::string header = read(at, CentralSize);
    if (header.empty() || number(header, 0, 4) != CentralSignature)
      return damaged("the table of contents is wrong");
    const std::size_t nameSize = number(header, 28, 2);
    const std::size_t extraSize = number(header, 30, 2);
    const std::uint64_t whole = CentralSize + nameSize + extraSize + number(header, 32, 2);
    if (whole > end - at) return damaged("the table of contents is cut off");
    const std::string variable = read(at + CentralSize, nameSize + extraSize);
    const std::string_view name = std::string_view(variable).substr(0, nameSize);
    at += whole;
    if (name.find('\0') != std::string_view::npos)
      return refusalError(PackageRefusal::UnsafeName, "\"" + shown(name) + "\" holds a NUL");
    member = {localOffset(header, std::string_view(variable).substr(nameSize)),
              number(header, 20, 4),
              number(header, 24, 4),
              static_cast<std::uint32_t>(number(header, 16, 4)),
              static_cast<std::uint16_t>(number(header, 8, 2)),
              static_cast<std::uint16_t>(number(header, 10, 2))};
    if ((member.flags & Encrypted) != 0)
      return refusalError(PackageRefusal::Encrypted,
                          "\"" + shown(name) + "\" can be read only with a password");
    return checkLocal(name, member.offset);
  }

  static std::uint64_t localOffset(std::string_view header, std::string_view extra) {
    const std::uint64_t offset = number(header, 42, 4);
    if (offset != InLargeField) return offset;
    while (extra.size() >= 4) {
      const std::size_t size = std::min<std::size_t>(number(extra, 2, 2), extra.size() - 4);
      if (number(extra, 0, 2) == LargeField) {
        // It holds, in this order, only those fields that have no room in the header.
        std::size_t skipped = number(header, 24, 4) == InLargeField ? 8 : 0;
        skipped += number(header, 20, 4) == InLargeField ? 8 : 0;
        return skipped + 8 <= size ? number(extra, 4 + skipped, 8) : offset;
      }
      extra.remove_prefix(4 + size);
    }
    return offset;
  }

  /// Programs that list an archive and programs that unpack it must see the same names.
  std::optional<Error> checkLocal(std::string_view name, std::uint64_t offset) const {
    const std::string header = read(offset, LocalSize);
    const bool same = !header.empty() && number(header, 0, 4) == LocalSignature &&
                      number(header, 26, 2) == name.size() &&
                      read(offset + LocalSize, name.size()) == name;
    if (same) return std::nullopt;
    return damaged("\"" + shown(name) + "\" is not where the table of contents says");
  }

  const int fd_;
  const std::uint64_t size_;
};

}  // namespace

bool looksLikeZip(int packageFd) noexcept {
  char magic[4] = {};
  if (::pread(packageFd, magic, sizeof magic, 0) != sizeof magic) return false;
  const std::uint64_t value = number(std::string_view(magic, sizeof magic), 0, sizeof magic);
  return value == LocalSignature || value == EndSignature;
}

std::optional<Error> readZipDirectory(int packageFd, std::uint64_t maximumEntries,
                                      std::vector<ZipMember>& members) {
  struct stat status {};
  if (::fstat(packageFd, &status) != 0) return Error::posix(errno);
  const ZipFile file(packageFd, static_cast<std::uint64_t>(status.st_size));
  if (auto error = file.read(maximumEntries, members)) return error;
  std::ranges::sort(members, {}, &ZipMember::offset);
  if (std::ranges::adjacent_find(members, {}, &ZipMember::offset) != members.end())
    return refusalError(PackageRefusal::DuplicateName, "the table of contents lists a file twice");
  return std::nullopt;
}

}  // namespace appsync
