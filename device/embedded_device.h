#pragma once

#include <filesystem>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "base/data_stream.h"
#include "device/device_opening.h"
#include "device/files/file_receiver.h"
#include "device/journal/records.h"
#include "device/state/device_watcher.h"
#include "platform/platform.h"

namespace appsync::device {

/// A phone in a folder: "device.db" (SQLite, WAL), "root/" (what the phone sees as "/") and "log/".
/// It implements every service of Platform but SyncHost, for real and persistently. All members may
/// be called from any thread unless said otherwise; nothing throws.
class EmbeddedDevice {
 public:
  /// Makes a new device in a folder that is missing or empty.
  static bool initialize(const std::filesystem::path& folder, const DeviceOptions& options,
                         DeviceError& error) noexcept;

  /// Opens a device. With Access::Write it first finishes what a killed process left behind: sweeps
  /// left-over containers and ends the progress of installs that nobody carries on.
  static std::unique_ptr<EmbeddedDevice> open(const std::filesystem::path& folder, Access access,
                                              DeviceError& error) noexcept;

  virtual ~EmbeddedDevice() = default;

  /// The device's services together with the host's own.
  virtual Platform platform(SyncHost& host) noexcept = 0;

  // Single services, for those who need no more.
  virtual FileManager& files() noexcept = 0;
  virtual AppRegistry& appRegistry() noexcept = 0;
  virtual SystemNotifier& systemNotifier() noexcept = 0;
  virtual HomeScreenService& homeScreen() noexcept = 0;
  virtual InstallCoordination& installCoordination() noexcept = 0;
  virtual Log& log() noexcept = 0;

  /// Begins to receive a file at a path of the phone; parents are made, an existing file is
  /// replaced when it is finished. nullptr (with an error) when that cannot be.
  virtual std::unique_ptr<FileReceiver> receiveFile(std::string_view path,
                                                    std::optional<Error>* error) noexcept = 0;

  /// The names in a directory of the phone, sorted; none of one that is not there. nullopt (with an
  /// error) when they could not be read.
  virtual std::optional<std::vector<std::string>> namesIn(std::string_view directory,
                                                          std::optional<Error>* error) noexcept = 0;

  /// At most one watcher; nullptr for none. No call to the old one runs after this has returned.
  virtual void setWatcher(DeviceWatcher* watcher) noexcept = 0;

  /// The host wants to end: termination assertions are refused from now on with an unknown error
  /// (3) and pending delays of the background queue run at once, so that waiting installs come to
  /// an end.
  virtual void hurry() noexcept = 0;

  /// Whether the device has something left to do for the application by itself: an install or a
  /// removal through coordination, or telling a client that is there. False for an install that
  /// waits for its client; always false without coordination, where calls return when all is done.
  virtual bool isBusyWith(std::string_view bundleId) noexcept = 0;
  /// The applications whose coordinators named this client to bring the package, and still wait for
  /// it; sorted.
  virtual std::vector<std::string> packagesOwedBy(CoordinationClientId client) noexcept = 0;

  // What a person does on the phone.

  // Neither is done, with a reason, while the policy forbids to remove applications.

  /// Removes an application with its placeholder and data. False (with a reason) when there is
  /// none.
  virtual bool uninstall(std::string_view bundleId, std::optional<Error>* error) noexcept = 0;
  /// Takes an application's package away; its data and a placeholder of
  /// InstallType::IntentionalDowngrade stay. False (with a reason) when it is not installed, is
  /// open, is being updated or belongs to the system.
  virtual bool demote(std::string_view bundleId, std::optional<Error>* error) noexcept = 0;
  virtual bool setPolicy(PolicySetting setting, PolicyValue value,
                         std::optional<Error>* error) noexcept = 0;

  /// Puts an application on the device that comes with the system: kind BundleKind::System, not to
  /// be uninstalled.
  virtual bool addSystemApplication(std::string_view bundleId, std::string_view displayName,
                                    std::string_view version,
                                    std::optional<Error>* error) noexcept = 0;

  // What a backup saves of an application beside its files, and a restore gives back.

  /// The opaque blob that came with the application or its placeholder; nullopt for none, and with
  /// an error when that cannot be read.
  virtual std::optional<Bytes> opaqueBlob(std::string_view bundleId,
                                          std::optional<Error>* error = nullptr) noexcept = 0;

  /// Gives an application's own data, or for a placeholder what a restore has still to give back to
  /// it, as a tar archive whose bytes depend only on the data. Empty data gives no bytes at all.
  /// False (with an error) when it could not be read or the sink ended it (POSIX 125).
  virtual bool saveData(std::string_view bundleId, const DataSink& sink,
                        std::optional<Error>* error) noexcept = 0;

  /// Takes such an archive and lays the data out where it waits for the application, in one step
  /// and on the disk; what waited there before is gone. False (with an error, POSIX 125 for the
  /// source's own failure) when it is no archive, holds what no data may hold, or cannot be stored;
  /// nothing has changed then.
  virtual bool restoreData(std::string_view bundleId, const DataSource& source,
                           std::optional<Error>* error) noexcept = 0;

  /// Takes such an archive and gives it to an installed application in the place of its data, in
  /// one step and on the disk; no bytes at all leave it without any. Until then the old data is
  /// whole. False (with an error, POSIX 2 when it is not installed, 16 when it is open or being
  /// updated) as above; nothing has changed then. It cannot be brought to the foreground meanwhile.
  virtual bool overwriteData(std::string_view bundleId, const DataSource& source,
                             std::optional<Error>* error) noexcept = 0;

  // Bringing an application to the foreground and ending it need no device lock, so that a person
  // can do both while a sync runs in another process.

  /// False (with a reason) when the application is not installed, is a placeholder, may not be
  /// launched or is kept from running by an install.
  static bool launch(const std::filesystem::path& folder, std::string_view bundleId,
                     DeviceError& deviceError, std::optional<Error>* error) noexcept;
  /// Ending an application that does not run is no failure.
  static bool quit(const std::filesystem::path& folder, std::string_view bundleId,
                   DeviceError& deviceError, std::optional<Error>* error) noexcept;

  // Tapping the placeholder of an application, and cancelling its install, reach the process that
  // writes the device; without one they are done here. False (with a reason) when no coordinated
  // install of the application is on its way, or it is past cancelling.
  // A restored application that waits is cancelled like one that is uninstalled, also without
  // coordination, and not while the policy forbids to remove applications. Cancelling what was
  // tapped leaves a demoted application as it was before.

  /// The install's client is asked to bring this application first. A demoted or restored
  /// application that waits is asked for: its placeholder's install type becomes
  /// InstallType::StoreDownload, also without coordination.
  static bool tap(const std::filesystem::path& folder, std::string_view bundleId,
                  DeviceError& deviceError, std::optional<Error>* error) noexcept;
  static bool cancel(const std::filesystem::path& folder, std::string_view bundleId,
                     DeviceError& deviceError, std::optional<Error>* error) noexcept;

  // What people look at.

  virtual DeviceOptions options() noexcept = 0;
  /// One record per registry entry (BundleKind::All), sorted by identifier, placeholders last.
  /// None, with an error, when the registry cannot be read.
  virtual std::vector<AppRecord> applications(std::optional<Error>* error = nullptr) noexcept = 0;
  virtual PolicyValue policy(PolicySetting setting) noexcept = 0;
  virtual std::vector<std::string> foregroundApplications() noexcept = 0;
  virtual std::vector<std::string> uninstalledApplications() noexcept = 0;
  virtual std::vector<std::string> homeScreenOrder() noexcept = 0;
  /// What happened to the applications, oldest first; the device keeps the newest 10,000 entries.
  /// None, with an error, when it cannot be read.
  virtual std::vector<HistoryEntry> history(std::optional<Error>* error = nullptr) noexcept = 0;
  /// The transaction records after `afterNumber`, oldest first; the device keeps the newest 20,000.
  /// None, with an error, when they cannot be read.
  virtual std::vector<TransactionRecord> transactions(
      std::int64_t afterNumber = 0, std::optional<Error>* error = nullptr) noexcept = 0;
  /// The log lines kept, oldest first.
  virtual void readLog(const std::function<void(const LogLine&)>& visitor) noexcept = 0;
};

}  // namespace appsync::device
