#pragma once

#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <string_view>

#include "platform/bytes.h"

namespace appsync::host {

inline constexpr std::string_view BackupManifestFile = "Manifest.plist";
inline constexpr std::string_view BackupDataFolder = "Data";

/// "<identifier>.tar"; the identifier is usable.
std::string backupDataName(std::string_view identifier);
/// The identifier of such a name; empty when it is none or its identifier cannot be used.
std::string_view identifierOfBackupData(std::string_view name);

struct ManifestEntry {
  std::uint64_t size = 0;  ///< bytes
  std::string digest;      ///< SHA-256, lower-case hexadecimal
};

/// What a backup holds beside its manifest.
struct BackupManifest {
  std::map<std::string, ManifestEntry, std::less<>> files;  ///< the property lists, by name
  std::map<std::string, ManifestEntry, std::less<>> data;   ///< the archives, by identifier
};

/// nullopt, with what is wrong with it, for anything that is no whole manifest of this version.
[[nodiscard]] std::optional<BackupManifest> parseManifest(ByteView bytes, std::string& problem);
/// nullopt when the property list gets too large.
std::optional<Bytes> serializeManifest(const BackupManifest& manifest);

}  // namespace appsync::host
