#pragma once

#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <vector>

#include "device/coordination/coordination_rows.h"
#include "device/state/background_queue.h"
#include "platform/mutex.h"

namespace appsync::device {

/// The service thread: delivers the stored events, one after another, to their coordinator's
/// observer or else to a listener for its creator. An event goes out of the store when its receiver
/// has returned, so that a process that dies meanwhile delivers it anew; one that nobody is there
/// for stays. What cannot be read is tried again later. Thread-safe; no lock is held during a
/// delivery.
class EventDelivery {
 public:
  /// Gives the coordinator that an event shows.
  using Coordinators = std::function<std::shared_ptr<InstallCoordinator>(const CoordinatorRow&)>;

  explicit EventDelivery(Database& database) : database_(database) {}
  ~EventDelivery() { stop(); }

  void start(Coordinators coordinators);
  /// Runs what was posted, delivers nothing more and ends the thread. Not to be called from an
  /// event.
  void stop();

  /// There may be new events.
  void check();
  /// Runs a task between events.
  void post(std::function<void()> task);

  // After these no event runs or comes to the one that was taken away; they do not wait for the
  // event that they are called from.
  void setObserver(std::int64_t coordinator, CoordinatorObserver* observer);
  void removeObserver(const CoordinatorObserver* observer);
  std::uint64_t addListener(std::set<CoordinationClientId> clients, CoordinatorObserver& delegate);
  void removeListener(std::uint64_t listener);

  /// Whether there is an event of the application's coordinators that somebody gets or is getting,
  /// or any task that has not ended.
  bool isBusy(std::string_view identifier);

 private:
  struct Listener {
    std::set<CoordinationClientId> clients;
    CoordinatorObserver* delegate;
  };

  void checkAfter(std::chrono::milliseconds delay) APPSYNC_REQUIRES(mutex_);
  void deliverAll();
  [[nodiscard]] bool deliver(const EventRow& event);
  void send(const EventRow& event, CoordinatorObserver& observer);
  void remove(const EventRow& event);
  /// nullopt when they cannot be read.
  std::optional<std::vector<EventRow>> pending();
  CoordinatorObserver* receiver(const CoordinatorRow& coordinator) const APPSYNC_REQUIRES(mutex_);
  void waitUntilReturned(const CoordinatorObserver* observer) APPSYNC_REQUIRES(mutex_);

  Database& database_;
  Coordinators coordinators_;  ///< set before there is anything to deliver
  Mutex mutex_;
  Condition returned_;
  std::map<std::int64_t, CoordinatorObserver*> observers_ APPSYNC_GUARDED_BY(mutex_);
  std::map<std::uint64_t, Listener> listeners_ APPSYNC_GUARDED_BY(mutex_);
  std::uint64_t lastListener_ APPSYNC_GUARDED_BY(mutex_) = 0;
  std::size_t tasks_ APPSYNC_GUARDED_BY(mutex_) = 0;  ///< that have not ended
  const CoordinatorObserver* delivering_ APPSYNC_GUARDED_BY(mutex_) = nullptr;
  std::thread::id deliverer_ APPSYNC_GUARDED_BY(mutex_);
  /// Events that could not be taken out of the store.
  std::set<std::int64_t> delivered_ APPSYNC_GUARDED_BY(mutex_);
  bool checkDue_ APPSYNC_GUARDED_BY(mutex_) = true;  ///< before the start none is needed
  bool stopping_ APPSYNC_GUARDED_BY(mutex_) = false;

  ThreadBackgroundQueue queue_;
};

}  // namespace appsync::device
