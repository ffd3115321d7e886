#pragma once

#include <filesystem>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "device/device_opening.h"
#include "device/journal/records.h"
#include "phone/phone.h"
#include "platform/platform.h"

namespace appsync::device {

/// A phone in a folder: "device.db" (SQLite, WAL), "root/" (what the phone sees as "/") and "log/".
/// It implements every service of Platform but SyncHost, for real and persistently. All members may
/// be called from any thread unless said otherwise; nothing throws.
class EmbeddedDevice : public IncomingFiles, public ApplicationData, public PhoneActivity {
 public:
  /// Makes a new device in a folder that is missing or empty.
  [[nodiscard]] static bool initialize(const std::filesystem::path& folder,
                                       const DeviceOptions& options, DeviceError& error) noexcept;

  /// Opens a device. With Access::Write it first finishes what a killed process left behind: sweeps
  /// left-over containers and ends the progress of installs that nobody carries on.
  [[nodiscard]] static std::unique_ptr<EmbeddedDevice> open(const std::filesystem::path& folder,
                                                            Access access,
                                                            DeviceError& error) noexcept;

  /// The device's services together with the host's own.
  virtual Platform platform(SyncHost& host) noexcept = 0;

  virtual Phone phone() noexcept = 0;

  // Single services, for those who need no more.
  virtual FileManager& files() noexcept = 0;
  virtual AppRegistry& appRegistry() noexcept = 0;
  virtual SystemNotifier& systemNotifier() noexcept = 0;
  virtual HomeScreenService& homeScreen() noexcept = 0;
  virtual InstallCoordination& installCoordination() noexcept = 0;
  virtual Log& log() noexcept = 0;

  // What a person does on the phone.

  // Neither is done, with a reason, while the policy forbids to remove applications.

  /// Removes an application with its placeholder and data. False (with a reason) when there is
  /// none.
  [[nodiscard]] virtual bool uninstall(std::string_view bundleId,
                                       std::optional<Error>* error) noexcept = 0;
  /// Takes an application's package away; its data and a placeholder of
  /// InstallType::IntentionalDowngrade stay. False (with a reason) when it is not installed, is
  /// open, is being updated or belongs to the system.
  [[nodiscard]] virtual bool demote(std::string_view bundleId,
                                    std::optional<Error>* error) noexcept = 0;
  [[nodiscard]] virtual bool setPolicy(PolicySetting setting, PolicyValue value,
                                       std::optional<Error>* error) noexcept = 0;

  /// Puts an application on the device that comes with the system: kind BundleKind::System, not to
  /// be uninstalled.
  [[nodiscard]] virtual bool addSystemApplication(std::string_view bundleId,
                                                  std::string_view displayName,
                                                  std::string_view version,
                                                  std::optional<Error>* error) noexcept = 0;

  // Bringing an application to the foreground and ending it need no device lock, so that a person
  // can do both while a sync runs in another process.

  /// False (with a reason) when the application is not installed, is a placeholder, may not be
  /// launched or is kept from running by an install.
  [[nodiscard]] static bool launch(const std::filesystem::path& folder, std::string_view bundleId,
                                   DeviceError& deviceError, std::optional<Error>* error) noexcept;
  /// Ending an application that does not run is no failure.
  [[nodiscard]] static bool quit(const std::filesystem::path& folder, std::string_view bundleId,
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
  [[nodiscard]] static bool tap(const std::filesystem::path& folder, std::string_view bundleId,
                                DeviceError& deviceError, std::optional<Error>* error) noexcept;
  [[nodiscard]] static bool cancel(const std::filesystem::path& folder, std::string_view bundleId,
                                   DeviceError& deviceError, std::optional<Error>* error) noexcept;

  // What people look at.

  virtual DeviceOptions options() noexcept = 0;
  virtual PolicyValue policy(PolicySetting setting) noexcept = 0;
  virtual std::vector<std::string> foregroundApplications() noexcept = 0;
  virtual std::vector<std::string> uninstalledApplications() noexcept = 0;
  virtual std::vector<std::string> homeScreenOrder() noexcept = 0;
  /// What happened to the applications, oldest first; the device keeps the newest 10,000 entries.
  /// None, with an error, when it cannot be read.
  [[nodiscard]] virtual std::vector<HistoryEntry> history(
      std::optional<Error>* error = nullptr) noexcept = 0;
  /// The transaction records after `afterNumber`, oldest first; the device keeps the newest 20,000.
  /// None, with an error, when they cannot be read.
  [[nodiscard]] virtual std::vector<TransactionRecord> transactions(
      std::int64_t afterNumber = 0, std::optional<Error>* error = nullptr) noexcept = 0;
  /// The log lines kept, oldest first.
  virtual void readLog(const std::function<void(const LogLine&)>& visitor) noexcept = 0;
};

}  // namespace appsync::device
