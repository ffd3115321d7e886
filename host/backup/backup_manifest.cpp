#include "host/backup/backup_manifest.h"

#include <fmt/format.h>

#include <algorithm>

#include "base/identifiers.h"
#include "base/text.h"
#include "host/backup/backup_folder.h"
#include "platform/property_list_codec.h"

namespace appsync::host {
namespace {

constexpr std::int64_t FormatVersion = 1;
constexpr std::string_view VersionKey = "FormatVersion";
constexpr std::string_view FilesKey = "Files";
constexpr std::string_view SizeKey = "Size";
constexpr std::string_view DigestKey = "SHA256";
constexpr std::string_view ArchiveSuffix = ".tar";
constexpr std::string_view PropertyLists[] = {BackupApplicationsFile, BackupDemotionsFile,
                                              BackupIconLayoutFile};

bool isDigest(const std::string& text) {
  return text.size() == 64 && text.find_first_not_of("0123456789abcdef") == std::string::npos;
}

std::optional<ManifestEntry> entryOf(const PropertyList& value) {
  const PropertyList* size = value.find(SizeKey);
  const PropertyList* digest = value.find(DigestKey);
  const auto bytes = size ? size->asUnsigned() : std::nullopt;
  const std::string* text = digest ? digest->asString() : nullptr;
  if (!bytes || !text || !isDigest(*text)) return std::nullopt;
  return ManifestEntry{*bytes, *text};
}

std::string objectionTo(std::string_view path) {
  const std::string shown = printable(path);
  if (path.starts_with('/') || path.find("..") != std::string_view::npos) {
    return fmt::format("its manifest names \"{}\", which leads outside", shown);
  }
  return fmt::format("its manifest names \"{}\", which belongs to no backup", shown);
}

/// False when no file of a backup has this path.
bool place(BackupManifest& manifest, std::string_view path, ManifestEntry entry) {
  if (std::ranges::find(PropertyLists, path) != std::end(PropertyLists)) {
    manifest.files.emplace(path, std::move(entry));
    return true;
  }
  const std::string prefix = fmt::format("{}/", BackupDataFolder);
  if (!path.starts_with(prefix)) return false;
  const std::string_view identifier = identifierOfBackupData(path.substr(prefix.size()));
  if (identifier.empty()) return false;
  manifest.data.emplace(identifier, std::move(entry));
  return true;
}

std::optional<BackupManifest> refuse(std::string& problem, std::string reason) {
  problem = std::move(reason);
  return std::nullopt;
}

}  // namespace

std::string backupDataName(std::string_view identifier) {
  return fmt::format("{}{}", identifier, ArchiveSuffix);
}

std::string_view identifierOfBackupData(std::string_view name) {
  if (!name.ends_with(ArchiveSuffix)) return {};
  name.remove_suffix(ArchiveSuffix.size());
  return isUsableIdentifier(name) ? name : std::string_view();
}

std::optional<BackupManifest> parseManifest(ByteView bytes, std::string& problem) {
  const auto root = parseDictionary(bytes);
  const PropertyList* version = root ? find(*root, VersionKey) : nullptr;
  const auto number = version ? version->asInteger() : std::nullopt;
  if (!number || *number < 1) return refuse(problem, "its manifest is damaged");
  if (*number > FormatVersion) {
    return refuse(problem, "it was made by a newer appsync; use that one");
  }
  const auto* files = findDictionary(*root, FilesKey);
  if (!files) return refuse(problem, "its manifest is damaged");
  BackupManifest manifest;
  for (const auto& [path, value] : *files) {
    auto entry = entryOf(value);
    if (!entry) {
      return refuse(
          problem, fmt::format("its manifest lacks the size or digest of \"{}\"", printable(path)));
    }
    if (!place(manifest, path, std::move(*entry))) return refuse(problem, objectionTo(path));
  }
  for (const std::string_view name : PropertyLists) {
    if (!manifest.files.contains(name)) {
      return refuse(problem, fmt::format("its manifest does not name {}", name));
    }
  }
  return manifest;
}

std::optional<Bytes> serializeManifest(const BackupManifest& manifest) {
  PropertyList::Dictionary files;
  const auto add = [&](std::string path, const ManifestEntry& entry) {
    files.emplace(std::move(path),
                  PropertyList::Dictionary{{std::string(SizeKey), entry.size},
                                           {std::string(DigestKey), entry.digest}});
  };
  for (const auto& [name, entry] : manifest.files) add(name, entry);
  for (const auto& [identifier, entry] : manifest.data) {
    add(fmt::format("{}/{}", BackupDataFolder, backupDataName(identifier)), entry);
  }
  return serializePropertyList(PropertyList::Dictionary{{std::string(VersionKey), FormatVersion},
                                                        {std::string(FilesKey), std::move(files)}},
                               PropertyListFormat::Xml);
}

}  // namespace appsync::host
