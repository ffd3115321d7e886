// Restores through the coordination service.

#include <tuple>

#include "client/apps_client.h"
#include "coordination/failure.h"
#include "coordination/restore_preparation.h"
#include "restore/halvo_metadata.h"
#include "restore/placeholder_info.h"

namespace appsync {
namespace {

InstallType installTypeFor(DemotionStatus demotionStatus) {
  switch (demotionStatus) {
    case DemotionStatus::Intentional:
      return InstallType::IntentionalDowngrade;
    case DemotionStatus::Automatic:
      return InstallType::Downgrade;
    case DemotionStatus::NotDemoted:
      break;
  }
  return InstallType::Restore;
}

/// Fills in the placeholder of one restored application.
struct RestoredPlaceholder {
  const ClientLog& log;
  std::string_view bundleId;
  InstallPlaceholder& placeholder;

  bool setAttributes(const PropertyList::Dictionary& metadata) const {
    PlaceholderAttributes attributes;
    attributes.setLaunchProhibited(metadataProhibitsLaunch(metadata));
    attributes.setBundleVersion(metadataVersion(metadata));
    std::optional<Error> error;
    if (!placeholder.setPlaceholderAttributes(attributes, &error)) {
      log.error("Error %{public}@ setting placeholder attributes for '%{public}@'", error,
                bundleId);
      return false;
    }
    log.normal("set %{public}@ placeholder attributes for %{public}@", attributes, bundleId);
    return true;
  }

  bool setStoreMetadata(const PropertyList::Dictionary& metadata) const {
    std::optional<Error> error;
    if (!placeholder.setMetadata(StoreMetadata::fromDictionary(metadata), &error)) {
      log.error("Error %{public}@ setting store metadata for '%{public}@'", error, bundleId);
      return false;
    }
    log.normal("set store metadata on placeholder for %{public}@", bundleId);
    return true;
  }

  bool setSinfData(const std::optional<Bytes>& sinf) const {
    if (!sinf) return true;
    std::optional<Error> error;
    if (!placeholder.setSinfData(*sinf, &error)) {
      log.error("Error %{public}@ setting SINF data for '%{public}@'", error, bundleId);
      return false;
    }
    log.normal("set SINF data on placeholder for %{public}@", bundleId);
    return true;
  }

  bool setConfigurationComplete() const {
    std::optional<Error> error;
    if (!placeholder.setConfigurationComplete(&error)) {
      log.error("Error %{public}@ setting placeholder configuration as complete for '%{public}@'",
                error, bundleId);
      return false;
    }
    log.normal("set placeholder configuration complete for %{public}@", bundleId);
    return true;
  }
};

}  // namespace

bool AppsClient::prepareAppForRestoreUsingCoordination(std::string_view bundleId,
                                                       ByteView halvoMetadata,
                                                       const std::optional<Bytes>& sinfData,
                                                       const std::optional<Bytes>& iconData,
                                                       DemotionStatus demotionStatus) {
  if (demotionStatus == DemotionStatus::NotDemoted) {
    return _prepareNonDemotedAppForRestoreWithBundleId(bundleId, halvoMetadata, sinfData, iconData);
  }
  return _prepareDemotedAppForRestoreWithBundleId(bundleId, halvoMetadata, sinfData, iconData,
                                                  demotionStatus);
}

bool AppsClient::_prepareNonDemotedAppForRestoreWithBundleId(std::string_view bundleId,
                                                             ByteView halvoMetadata,
                                                             const std::optional<Bytes>& sinfData,
                                                             const std::optional<Bytes>& iconData) {
  return RestorePreparation(*this, _platform, _log, {bundleId, halvoMetadata, sinfData, iconData})
      .runNonDemoted();
}

bool AppsClient::_prepareDemotedAppForRestoreWithBundleId(std::string_view bundleId,
                                                          ByteView halvoMetadata,
                                                          const std::optional<Bytes>& sinfData,
                                                          const std::optional<Bytes>& iconData,
                                                          DemotionStatus demotionStatus) {
  return RestorePreparation(*this, _platform, _log, {bundleId, halvoMetadata, sinfData, iconData})
      .runDemoted(demotionStatus);
}

std::shared_ptr<InstallPlaceholder> AppsClient::_placeHolderForBundleIdentifier(
    std::string_view bundleId, const PropertyList::Dictionary& halvoMetadata,
    const std::optional<Bytes>& sinfData, const std::optional<Bytes>& iconData,
    DemotionStatus demotionStatus) {
  const std::string path = placeholderAppPathForBundleIdentifier(bundleId);
  if (!createPlaceHolderPath(path, bundleId, placeholderFileAttributes())) return nullptr;
  const std::string iconPath = joinPath(path, PlaceholderIconName);
  std::uint64_t iconSize = 0;
  // A placeholder without an icon is better than none.
  std::ignore = writeIconData(iconData, iconPath, &iconSize, bundleId, placeholderFileAttributes());

  const std::string name = metadataName(halvoMetadata).value_or(std::string(bundleId));
  std::shared_ptr<InstallPlaceholder> placeholder =
      _placeHolderForBundleIdentifier(bundleId, name, installTypeFor(demotionStatus));
  if (!placeholder) return nullptr;
  const RestoredPlaceholder restored{_log, bundleId, *placeholder};
  const bool configured =
      (iconSize == 0 || _createIconPromiseForBundleIdentifier(bundleId, iconPath, iconSize,
                                                              placeholder.get(), false)) &&
      restored.setAttributes(halvoMetadata) && restored.setStoreMetadata(halvoMetadata) &&
      restored.setSinfData(sinfData) && restored.setConfigurationComplete();
  if (configured) return placeholder;
  placeholder->cancel(failure(FailureCode::RestoreFailed), SyncHostClientID);
  return nullptr;
}

}  // namespace appsync
