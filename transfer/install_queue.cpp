// Installs received packages, one operation each. What follows from an assertion is decided in
// install_plan; here are the effects.

#include <cerrno>
#include <tuple>

#include "client/apps_client.h"
#include "platform/bundle.h"
#include "platform/existence.h"
#include "platform/sync_files.h"
#include "transfer/install_plan.h"

namespace appsync {
namespace {

constexpr std::chrono::seconds RetryDelay{30};
constexpr std::string_view InstallScenario = "Asset install";
constexpr std::string_view FailureScenario = "Aerix restore";
/// The application service's own errors, which no second try mends.
constexpr std::string_view StartwellErrorDomain = "StartwellError";

/// Removes a package whose install is over. What is not seen to be a file stays: an empty path
/// leads to the directory in which all packages arrive.
void removePackage(FileManager& files, const std::string& path) {
  if (isFile(files, path)) std::ignore = files.removeItem(path);
}

/// Without a placeholder over it, the registry would take the working version that was to be
/// updated.
bool wouldTakeTheApplication(AppRegistry& registry, std::string_view identifier) {
  const std::optional<AppRecord> record = registry.recordForIdentifier(identifier, false);
  return record && record->isInstalled && !record->isPlaceholder &&
         !registry.recordForIdentifier(identifier, true);
}

}  // namespace

void AppsClient::_enqueueAssetInstall(const SyncAssetPtr& asset) {
  _installGroup.enter();
  _log.normal("Enqueue install request for %{public}@", asset->identifier);
  _installOperationQueue.add([this, asset] {
    _log.normal("Performing install for %{public}@", asset->identifier);
    _performAssetInstall(asset);
    _log.normal("Finished install for %{public}@", asset->identifier);
    cleanRestoreStateForIdentifier(asset->identifier);
    _installGroup.leave();
  });
}

void AppsClient::_performAssetInstall(const SyncAssetPtr& asset) {
  const std::string& identifier = asset->identifier;
  _log.normal("Grabbing assertion for %{public}@", identifier);
  HomeScreenService::AssertionResult result =
      _platform.homeScreen.createTerminationAssertion(identifier, 0);
  const InstallPlan plan = installPlanFor(result.outcome, identifier);
  _log.write(plan.level, plan.line);
  _platform.transactionLog.logScenario(InstallScenario, 0, plan.recordSuccess, identifier,
                                       plan.recordDescription);
  switch (plan.next) {
    case InstallPlan::Next::Retry:
      result.assertion.reset();
      _retryAssetInstall(asset);
      return;
    case InstallPlan::Next::Fail:
      assetInstallFailed(asset, Error{std::string(POSIXErrorDomain), EINVAL, {}, nullptr});
      break;
    case InstallPlan::Next::Install:
      _installPackage(asset);
      ++_numAppInstallsAttempted;
      break;
  }
  result.assertion.reset();
  if (asset->path) removePackage(_platform.files, *asset->path);
}

void AppsClient::_installPackage(const SyncAssetPtr& asset) {
  std::optional<Error> error;
  const bool installed = _platform.appRegistry.installApplication(
      FileLocation::file(asset->path.value_or(std::string())),
      {{std::string(SWPackageTypeKey), SWPackageTypeCustomer},
       {std::string(KBBundleIdentifier), asset->identifier}},
      &error);
  if (installed) {
    assetInstallSucceeded(asset);
  } else {
    _installFailed(asset, error);
  }
}

/// There is no last try: while the home screen keeps refusing, the install group stays busy.
void AppsClient::_retryAssetInstall(const SyncAssetPtr& asset) {
  _log.error("Will retry installation of %{public}@ in %d seconds", asset->identifier,
             static_cast<std::int32_t>(RetryDelay.count()));
  _platform.transactionLog.logScenario(InstallScenario, 0, true, asset->identifier,
                                       "retrying asset install");
  // Entered before the delay and left after the next enqueue, so that nobody who waits for the
  // group sees it empty in between.
  _installGroup.enter();
  const bool scheduled = _retries.after(RetryDelay, [this, asset] {
    _log.error("Re-enqueue installation request for %{public}@", asset->identifier);
    _enqueueAssetInstall(asset);
    _installGroup.leave();
  });
  if (!scheduled) _installGroup.leave();
}

void AppsClient::assetInstallSucceeded(const SyncAssetPtr& asset) noexcept {
  _log.normal("%{public}@ install succeeded", asset->identifier);
  changeAssetID(asset->identifier, exchange::TodoInstalled);
  cleanRestoreStateForIdentifier(asset->identifier);
}

void AppsClient::assetInstallFailed(const SyncAssetPtr& asset, const Error& error) noexcept {
  _installFailed(asset, error);
}

void AppsClient::_installFailed(const SyncAssetPtr& asset, const std::optional<Error>& error) {
  const std::string& identifier = asset->identifier;
  if (_isRecoverableError(error) || asset->isRestore) {
    _log.normal("%{public}@ install failed but was recoverable: %{public}@", identifier, error);
    _platform.transactionLog.logScenario(FailureScenario, 0, false, identifier,
                                         "install failed recoverably");
  } else {
    _log.normal("%{public}@ install failed unrecoverably: %{public}@", identifier, error);
    changeAssetID(identifier, exchange::TodoFailed);
    _cancelApplicationRestore(*asset,
                              logMessage("not asking backup manager to cancel app restore for "
                                         "%{public}@ as install coordination is enabled",
                                         identifier));
    _removeFailedPlaceholder(*asset);
  }
  cleanRestoreStateForIdentifier(identifier);
}

void AppsClient::_removeFailedPlaceholder(const SyncAsset& asset) {
  const std::string& identifier = asset.identifier;
  if (_useInstallCoordinator) {
    if (asset.isRestore) {
      _log.normal("not uninstalling restore asset %{public}@ as install coordination is enabled",
                  identifier);
    } else {
      uninstallAppUsingCoordination(identifier);
    }
    return;
  }
  const bool removed = !wouldTakeTheApplication(_platform.appRegistry, identifier) &&
                       _platform.appRegistry.uninstallApplication(identifier, {});
  if (!removed) _log.error("Uninstall of %{public}@ failed.", identifier);
  _platform.transactionLog.logScenario(
      FailureScenario, 0, removed, identifier,
      removed ? "placeholder removed" : "failed to remove placeholder");
}

bool AppsClient::_isRecoverableError(const std::optional<Error>& error) {
  if (_useInstallCoordinator) {
    _log.normal("Treating error %{public}@ as non recoverable as install coordination is enabled",
                error);
    return false;
  }
  if (!error || !_platform.syncHost.TWIsRecoverableError(*error)) return false;
  return error->domain != InstallerServiceErrorDomain && error->domain != StartwellErrorDomain;
}

}  // namespace appsync
