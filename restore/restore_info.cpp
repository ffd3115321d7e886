// The applications of a restored backup: each becomes a placeholder or a coordinated restore.

#include <tuple>

#include "client/apps_client.h"
#include "client/identifier_safety.h"
#include "client/paths.h"
#include "client/unreadable.h"
#include "platform/existence.h"
#include "platform/property_list_codec.h"
#include "restore/halvo_metadata.h"
#include "restore/placeholder_info.h"

namespace appsync {
namespace {

constexpr std::string_view KeptCopyPath =
    "/var/mobile/Library/Logs/Vellum/RestoreApplications.plist";

/// The applications that were demoted when the backup was made.
class DemotedApps {
 public:
  explicit DemotedApps(const PropertyList::Dictionary& lists)
      : automatic_(namesUnder(lists, exchange::AutomaticDowngradesKey)),
        intentional_(namesUnder(lists, exchange::IntentionalDowngradesKey)) {}

  DemotionStatus statusOf(const std::string& bundleId) const {
    if (automatic_.contains(bundleId)) return DemotionStatus::Automatic;
    if (intentional_.contains(bundleId)) return DemotionStatus::Intentional;
    return DemotionStatus::NotDemoted;
  }

 private:
  static std::set<std::string> namesUnder(const PropertyList::Dictionary& lists,
                                          std::string_view key) {
    const std::vector<std::string> names = findStrings(lists, key);
    return {names.begin(), names.end()};
  }

  const std::set<std::string> automatic_;
  const std::set<std::string> intentional_;
};

/// What the restore list holds of one application.
struct RestoreEntry {
  Bytes metadata;
  std::optional<Bytes> sinf;
  std::optional<Bytes> icon;
};

std::optional<RestoreEntry> readEntry(const ClientLog& log, std::string_view bundleId,
                                      const PropertyList& value) {
  const PropertyList::Dictionary* entry = value.asDictionary();
  if (!entry) {
    log.normal("no halvo restore info for '%{public}@' - skipping", bundleId);
    return std::nullopt;
  }
  std::optional<Bytes> metadata = findData(*entry, exchange::RestoreMetadataKey);
  if (!metadata) {
    log.normal("no HalvoMetadata for '%{public}@' - ignoring", bundleId);
    return std::nullopt;
  }
  return RestoreEntry{std::move(*metadata), findData(*entry, exchange::RestoreSinfKey),
                      findData(*entry, exchange::RestoreIconKey)};
}

std::optional<PropertyList::Dictionary> loadRestoreList(FileManager& files, const ClientLog& log) {
  std::optional<Error> error;
  const std::optional<Bytes> bytes = files.contentsAtPath(exchange::RestoreList, &error);
  if (!bytes) {
    log.normal("failed to read halvo app restore info. err=%{public}@", error);
    return std::nullopt;
  }
  log.normal("processing halvo restore info");
  std::optional<PropertyList::Dictionary> list = parseDictionary(*bytes, &error);
  if (!list) log.normal("failed to parse halvo app restore info. err=%{public}@", error);
  return list;
}

void record(TransactionLog& log, bool success, std::string_view bundleId,
            std::string_view description) {
  log.logScenario("Halvo App Restore", std::nullopt, success, bundleId, description);
}

}  // namespace

bool AppsClient::_processHalvoRestoreInfo() {
  std::optional<Error> unseen;
  if (!_platform.files.attributesOfItem(exchange::RestoreList, &unseen)) {
    if (!isMissing(unseen)) {
      // It may be there, and the next restore may see it.
      _log.error("can't look at %{public}@: %{public}@", exchange::RestoreList, unseen);
      return false;
    }
    _log.normal("no halvo restore plist found - skipping processing of halvo restored apps");
    return true;
  }
  const std::optional<PropertyList::Dictionary> list = loadRestoreList(_platform.files, _log);
  const bool result = list && _restoreApplications(*list);

  // The list is used once, whatever came of it.
  std::ignore = _platform.files.removeItem(KeptCopyPath);
  std::optional<Error> error;
  if (!_platform.files.moveItem(exchange::RestoreList, KeptCopyPath, &error)) {
    _log.normal("failed to copy halvo metadata. err=%{public}@", error);
  }
  return result;
}

bool AppsClient::_restoreApplications(const PropertyList::Dictionary& restoreList) {
  std::optional<Error> error;
  const std::optional<PropertyList::Dictionary> lists =
      _loadDemotedAppsPlist(exchange::DemotedApplications, &error);
  sayUnreadable(_log, exchange::DemotedApplications, error);
  _log.oversize("Demoted Apps: %{public}@", lists);
  const DemotedApps demoted(lists.value_or(PropertyList::Dictionary{}));
  bool result = false;
  for (const auto& [bundleId, value] : restoreList) {
    const DemotionStatus status = demoted.statusOf(bundleId);
    _log.normal("processing halvo restore info for '%{public}@' demotionStatus :%lu", bundleId,
                static_cast<std::uint64_t>(status));
    if (_placeholderExistsForApplication(bundleId)) {
      _log.normal("placeholder already exists for '%{public}@' - skiping'", bundleId);
      continue;
    }
    // The whole path is tested, since ".." climbs out of the folder that it is joined to.
    if (!isSafe(placeholderAppPathForBundleIdentifier(bundleId))) {
      _log.normal("Ignoring invalid path: %{public}@", bundleId);
      continue;
    }
    const std::optional<RestoreEntry> entry = readEntry(_log, bundleId, value);
    if (!entry) continue;
    result =
        _useInstallCoordinator
            ? prepareAppForRestoreUsingCoordination(bundleId, entry->metadata, entry->sinf,
                                                    entry->icon, status)
            : _processHalvoRestoreInfoForApp(bundleId, entry->metadata, entry->sinf, entry->icon);
  }
  return result;
}

bool AppsClient::_processHalvoRestoreInfoForApp(std::string_view bundleId, ByteView halvoMetaData,
                                                const std::optional<Bytes>& sinfData,
                                                const std::optional<Bytes>& iconData) {
  _log.normal("processing app restore info for '%{public}@'", bundleId);
  std::optional<Error> error;
  const std::optional<PropertyList::Dictionary> metadata = parseDictionary(halvoMetaData, &error);
  if (!metadata) {
    _log.normal("failed to parse halvo metadata for '%{public}@'. err=%{public}@", bundleId, error);
    record(_platform.transactionLog, false, bundleId, "Failed to parse halvo metadata");
    // Handled: trying again would not make it readable.
    return true;
  }
  sayUnexpectedTypesOfMetadata(_log, bundleId, *metadata);
  PropertyList::Dictionary options = placeholderOptions(bundleId, InstallType::Restore);
  options.emplace(SWHalvoMetadataKey, Bytes(halvoMetaData.begin(), halvoMetaData.end()));
  options.emplace(SWApplicationSINFKey, sinfData ? PropertyList(*sinfData) : PropertyList::null());
  if (_installRestorePlaceholder(bundleId, *metadata, iconData, options)) return true;
  _log.normal(
      "failed to process app restore info for '%{public}@'. halvoMetadataDictionary=%{public}@",
      bundleId, *metadata);
  return false;
}

bool AppsClient::_installRestorePlaceholder(std::string_view bundleId,
                                            const PropertyList::Dictionary& metadata,
                                            const std::optional<Bytes>& iconData,
                                            const PropertyList::Dictionary& options) {
  TransactionLog& transactions = _platform.transactionLog;
  const std::string path = placeholderAppPathForBundleIdentifier(bundleId);
  if (!createPlaceHolderPath(path, bundleId, placeholderFileAttributes())) {
    // The reason stands in the line before; this one has a place for it but never held it.
    _log.normal("failed to create app directory for '%{public}@'. err=%{public}@", bundleId,
                std::optional<Error>());
    record(transactions, false, bundleId, "Failed to create app directory");
    return false;
  }
  // A placeholder without an icon is better than none.
  std::ignore = writeIconData(iconData, joinPath(path, PlaceholderIconName), nullptr, bundleId,
                              placeholderFileAttributes());
  const PropertyList::Dictionary info =
      placeholderInfo(bundleId, metadataVersion(metadata), metadataName(metadata),
                      periodicalFlag(metadata), metadataProhibitsLaunch(metadata));
  _log.normal("creating placeholder for '%{public}@'. info.plist=%{public}@", bundleId, info);
  if (!writePlaceholderInfo(_platform.files, path, info)) {
    _log.normal("failed to create placeholder info at %{public}@ with info %{public}@",
                paths::infoIn(path), info);
    record(transactions, false, bundleId, "Failed to create placeholder info");
    return false;
  }
  const bool installed =
      _platform.appRegistry.installApplication(FileLocation::directory(path), options, nullptr);
  logPlaceholderInstall(_log, installed, path, info);
  record(transactions, installed, bundleId,
         installed ? "Installed placeholder" : "Failed to install placeholder");
  return installed;
}

}  // namespace appsync
