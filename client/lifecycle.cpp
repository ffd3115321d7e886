#include "client/apps_client.h"
#include "platform/sync_host.h"

namespace appsync {
namespace {

/// The client never syncs incrementally, so it keeps no anchor.
constexpr std::string_view SyncAnchor = "NO_APP_SYNC_ANCHOR";
constexpr std::string_view AccessQueueLabel = "com.corvane.qmx.Tarnway.AppSync";
constexpr std::size_t MaximumConcurrentInstalls = 10;
constexpr LogHandle TransactionLogHandle{"com.corvane.appinstallation", "twc.appsync"};

void startupComplete(void* observer) noexcept {
  if (observer) static_cast<AppsClient*>(observer)->setupInstallCoordinatorObserver();
}

}  // namespace

AppsClient::AppsClient(const Platform& platform)
    : _platform(platform),
      _log(platform.log, platform.syncHost.pluginBundleIdentifier()),
      _installOperationQueue(MaximumConcurrentInstalls),
      _backupManager(platform.backupManager),
      _accessQueue(AccessQueueLabel),
      _retries(platform.backgroundQueue) {
  _platform.appRegistry.addObserver(this);
  _platform.transactionLog.initializeWithLog(TransactionLogHandle);
  _useInstallCoordinator = _platform.installCoordination.coordinationIsEnabled();
  // A tool that loads the plug-in only to query it must not receive coordinator events.
  if (_runsInSyncHost()) {
    _platform.systemNotifier.addObserver(this, TWStartupCompleteNotification, &startupComplete);
  }
}

AppsClient::~AppsClient() {
  _retries.close([this] { _installGroup.leave(); });
  _installOperationQueue.waitUntilAllOperationsAreFinished();

  const std::size_t outstanding = _accessQueue.sync(
      [this]() APPSYNC_REQUIRES(_accessQueue) { return _outstandingXFTTransfers.size(); });
  if (outstanding > 0) {
    _log.error("%{public}@ getting dealloc'd with %lu outstanding XFT transfers!", "<AppsClient>",
               outstanding);
  }
  _platform.appRegistry.removeObserver(this);
  if (_runsInSyncHost()) {
    _platform.systemNotifier.removeObserver(this, TWStartupCompleteNotification);
    _appInstallObserver = nullptr;
  }
  if (_useInstallCoordinator) _platform.installCoordination.removeObserver(this);
}

bool AppsClient::_runsInSyncHost() const {
  return _platform.syncHost.mainBundleIdentifier() == SyncHostBundleIdentifier;
}

std::vector<std::string> AppsClient::supportedDataclasses() noexcept {
  return {std::string(ApplicationDataclass)};
}

std::string AppsClient::currentSyncAnchor() noexcept { return std::string(SyncAnchor); }

bool AppsClient::prepareForSyncWithHostAnchor(std::string_view, const ProgressCallback&,
                                              std::optional<Error>*) noexcept {
  _qlpAppsToIgnore.clear();
  return true;
}

std::optional<std::set<std::string>> AppsClient::disabledAssetTypes() noexcept {
  if (_appInstallationAllowed() || _appRemovalAllowed()) return std::nullopt;
  return std::set{std::string(ApplicationDataclass)};
}

std::uint32_t AppsClient::_getAndResetNumAppInstallsAttempted() {
  return _numAppInstallsAttempted.exchange(0);
}

bool AppsClient::_appInstallationAllowed() {
  return _platform.devicePolicy.effectiveBoolValue(PolicySetting::AppInstallationAllowed) !=
         PolicyValue::ExplicitlyNo;
}

bool AppsClient::_appRemovalAllowed() {
  return _platform.devicePolicy.effectiveBoolValue(PolicySetting::AppRemovalAllowed) !=
         PolicyValue::ExplicitlyNo;
}

}  // namespace appsync
