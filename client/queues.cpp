#include "client/queues.h"

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

void OperationQueue::addThread() {
  try {
    threads_.emplace_back([this] { work(); });
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

struct DelayedTasks::Task {
  std::function<void()> run;
  BackgroundQueue::Token token = 0;
  bool started = false;
};

bool DelayedTasks::after(std::chrono::milliseconds delay, std::function<void()> run) {
  // Held while the task is handed over, so that it cannot start before its token is known.
  const std::lock_guard lock(mutex_);
  if (closed_) return false;
  const std::uint64_t id = next_++;
  auto task = std::make_shared<Task>(Task{std::move(run)});
  pending_.emplace(id, task);
  task->token = queue_.after(delay, [this, id] {
    std::unique_lock running(mutex_);
    const auto found = pending_.find(id);
    if (found == pending_.end()) return;
    const std::shared_ptr<Task> started = found->second;
    started->started = true;
    running.unlock();
    started->run();
    running.lock();
    pending_.erase(id);
  });
  return true;
}

void DelayedTasks::close(const std::function<void()>& dropped) {
  std::map<std::uint64_t, std::shared_ptr<Task>> left;
  {
    const std::lock_guard lock(mutex_);
    closed_ = true;
    left.swap(pending_);
  }
  for (const auto& [id, task] : left) {
    queue_.cancel(task->token);
    if (!task->started) dropped();
  }
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
