// What coordinators and the application registry report.

#include "client/apps_client.h"
#include "coordination/failure.h"
#include "platform/sync_files.h"

namespace appsync {
namespace {

constexpr std::string_view EventServiceName = "com.corvane.twc.ipx.icappobserverdelegate";

SyncAssetPtr assetNamed(SyncHost& host, std::string_view bundleId) {
  return host.makeDownload(bundleId, ApplicationDataclass, std::nullopt);
}

}  // namespace

void AppsClient::setupInstallCoordinatorObserver() {
  const Lock lock(_startUpMutex);
  if (_appInstallObserver) return;
  _appInstallObserver = _platform.installCoordination.createEventListener(
      EventServiceName, {SyncHostClientID}, *this);
}

void AppsClient::promiseDidBeginFulfillmentWithIdentifier(std::uint64_t identifier) noexcept {
  _log.normal("promiseDidBeginFulfillmentWithIdentifier %lu", identifier);
}

void AppsClient::coordinatorDidInstallPlaceholder(InstallCoordinator& coordinator) noexcept {
  _log.normal("coordinatorDidInstallPlaceholder for %{public}@ with error %{public}@",
              coordinator.bundleIdentifier(), coordinator.error());
}

void AppsClient::coordinatorDidCompleteSuccessfully(InstallCoordinator& coordinator) noexcept {
  const std::optional<std::string> bundleId = coordinator.bundleIdentifier();
  const std::optional<Error> error = coordinator.error();
  _log.normal("coordinatorDidCompleteSuccessfully for %{public}@ with error %{public}@", bundleId,
              error);
  if (!bundleId) return;
  changeAssetID(*bundleId, error ? exchange::TodoFailed : exchange::TodoInstalled);
  cleanRestoreStateForIdentifier(*bundleId);
}

void AppsClient::coordinatorShouldPrioritize(InstallCoordinator& coordinator) noexcept {
  const std::optional<std::string> bundleId = coordinator.bundleIdentifier();
  if (!bundleId) return;
  _log.normal("Prioritize %{public}@", *bundleId);
  SyncHostService& service = _platform.syncHost.service();
  if (!service.supportsPrioritizeAsset()) {
    _log.error("Cannot prioritize %{public}@ as it's not supported", *bundleId);
    return;
  }
  // The completion may run when this client is gone; the log is not.
  service.prioritizeAsset(assetNamed(_platform.syncHost, *bundleId),
                          [log = _log, bundleId](const std::optional<Error>& error) {
                            log.normal("Prioritize %{public}@ finished with error %{public}@",
                                       *bundleId, error);
                          });
}

void AppsClient::coordinatorCanceledWithReason(InstallCoordinator& coordinator, const Error&,
                                               CoordinationClientId) noexcept {
  const std::optional<std::string> bundleId = coordinator.bundleIdentifier();
  if (!bundleId) return;
  const bool alreadyCancelled = _accessQueue.sync([&]() APPSYNC_REQUIRES(_accessQueue) {
    return !_userCancelledApps.insert(*bundleId).second;
  });
  SyncHostService& service = _platform.syncHost.service();
  if (alreadyCancelled || !service.supportsCancelAssetAsFailed()) {
    _log.error("Cannot cancel %{public}@ as it's already cancelled %d OR the call is not supported",
               *bundleId, alreadyCancelled);
    return;
  }
  _log.normal("Cancelling asset sync for %{public}@", *bundleId);
  service.cancelAssetAsFailed(assetNamed(_platform.syncHost, *bundleId));
}

void AppsClient::applicationInstallsDidCancel(const std::vector<AppRecord>& records) noexcept {
  if (_useInstallCoordinator) {
    _log.normal(
        "not handling applicationInstallsDidCancel because install coordination is "
        "enabled.");
    return;
  }
  for (const AppRecord& record : records) {
    if (record.installType != InstallType::Restore) continue;
    assetTransferSucceeded(assetNamed(_platform.syncHost, record.applicationIdentifier), false,
                           failure(FailureCode::RestoreCancelled));
  }
}

}  // namespace appsync
