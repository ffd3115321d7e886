#include "packages/package_extractor.h"

#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <new>

#include "base/identifiers.h"
#include "base/text.h"
#include "packages/package_entry_rules.h"
#include "packages/package_reader.h"
#include "packages/unpack_target.h"
#include "platform/bundle.h"
#include "platform/property_list_codec.h"
#include "platform/sync_files.h"

namespace appsync {

namespace {

constexpr PropertyListLimits InfoLimits{std::size_t{1} << 20, 20'000, 16};

std::optional<Error> systemError(int reason, std::string_view path) {
  if (reason == ENOSPC || reason == EDQUOT)
    return Error::withDescription(POSIXErrorDomain, reason, "no space: the device is full");
  return Error::posix(reason, path);
}

std::optional<Error> badInfo(std::string_view detail) {
  return refusalError(PackageRefusal::BadInfo, detail);
}

std::optional<Error> writeFile(PackageReader& reader, UnpackTarget& target,
                               const PackageItem& item) {
  const FileDescriptor file = target.createFile(item.path, item.isExecutable);
  if (!file) return systemError(errno, item.path);
  std::uint64_t end = 0;
  const auto write = [&](std::uint64_t offset, ByteView bytes) -> std::optional<Error> {
    end = offset + bytes.size();
    if (writeAllAt(file.get(), bytes, offset)) return std::nullopt;
    return systemError(errno, item.path);
  };
  std::uint64_t size = 0;
  if (auto error = reader.readFile(write, size)) return error;
  if (size > end && ::ftruncate(file.get(), static_cast<off_t>(size)) != 0)
    return systemError(errno, item.path);
  return std::nullopt;
}

std::optional<Error> unpack(PackageReader& reader, UnpackTarget& target) {
  PackageItem item;
  std::optional<Error> error;
  while (reader.next(item, error)) {
    if (item.path.empty()) continue;
    if (!item.isDirectory) {
      error = writeFile(reader, target, item);
    } else if (!target.makeDirectory(item.path)) {
      error = systemError(errno, item.path);
    }
    if (error) break;
  }
  return error;
}

/// The information dictionary as it now stands in the target.
std::optional<Error> readInfo(const PackageReader& reader, UnpackTarget& target,
                              const std::string& path, PropertyList::Dictionary& info) {
  if (!reader.rules().holdsFile(path)) return badInfo("the application has no Info.plist");
  const FileDescriptor file = target.openFile(path);
  struct stat status {};
  if (!file || ::fstat(file.get(), &status) != 0) return systemError(errno, path);
  const auto size = static_cast<std::size_t>(status.st_size);
  if (size > InfoLimits.bytes) return badInfo("Info.plist is larger than 1 MiB");
  Bytes bytes(size);
  const std::int64_t count = readAt(file.get(), bytes, 0);
  if (count != status.st_size) return systemError(count < 0 ? errno : EIO, path);
  std::optional<Error> cause;
  std::optional<PropertyList> parsed = parsePropertyList(bytes, &cause, InfoLimits);
  if (!parsed) return badInfo("Info.plist " + cause->localizedDescription());
  PropertyList::Dictionary* dictionary = parsed->asDictionary();
  if (!dictionary) return badInfo("Info.plist holds no dictionary");
  info = std::move(*dictionary);
  return std::nullopt;
}

std::optional<Error> checkIdentifier(const PropertyList::Dictionary& info,
                                     std::optional<std::string_view> expected,
                                     std::string& identifier) {
  const std::string* given = findString(info, KBBundleIdentifier);
  if (!given) return badInfo("Info.plist names no KBBundleIdentifier");
  if (!isUsableIdentifier(*given) || given->find("..") != std::string::npos)
    return badInfo(
        "the identifier \"" + shown(*given) +
        "\" holds more than letters, digits, \"-\", \"_\" and single dots, or is too long");
  if (expected && *given != *expected)
    return refusalError(PackageRefusal::WrongIdentifier,
                        "it holds \"" + *given + "\" instead of \"" + shown(*expected) + "\"");
  identifier = *given;
  return std::nullopt;
}

std::optional<Error> prepareExecutable(const PackageReader& reader, UnpackTarget& target,
                                       const ExtractedPackage& package) {
  const PropertyList* named = find(package.info, KBBundleExecutable);
  if (!named) return std::nullopt;
  const std::string* executable = named->asString();
  if (!executable || executable->empty()) return badInfo("KBBundleExecutable is no name");
  const std::string path = package.bundleName + "/" + *executable;
  if (!reader.rules().holdsFile(path))
    return badInfo("the executable \"" + shown(*executable) + "\" is missing");
  const FileDescriptor file = target.openFile(path);
  if (!file || !makeExecutable(file.get())) return systemError(errno, path);
  return std::nullopt;
}

std::optional<Error> extract(int packageFd, int targetDirectoryFd,
                             std::optional<std::string_view> expectedIdentifier,
                             const PackageLimits& limits, ExtractedPackage& package) {
  PackageReader reader(packageFd, limits);
  UnpackTarget target(targetDirectoryFd);
  if (auto error = unpack(reader, target)) return error;
  const PackageEntryRules& rules = reader.rules();
  package.bundleName = rules.bundleName();
  if (auto error = readInfo(reader, target, package.bundleName + "/Info.plist", package.info))
    return error;
  if (auto error = checkIdentifier(package.info, expectedIdentifier, package.identifier))
    return error;
  if (auto error = prepareExecutable(reader, target, package)) return error;
  if (const auto* version = findString(package.info, KBBundleVersion)) package.version = *version;
  if (const auto* name = findString(package.info, KBBundleDisplayName)) package.displayName = *name;
  package.hasMetadata = rules.holdsFile(exchange::MetadataName);
  package.hasArtwork = rules.holdsFile(exchange::ArtworkName);
  package.bytes = rules.fileBytes();
  return std::nullopt;
}

}  // namespace

std::optional<ExtractedPackage> extractPackage(int packageFd, int targetDirectoryFd,
                                               std::optional<std::string_view> expectedIdentifier,
                                               const PackageLimits& limits,
                                               std::optional<Error>* error) noexcept {
  std::optional<Error> reason;
  try {
    ExtractedPackage package;
    reason = extract(packageFd, targetDirectoryFd, expectedIdentifier, limits, package);
    if (!reason) return package;
  } catch (const std::bad_alloc&) {
    reason = Error::posix(ENOMEM);
  }
  setError(error, std::move(*reason));
  return std::nullopt;
}

}  // namespace appsync
