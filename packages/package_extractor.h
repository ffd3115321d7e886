#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "platform/error.h"
#include "platform/property_list.h"

namespace appsync {

/// Why a package is refused: codes of InstallerServiceErrorDomain. The error's description is one
/// line for people that begins with the name and tells the entry and the reason.
enum class PackageRefusal : std::int64_t {
  NotAnArchive = 1,
  Damaged,
  NoApplication,
  SeveralApplications,
  ForeignEntry,  ///< something beside the application and its two metadata files
  Link,
  SpecialFile,
  PrivilegedMode,  ///< set-user-id, set-group-id or sticky
  AbsoluteName,
  ParentName,
  UnsafeName,  ///< NUL, newline or another control character, no UTF-8, too long
  DuplicateName,
  TooManyEntries,
  TooLarge,
  CompressionBomb,
  Encrypted,
  BadInfo,  ///< Info.plist missing, no property list, or without a usable identifier
  WrongIdentifier,
};

/// "damaged", "too many entries", ...: the named reason.
std::string_view name(PackageRefusal refusal);

struct PackageLimits {
  std::uint64_t entries = 100'000;
  std::uint64_t bytes = std::uint64_t{8} << 30;  ///< unpacked, all files together
  /// Unpacked bytes allowed for each byte of the package, beyond a free allowance of 16 MiB.
  std::uint64_t ratio = 200;
  /// Files of a zip archive up to this size are unpacked in one piece, which takes twice as much
  /// memory.
  std::uint64_t wholeFile = std::uint64_t{1} << 20;
};

struct ExtractedPackage {
  std::string bundleName;  ///< "<Name>.app"
  std::string identifier;
  std::optional<std::string> version;
  std::optional<std::string> displayName;
  PropertyList::Dictionary info;
  bool hasMetadata = false;  ///< HalvoMetadata.plist stands beside the bundle
  bool hasArtwork = false;   ///< HalvoArtwork stands beside the bundle
  std::uint64_t bytes = 0;   ///< of all files
};

/// Unpacks an application package (zip or tar, any compression that libarchive reads) into a
/// directory. `packageFd` is an open regular file; `targetDirectoryFd` an empty directory of the
/// caller's. Nothing outside the target is ever written, whatever the package holds; on failure the
/// caller removes what lies in it. `expectedIdentifier`, when given, must be the bundle's
/// identifier. Borrows both descriptors for the call and moves the package's offset. Files become
/// 0644, or 0755 where their owner may run them or KBBundleExecutable names them; nothing is put on
/// disk yet. Besides refusals, the error may be one of POSIXErrorDomain. Thread-safe.
[[nodiscard]] std::optional<ExtractedPackage> extractPackage(
    int packageFd, int targetDirectoryFd, std::optional<std::string_view> expectedIdentifier,
    const PackageLimits& limits, std::optional<Error>* error) noexcept;

}  // namespace appsync
