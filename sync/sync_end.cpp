// Closes or resets the application sync, and tidies metadata before a backup.

#include <system_error>
#include <tuple>

#include "client/apps_client.h"
#include "client/paths.h"
#include "platform/bundle.h"
#include "platform/property_list_codec.h"

namespace appsync {
namespace {

std::string systemText(const std::optional<Error>& error) {
  if (!error) return "unknown error";
  if (error->domain != POSIXErrorDomain) return error->localizedDescription();
  return std::generic_category().message(static_cast<int>(error->code));
}

const std::string& identifierOf(const AppRecord& record) {
  return record.bundleIdentifier ? *record.bundleIdentifier : record.applicationIdentifier;
}

/// Brings one application's metadata up to date; true when it was changed.
bool tidyMetadata(const AppRecord& record, PropertyList::Dictionary& metadata,
                  const ClientLog& log) {
  bool changed = false;
  const bool deviceBased = record.isDeviceBasedAssignment;
  if (deviceBased || metadata.contains("DeviceBasedQLP")) {
    metadata.insert_or_assign("DeviceBasedQLP", deviceBased);
    log.normal("Updated DeviceBasedQLP state for : %{public}@ to %d", identifierOf(record),
               deviceBased);
    changed = true;
  }
  if (findFlag(metadata, "is-auto-download")) {
    metadata.erase("is-auto-download");
    log.normal("clearing is-auto-download value for %{public}@", identifierOf(record));
    changed = true;
  }
  return changed;
}

}  // namespace

void AppsClient::syncEndedWithSuccess(bool success) noexcept {
  _log.normal("sync ended with success: %c", success);
  if (!success) return;

  std::optional<Error> error;
  if (!_platform.files.touch(exchange::SyncRoot, &error)) {
    _log.error("Failed to update utimes of \"%s\": %s", exchange::SyncRoot, systemText(error));
  }
  if (_uninstalledApps) {
    _log.normal("clearing uninstalled apps: %{public}@", *_uninstalledApps);
    if (_platform.installerService.clearUninstalled(*_uninstalledApps) != 0) {
      // Kept, so that the next successful sync tries again.
      _log.error("Failed to clear uninstalled apps from Deploya.");
    } else {
      _uninstalledApps.reset();
    }
  }
  // A sync has ended all the same; the host writes the list anew.
  std::ignore = _platform.files.removeItem(exchange::LastSyncState);
}

void AppsClient::clearSyncData() noexcept {
  _log.normal("blasting work area");
  {
    const Lock lock(_stateFileMutex);
    // Nobody is told of what could not be cleared.
    std::ignore = _platform.files.removeItem(exchange::SyncRoot);
  }

  _log.normal("Uninstalling all placeholder apps");
  _enumeratePlaceholdersWithBlock([this](const AppRecord& record, bool&) {
    const bool removed = _platform.appRegistry.uninstallApplication(identifierOf(record), {});
    _log.normal("Uninstall %{public}@ = %c", identifierOf(record), removed);
  });

  const auto uninstalled = _platform.installerService.lookupUninstalled();
  if (!uninstalled) {
    _log.error("Failed to fetch uninstalled apps list to clear it");
    return;
  }
  std::vector<std::string> identifiers;
  for (const auto& [identifier, ignored] : *uninstalled) identifiers.push_back(identifier);
  if (_platform.installerService.clearUninstalled(identifiers) != 0) {
    _log.error("Failed to clear uninstalled apps list");
  }
}

void AppsClient::prepareForBackup() noexcept {
  _log.normal("preparing for backup");
  _platform.appRegistry.enumerateBundles(BundleKind::User, [this](const AppRecord& record, bool&) {
    if (!record.bundleContainerPath) return;
    const std::string path = joinPath(*record.bundleContainerPath, exchange::MetadataName);
    std::optional<PropertyList::Dictionary> metadata = loadDictionary(_platform.files, path);
    if (!metadata || !tidyMetadata(record, *metadata, _log)) return;
    const std::optional<Bytes> bytes =
        serializePropertyList(std::move(*metadata), PropertyListFormat::Xml);
    if (bytes) std::ignore = _platform.files.writeAtomically(path, *bytes);
  });
  _log.normal("finished preparing for backup");
}

}  // namespace appsync
