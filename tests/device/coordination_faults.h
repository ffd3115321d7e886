#pragma once

#include <sqlite3.h>

#include <atomic>
#include <chrono>
#include <string>

#include "tests/device/coordination_test.h"
#include "tests/device/device_parts.h"

namespace appsync::device {

inline constexpr std::string_view Id = "com.example.a";
inline const std::string Icon = "/tmp/Icons/com.example.a.png";
inline const FileLocation Package = FileLocation::file("/var/mobile/Media/PublicStaging/a.pkg");

/// What fails of the database, and for how long.
struct Mode {
  const char* name;
  bool reads;  ///< reads outside of changes; else the commits of changes
  bool once;   ///< else all from that step on
};
inline constexpr Mode Modes[] = {{"ReadsOnce", true, true},
                                 {"ReadsFromThenOn", true, false},
                                 {"ChangesOnce", false, true},
                                 {"ChangesFromThenOn", false, false}};

inline void PrintTo(const Mode& mode, std::ostream* out) { *out << mode.name; }

/// Lets one connection fail from a step on, counted from 1. Works under the lock of its owner.
class DatabaseFaults {
 public:
  DatabaseFaults(const Mode& mode, int step) : mode_(mode), left_(step) {}

  void strike(Database& database) {
    database.read("", [this](Connection& connection) {
      connection.keepNothing();  // the authorizer is asked when a statement is prepared
      handle_ = connection.getHandle();
      sqlite3_set_authorizer(
          handle_,
          [](void* faults, int action, const char* name, const char*, const char*, const char*) {
            return static_cast<DatabaseFaults*>(faults)->allows(action, name) ? SQLITE_OK
                                                                              : SQLITE_DENY;
          },
          this);
    });
  }
  bool struck() const { return struck_; }

  /// While it lives, what its thread asks is no step.
  class Uncounted {
   public:
    Uncounted() { uncounted_ = true; }
    ~Uncounted() { uncounted_ = false; }
    Uncounted(const Uncounted&) = delete;
    Uncounted& operator=(const Uncounted&) = delete;
  };

 private:
  bool allows(int action, const char* name) {
    const bool isStep = mode_.reads
                            ? action == SQLITE_SELECT && sqlite3_get_autocommit(handle_) != 0
                            : action == SQLITE_TRANSACTION && std::string_view(name) == "COMMIT";
    if (!isStep) return true;
    if (struck_) return mode_.once;
    if (uncounted_ || --left_ > 0) return true;
    struck_ = true;
    return false;
  }

  static inline thread_local bool uncounted_ = false;
  const Mode mode_;
  int left_;
  sqlite3* handle_ = nullptr;
  std::atomic<bool> struck_ = false;
};

/// An install that waits for its package.
struct BegunInstall {
  std::shared_ptr<InstallCoordinator> coordinator;  ///< nullptr: its client gave up
  std::shared_ptr<PathTransferPromise> package;

  void bringPackage() const {
    package->setTransferPath(Package);
    package->setPercentComplete(1.0);
    package->setComplete(true);
  }
};

/// What a client does, as far as it gets: it gives up when it is refused.
inline BegunInstall beginInstall(DeviceInstallCoordination& service,
                                 CoordinatorObserver& observer) {
  const auto coordinator = service.coordinatorFor(CoordinatorKind::Initiating, Id, SyncHostClientID,
                                                  true, nullptr, nullptr);
  if (!coordinator) return {};
  coordinator->setObserver(&observer);
  const auto package =
      service.createPathTransferPromise("com.example.a-Asset", SyncHostClientID, std::nullopt, 0);
  const auto icon = service.createPathTransferPromise("com.example.a-Icon", SyncHostClientID,
                                                      FileLocation::file(Icon), 1);
  const auto placeholder =
      service.createAppPlaceholder("A", Id, InstallType::Sync, SyncHostClientID);
  if (icon) icon->setComplete(true);
  const InstallOptions options{StoreMetadata{{{"itemName", "A"}}}, InstallType::Sync, 1,
                               toBytes("sinf")};
  const bool ready = package && icon && placeholder &&
                     coordinator->setInstallOptions(options, nullptr) &&
                     coordinator->setInitialQPKAssetPromises({}, nullptr) &&
                     coordinator->setAppAssetPromise(package, nullptr) &&
                     placeholder->setIconPromise(icon, nullptr) &&
                     placeholder->setPlaceholderAttributes({}, nullptr) &&
                     placeholder->setConfigurationComplete(nullptr) &&
                     coordinator->setPlaceholderPromise(placeholder, nullptr);
  if (!ready) {
    coordinator->cancel(Error::posix(ECANCELED), SyncHostClientID);
    return {};
  }
  return {coordinator, package};
}

/// The same, and the package comes.
inline std::shared_ptr<InstallCoordinator> install(DeviceInstallCoordination& service,
                                                   CoordinatorObserver& observer) {
  const BegunInstall begun = beginInstall(service, observer);
  if (begun.coordinator) begun.bringPackage();
  return begun.coordinator;
}

inline std::shared_ptr<InstallCoordinator> find(DeviceInstallCoordination& service) {
  return service.coordinatorFor(CoordinatorKind::Any, Id, SyncHostClientID, false, nullptr,
                                nullptr);
}

}  // namespace appsync::device
