// Placeholder applications: the small bundles that the registry shows until the packages arrive.

#include <tuple>

#include "client/apps_client.h"
#include "client/paths.h"
#include "platform/bundle.h"
#include "restore/placeholder_info.h"

namespace appsync {
namespace {

constexpr std::string_view PlaceholdersFolder = "com.corvane.twc.Apps";

}  // namespace

std::string AppsClient::placeholderAppPathForBundleIdentifier(std::string_view bundleId) const {
  const std::string folder = joinPath(_platform.files.temporaryDirectory(), PlaceholdersFolder);
  return joinPath(folder, std::string(bundleId) + ".app");
}

bool AppsClient::createPlaceHolderPath(std::string_view path, std::string_view bundleId,
                                       const FileAttributes& attributes) {
  std::optional<Error> error;
  const bool created = _platform.files.createDirectory(path, true, attributes, &error);
  if (!created || error) {
    _platform.transactionLog.logScenario("Halvo App Restore", std::nullopt, false, bundleId,
                                         "Failed to create app directory");
  }
  _log.normal("Created app directory for '%{public}@' at %{public}@ with err=%{public}@", bundleId,
              path, error);
  return created;
}

bool AppsClient::writeIconData(const std::optional<Bytes>& iconData, std::string_view path,
                               std::uint64_t* fileSize, std::string_view bundleId,
                               const FileAttributes& attributes) {
  if (!iconData) {
    _log.error("no icon data for '%{public}@'", bundleId);
    return false;
  }
  std::uint64_t size = 0;
  const bool created = _platform.files.createFile(path, *iconData, attributes);
  if (created) {
    std::optional<Error> error;
    const auto item = _platform.files.attributesOfItem(path, &error);
    if (item && !error) {
      size = item->size;
      if (fileSize) *fileSize = size;
    }
  }
  _log.normal("icon data for '%{public}@' was writen to %{public}@ with status:%d fileSize:%llu",
              bundleId, path, created, size);
  return created;
}

void AppsClient::_createPlaceHolderApplication(const SyncAssetPtr& asset) {
  _log.normal("plist %{public}@", asset->infoPlist);
  const PropertyList::Dictionary package =
      loadDictionary(_platform.files, asset->infoPlist.value_or(std::string()))
          .value_or(PropertyList::Dictionary{});
  const std::string name = asset->prettyName.value_or(std::string());
  const std::string& identifier = asset->identifier;
  if (name.empty() || identifier.empty()) return;

  const std::string path = placeholderAppPathForBundleIdentifier(identifier);
  if (!createPlaceHolderPath(path, identifier, placeholderFileAttributes())) return;
  _copyIcon(asset->icon, joinPath(path, PlaceholderIconName));

  // An empty version keeps the dictionary complete: without its placeholder, an update that fails
  // would take the installed application with it.
  const PropertyList::Dictionary info =
      placeholderInfo(identifier, versionOf(*asset).value_or(std::string()), name,
                      periodicalFlag(package), infoProhibitsLaunch(package));
  if (!writePlaceholderInfo(_platform.files, path, info)) return;
  _log.normal("creating placeholder for '%{public}@'. info.plist=%{public}@", identifier, info);

  const bool installed = _platform.appRegistry.installApplication(
      FileLocation::directory(path), placeholderOptions(identifier, InstallType::Sync), nullptr);
  logPlaceholderInstall(_log, installed, path, info);
  _platform.transactionLog.logScenario(
      "Install placeholder", std::nullopt, installed, identifier,
      installed ? "Installed placeholder" : "Failed to install placeholder");
}

/// A placeholder without an icon is better than none, so a failure is only logged.
void AppsClient::_copyIcon(const std::optional<FileLocation>& icon, const std::string& target) {
  if (!icon || icon->path.empty()) return;
  // The directory of an earlier placeholder is used again.
  std::ignore = _platform.files.removeItem(target);
  std::optional<Error> error;
  if (!_platform.files.copyItem(icon->path, target, &error)) {
    _log.error("Copying icon from %{public}@ to %{public}@ failed: %{public}@", icon->path, target,
               error);
  }
}

bool AppsClient::_placeholderExistsForApplication(std::string_view bundleId) {
  // Coordinated restores are always handed on; their coordinators know what is there.
  if (_useInstallCoordinator) return false;
  bool found = false;
  _platform.appRegistry.enumerateBundles(
      BundleKind::User, [&](const AppRecord& record, bool& stop) {
        if (record.bundleIdentifier != bundleId) return;
        found = true;
        _log.normal("Found placeholder for bundle %{public}@", bundleId);
        stop = true;
      });
  return found;
}

void AppsClient::_enumeratePlaceholdersWithBlock(const AppRegistry::Visitor& visitor) {
  _platform.appRegistry.enumerateBundles(BundleKind::All,
                                         [&visitor](const AppRecord& record, bool& stop) {
                                           if (record.isApplication && record.isPlaceholder) {
                                             visitor(record, stop);
                                           }
                                         });
}

std::set<std::string> AppsClient::_getSystemAppPlaceholders() {
  std::set<std::string> placeholders;
  _platform.appRegistry.enumerateBundles(
      BundleKind::System, [&placeholders](const AppRecord& record, bool&) {
        if (record.isApplication && record.isPlaceholder && record.bundleIdentifier) {
          placeholders.insert(*record.bundleIdentifier);
        }
      });
  _log.normal("SystemAppPlaceholders %{public}@", placeholders);
  return placeholders;
}

}  // namespace appsync
