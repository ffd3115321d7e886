#include "tests/fakes/fake_background_queue.h"

#include <algorithm>

namespace appsync::fakes {

BackgroundQueue::Token FakeBackgroundQueue::after(std::chrono::milliseconds delay,
                                                  std::function<void()> task) noexcept {
  trace_.add(TraceCall, callText("BackgroundQueue.after", delay.count()));
  const std::scoped_lock lock(mutex_);
  tasks_.emplace(nextToken_, Task{clock_.now() + delay, std::move(task)});
  changed_.notify_all();
  return nextToken_++;
}

void FakeBackgroundQueue::cancel(Token token) noexcept {
  trace_.add(TraceCall, callText("BackgroundQueue.cancel"));
  std::unique_lock lock(mutex_);
  tasks_.erase(token);
  changed_.wait(lock, [&] { return running_ != token; });
}

std::function<void()> FakeBackgroundQueue::takeDue(std::chrono::milliseconds end) {
  const auto soonest =
      std::ranges::min_element(tasks_, {}, [](const auto& entry) { return entry.second.due; });
  if (soonest == tasks_.end() || soonest->second.due > end) return nullptr;
  if (soonest->second.due > clock_.now()) clock_.advance(soonest->second.due - clock_.now());
  std::function<void()> run = std::move(soonest->second.run);
  running_ = soonest->first;
  tasks_.erase(soonest);
  return run;
}

void FakeBackgroundQueue::advance(std::chrono::milliseconds time) {
  const std::chrono::milliseconds end = clock_.now() + time;
  std::unique_lock lock(mutex_);
  while (std::function<void()> run = takeDue(end)) {
    lock.unlock();
    run();
    run = nullptr;
    lock.lock();
    running_.reset();
    changed_.notify_all();
  }
  if (clock_.now() < end) clock_.advance(end - clock_.now());
}

std::size_t FakeBackgroundQueue::pendingCount() const {
  const std::scoped_lock lock(mutex_);
  return tasks_.size();
}

bool FakeBackgroundQueue::waitForPending(std::size_t count) {
  std::unique_lock lock(mutex_);
  return changed_.wait_for(lock, std::chrono::minutes(1), [&] { return tasks_.size() >= count; });
}

std::vector<std::chrono::milliseconds> FakeBackgroundQueue::pendingDelays() const {
  const std::scoped_lock lock(mutex_);
  std::vector<std::chrono::milliseconds> delays;
  for (const auto& [token, task] : tasks_) delays.push_back(task.due - clock_.now());
  std::ranges::sort(delays);
  return delays;
}

}  // namespace appsync::fakes
