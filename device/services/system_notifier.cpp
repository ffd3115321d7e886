#include "device/services/system_notifier.h"

#include <algorithm>

namespace appsync::device {

LocalNotifier::~LocalNotifier() {
  const Lock lock(mutex_);
  subscriptions_.clear();
}

SystemNotifier::Registration LocalNotifier::registerCheck(std::string_view name) noexcept {
  if (name.empty()) return {1, 0};
  const Lock lock(mutex_);
  tokenNames_.emplace_back(name);
  return {0, static_cast<int>(tokenNames_.size())};
}

void LocalNotifier::setState(int token, std::uint64_t state) noexcept {
  const Lock lock(mutex_);
  if (token < 1 || static_cast<std::size_t>(token) > tokenNames_.size()) return;
  states_[tokenNames_[static_cast<std::size_t>(token) - 1]] = state;
}

std::uint64_t LocalNotifier::state(std::string_view name) noexcept {
  const Lock lock(mutex_);
  const auto found = states_.find(name);
  return found == states_.end() ? 0 : found->second;
}

void LocalNotifier::post(std::string_view name) noexcept {
  const Lock lock(mutex_);
  const Posting posting{std::string(name), ++postingCount_};
  queue_.after({}, [this, posting] { deliver(posting); });
}

void LocalNotifier::addObserver(void* observer, std::string_view name, Callback callback) noexcept {
  const Lock lock(mutex_);
  subscriptions_.emplace(++lastSubscription_,
                         Subscription{observer, std::string(name), callback, postingCount_});
}

void LocalNotifier::removeObserver(void* observer, std::string_view name) noexcept {
  const Lock lock(mutex_);
  std::uint64_t called = 0;
  std::erase_if(subscriptions_, [&](const auto& item) APPSYNC_REQUIRES(mutex_) {
    const auto& [number, subscription] = item;
    const bool gone = subscription.observer == observer && subscription.name == name;
    if (gone && number == running_) called = number;
    return gone;
  });
  if (called == 0 || std::this_thread::get_id() == deliverer_) return;
  while (running_ == called) returned_.wait(mutex_);
}

void LocalNotifier::deliver(const Posting& posting) {
  const Lock lock(mutex_);
  deliverer_ = std::this_thread::get_id();
  // Subscriptions come and go during a callback: the next one is looked up by its number.
  for (auto next = subscriptions_.begin(); next != subscriptions_.end();
       next = subscriptions_.upper_bound(running_)) {
    running_ = next->first;
    const Subscription subscription = next->second;
    if (subscription.name != posting.name || subscription.since >= posting.number) continue;
    {
      const Unlock unlocked(mutex_);
      subscription.callback(subscription.observer);
    }
    returned_.notifyAll();
  }
  running_ = 0;
  returned_.notifyAll();
}

}  // namespace appsync::device
