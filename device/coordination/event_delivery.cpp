#include "device/coordination/event_delivery.h"

#include <algorithm>
#include <cerrno>
#include <future>
#include <utility>

namespace appsync::device {
namespace {

/// Until events that could not be read are looked for again.
constexpr std::chrono::milliseconds RetryDelay{200};

}  // namespace

void EventDelivery::start(Coordinators coordinators) {
  const Lock lock(mutex_);
  coordinators_ = std::move(coordinators);
  checkDue_ = false;
  checkAfter({});  // what was kept from before
}

void EventDelivery::stop() {
  if (queue_.isStopped()) return;
  {
    const Lock lock(mutex_);
    stopping_ = true;
  }
  std::promise<void> ran;
  queue_.after({}, [&ran] { ran.set_value(); });
  ran.get_future().wait();
  queue_.stop();
}

void EventDelivery::check() {
  const Lock lock(mutex_);
  checkAfter({});
}

void EventDelivery::checkAfter(std::chrono::milliseconds delay) {
  if (!std::exchange(checkDue_, true)) queue_.after(delay, [this] { deliverAll(); });
}

void EventDelivery::post(std::function<void()> task) {
  const Lock lock(mutex_);
  ++tasks_;
  queue_.after({}, [this, task = std::move(task)]() mutable {
    task();
    task = nullptr;  // what it holds goes before it has ended
    const Lock ended(mutex_);
    --tasks_;
  });
}

void EventDelivery::setObserver(std::int64_t coordinator, CoordinatorObserver* observer) {
  const Lock lock(mutex_);
  CoordinatorObserver* replaced = nullptr;
  if (const auto found = observers_.find(coordinator); found != observers_.end()) {
    replaced = found->second;
  }
  if (observer) {
    observers_[coordinator] = observer;
  } else {
    observers_.erase(coordinator);
  }
  checkAfter({});
  if (replaced && replaced != observer) waitUntilReturned(replaced);
}

void EventDelivery::removeObserver(const CoordinatorObserver* observer) {
  const Lock lock(mutex_);
  std::erase_if(observers_, [&](const auto& item) { return item.second == observer; });
  // A listener may be there for what the observer would have had.
  checkAfter({});
  waitUntilReturned(observer);
}

std::uint64_t EventDelivery::addListener(std::set<CoordinationClientId> clients,
                                         CoordinatorObserver& delegate) {
  const Lock lock(mutex_);
  listeners_.emplace(++lastListener_, Listener{std::move(clients), &delegate});
  checkAfter({});
  return lastListener_;
}

void EventDelivery::removeListener(std::uint64_t listener) {
  const Lock lock(mutex_);
  const auto found = listeners_.find(listener);
  if (found == listeners_.end()) return;
  const CoordinatorObserver* const delegate = found->second.delegate;
  listeners_.erase(found);
  waitUntilReturned(delegate);
}

bool EventDelivery::isBusy(std::string_view identifier) {
  const auto events = pending();
  const Lock lock(mutex_);
  if (tasks_ > 0) return true;
  return events &&
         std::ranges::any_of(*events, [&](const EventRow& event) APPSYNC_REQUIRES(mutex_) {
           return event.coordinator.identifier == identifier && receiver(event.coordinator);
         });
}

CoordinatorObserver* EventDelivery::receiver(const CoordinatorRow& coordinator) const {
  const auto observer = observers_.find(coordinator.number);
  if (observer != observers_.end()) return observer->second;
  for (const auto& [number, listener] : listeners_) {
    if (listener.clients.contains(coordinator.creator)) return listener.delegate;
  }
  return nullptr;
}

void EventDelivery::waitUntilReturned(const CoordinatorObserver* observer) {
  if (std::this_thread::get_id() == deliverer_) return;
  while (delivering_ == observer) returned_.wait(mutex_);
}

void EventDelivery::deliverAll() {
  {
    const Lock lock(mutex_);
    checkDue_ = false;
  }
  const auto events = pending();
  if (!events) {
    const Lock lock(mutex_);
    checkAfter(RetryDelay);
    return;
  }
  std::set<std::int64_t> passedOver;  // so that a coordinator's events stay in their order
  for (const EventRow& event : *events) {
    const std::int64_t coordinator = event.coordinator.number;
    if (!passedOver.contains(coordinator) && deliver(event)) {
      remove(event);
    } else {
      passedOver.insert(coordinator);
    }
  }
}

std::optional<std::vector<EventRow>> EventDelivery::pending() {
  auto events =
      database_.lookUp("the events of install coordinators could not be read", pendingEvents);
  if (!events) return events;
  const Lock lock(mutex_);
  const auto isDelivered = [&](const EventRow& event) APPSYNC_REQUIRES(mutex_) {
    return delivered_.contains(event.number);
  };
  std::erase_if(*events, isDelivered);
  return events;
}

bool EventDelivery::deliver(const EventRow& event) {
  const Lock lock(mutex_);
  CoordinatorObserver* const observer = stopping_ ? nullptr : receiver(event.coordinator);
  if (!observer) return false;
  delivering_ = observer;
  deliverer_ = std::this_thread::get_id();
  {
    const Unlock unlocked(mutex_);
    send(event, *observer);
  }
  delivering_ = nullptr;
  returned_.notifyAll();
  return true;
}

void EventDelivery::send(const EventRow& event, CoordinatorObserver& observer) {
  const std::shared_ptr<InstallCoordinator> coordinator = coordinators_(event.coordinator);
  switch (event.kind) {
    case EventKind::PromiseBegan:
      observer.promiseDidBeginFulfillmentWithIdentifier(event.promise);
      break;
    case EventKind::PlaceholderInstalled:
      observer.coordinatorDidInstallPlaceholder(*coordinator);
      break;
    case EventKind::Completed:
      observer.coordinatorDidCompleteSuccessfully(*coordinator);
      break;
    case EventKind::Prioritize:
      // Nothing can be sent any more of what is over.
      if (event.coordinator.isLive()) observer.coordinatorShouldPrioritize(*coordinator);
      break;
    case EventKind::Cancelled:
      observer.coordinatorCanceledWithReason(
          *coordinator, errorFrom(event.reason.value_or(Bytes{})).value_or(Error::posix(ECANCELED)),
          event.client);
      break;
  }
}

void EventDelivery::remove(const EventRow& event) {
  const bool removed = database_.change(
      "an event that was delivered could not be taken out", Database::Commit::Ordinary,
      [&](Connection& database) { removeEvent(database, event.number); });
  if (removed) return;
  const Lock lock(mutex_);
  delivered_.insert(event.number);
}

}  // namespace appsync::device
