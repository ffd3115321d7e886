#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/error.h"
#include "platform/file_manager.h"
#include "platform/property_list.h"

namespace appsync {

/// Which bundles an enumeration visits.
enum class BundleKind : std::uint32_t {
  All = 0,     ///< every record: a placeholder laid over an installed application is one of its own
  User = 1,    ///< one record per application of the user (type "User"), placeholders included
  System = 7,  ///< one record per system application (type "System"), placeholders included
};

/// Why an application is being installed. Other values occur and are passed through.
enum class InstallType : std::uint64_t {
  None = 0,
  StoreDownload = 1,
  Restore = 2,
  AutomaticDownload = 3,
  Sync = 4,
  AutomaticUpdate = 5,
  Migration = 6,
  Downgrade = 7,             ///< demoted by the system
  IntentionalDowngrade = 8,  ///< demoted by the person
};

enum class InstallState : std::uint64_t {
  Waiting = 0,
  Active = 1,
  Paused = 2,
  Canceled = 3,
  Failed = 4,
  Finished = 5,
};

enum class InstallPhase : std::uint64_t {
  Loading = 0,
  Installing = 1,
  RestoringData = 2,
  InstallingPlaceholder = 3,
};

// Values of AppRecord::applicationType.
inline constexpr std::string_view ApplicationTypeUser = "User";
inline constexpr std::string_view ApplicationTypeSystem = "System";

// Options of installApplication.
inline constexpr std::string_view SWPackageTypeKey = "SWPackageTypeKey";
inline constexpr std::string_view SWPackageTypeCustomer = "SWPackageTypeCustomer";
inline constexpr std::string_view SWPackageTypePlaceholder = "SWPackageTypePlaceholder";
inline constexpr std::string_view SWInstallTypeKey = "SWInstallType";
inline constexpr std::string_view SWHalvoMetadataKey = "SWHalvoMetadataKey";
inline constexpr std::string_view SWApplicationSINFKey = "SWApplicationSINFKey";
// Option of uninstallApplication.
inline constexpr std::string_view UninstallPlaceholdersOnlyKey = "UninstallPlaceholdersOnly";

/// What the registry knew of one bundle when the record was made: a snapshot, safe to keep.
struct AppRecord {
  std::string applicationIdentifier;
  std::optional<std::string> bundleIdentifier;
  std::optional<std::string> bundleVersion;
  /// Directory of the bundle itself ("…/Name.app").
  std::optional<std::string> bundlePath;
  /// Directory that holds the bundle and its metadata files.
  std::optional<std::string> bundleContainerPath;
  std::string applicationType{ApplicationTypeUser};
  /// Name shown under the icon; empty when the bundle gives none.
  std::string displayName;
  std::uint64_t staticDiskUsage = 0;  ///< bytes
  InstallType installType = InstallType::None;
  /// False for a bundle of another sort (an extension), which the enumeration of all bundles
  /// visits.
  bool isApplication = true;
  /// True for placeholders too; isPlaceholder tells them apart.
  bool isInstalled = true;
  /// The application's package has not arrived yet.
  bool isPlaceholder = false;
  bool isDeviceBasedAssignment = false;
};

/// The identifier, with " (placeholder)" behind it for a placeholder.
std::string description(const AppRecord& record);

/// The registry's progress of one application being installed. Live: every call reads or changes
/// the registry's own values, from any thread. Holding it keeps no application alive; once the
/// install is over, changes have no effect and reads give the last values.
class InstallProgress {
 public:
  virtual ~InstallProgress() = default;

  virtual InstallState installState() const noexcept = 0;
  virtual void setInstallState(InstallState state) noexcept = 0;
  virtual InstallPhase installPhase() const noexcept = 0;
  virtual void setInstallPhase(InstallPhase phase) noexcept = 0;
  virtual std::int64_t totalUnitCount() const noexcept = 0;
  virtual void setTotalUnitCount(std::int64_t count) noexcept = 0;
  virtual std::int64_t completedUnitCount() const noexcept = 0;
  virtual void setCompletedUnitCount(std::int64_t count) noexcept = 0;
  /// Sets the state to Canceled and tells the registry's observers.
  virtual void cancel() noexcept = 0;
  virtual std::string description() const = 0;
};

/// Receives registry events on the registry's own threads.
class AppRegistryObserver {
 public:
  virtual ~AppRegistryObserver() = default;

  /// The installs that run or wait, in the order of their priority, and those that are paused. A
  /// new observer gets one report soon after it was added, and another after every change.
  virtual void applicationInstallsArePrioritized(const std::vector<AppRecord>& prioritized,
                                                 const std::vector<AppRecord>& paused) noexcept {
    (void)prioritized, (void)paused;
  }
  /// Installs that the person or the system cancelled.
  virtual void applicationInstallsDidCancel(const std::vector<AppRecord>& records) noexcept {
    (void)records;
  }
};

/// The phone's registry of applications. All calls may come from any thread and block until done.
class AppRegistry {
 public:
  /// Visits one record; setting `stop` ends the enumeration after this visit.
  using Visitor = std::function<void(const AppRecord& record, bool& stop)>;

  virtual ~AppRegistry() = default;

  /// Borrows the observer until removeObserver, which returns only when no event to it is running
  /// and none will come. An observer must not remove itself from inside an event.
  virtual void addObserver(AppRegistryObserver* observer) noexcept = 0;
  virtual void removeObserver(AppRegistryObserver* observer) noexcept = 0;

  /// True for placeholders too.
  virtual bool isApplicationInstalled(std::string_view bundleId) noexcept = 0;

  /// With `placeholder`, the application's placeholder; without, the installed application or,
  /// failing that, its placeholder. nullopt when there is none.
  virtual std::optional<AppRecord> recordForIdentifier(std::string_view bundleId,
                                                       bool placeholder) noexcept = 0;

  /// Calls the visitor on the calling thread, before it returns, with a snapshot taken at the
  /// start; the visitor may call the registry.
  virtual void enumerateBundles(BundleKind kind, const Visitor& visitor) noexcept = 0;

  /// Installs the package file, or the placeholder bundle directory, at `package`.
  /// Options: SWPackageTypeKey (SWPackageTypeCustomer or SWPackageTypePlaceholder) and
  /// KBBundleIdentifier, both required; for placeholders SWInstallTypeKey (number),
  /// SWHalvoMetadataKey (data) and SWApplicationSINFKey (data or null). A package replaces the
  /// installed version and the placeholder in one step; a crash or a failure leaves the old state
  /// whole.
  [[nodiscard]] virtual bool installApplication(const FileLocation& package,
                                                const PropertyList::Dictionary& options,
                                                std::optional<Error>* error) noexcept = 0;

  /// Without options takes away the application, or only the placeholder while one is laid over an
  /// installed version. With UninstallPlaceholdersOnlyKey true never touches an installed version.
  /// False when there was nothing of the kind or it could not be removed.
  [[nodiscard]] virtual bool uninstallApplication(
      std::string_view bundleId, const PropertyList::Dictionary& options) noexcept = 0;

  /// The progress of the application's install that begins at `phase`; nullptr when it is not being
  /// installed.
  virtual std::shared_ptr<InstallProgress> installProgress(const AppRecord& record,
                                                           InstallPhase phase) noexcept = 0;
  /// The current progress of the record's install, fetched synchronously; nullptr when there is
  /// none.
  virtual std::shared_ptr<InstallProgress> installProgressSync(
      const AppRecord& record) noexcept = 0;

  /// Tells the registry that the phase its progress is in has come to its end: a Loading phase is
  /// followed by Installing unless the state is Failed or Canceled.
  virtual void installPhaseFinished(InstallProgress& progress) noexcept = 0;
};

}  // namespace appsync
