#include "client/queues.h"

#include <map>
#include <system_error>
#include <utility>

namespace appsync {

void TaskGroup::enter() {
  const std::lock_guard lock(mutex_);
  ++outstanding_;
}

void TaskGroup::leave() {
  // Notified under the lock: a waiter may destroy the group as soon as it is empty.
  const std::lock_guard lock(mutex_);
  if (--outstanding_ == 0) empty_.notify_all();
}

void TaskGroup::wait() {
  std::unique_lock lock(mutex_);
  empty_.wait(lock, [this] { return outstanding_ == 0; });
}

OperationQueue::~OperationQueue() {
  waitUntilAllOperationsAreFinished();
  {
    const std::lock_guard lock(mutex_);
    closing_ = true;
  }
  changed_.notify_all();
  for (std::thread& thread : threads_) thread.join();
}

void OperationQueue::add(std::function<void()> operation) {
  {
    const std::lock_guard lock(mutex_);
    if (waiting_.size() >= idle_ && threads_.size() < maximum_) addThread();
    if (!threads_.empty()) {
      waiting_.push_back(std::move(operation));
      changed_.notify_all();
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
  std::unique_lock lock(mutex_);
  changed_.wait(lock, [this] { return running_ == 0 && waiting_.empty(); });
}

void OperationQueue::work() {
  std::unique_lock lock(mutex_);
  while (true) {
    ++idle_;
    changed_.wait(lock, [this] { return closing_ || !waiting_.empty(); });
    --idle_;
    if (waiting_.empty()) return;
    std::function<void()> operation = std::move(waiting_.front());
    waiting_.pop_front();
    ++running_;
    lock.unlock();
    operation();
    operation = nullptr;
    lock.lock();
    --running_;
    if (running_ == 0 && waiting_.empty()) changed_.notify_all();
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
      const std::lock_guard lock(mutex);
      const auto found = pending.find(id);
      if (found == pending.end()) return;
      task = std::move(found->second.run);
      running.emplace(id, found->second.token);
      pending.erase(found);
    }
    task();
    task = nullptr;
    const std::lock_guard lock(mutex);
    running.erase(id);
  }

  std::mutex mutex;
  std::map<std::uint64_t, Pending> pending;
  std::map<std::uint64_t, BackgroundQueue::Token> running;
  std::uint64_t next = 0;
  bool closed = false;
};

DelayedTasks::DelayedTasks(BackgroundQueue& queue)
    : queue_(queue), tasks_(std::make_shared<Tasks>()) {}

bool DelayedTasks::after(std::chrono::milliseconds delay, std::function<void()> run) {
  // Held while the task is handed over, so that it cannot start before its token is known.
  const std::lock_guard lock(tasks_->mutex);
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
    const std::lock_guard lock(tasks_->mutex);
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
  const std::lock_guard lock(mutex_);
  ++count_;
  signalled_.notify_one();
}

bool Semaphore::wait(std::optional<std::chrono::milliseconds> limit) {
  std::unique_lock lock(mutex_);
  const auto ready = [this] { return count_ > 0; };
  if (!limit) {
    signalled_.wait(lock, ready);
  } else if (!signalled_.wait_for(lock, *limit, ready)) {
    return false;
  }
  --count_;
  return true;
}

}  // namespace appsync
