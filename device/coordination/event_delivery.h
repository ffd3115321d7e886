#pragma once

#include <condition_variable>
#include <deque>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <set>
#include <thread>
#include <vector>

#include "device/coordination/coordination_rows.h"

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
  using Lock = std::unique_lock<std::mutex>;

  void run();
  /// False when the events could not be read.
  bool deliverAll();
  bool deliver(const EventRow& event);
  void send(const EventRow& event, CoordinatorObserver& observer);
  void remove(const EventRow& event);
  /// nullopt when they cannot be read.
  std::optional<std::vector<EventRow>> pending();
  /// The lock is held.
  CoordinatorObserver* receiver(const CoordinatorRow& coordinator) const;
  void waitUntilReturned(const CoordinatorObserver* observer, Lock& lock);

  Database& database_;
  Coordinators coordinators_;  ///< set before the thread begins
  std::mutex mutex_;
  std::condition_variable changed_;
  std::condition_variable returned_;
  // Guarded by mutex_.
  std::map<std::int64_t, CoordinatorObserver*> observers_;
  std::map<std::uint64_t, Listener> listeners_;
  std::uint64_t lastListener_ = 0;
  std::deque<std::function<void()>> tasks_;
  bool runsTask_ = false;
  const CoordinatorObserver* delivering_ = nullptr;
  std::set<std::int64_t> delivered_;  ///< events that could not be taken out of the store
  bool checkDue_ = true;              // what was kept from before
  bool stopping_ = false;

  std::thread thread_;
  std::thread::id threadId_;  ///< stays when the thread has ended
};

}  // namespace appsync::device
