// Installs and uninstalls through the coordination service.

#include "client/apps_client.h"
#include "coordination/failure.h"
#include "coordination/install_preparation.h"
#include "coordination/transaction_steps.h"

namespace appsync {

bool AppsClient::prepareAppForInstallUsingCoordination(const SyncAssetPtr& asset,
                                                       bool existingApp) {
  return InstallPreparation(*this, _platform, _log, *asset, existingApp).run();
}

bool AppsClient::updateTransferProgressForApp(const SyncAssetPtr& asset, bool existingApp) {
  const std::string& bundleId = asset->identifier;
  const std::shared_ptr<InstallCoordinator> coordinator =
      _initiatingOrUpdatingAppInstallCoordinatorForBundleIdentifier(bundleId, existingApp, false,
                                                                    nullptr);
  if (!coordinator || coordinator->error()) return false;
  std::shared_ptr<PathTransferPromise> promise = coordinator->appAssetPromise(nullptr);
  if (promise && promise->isComplete()) {
    _log.normal("Asset promise is already satisfied for %{public}@", bundleId);
    return false;
  }
  if (!promise) {
    promise = _createAppAssetPromiseForBundleIdentifier(bundleId, asset->path, coordinator.get());
  }
  if (!promise) return false;
  _log.normal("Updating download progress: %f install progress:%f for %{public}@",
              asset->downloadProgress, promise->percentComplete(), bundleId);
  promise->setPercentComplete(asset->downloadProgress);
  return true;
}

void AppsClient::transferCompleteForApp(const SyncAssetPtr& asset,
                                        const std::optional<Error>& error, bool isExistingApp) {
  const std::string& bundleId = asset->identifier;
  const std::shared_ptr<InstallCoordinator> coordinator =
      _initiatingOrUpdatingAppInstallCoordinatorForBundleIdentifier(bundleId, isExistingApp, false,
                                                                    nullptr);
  if (!coordinator || coordinator->error()) return;
  if (error) {
    coordinator->cancel(_platform.installCoordination.createUserPresentableError(
                            static_cast<std::int64_t>(FailureCode::InstallFailed), 0, error),
                        SyncHostClientID);
    return;
  }
  std::shared_ptr<PathTransferPromise> promise = coordinator->appAssetPromise(nullptr);
  if (promise && promise->isComplete()) {
    _log.normal("Asset promise is already satisfied for %{public}@", bundleId);
    return;
  }
  if (!promise) {
    promise = _createAppAssetPromiseForBundleIdentifier(bundleId, asset->path, coordinator.get());
  } else if (asset->path) {
    promise->setTransferPath(FileLocation::file(*asset->path));
  }
  if (!promise) return;
  _log.normal("Satisfying asset promise for %{public}@", bundleId);
  promise->setPercentComplete(1.0);
  promise->setComplete(true);
}

void AppsClient::assetSyncFinishedWithStatus(bool status,
                                             const std::set<std::string>& outstandingItems) {
  for (const std::string& bundleId : outstandingItems) {
    const std::shared_ptr<InstallCoordinator> coordinator =
        _platform.installCoordination.coordinatorFor(CoordinatorKind::Any, bundleId,
                                                     SyncHostClientID, false, nullptr, nullptr);
    if (!coordinator || status) continue;
    const Error reason = failure(FailureCode::TransferFailed);
    _log.normal("Cancelling coordinator with error %{public}@ for %{public}@", reason, bundleId);
    coordinator->cancel(reason, SyncHostClientID);
  }
}

void AppsClient::uninstallAppUsingCoordination(std::string_view bundleId) {
  logStepBegin(_platform.transactionLog, TransactionStep::UninstallApp, bundleId, "Uninstall app");
  // The completion may run when this client is gone; the services it uses are not.
  _platform.installCoordination.uninstallApp(
      bundleId, false,
      [log = _log, &transactionLog = _platform.transactionLog,
       identifier = std::string(bundleId)](const std::optional<Error>& error) {
        log.normal(
            "Uninstall of %{public}@ with install coordinator succeeded wiht error "
            "%{public}@.",
            identifier, error);
        logStepEnd(transactionLog, TransactionStep::UninstallApp, !error, identifier,
                   "Uninstall app");
      });
}

}  // namespace appsync
