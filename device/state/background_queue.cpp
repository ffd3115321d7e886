#include "device/state/background_queue.h"

#include <algorithm>

namespace appsync::device {

namespace {

// Longer delays would overflow the clock.
constexpr std::chrono::milliseconds LongestDelay = std::chrono::hours(24 * 365 * 10);

}  // namespace

ThreadBackgroundQueue::ThreadBackgroundQueue() : thread_([this] { run(); }) {}

ThreadBackgroundQueue::~ThreadBackgroundQueue() {
  stop();
  thread_.join();
}

BackgroundQueue::Token ThreadBackgroundQueue::after(std::chrono::milliseconds delay,
                                                    std::function<void()> task) noexcept {
  const Lock lock(mutex_);
  const Token token = ++lastToken_;
  const Clock::time_point now = Clock::now();
  const auto wait = std::clamp(delay, std::chrono::milliseconds(0), LongestDelay);
  const Clock::time_point due = expedited_ ? now : now + wait;
  due_.emplace(token, due);
  pending_.emplace(Key{due, token}, std::move(task));
  changed_.notifyAll();
  return token;
}

void ThreadBackgroundQueue::cancel(Token token) noexcept {
  Tasks::node_type dropped;  // destroyed after the lock: what a task holds may call the queue
  const Lock lock(mutex_);
  if (const auto due = due_.find(token); due != due_.end()) {
    dropped = pending_.extract(Key{due->second, token});
    due_.erase(due);
  } else if (std::this_thread::get_id() != thread_.get_id()) {
    while (running_ == token) finished_.wait(mutex_);
  }
}

void ThreadBackgroundQueue::expedite() noexcept {
  const Lock lock(mutex_);
  expedited_ = true;
  const Clock::time_point now = Clock::now();
  std::size_t ahead = pending_.size();
  Tasks expedited;
  for (auto& [key, task] : pending_) {
    // Distinct times in the past keep the order, also before tasks that come later.
    const Clock::time_point due = std::min(key.first, now) - std::chrono::nanoseconds(ahead--);
    due_[key.second] = due;
    expedited.emplace(Key{due, key.second}, std::move(task));
  }
  pending_ = std::move(expedited);
  changed_.notifyAll();
}

void ThreadBackgroundQueue::stop() noexcept {
  const Lock lock(mutex_);
  stopping_ = true;
  changed_.notifyAll();
  if (std::this_thread::get_id() == thread_.get_id()) return;
  while (running_) finished_.wait(mutex_);
}

bool ThreadBackgroundQueue::isStopped() noexcept {
  const Lock lock(mutex_);
  return stopping_;
}

void ThreadBackgroundQueue::run() {
  const Lock lock(mutex_);
  while (!stopping_) {
    if (pending_.empty()) {
      changed_.wait(mutex_);
      continue;
    }
    const Key next = pending_.begin()->first;
    if (next.first > Clock::now()) {
      changed_.waitUntil(mutex_, next.first);
      continue;
    }
    Tasks::node_type node = pending_.extract(pending_.begin());
    due_.erase(next.second);
    running_ = next.second;
    {
      const Unlock unlocked(mutex_);
      node.mapped()();
      node = {};  // what the task holds goes before anybody is told that it has ended
    }
    running_.reset();
    finished_.notifyAll();
  }
}

}  // namespace appsync::device
