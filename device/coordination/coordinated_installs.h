#pragma once

#include <functional>
#include <map>
#include <string>

#include "device/apps/app_registry.h"
#include "device/coordination/coordination_store.h"
#include "device/state/device_core.h"
#include "device/state/keyed_workers.h"
#include "platform/mutex.h"

namespace appsync::device {

/// Does what the service does by itself: installs placeholders and packages, and takes away what
/// was given up. Each operation is called by one worker of the application at a time.
class CoordinatedInstalls {
 public:
  CoordinatedInstalls(DeviceCore& device, DeviceAppRegistry& registry, CoordinationStore& store,
                      KeyedWorkers& workers)
      : device_(device), registry_(registry), store_(store), workers_(workers) {}

  /// Goes on with the application's coordinator as far as it can.
  void advance(const std::string& identifier, std::int64_t coordinator);
  /// Removes what coordinators that are over leave behind: their package and, if they failed or
  /// were cancelled, their placeholder.
  void tidyUp(const std::string& identifier);

  /// Installs that wait for an application to leave the foreground fail from now on.
  void expedite();
  /// Nothing more is begun.
  void leaveWaiting();

 private:
  /// False when the coordinator cannot be read.
  [[nodiscard]] bool carryOn(std::int64_t coordinator, std::optional<Error>* error);

  // False when there is nothing more to be done now.
  [[nodiscard]] bool take(Step step, const CoordinatorState& state);
  [[nodiscard]] bool installPlaceholder(const CoordinatorState& state);
  [[nodiscard]] bool installPackage(const CoordinatorState& state);

  /// A change for a live coordinator; false, and trouble of the coordinator's, when it fails.
  [[nodiscard]] bool change(const CoordinatorState& state,
                            const std::function<void(Connection&, Consequences&)>& work,
                            Database::Commit commit = Database::Commit::Ordinary);
  /// Notes the placeholder's presence, Adopted in the place of Begun where one stands already that
  /// is to stay. None when it is not wanted any more, or that failed.
  Presence note(const CoordinatorState& state, Presence presence);
  enum class Beginning { Made, NotReady, Failed };
  /// Marks the package as being installed, unless the coordinator is not ready any more.
  Beginning begin(const CoordinatorState& state);
  void finish(const CoordinatorState& state, const std::optional<Error>& error);
  /// Puts the failure on record and takes the placeholder away, before anybody hears of it, so that
  /// whoever does finds the phone as it is to stay. False when it cannot be recorded.
  [[nodiscard]] bool fail(const CoordinatorState& state, const Error& error);
  /// Takes away what the placeholder has in the registry, as a person does if it was forsaken; the
  /// registry stays as it was where it was only adopted.
  void removePlaceholder(const std::string& identifier, const PlaceholderRow& placeholder);

  /// For an application to leave the foreground.
  struct Wait {
    std::int64_t coordinator = 0;  ///< of which people know that it waits
    bool isLookDue = false;
  };
  /// Comes back later; an error when that is not to be.
  [[nodiscard]] std::optional<Error> waitForForeground(const CoordinatorRow& coordinator);
  void lookAgain(const std::string& identifier, std::int64_t coordinator);
  bool isLeaving();

  DeviceCore& device_;
  DeviceAppRegistry& registry_;
  CoordinationStore& store_;
  KeyedWorkers& workers_;
  Mutex mutex_;
  std::map<std::string, Wait> waits_ APPSYNC_GUARDED_BY(mutex_);  ///< by application
  bool expedited_ APPSYNC_GUARDED_BY(mutex_) = false;
  bool leaving_ APPSYNC_GUARDED_BY(mutex_) = false;
};

}  // namespace appsync::device
