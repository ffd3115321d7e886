#include "device/services/system_notifier.h"

#include <algorithm>

namespace appsync::device {

LocalNotifier::~LocalNotifier() {
  const std::lock_guard lock(mutex_);
  subscriptions_.clear();
}

SystemNotifier::Registration LocalNotifier::registerCheck(std::string_view name) noexcept {
  if (name.empty()) return {1, 0};
  const std::lock_guard lock(mutex_);
  tokenNames_.emplace_back(name);
  return {0, static_cast<int>(tokenNames_.size())};
}

void LocalNotifier::setState(int token, std::uint64_t state) noexcept {
  const std::lock_guard lock(mutex_);
  if (token < 1 || static_cast<std::size_t>(token) > tokenNames_.size()) return;
  states_[tokenNames_[static_cast<std::size_t>(token) - 1]] = state;
}

std::uint64_t LocalNotifier::state(std::string_view name) noexcept {
  const std::lock_guard lock(mutex_);
  const auto found = states_.find(name);
  return found == states_.end() ? 0 : found->second;
}

void LocalNotifier::post(std::string_view name) noexcept {
  const std::lock_guard lock(mutex_);
  const Posting posting{std::string(name), ++postingCount_};
  queue_.after({}, [this, posting] { deliver(posting); });
}

void LocalNotifier::addObserver(void* observer, std::string_view name, Callback callback) noexcept {
  const std::lock_guard lock(mutex_);
  subscriptions_.emplace(++lastSubscription_,
                         Subscription{observer, std::string(name), callback, postingCount_});
}

void LocalNotifier::removeObserver(void* observer, std::string_view name) noexcept {
  std::unique_lock lock(mutex_);
  std::uint64_t called = 0;
  std::erase_if(subscriptions_, [&](const auto& item) {
    const auto& [number, subscription] = item;
    const bool gone = subscription.observer == observer && subscription.name == name;
    if (gone && number == running_) called = number;
    return gone;
  });
  if (called != 0 && std::this_thread::get_id() != deliverer_)
    returned_.wait(lock, [&] { return running_ != called; });
}

void LocalNotifier::deliver(const Posting& posting) {
  std::unique_lock lock(mutex_);
  deliverer_ = std::this_thread::get_id();
  // Subscriptions come and go during a callback: the next one is looked up by its number.
  for (auto next = subscriptions_.begin(); next != subscriptions_.end();
       next = subscriptions_.upper_bound(running_)) {
    running_ = next->first;
    const Subscription subscription = next->second;
    if (subscription.name != posting.name || subscription.since >= posting.number) continue;
    lock.unlock();
    subscription.callback(subscription.observer);
    lock.lock();
    returned_.notify_all();
  }
  running_ = 0;
  returned_.notify_all();
}

}  // namespace appsync::device
