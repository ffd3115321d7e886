#pragma once

#include <memory>
#include <shared_mutex>

#include "device/apps/app_registry.h"
#include "device/coordination/coordinated_installs.h"
#include "device/coordination/coordination_state.h"
#include "device/coordination/event_delivery.h"
#include "device/coordination/keyed_workers.h"
#include "device/state/device_core.h"

namespace appsync::device {

class CoordinationCore;
class CoordinatorHandle;
class PathPromiseHandle;

/// The way to a core that may be gone. Whoever holds it may outlive the core.
class CoordinationGate {
 public:
  explicit CoordinationGate(CoordinationCore& core) : core_(&core) {}

  /// Gives `otherwise` when the core is gone; else it stays until `use` has returned.
  template <typename Result, typename Use>
  Result with(Result otherwise, const Use& use) {
    const std::shared_lock lock(mutex_);
    return core_ ? Result(use(*core_)) : otherwise;
  }
  /// Waits for those who use the core.
  void close() {
    const std::unique_lock lock(mutex_);
    core_ = nullptr;
  }

 private:
  std::shared_mutex mutex_;
  CoordinationCore* core_;
};

/// What the parts of the coordination service share. Its state is the database's: objects given out
/// are thin and hold a row's number. Thread-safe; no lock is held while it calls out.
class CoordinationCore {
 public:
  CoordinationCore(DeviceCore& device, DeviceAppRegistry& registry);
  /// Lets a running install end; what waits is carried on when the device is next opened.
  ~CoordinationCore();

  /// Begins to work, with what was left from before.
  void start();
  void hurry();

  // Changes. False with an error when the object is over, or the change is refused (Refused thrown
  // by `change`) or fails. A promise that is over is left as it is, which is no failure.
  using CoordinatorChange = std::function<void(SQLite::Database&, CoordinatorRow&)>;
  using PromiseChange = std::function<void(PromiseRow&)>;
  using PlaceholderChange = std::function<void(SQLite::Database&, PlaceholderRow&)>;
  bool changeCoordinator(std::int64_t number, const CoordinatorChange& change,
                         std::optional<Error>* error);
  bool changePromise(std::int64_t number, const PromiseChange& change, std::optional<Error>* error);
  bool changePlaceholder(std::int64_t number, const PlaceholderChange& change,
                         std::optional<Error>* error);

  // A cancelled package promise or placeholder takes its coordinator along. False when it is past
  // cancelling.
  bool cancelCoordinator(std::int64_t number, const Error& reason, CoordinationClientId client);
  bool cancelPromise(std::int64_t number, const Error& reason, CoordinationClientId client);
  bool cancelPlaceholder(std::int64_t number, const Error& reason, CoordinationClientId client);

  std::optional<PromiseRow> promise(std::int64_t number);

  // What keeps a live coordinator from going on and could not be written down: an error of the
  // coordinator until its client asks for it anew, or the device is next opened.
  void noteTrouble(std::int64_t coordinator, const Error& error);
  void noteTroubleWithPromise(std::int64_t promise, const Error& error);
  std::optional<Error> trouble(std::int64_t coordinator);

  /// Runs work in one transaction and then does what follows from it.
  bool change(const std::function<void(SQLite::Database&, Consequences&)>& work,
              std::optional<Error>* error, Database::Commit commit = Database::Commit::Ordinary);
  bool read(const Database::Work& work, std::optional<Error>* error = nullptr);

  // The one object for a row as long as somebody holds it.
  std::shared_ptr<CoordinatorHandle> handleOf(const CoordinatorRow& row);
  std::shared_ptr<PathPromiseHandle> handleOf(const PromiseRow& row);

  /// Removes what the application's coordinators that are over leave behind.
  void tidyUp(const std::string& identifier);

  void log(std::string_view text);

  DeviceCore& device() { return device_; }
  DeviceAppRegistry& registry() { return registry_; }
  KeyedWorkers& workers() { return workers_; }
  EventDelivery& events() { return events_; }
  const std::shared_ptr<CoordinationGate>& gate() const { return gate_; }

 private:
  void apply(const Consequences& consequences);
  void showProgress(const PromiseRow& promise);

  DeviceCore& device_;
  DeviceAppRegistry& registry_;
  const std::shared_ptr<CoordinationGate> gate_;

  std::mutex mutex_;
  // Guarded by mutex_.
  std::map<std::int64_t, std::weak_ptr<CoordinatorHandle>> coordinators_;
  std::map<std::int64_t, std::weak_ptr<PathPromiseHandle>> promises_;
  std::map<std::int64_t, Error> troubles_;  ///< by coordinator

  EventDelivery events_;
  CoordinatedInstalls installs_;
  KeyedWorkers workers_;
};

}  // namespace appsync::device
