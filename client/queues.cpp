#include "client/queues.h"

#include <map>
#include <system_error>
#include <utility>

namespace appsync {

void TaskGroup::enter() {
  const Lock lock(mutex_);
  ++outstanding_;
}

void TaskGroup::leave() {
  // Notified under the lock: a waiter may destroy the group as soon as it is empty.
  const Lock lock(mutex_);
  if (--outstanding_ == 0) empty_.notifyAll();
}

void TaskGroup::wait() {
  const Lock lock(mutex_);
  while (outstanding_ > 0) empty_.wait(mutex_);
}

OperationQueue::~OperationQueue() {
  waitUntilAllOperationsAreFinished();
  {
    const Lock lock(mutex_);
    closing_ = true;
  }
  changed_.notifyAll();
  for (std::thread& thread : threads_) thread.join();
}

void OperationQueue::add(std::function<void()> operation) {
  {
    const Lock lock(mutex_);
    if (waiting_.size() >= idle_ && threads_.size() < maximum_) addThread();
    if (!threads_.empty()) {
      waiting_.push_back(std::move(operation));
      changed_.notifyAll();
      return;
    }
  }
  operation();
}

std::thread OperationQueue::newThread(std::function<void()> work) {
  return std::thread(std::move(work));
}

void OperationQueue::addThread() {
  try {
    threads_.push_back(startThread_([this] { work(); }));
  } catch (const std::system_error&) {
    // The system has no thread to spare: those that are there do the work, only later, and without
    // any it is done at once.
  }
}

void OperationQueue::waitUntilAllOperationsAreFinished() {
  const Lock lock(mutex_);
  while (running_ > 0 || !waiting_.empty()) changed_.wait(mutex_);
}

void OperationQueue::work() {
  const Lock lock(mutex_);
  while (true) {
    ++idle_;
    while (!closing_ && waiting_.empty()) changed_.wait(mutex_);
    --idle_;
    if (waiting_.empty()) return;
    std::function<void()> operation = std::move(waiting_.front());
    waiting_.pop_front();
    ++running_;
    {
      const Unlock unlocked(mutex_);
      operation();
      operation = nullptr;
    }
    --running_;
    if (running_ == 0 && waiting_.empty()) changed_.notifyAll();
  }
}

struct DelayedTasks::Tasks {
  struct Pending {
    std::function<void()> run;
    BackgroundQueue::Token token = 0;
  };

  /// Runs a task that is still pending. Nothing of it is left when it no longer counts as running.
  void run(std::uint64_t id) {
    std::function<void()> task;
    {
      const Lock lock(mutex);
      const auto found = pending.find(id);
      if (found == pending.end()) return;
      task = std::move(found->second.run);
      running.emplace(id, found->second.token);
      pending.erase(found);
    }
    task();
    task = nullptr;
    const Lock lock(mutex);
    running.erase(id);
  }

  Mutex mutex;
  std::map<std::uint64_t, Pending> pending APPSYNC_GUARDED_BY(mutex);
  std::map<std::uint64_t, BackgroundQueue::Token> running APPSYNC_GUARDED_BY(mutex);
  std::uint64_t next APPSYNC_GUARDED_BY(mutex) = 0;
  bool closed APPSYNC_GUARDED_BY(mutex) = false;
};

DelayedTasks::DelayedTasks(BackgroundQueue& queue)
    : queue_(queue), tasks_(std::make_shared<Tasks>()) {}

bool DelayedTasks::after(std::chrono::milliseconds delay, std::function<void()> run) {
  // Held while the task is handed over, so that it cannot start before its token is known.
  const Lock lock(tasks_->mutex);
  if (tasks_->closed) return false;
  const std::uint64_t id = tasks_->next++;
  Tasks::Pending& task = tasks_->pending[id];
  task.run = std::move(run);
  task.token = queue_.after(delay, [tasks = tasks_, id] { tasks->run(id); });
  return true;
}

void DelayedTasks::close(const std::function<void()>& dropped) {
  std::map<std::uint64_t, Tasks::Pending> pending;
  std::map<std::uint64_t, BackgroundQueue::Token> running;
  {
    const Lock lock(tasks_->mutex);
    tasks_->closed = true;
    pending.swap(tasks_->pending);
    running = tasks_->running;
  }
  for (const auto& [id, task] : pending) {
    queue_.cancel(task.token);
    dropped();
  }
  for (const auto& [id, token] : running) queue_.cancel(token);
}

void Semaphore::signal() {
  const Lock lock(mutex_);
  ++count_;
  signalled_.notifyOne();
}

bool Semaphore::wait(std::optional<std::chrono::milliseconds> limit) {
  using Clock = std::chrono::steady_clock;
  const Clock::time_point end = Clock::now() + limit.value_or(std::chrono::milliseconds(0));
  const Lock lock(mutex_);
  while (count_ == 0) {
    if (!limit) {
      signalled_.wait(mutex_);
    } else if (!signalled_.waitUntil(mutex_, end) && count_ == 0) {
      return false;
    }
  }
  --count_;
  return true;
}

}  // namespace appsync
