#include "device/embedded_device.h"

#include <fmt/format.h>

#include <algorithm>
#include <cerrno>
#include <tuple>

#include "base/identifiers.h"
#include "device/apps/app_registry.h"
#include "device/apps/application_data.h"
#include "device/apps/demotion.h"
#include "device/apps/idle_application.h"
#include "device/apps/installer_service.h"
#include "device/apps/installs.h"
#include "device/apps/launching.h"
#include "device/apps/person_wishes.h"
#include "device/apps/removal.h"
#include "device/coordination/install_coordination_service.h"
#include "device/coordination/no_coordination.h"
#include "device/files/file_receiver.h"
#include "device/home/home_screen.h"
#include "device/journal/history.h"
#include "device/journal/transaction_log.h"
#include "device/open_folder.h"
#include "device/person_socket.h"
#include "device/recovery.h"
#include "device/services/backup_manager.h"
#include "device/services/system_notifier.h"
#include "device/state/background_queue.h"
#include "device/state/device_policy.h"
#include "icons/icon_renderer.h"
#include "icons/image_encoder.h"

namespace appsync::device {
namespace {

Error notInstalling(std::string_view bundleId) {
  return objection(ENOENT, bundleId, "is not being installed");
}

class FolderDevice final : public EmbeddedDevice {
 public:
  explicit FolderDevice(OpenFolder opened)
      : paths_(std::move(opened.paths)),
        lock_(std::move(opened.lock)),
        log_(std::move(opened.log)),
        database_(std::move(opened.database)),
        options_(opened.options),
        files_(paths_.root),
        foreground_(paths_.foreground) {
    if (!database_->writable() || !files_.isOpen()) return;
    finishInterruptedWork(core_);
    if (options_.coordination) coordination_.emplace(core_, registry_);
    personSocket_ = PersonSocket::open(paths_, [this](PersonWish wish, std::string_view bundleId) {
      return carryOut(wish, bundleId);
    });
    if (personSocket_) return;
    log_->write(LogChannel::TWLogCategoryFramework, LogLevel::Error,
                fmt::format("nobody can tap or cancel an install meanwhile: {}",
                            Error::posix(errno).localizedDescription()));
  }

  bool isUsable() const { return files_.isOpen(); }

  Platform platform(SyncHost& host) noexcept override {
    return {.log = *log_,
            .files = files_,
            .appRegistry = registry_,
            .installCoordination = installCoordination(),
            .installerService = installerService_,
            .backupManager = backupManager_,
            .devicePolicy = policy_,
            .homeScreen = homeScreen_,
            .iconRenderer = iconRenderer_,
            .imageEncoders = imageEncoders_,
            .transactionLog = transactions_,
            .systemNotifier = notifier_,
            .syncHost = host,
            .backgroundQueue = queue_};
  }

  Phone phone() noexcept override {
    return {.files = files_,
            .apps = registry_,
            .homeScreen = homeScreen_,
            .iconRenderer = iconRenderer_,
            .imageEncoders = imageEncoders_,
            .incoming = *this,
            .data = *this,
            .activity = *this,
            .coordination = coordination_ ? &*coordination_ : nullptr};
  }

  /// Why a wish cannot be carried out.
  std::optional<Error> carryOut(PersonWish wish, std::string_view bundleId) {
    return wish == PersonWish::Tap ? tap(bundleId) : cancel(bundleId);
  }

  FileManager& files() noexcept override { return files_; }
  AppRegistry& appRegistry() noexcept override { return registry_; }
  SystemNotifier& systemNotifier() noexcept override { return notifier_; }
  HomeScreenService& homeScreen() noexcept override { return homeScreen_; }
  InstallCoordination& installCoordination() noexcept override {
    return coordination_ ? static_cast<InstallCoordination&>(*coordination_) : noCoordination_;
  }
  Log& log() noexcept override { return *log_; }

  std::unique_ptr<FileReceiver> receiveFile(std::string_view path,
                                            std::optional<Error>* error) noexcept override {
    if (database_->writable()) return receiveInto(files_, path, error);
    setError(error, Error::posix(EROFS, path));
    return nullptr;
  }

  std::optional<std::vector<std::string>> namesIn(std::string_view directory,
                                                  std::optional<Error>* error) noexcept override {
    auto names = containers_.namesIn(directory, error);
    if (names) std::ranges::sort(*names);
    return names;
  }

  void setWatcher(PhoneWatcher* watcher) noexcept override { watcher_.set(watcher); }

  void expedite() noexcept override {
    homeScreen_.refuseAssertions();
    queue_.expedite();
    if (coordination_) coordination_->expedite();
  }

  std::set<std::string> busyAmong(const std::set<std::string>& bundleIds) noexcept override {
    std::set<std::string> busy;
    if (!coordination_) return busy;
    std::ranges::copy_if(
        bundleIds, std::inserter(busy, busy.end()),
        [this](const std::string& bundleId) { return coordination_->isBusy(bundleId); });
    return busy;
  }

  std::set<std::string> packagesOwedBy(CoordinationClientId client) noexcept override {
    return coordination_ ? coordination_->packagesOwedBy(client) : std::set<std::string>{};
  }

  bool uninstall(std::string_view bundleId, std::optional<Error>* error) noexcept override {
    const bool removed = registry_.change(bundleId, removeForPerson, error);
    if (removed && coordination_) coordination_->cancelInstall(bundleId);
    return removed;
  }

  bool demote(std::string_view bundleId, std::optional<Error>* error) noexcept override {
    return registry_.change(bundleId, demoteForPerson, error);
  }

  bool setPolicy(PolicySetting setting, PolicyValue value,
                 std::optional<Error>* error) noexcept override {
    return policy_.set(setting, value, error);
  }

  bool addSystemApplication(std::string_view bundleId, std::string_view displayName,
                            std::string_view version,
                            std::optional<Error>* error) noexcept override {
    const auto install = [&](DeviceCore& core, const std::string& id, std::optional<Error>* why) {
      return installSystemApplication(core, id, std::string(displayName), std::string(version),
                                      why);
    };
    return registry_.change(bundleId, install, error);
  }

  std::optional<Bytes> opaqueBlob(std::string_view bundleId,
                                  std::optional<Error>* error) noexcept override {
    return registry_.opaqueBlob(bundleId, error);
  }

  bool saveData(std::string_view bundleId, const DataSink& sink,
                std::optional<Error>* error) noexcept override {
    if (!isUsableIdentifier(bundleId)) return failWith(error, Error::posix(EINVAL, bundleId));
    return saveApplicationData(core_, bundleId, sink, error);
  }

  bool restoreData(std::string_view bundleId, const DataSource& source,
                   std::optional<Error>* error) noexcept override {
    return takesData(bundleId, error) && restoreApplicationData(core_, bundleId, source, error);
  }

  bool overwriteData(std::string_view bundleId, const DataSource& source,
                     std::optional<Error>* error) noexcept override {
    return takesData(bundleId, error) && overwriteApplicationData(core_, bundleId, source, error);
  }

  DeviceOptions options() noexcept override { return options_; }

  std::vector<AppRecord> applications(std::optional<Error>* error) noexcept override {
    return registry_.records(error);
  }

  PolicyValue policy(PolicySetting setting) noexcept override {
    return policy_.effectiveBoolValue(setting);
  }

  std::vector<std::string> foregroundApplications() noexcept override {
    return foreground_.running();
  }

  std::vector<std::string> uninstalledApplications() noexcept override {
    std::vector<std::string> identifiers;
    const auto uninstalled = installerService_.lookupUninstalled();
    if (!uninstalled) return identifiers;
    for (const auto& [identifier, details] : *uninstalled) identifiers.push_back(identifier);
    return identifiers;
  }

  std::vector<std::string> homeScreenOrder() noexcept override { return homeScreen_.order(); }

  std::vector<HistoryEntry> history(std::optional<Error>* error) noexcept override {
    return readHistory(*database_, error);
  }

  std::vector<TransactionRecord> transactions(std::int64_t afterNumber,
                                              std::optional<Error>* error) noexcept override {
    return transactions_.recordsAfter(afterNumber, error);
  }

  void readLog(const std::function<void(const LogLine&)>& visitor) noexcept override {
    log_->read(visitor);
  }

 private:
  bool takesData(std::string_view bundleId, std::optional<Error>* error) const {
    if (!database_->writable()) return failWith(error, Error::posix(EROFS, bundleId));
    return isUsableIdentifier(bundleId) || failWith(error, Error::posix(EINVAL, bundleId));
  }

  std::optional<Error> tap(std::string_view bundleId) {
    const bool isHeard = coordination_ && coordination_->tap(bundleId);
    std::optional<Error> error;
    const bool isAsked =
        (!isHeard || registry_.isDemoted(bundleId)) && registry_.change(bundleId, askFor, &error);
    if (error) return error;
    if (isHeard || isAsked) return std::nullopt;
    return registry_.isBeingInstalled(bundleId)
               ? objection(EBUSY, bundleId,
                           "is just being installed, and this phone brings packages in their order")
               : notInstalling(bundleId);
  }

  /// What only waits for its restore goes like an application that is uninstalled.
  std::optional<Error> cancel(std::string_view bundleId) {
    std::optional<Error> error;
    const auto effect = effectOfCancelling(core_, std::string(bundleId), &error);
    if (!effect || (effect == Cancelling::Forgetting && !mayRemove(core_, &error))) return error;
    if (coordination_ && coordination_->cancelInstall(bundleId)) {
      // What cannot be undone stays asked for, or waits; the log tells.
      std::ignore = registry_.change(bundleId, undoAsking, nullptr);
      std::ignore = registry_.change(bundleId, forgetWaitingData, nullptr);
      return std::nullopt;
    }
    if (registry_.change(bundleId, cancelWish, &error)) return std::nullopt;
    if (error) return error;
    const bool isLive =
        coordination_ && coordination_->coordinatorFor(CoordinatorKind::Any, bundleId,
                                                       PersonClientID, false, nullptr, nullptr);
    return isLive || registry_.isBeingInstalled(bundleId)
               ? objection(EBUSY, bundleId, "is just being installed, too late to cancel")
               : notInstalling(bundleId);
  }

  // In the order in which they need one another: what works on threads of its own goes first.
  const DevicePaths paths_;
  const std::unique_ptr<WriteLock> lock_;
  const std::unique_ptr<LogFiles> log_;
  const std::unique_ptr<Database> database_;
  const DeviceOptions options_;
  ConfinedFileManager files_;
  Foreground foreground_;
  Containers containers_{files_, files_, *log_};
  WatcherSlot watcher_;
  KeyedMutex applicationLocks_;
  RegistryObservers observers_{[this] { return reportInstalls(*database_); }};
  DeviceCore core_{*database_, files_,   files_,      containers_,      *log_,
                   observers_, watcher_, foreground_, applicationLocks_};
  DeviceAppRegistry registry_{core_};
  DeviceInstallerService installerService_{*database_};
  DeviceBackupManager backupManager_{core_};
  StoredDevicePolicy policy_{*database_};
  StoredTransactionLog transactions_{*database_};
  DeviceHomeScreen homeScreen_{core_};
  DeviceIconRenderer iconRenderer_{files_};
  PngEncoderService imageEncoders_{PngEncoderService::Compression::Quick};
  LocalNotifier notifier_;
  ThreadBackgroundQueue queue_;
  NoCoordination noCoordination_{queue_};
  std::optional<DeviceInstallCoordination> coordination_;
  std::unique_ptr<PersonSocket> personSocket_;
};

/// Does work that may throw. What it throws is a problem of the folder.
template <typename Work>
std::invoke_result_t<Work> guarded(const std::filesystem::path& folder, DeviceError& error,
                                   const Work& work) noexcept {
  try {
    return work();
  } catch (const std::exception& failure) {
    error = unusableFolder(folder, failure.what());
    return {};
  }
}

std::unique_ptr<FolderDevice> openDevice(const std::filesystem::path& folder, Access access,
                                         DeviceError& error) {
  std::optional<OpenFolder> opened = openFolder(folder, access, error);
  if (!opened) return nullptr;
  auto device = std::make_unique<FolderDevice>(std::move(*opened));
  if (device->isUsable()) return device;
  error = unusableFolder(folder, "its files cannot be opened");
  return nullptr;
}

/// By the process that writes the device, or here when there is none.
bool fulfil(PersonWish wish, const std::filesystem::path& folder, std::string_view bundleId,
            DeviceError& deviceError, std::optional<Error>* error) {
  {
    const std::optional<OpenFolder> opened = openFolder(folder, Access::ReadOnly, deviceError);
    if (!opened) return false;
    if (!isUsableIdentifier(bundleId)) return failWith(error, notInstalling(bundleId));
  }
  std::optional<Error> refusal;
  switch (askWriter(DevicePaths(folder), wish, bundleId, &refusal)) {
    case WishOutcome::Done:
      return true;
    case WishOutcome::Failed:
      deviceError = device::deviceError(
          DeviceProblem::Unusable, DevicePaths(folder).folder,
          refusal ? refusal->localizedDescription() : "its socket cannot be used", "try again");
      return false;
    case WishOutcome::Refused:
      break;
    case WishOutcome::NobodyThere:
      const auto device = openDevice(folder, Access::Write, deviceError);
      if (!device) return false;
      refusal = device->carryOut(wish, bundleId);
  }
  return !refusal || failWith(error, *refusal);
}

}  // namespace

bool EmbeddedDevice::initialize(const std::filesystem::path& folder, const DeviceOptions& options,
                                DeviceError& error) noexcept {
  return guarded(folder, error,
                 [&] { return makeDeviceFolder(DevicePaths(folder), options, error); });
}

std::unique_ptr<EmbeddedDevice> EmbeddedDevice::open(const std::filesystem::path& folder,
                                                     Access access, DeviceError& error) noexcept {
  return guarded(folder, error, [&] { return openDevice(folder, access, error); });
}

bool EmbeddedDevice::launch(const std::filesystem::path& folder, std::string_view bundleId,
                            DeviceError& deviceError, std::optional<Error>* error) noexcept {
  return guarded(folder, deviceError, [&] {
    const std::optional<OpenFolder> opened = openFolder(folder, Access::ReadOnly, deviceError);
    if (!opened) return false;
    ConfinedFileManager files(opened->paths.root);
    const auto refusal = [&] { return objectionToLaunch(*opened->database, files, bundleId); };
    if (isUsableIdentifier(bundleId)) {
      return Foreground(opened->paths.foreground).launch(std::string(bundleId), refusal, error);
    }
    if (error) *error = refusal();
    return false;
  });
}

bool EmbeddedDevice::quit(const std::filesystem::path& folder, std::string_view bundleId,
                          DeviceError& deviceError, std::optional<Error>* error) noexcept {
  return guarded(folder, deviceError, [&] {
    const std::optional<OpenFolder> opened = openFolder(folder, Access::ReadOnly, deviceError);
    // What no application can be called does not run.
    return opened && (!isUsableIdentifier(bundleId) ||
                      Foreground(opened->paths.foreground).quit(std::string(bundleId), error));
  });
}

bool EmbeddedDevice::tap(const std::filesystem::path& folder, std::string_view bundleId,
                         DeviceError& deviceError, std::optional<Error>* error) noexcept {
  return guarded(folder, deviceError,
                 [&] { return fulfil(PersonWish::Tap, folder, bundleId, deviceError, error); });
}

bool EmbeddedDevice::cancel(const std::filesystem::path& folder, std::string_view bundleId,
                            DeviceError& deviceError, std::optional<Error>* error) noexcept {
  return guarded(folder, deviceError,
                 [&] { return fulfil(PersonWish::Cancel, folder, bundleId, deviceError, error); });
}

}  // namespace appsync::device
