#include "tests/fakes/fake_system_notifier.h"

#include <algorithm>

namespace appsync::fakes {

SystemNotifier::Registration FakeSystemNotifier::registerCheck(std::string_view name) noexcept {
  trace_.add(TraceCall, callText("SystemNotifier.registerCheck", name));
  const std::scoped_lock lock(mutex_);
  if (registrationStatus_ != 0) return {registrationStatus_, 0};
  tokens_.emplace_back(name);
  return {0, static_cast<int>(tokens_.size())};
}

void FakeSystemNotifier::setState(int token, std::uint64_t state) noexcept {
  const std::scoped_lock lock(mutex_);
  const auto index = static_cast<std::size_t>(token) - 1;
  const std::string name = index < tokens_.size() ? tokens_[index] : "unknown token";
  trace_.add(TraceCall, callText("SystemNotifier.setState", name, state));
  if (index < tokens_.size()) states_.insert_or_assign(name, state);
}

void FakeSystemNotifier::post(std::string_view name) noexcept {
  trace_.add(TraceCall, callText("SystemNotifier.post", name));
  std::unique_lock lock(mutex_);
  const auto state = states_.find(name);
  posts_.emplace_back(name, state == states_.end() ? 0 : state->second);
  const std::vector<Observer> observers = observers_;
  for (const Observer& observer : observers) {
    if (observer.name != name || std::ranges::find(observers_, observer) == observers_.end()) {
      continue;
    }
    running_.push_back(observer);
    lock.unlock();
    observer.callback(observer.observer);
    lock.lock();
    running_.erase(std::ranges::find(running_, observer));
    finished_.notify_all();
  }
}

void FakeSystemNotifier::addObserver(void* observer, std::string_view name,
                                     Callback callback) noexcept {
  trace_.add(TraceCall, callText("SystemNotifier.addObserver", name));
  const std::scoped_lock lock(mutex_);
  observers_.push_back({observer, std::string(name), callback});
}

void FakeSystemNotifier::removeObserver(void* observer, std::string_view name) noexcept {
  trace_.add(TraceCall, callText("SystemNotifier.removeObserver", name));
  const auto matches = [&](const Observer& entry) {
    return entry.observer == observer && entry.name == name;
  };
  std::unique_lock lock(mutex_);
  std::erase_if(observers_, matches);
  finished_.wait(lock, [&] { return std::ranges::none_of(running_, matches); });
}

void FakeSystemNotifier::setRegistrationStatus(std::uint32_t status) {
  const std::scoped_lock lock(mutex_);
  registrationStatus_ = status;
}

std::uint64_t FakeSystemNotifier::stateOf(std::string_view name) const {
  const std::scoped_lock lock(mutex_);
  const auto found = states_.find(name);
  return found == states_.end() ? 0 : found->second;
}

std::vector<std::uint64_t> FakeSystemNotifier::postedStates(std::string_view name) const {
  const std::scoped_lock lock(mutex_);
  std::vector<std::uint64_t> states;
  for (const auto& [posted, state] : posts_) {
    if (posted == name) states.push_back(state);
  }
  return states;
}

std::size_t FakeSystemNotifier::observerCount(std::string_view name) const {
  const std::scoped_lock lock(mutex_);
  return static_cast<std::size_t>(
      std::ranges::count(observers_, std::string(name), &Observer::name));
}

}  // namespace appsync::fakes
