#include "tests/fakes/event_recorder.h"

#include <algorithm>
#include <chrono>

namespace appsync::fakes {

namespace {

std::string idOf(const InstallCoordinator& coordinator) {
  return coordinator.bundleIdentifier().value_or("none");
}

}  // namespace

void EventRecorder::promiseDidBeginFulfillmentWithIdentifier(std::uint64_t identifier) noexcept {
  add("begin " + std::to_string(identifier));
}
void EventRecorder::coordinatorDidInstallPlaceholder(InstallCoordinator& coordinator) noexcept {
  add("placeholder " + idOf(coordinator));
}
void EventRecorder::coordinatorDidCompleteSuccessfully(InstallCoordinator& coordinator) noexcept {
  const std::optional<Error> error = coordinator.error();
  add(error ? "failed " + idOf(coordinator) + ": " + error->localizedDescription()
            : "complete " + idOf(coordinator));
}
void EventRecorder::coordinatorShouldPrioritize(InstallCoordinator& coordinator) noexcept {
  add("prioritize " + idOf(coordinator));
}
void EventRecorder::coordinatorCanceledWithReason(InstallCoordinator& coordinator, const Error&,
                                                  CoordinationClientId client) noexcept {
  add("canceled " + idOf(coordinator) + " by " + std::to_string(client));
}

void EventRecorder::add(std::string event) {
  if (during) during(event);
  const std::lock_guard lock(mutex_);
  events_.push_back(std::move(event));
  thread_ = std::this_thread::get_id();
  changed_.notify_all();
}

EventRecorder::Events EventRecorder::events() {
  const std::lock_guard lock(mutex_);
  return events_;
}

bool EventRecorder::waitFor(std::string_view beginning) {
  std::unique_lock lock(mutex_);
  return changed_.wait_for(lock, std::chrono::minutes(1), [&] { return countNow(beginning) > 0; });
}

std::size_t EventRecorder::count(std::string_view beginning) {
  const std::lock_guard lock(mutex_);
  return countNow(beginning);
}

std::size_t EventRecorder::countNow(std::string_view beginning) const {
  return static_cast<std::size_t>(std::ranges::count_if(
      events_, [&](const std::string& event) { return event.starts_with(beginning); }));
}

std::thread::id EventRecorder::thread() {
  const std::lock_guard lock(mutex_);
  return thread_;
}

}  // namespace appsync::fakes
