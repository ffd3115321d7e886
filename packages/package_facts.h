#pragma once

#include <cstdint>
#include <filesystem>
#include <optional>
#include <span>
#include <string>
#include <string_view>

#include "platform/bytes.h"

namespace appsync {

/// The endings by which a file counts as a package, in lower case: ".zip", ".tar.gz", ...
std::span<const std::string_view> packageEndings();
/// The one of them that a file's name has; empty when it has none.
std::string_view packageEnding(std::string_view fileName);

/// An application package as its information dictionary describes it.
struct PackageFacts {
  std::filesystem::path file;
  std::string identifier;
  std::string version;  ///< empty when the bundle gives none
  std::string name;     ///< display name or, failing that, the bundle's own name
};

/// Why a file cannot be offered to the phone.
struct UnreadablePackage {
  std::string file;  ///< its name
  /// By its ending or its contents, and no other is used in its place.
  bool looksLikePackage = false;
  std::string reason;  ///< for people, one line
};

/// Reads no further than the information dictionary: what lies behind may be damaged, the phone
/// judges that. Memory and work are bounded whatever the file holds. nullopt (with the reason) when
/// this is no package or its beginning cannot be read.
std::optional<PackageFacts> readPackage(const std::filesystem::path& path,
                                        UnreadablePackage& failure);

/// Reads all of a package. Why that cannot be done, for people; nullopt when it can.
std::optional<std::string> damageOf(const std::filesystem::path& path);

/// What the phone shows of an application before its package arrives. Absent parts stay empty.
struct PackageParts {
  std::optional<Bytes> infoPlist;
  std::string iconName;
  std::optional<Bytes> icon;
  std::optional<Bytes> metadata;  ///< HalvoMetadata.plist
  std::optional<Bytes> artwork;   ///< HalvoArtwork
};

/// Collects the parts until the end of the package or the first damage.
PackageParts readPackageParts(const std::filesystem::path& path);

}  // namespace appsync
