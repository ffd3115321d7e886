// How far each package's transfer has come, how it ended, and the end of them all.

#include <cmath>
#include <tuple>

#include "client/apps_client.h"
#include "client/identifier_safety.h"
#include "client/paths.h"
#include "coordination/failure.h"
#include "transfer/status_names.h"

namespace appsync {
namespace {

constexpr std::int64_t ProgressUnits = 1000;

/// A host that has nothing to send divides by zero: what is no number counts as none of it.
std::int64_t completedUnits(double fraction) {
  const double units = std::trunc(fraction * ProgressUnits);
  return std::abs(units) < 0x1p63 ? static_cast<std::int64_t>(units) : 0;
}

bool isUnfinished(InstallState state) {
  return static_cast<std::uint64_t>(state) < static_cast<std::uint64_t>(InstallState::Canceled);
}

}  // namespace

std::shared_ptr<InstallProgress> AppsClient::_progressForAssetIdentifier(
    std::string_view identifier) {
  if (_useInstallCoordinator) {
    _log.normal("Not returning progress for %{public}@ as install coordination is enabled",
                identifier);
    return nullptr;
  }
  std::shared_ptr<InstallProgress> progress;
  if (const auto record = _platform.appRegistry.recordForIdentifier(identifier, true)) {
    progress = _platform.appRegistry.installProgress(*record, InstallPhase::Loading);
  }
  // At error level, where readers of the log look for it.
  _log.error("Returning %{public}@ progress for %{public}@", progress, identifier);
  return progress;
}

void AppsClient::assetTransferUpdatedProgress(const SyncAssetPtr& asset, double fraction) noexcept {
  const std::string& identifier = asset->identifier;
  _log.normal("finished transferring %lf for %{public}@", fraction, identifier);
  if (_useInstallCoordinator) {
    const bool existing = _accessQueue.sync(
        [&]() APPSYNC_REQUIRES(_accessQueue) { return _updatingApps.contains(identifier); });
    // Only shown; it has told of its failure.
    std::ignore = updateTransferProgressForApp(asset, existing);
  } else if (const auto progress = _progressForAssetIdentifier(identifier)) {
    progress->setInstallState(InstallState::Active);
    if (progress->totalUnitCount() != ProgressUnits) progress->setTotalUnitCount(ProgressUnits);
    progress->setCompletedUnitCount(completedUnits(fraction));
  }
  _accessQueue.sync(
      [&]() APPSYNC_REQUIRES(_accessQueue) { _outstandingXFTTransfers.insert(identifier); });
}

void AppsClient::assetTransferSucceeded(const SyncAssetPtr& asset, bool succeeded,
                                        const std::optional<Error>& error) noexcept {
  const std::string& identifier = asset->identifier;
  bool existingApp = false;
  bool userCancelled = false;
  _accessQueue.sync([&]() APPSYNC_REQUIRES(_accessQueue) {
    existingApp = _updatingApps.erase(identifier) > 0;
    userCancelled = _userCancelledApps.erase(identifier) > 0;
    _outstandingXFTTransfers.erase(identifier);
  });
  _log.normal("transfer for asset %{public}@ ended with success %c error %{public}@ existingApp:%d",
              *asset, succeeded, error, existingApp);
  const std::shared_ptr<InstallProgress> progress = _progressForAssetIdentifier(identifier);
  if (succeeded) {
    _assetReceived(asset, progress, existingApp);
  } else {
    _assetTransferFailed(asset, progress, error, existingApp, userCancelled);
  }
}

void AppsClient::_assetReceived(const SyncAssetPtr& asset,
                                const std::shared_ptr<InstallProgress>& progress,
                                bool existingApp) {
  const std::string& identifier = asset->identifier;
  _log.normal("asset transfer succeeded for %{public}@", identifier);
  if (progress) {
    if (_useInstallCoordinator) {
      _log.normal("not setting install phase finished for %{public}@ as coordination is enabled",
                  identifier);
    } else {
      _platform.appRegistry.installPhaseFinished(*progress);
    }
  }

  if (asset->path && !asset->path->starts_with('/')) {
    asset->path = joinPath(exchange::StagingRoot, *asset->path);
  } else if (!asset->path) {
    const std::optional<PropertyList> remembered =
        _restoreStatePropertyForKey(exchange::RestorePathKey, identifier, versionOf(*asset));
    if (remembered && remembered->asString()) asset->path = *remembered->asString();
  }
  if (!isSafe(asset->path)) {
    _log.normal("Ignoring invalid path: %{public}@", asset->path);
    return;
  }
  if (!asset->isDownload) {
    changeAssetID(identifier, exchange::TodoSent);
    return;
  }
  _log.normal("Received file at %{public}@", asset->path);
  changeAssetID(identifier, exchange::TodoDownloaded);
  if (asset->isRestore) {
    _restoreAssetReceived(asset, progress);
    return;
  }
  _log.normal("Installing synced asset %{public}@", *asset);
  if (_useInstallCoordinator) {
    transferCompleteForApp(asset, std::nullopt, existingApp);
  } else {
    _enqueueAssetInstall(asset);
  }
}

/// A package whose data is in the restored backup waits until the host has delivered that data.
void AppsClient::_restoreAssetReceived(const SyncAssetPtr& asset,
                                       const std::shared_ptr<InstallProgress>& progress) {
  if (asset->completedAssetParts == kTWAssetPartApplicationData) {
    if (_useInstallCoordinator) {
      _log.normal(
          "Not processing kTWAssetPartApplicationData for restore asset %{public}@ as coordination "
          "is enabled",
          *asset);
    } else {
      _enqueueAssetInstall(asset);
    }
    return;
  }
  if (_useInstallCoordinator) {
    _log.normal("Not processing restore asset %{public}@ as coordination is enabled", *asset);
    return;
  }
  if (!_backupManager.restoreDataExists(asset->identifier)) {
    _log.normal("No restore data exists for %{public}@", asset->shortDescription);
    _enqueueAssetInstall(asset);
    return;
  }
  _log.normal("Restore data exists for %{public}@", asset->shortDescription);
  if (progress) progress->setInstallPhase(InstallPhase::RestoringData);
  _setRestoreStatePropertyValue(*asset->path, exchange::RestorePathKey, asset->identifier,
                                versionOf(*asset));
}

void AppsClient::_assetTransferFailed(const SyncAssetPtr& asset,
                                      const std::shared_ptr<InstallProgress>& progress,
                                      const std::optional<Error>& error, bool existingApp,
                                      bool userCancelled) {
  const std::string& identifier = asset->identifier;
  const bool recoverable = _isRecoverableError(error);
  _log.normal("failed to transfer asset %{public}@. err=%{public}@, recoverable=%d", *asset, error,
              recoverable);
  if (recoverable) {
    if (progress) progress->setInstallState(InstallState::Failed);
    return;
  }
  if (!_platform.appRegistry.isApplicationInstalled(identifier) || asset->isRestore) return;

  if (progress && isUnfinished(progress->installState())) progress->cancel();
  _log.normal("Uninstalling placeholder %{public}@", identifier);
  _cancelApplicationRestore(*asset,
                            logMessage("Install coordination is enabled - not calling "
                                       "cancelApplicationRestoreWithBundleID for %{public}@",
                                       identifier));
  if (!_useInstallCoordinator) {
    const bool removed = _platform.appRegistry.uninstallApplication(
        identifier, {{std::string(UninstallPlaceholdersOnlyKey), true}});
    _log.normal("Uninstalling app using SW %{public}@ %s", identifier,
                removed ? "secceeded" : "failed");
  } else if (!userCancelled) {
    // Without an error it would count as complete.
    transferCompleteForApp(asset, error.value_or(failure(FailureCode::TransferFailed)),
                           existingApp);
  }
}

/// Restores are sorted out before the places that call this; the test stays so that one that gets
/// here after all does not keep the backup service waiting.
void AppsClient::_cancelApplicationRestore(const SyncAsset& asset,
                                           std::string_view lineIfCoordinated) {
  if (!asset.isRestore) return;
  if (_useInstallCoordinator) {
    _log.write(LogLevel::Default, lineIfCoordinated);
  } else {
    _backupManager.cancelApplicationRestore(asset.identifier);
  }
}

void AppsClient::assetTransferEndedWithSuccess(bool success) noexcept {
  _log.normal("asset transfer ended withsuccess: %c", success);
  _installGroup.wait();
  _notifyDashel(false);
  _getAndResetNumAppInstallsAttempted();
  const std::set<std::string> outstanding = _accessQueue.sync(
      [this]() APPSYNC_REQUIRES(_accessQueue) { return _outstandingXFTTransfers; });
  if (outstanding.empty()) return;

  if (_useInstallCoordinator) {
    assetSyncFinishedWithStatus(success, outstanding);
  } else {
    _settleOutstandingTransfers(success, outstanding);
  }
  if (success) {
    _log.error("Called with success == YES but with %lu outstanding XFT transfers!",
               outstanding.size());
  }
  _accessQueue.sync([this]() APPSYNC_REQUIRES(_accessQueue) {
    _outstandingXFTTransfers.clear();
    _updatingApps.clear();
    _userCancelledApps.clear();
  });
}

void AppsClient::_settleOutstandingTransfers(bool success,
                                             const std::set<std::string>& outstanding) {
  const InstallState state = success ? InstallState::Finished : InstallState::Failed;
  for (const std::string& identifier : outstanding) {
    _log.normal("Setting state for outstanding XFT loading phase of asset %{public}@ to %{public}@",
                identifier, installStateName(state));
    if (const auto progress = _progressForAssetIdentifier(identifier)) {
      progress->setInstallState(state);
      _platform.appRegistry.installPhaseFinished(*progress);
    }
  }
}

}  // namespace appsync
