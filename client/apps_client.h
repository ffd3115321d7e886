#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <optional>
#include <set>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "client/log_message.h"
#include "client/queues.h"
#include "client/todo_file.h"
#include "platform/mutex.h"
#include "platform/platform.h"
#include "platform/shared_work.h"
#include "platform/sync_client.h"

namespace appsync {

struct TransferCandidate;

/// Whether an application had been taken off the device, leaving a placeholder.
enum class DemotionStatus : std::uint64_t { NotDemoted = 0, Intentional = 1, Automatic = 2 };

/// The application client: keeps the phone's applications in step with what a desktop, a device
/// restore or a backup asks for. The host knows it as a SyncClient; everything else here is for the
/// plug-in's own files. Operations with a leading underscore serve the operations of this object.
///
/// Threads: the host's calls come one after another; coordinator and registry events arrive on
/// service threads at any time; installs run on the install operation queue. The sets of
/// applications in flight are touched only inside tasks on the access queue.
class AppsClient final : public SyncClient, public AppRegistryObserver, public CoordinatorObserver {
 public:
  /// Borrows the platform's services for its own life.
  explicit AppsClient(const Platform& platform);
  /// Lets running installs finish, drops retries that wait, and ends every registration.
  ~AppsClient() override;
  AppsClient(const AppsClient&) = delete;
  AppsClient& operator=(const AppsClient&) = delete;

  // --- The host's questions and the policies (client/lifecycle.cpp) ---
  std::vector<std::string> supportedDataclasses() noexcept override;
  std::string currentSyncAnchor() noexcept override;
  bool prepareForSyncWithHostAnchor(std::string_view hostAnchor,
                                    const ProgressCallback& progressCallback,
                                    std::optional<Error>* error) noexcept override;
  std::optional<std::set<std::string>> disabledAssetTypes() noexcept override;
  /// The number of install attempts since the last call.
  std::uint32_t _getAndResetNumAppInstallsAttempted();
  bool _appInstallationAllowed();
  bool _appRemovalAllowed();

  // --- State files (client/todo_list.cpp, client/restore_state.cpp) ---
  /// The array in the property list at `path`; none when the file is missing, empty or damaged.
  [[nodiscard]] std::optional<PropertyList::Array> _loadPlist(
      std::string_view path, std::optional<Error>* error = nullptr) const;
  [[nodiscard]] std::optional<PropertyList::Dictionary> _loadDemotedAppsPlist(
      std::string_view path, std::optional<Error>* error = nullptr) const;
  /// Sets the operation of the identifier's first entry in the todo list.
  void changeAssetID(std::string_view identifier, std::string_view toDo);
  std::optional<std::string> _operationStateForIdentifier(std::string_view identifier) const;
  /// A value that outlives the sync, kept for one version of one application; no version is one
  /// too.
  std::optional<PropertyList> _restoreStatePropertyForKey(
      std::string_view key, std::string_view identifier,
      const std::optional<std::string>& version) const;
  void _setRestoreStatePropertyValue(const PropertyList& value, std::string_view key,
                                     std::string_view identifier,
                                     const std::optional<std::string>& version);
  void cleanRestoreStateForIdentifier(std::string_view identifier);

  // --- Inventory (sync/inventory.cpp) ---
  PropertyList::Dictionary installedAssets() noexcept override;
  PropertyList::Dictionary installedAssetMetrics() noexcept override;
  std::set<std::string> corvaneIDsForAssets() noexcept override;

  // --- Reconciliation and the home screen (sync/reconcile.cpp, sync/home_screen.cpp) ---
  bool reconcileSync(const PropertyList& syncDescription, std::string_view newAnchor,
                     const ProgressCallback& progressCallback,
                     std::optional<Error>* error) noexcept override;
  bool reconcileRestoreOfType(std::int32_t type, std::optional<Error>* error) noexcept override;
  /// The items in home-screen order, then the rest; takes those that the home screen named out of
  /// `items`.
  std::vector<PropertyList> _orderTheItems(PropertyList::Dictionary& items) const;
  void _notifyDashel(bool starting) const;

  // --- End of a sync, clearing, backup (sync/sync_end.cpp) ---
  void syncEndedWithSuccess(bool success) noexcept override;
  void clearSyncData() noexcept override;
  void prepareForBackup() noexcept override;

  // --- Transfers (transfer/outstanding_transfers.cpp, transfer/transfer_results.cpp) ---
  std::vector<SyncAssetPtr> outstandingAssetTransfers() noexcept override;
  void assetTransferUpdatedProgress(const SyncAssetPtr& asset, double fraction) noexcept override;
  void assetTransferSucceeded(const SyncAssetPtr& asset, bool succeeded,
                              const std::optional<Error>& error) noexcept override;
  void assetTransferEndedWithSuccess(bool success) noexcept override;
  /// nullptr when there is none or installs are coordinated.
  std::shared_ptr<InstallProgress> _progressForAssetIdentifier(std::string_view identifier);

  // --- Install queue (transfer/install_queue.cpp) ---
  void assetInstallSucceeded(const SyncAssetPtr& asset) noexcept override;
  void assetInstallFailed(const SyncAssetPtr& asset, const Error& error) noexcept override;
  void _enqueueAssetInstall(const SyncAssetPtr& asset);
  void _performAssetInstall(const SyncAssetPtr& asset);
  /// No error at all is not recoverable.
  bool _isRecoverableError(const std::optional<Error>& error);

  // --- Installs through coordinators (coordination/install.cpp) ---
  [[nodiscard]] bool prepareAppForInstallUsingCoordination(const SyncAssetPtr& asset,
                                                           bool existingApp);
  /// True when the progress was passed on.
  [[nodiscard]] bool updateTransferProgressForApp(const SyncAssetPtr& asset, bool existingApp);
  void transferCompleteForApp(const SyncAssetPtr& asset, const std::optional<Error>& error,
                              bool isExistingApp);
  void assetSyncFinishedWithStatus(bool status, const std::set<std::string>& outstandingItems);
  void uninstallAppUsingCoordination(std::string_view bundleId);

  // --- Coordinators and promises (coordination/promises.cpp) ---
  [[nodiscard]] std::shared_ptr<InstallCoordinator>
  _initiatingOrUpdatingAppInstallCoordinatorForBundleIdentifier(std::string_view bundleId,
                                                                bool existingApp,
                                                                bool createIfNotExisting,
                                                                std::optional<Error>* error);
  [[nodiscard]] std::shared_ptr<InstallCoordinator>
  _restoringAppInstallCoordinatorForBundleIdentifier(std::string_view bundleId,
                                                     bool createIfNotExisting,
                                                     std::optional<Error>* error);
  std::shared_ptr<PathTransferPromise> _createAppAssetPromiseForBundleIdentifier(
      std::string_view bundleId, const std::optional<std::string>& path,
      InstallCoordinator* coordinator);
  std::shared_ptr<OutOfBandTransferPromise> _userDataPromiseForBundleIdentifier(
      std::string_view bundleId);
  std::shared_ptr<PathTransferPromise> _createIconPromiseForBundleIdentifier(
      std::string_view bundleId, std::string_view transferPath, std::uint64_t diskSpaceNeeded,
      InstallPlaceholder* placeholder, bool forAppInstall);
  std::shared_ptr<InstallPlaceholder> _placeHolderForBundleIdentifier(std::string_view bundleId,
                                                                      std::string_view name,
                                                                      InstallType installType);

  // --- Coordinator and registry events (coordination/events.cpp) ---
  void setupInstallCoordinatorObserver();
  void promiseDidBeginFulfillmentWithIdentifier(std::uint64_t identifier) noexcept override;
  void coordinatorDidInstallPlaceholder(InstallCoordinator& coordinator) noexcept override;
  void coordinatorDidCompleteSuccessfully(InstallCoordinator& coordinator) noexcept override;
  void coordinatorShouldPrioritize(InstallCoordinator& coordinator) noexcept override;
  void coordinatorCanceledWithReason(InstallCoordinator& coordinator, const Error& reason,
                                     CoordinationClientId client) noexcept override;
  void applicationInstallsDidCancel(const std::vector<AppRecord>& records) noexcept override;

  // --- Restores through coordinators (coordination/restore.cpp) ---
  [[nodiscard]] bool prepareAppForRestoreUsingCoordination(std::string_view bundleId,
                                                           ByteView halvoMetadata,
                                                           const std::optional<Bytes>& sinfData,
                                                           const std::optional<Bytes>& iconData,
                                                           DemotionStatus demotionStatus);
  [[nodiscard]] bool _prepareNonDemotedAppForRestoreWithBundleId(
      std::string_view bundleId, ByteView halvoMetadata, const std::optional<Bytes>& sinfData,
      const std::optional<Bytes>& iconData);
  [[nodiscard]] bool _prepareDemotedAppForRestoreWithBundleId(std::string_view bundleId,
                                                              ByteView halvoMetadata,
                                                              const std::optional<Bytes>& sinfData,
                                                              const std::optional<Bytes>& iconData,
                                                              DemotionStatus demotionStatus);
  std::shared_ptr<InstallPlaceholder> _placeHolderForBundleIdentifier(
      std::string_view bundleId, const PropertyList::Dictionary& halvoMetadata,
      const std::optional<Bytes>& sinfData, const std::optional<Bytes>& iconData,
      DemotionStatus demotionStatus);

  // --- Restored backups (restore/restore_info.cpp) ---
  [[nodiscard]] bool _processHalvoRestoreInfo();
  [[nodiscard]] bool _processHalvoRestoreInfoForApp(std::string_view bundleId,
                                                    ByteView halvoMetaData,
                                                    const std::optional<Bytes>& sinfData,
                                                    const std::optional<Bytes>& iconData);

  // --- Placeholder bundles (restore/placeholder_bundles.cpp) ---
  std::string placeholderAppPathForBundleIdentifier(std::string_view bundleId) const;
  [[nodiscard]] bool createPlaceHolderPath(std::string_view path, std::string_view bundleId,
                                           const FileAttributes& attributes);
  /// `fileSize` (bytes) may be null; it is written only when the size could be read.
  [[nodiscard]] bool writeIconData(const std::optional<Bytes>& iconData, std::string_view path,
                                   std::uint64_t* fileSize, std::string_view bundleId,
                                   const FileAttributes& attributes);
  void _createPlaceHolderApplication(const SyncAssetPtr& asset);
  bool _placeholderExistsForApplication(std::string_view bundleId);
  void _enumeratePlaceholdersWithBlock(const AppRegistry::Visitor& visitor);
  std::set<std::string> _getSystemAppPlaceholders();

  // --- Icons (restore/icon_rendering.cpp) ---
  [[nodiscard]] bool _makeIconFromBundlePath(const std::optional<std::string>& bundlePath,
                                             std::string_view saveTo) const;

 private:
  bool _runsInSyncHost() const;
  /// The file of a list; one that is there but cannot be read is said in the log.
  std::optional<Bytes> _bytesOrSay(std::string_view path) const;
  /// The list in a file's bytes; none for an empty or damaged one.
  std::optional<PropertyList::Array> _listIn(const Bytes& bytes) const;
  /// The list, as _loadPlist gives it; a file that is there but cannot be read is said in the log.
  std::optional<PropertyList::Array> _loadListOrSay(std::string_view path) const;
  struct TodoChange {
    std::string_view identifier;
    std::string_view toDo;
  };
  /// Makes changes that came together, each as if it were alone, with as few writes as can be.
  void _changeTodoList(std::span<TodoChange* const> changes) APPSYNC_EXCLUDES(_stateFileMutex);
  /// Makes a change in `_todoFile`, which is read first unless it is `unsaved`. True when it holds
  /// something unsaved then.
  [[nodiscard]] bool _changeTodoFile(const TodoChange& change, bool unsaved)
      APPSYNC_REQUIRES(_stateFileMutex);
  /// Makes and writes a change of a list of any form.
  void _changeParsed(const Bytes& list, const TodoChange& change) APPSYNC_REQUIRES(_stateFileMutex);
  void _performDeletions(const PropertyList::Array& todoList);
  void _sendIconLayout();
  SyncAssetPtr _prepareAsset(const TransferCandidate& candidate);
  [[nodiscard]] bool _handOffUncoordinated(const SyncAssetPtr& asset, bool hadPlaceholder);
  [[nodiscard]] bool _handOffCoordinated(const SyncAssetPtr& asset);
  void _assetReceived(const SyncAssetPtr& asset, const std::shared_ptr<InstallProgress>& progress,
                      bool existingApp);
  void _restoreAssetReceived(const SyncAssetPtr& asset,
                             const std::shared_ptr<InstallProgress>& progress);
  void _assetTransferFailed(const SyncAssetPtr& asset,
                            const std::shared_ptr<InstallProgress>& progress,
                            const std::optional<Error>& error, bool existingApp,
                            bool userCancelled);
  void _cancelApplicationRestore(const SyncAsset& asset, std::string_view lineIfCoordinated);
  void _settleOutstandingTransfers(bool success, const std::set<std::string>& outstanding);
  void _retryAssetInstall(const SyncAssetPtr& asset);
  void _removeFailedPlaceholder(const SyncAsset& asset);
  void _copyIcon(const std::optional<FileLocation>& icon, const std::string& target);
  void _installPackage(const SyncAssetPtr& asset);
  void _installFailed(const SyncAssetPtr& asset, const std::optional<Error>& error);
  /// The result of the last application that was processed; false when none was.
  [[nodiscard]] bool _restoreApplications(const PropertyList::Dictionary& restoreList);
  [[nodiscard]] bool _installRestorePlaceholder(std::string_view bundleId,
                                                const PropertyList::Dictionary& metadata,
                                                const std::optional<Bytes>& iconData,
                                                const PropertyList::Dictionary& options);

  const Platform _platform;
  const ClientLog _log;

  /// What the installer listed as uninstalled during the last inventory; none before one.
  std::optional<std::vector<std::string>> _uninstalledApps;
  /// One entry per enqueued install and per retry that waits.
  TaskGroup _installGroup;
  std::atomic<std::uint32_t> _numAppInstallsAttempted{0};
  /// Assets whose transfer has reported progress and has not ended.
  std::set<std::string> _outstandingXFTTransfers APPSYNC_GUARDED_BY(_accessQueue);
  OperationQueue _installOperationQueue;
  BackupManager& _backupManager;
  /// Applications not to be requested in this sync. Emptied and asked by this client; nothing on
  /// this platform fills it.
  std::set<std::string> _qlpAppsToIgnore;
  AccessQueue _accessQueue;
  /// Whether installs go through coordinators; asked once.
  /// The first cancellations may come before it is known.
  std::atomic<bool> _useInstallCoordinator = false;
  /// Applications whose transfer replaces an installed version.
  std::set<std::string> _updatingApps APPSYNC_GUARDED_BY(_accessQueue);
  std::set<std::string> _userCancelledApps APPSYNC_GUARDED_BY(_accessQueue);
  std::unique_ptr<CoordinatorEventListener> _appInstallObserver APPSYNC_GUARDED_BY(_startUpMutex);
  /// Start-up may be announced on several threads at once.
  Mutex _startUpMutex;

  /// Retries that wait for their delay.
  DelayedTasks _retries;
  /// Held while a state file is read, changed and written back: ten installs may end at once.
  mutable Mutex _stateFileMutex;
  /// The todo list as last read or changed here.
  mutable TodoFile _todoFile APPSYNC_GUARDED_BY(_stateFileMutex);
  SharedWork<TodoChange> _todoChanges{
      [this](std::span<TodoChange* const> changes) { _changeTodoList(changes); }};
};

}  // namespace appsync
