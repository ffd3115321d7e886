#include "device/state/keyed_workers.h"

#include <algorithm>

namespace appsync::device {

KeyedWorkers::KeyedWorkers(std::size_t threads) {
  while (threads_.size() < threads) threads_.emplace_back([this] { run(); });
}

void KeyedWorkers::add(std::string_view key, Job job, std::chrono::milliseconds delay) {
  const Lock lock(mutex_);
  if (stopping_) return;
  const auto due = Clock::now() + (expedited_ ? std::chrono::milliseconds(0) : delay);
  pending_.push_back({std::string(key), std::move(job), due});
  changed_.notifyAll();
}

void KeyedWorkers::exclusively(std::string_view key, const Job& job) {
  if (isRunHere(key)) return job();
  const Lock lock(mutex_);
  while (running_.contains(key)) changed_.wait(mutex_);
  perform(std::string(key), job);
}

bool KeyedWorkers::isRunHere(std::string_view key) {
  const Lock lock(mutex_);
  const auto runner = running_.find(key);
  return runner != running_.end() && runner->second == std::this_thread::get_id();
}

bool KeyedWorkers::isBusy(std::string_view key) {
  const Lock lock(mutex_);
  return running_.contains(key) ||
         std::ranges::any_of(pending_, [&](const Pending& each) { return each.key == key; });
}

void KeyedWorkers::expedite() {
  const Lock lock(mutex_);
  expedited_ = true;
  const auto now = Clock::now();
  for (Pending& each : pending_) each.due = std::min(each.due, now);
  changed_.notifyAll();
}

void KeyedWorkers::stop() {
  {
    const Lock lock(mutex_);
    stopping_ = true;
    changed_.notifyAll();
  }
  for (std::thread& thread : threads_) thread.join();
  threads_.clear();
}

std::deque<KeyedWorkers::Pending>::iterator KeyedWorkers::next() {
  const auto now = Clock::now();
  return std::ranges::find_if(pending_, [&](const Pending& each) APPSYNC_REQUIRES(mutex_) {
    return (stopping_ || each.due <= now) && !running_.contains(each.key);
  });
}

std::optional<KeyedWorkers::Clock::time_point> KeyedWorkers::nextLook(
    const std::deque<Pending>& pending, Clock::time_point now) {
  std::optional<Clock::time_point> next;
  for (const Pending& each : pending) {
    if (each.due > now) next = std::min(next.value_or(each.due), each.due);
  }
  return next;
}

void KeyedWorkers::waitForChange() {
  if (const auto next = nextLook(pending_, Clock::now())) {
    changed_.waitUntil(mutex_, *next);
  } else {
    changed_.wait(mutex_);
  }
}

void KeyedWorkers::perform(const std::string& key, const Job& job) {
  running_.emplace(key, std::this_thread::get_id());
  {
    const Unlock unlocked(mutex_);
    job();
  }
  running_.erase(key);
  changed_.notifyAll();
}

void KeyedWorkers::run() {
  const Lock lock(mutex_);
  while (true) {
    const auto found = next();
    if (found != pending_.end()) {
      const Pending taken = std::move(*found);
      pending_.erase(found);
      perform(taken.key, taken.job);
    } else if (stopping_ && pending_.empty()) {
      return;
    } else {
      waitForChange();
    }
  }
}

}  // namespace appsync::device
