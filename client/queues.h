#pragma once

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <deque>
#include <functional>
#include <memory>
#include <optional>
#include <string_view>
#include <thread>
#include <utility>
#include <vector>

#include "platform/background_queue.h"
#include "platform/mutex.h"

namespace appsync {

/// A counter of outstanding work that can be waited on. Thread-safe.
class TaskGroup {
 public:
  void enter();
  void leave();
  /// Blocks, without limit, until every enter has been left.
  void wait();

 private:
  Mutex mutex_;
  Condition empty_;
  std::size_t outstanding_ APPSYNC_GUARDED_BY(mutex_) = 0;
};

/// A serial queue for short bookkeeping: a task runs on the caller's thread, one at a time. Guards
/// what only tasks may touch.
class APPSYNC_CAPABILITY("access queue") AccessQueue {
 public:
  explicit AccessQueue(std::string_view label) : label_(label) {}

  std::string_view label() const { return label_; }

  /// Runs the task and returns its result. A task must not call `sync` again. Not analysed, for a
  /// task that says which queue it requires names it by its owner.
  template <typename Task>
  auto sync(Task&& task) APPSYNC_EXCLUDES(this) APPSYNC_NOT_ANALYSED {
    const Lock lock(mutex_);
    return std::forward<Task>(task)();
  }

 private:
  std::string_view label_;
  Mutex mutex_;
};

/// Runs operations in the order in which they were added, at most `maximum` at once. Threads are
/// made as they are needed; while the system has none to give, an operation runs in `add`. The
/// destructor runs what was added to its end. Thread-safe.
class OperationQueue {
 public:
  /// Starts a thread. Throws std::system_error when the system has none to give.
  using StartThread = std::function<std::thread(std::function<void()> work)>;

  explicit OperationQueue(std::size_t maximum, StartThread startThread = newThread)
      : maximum_(maximum), startThread_(std::move(startThread)) {}
  ~OperationQueue();
  OperationQueue(const OperationQueue&) = delete;
  OperationQueue& operator=(const OperationQueue&) = delete;

  void add(std::function<void()> operation);
  /// Blocks until nothing runs and nothing waits.
  void waitUntilAllOperationsAreFinished();

 private:
  static std::thread newThread(std::function<void()> work);
  void addThread() APPSYNC_REQUIRES(mutex_);
  void work();

  const std::size_t maximum_;
  const StartThread startThread_;
  Mutex mutex_;
  Condition changed_;
  std::deque<std::function<void()>> waiting_ APPSYNC_GUARDED_BY(mutex_);
  std::vector<std::thread> threads_ APPSYNC_GUARDED_BY(mutex_);
  std::size_t idle_ APPSYNC_GUARDED_BY(mutex_) = 0;
  std::size_t running_ APPSYNC_GUARDED_BY(mutex_) = 0;
  bool closing_ APPSYNC_GUARDED_BY(mutex_) = false;
};

/// Delayed tasks that belong to one owner. After `close` none runs any more, and what they held is
/// gone. Thread-safe; a task may add the next, but must not close.
class DelayedTasks {
 public:
  explicit DelayedTasks(BackgroundQueue& queue);
  ~DelayedTasks() { close(); }
  DelayedTasks(const DelayedTasks&) = delete;
  DelayedTasks& operator=(const DelayedTasks&) = delete;

  /// Runs the task after the delay. False when closed: the task is dropped.
  [[nodiscard]] bool after(std::chrono::milliseconds delay, std::function<void()> task);
  /// Drops what is pending and waits for what runs; `dropped` is called once for each dropped task.
  void close(const std::function<void()>& dropped = [] {});

 private:
  struct Tasks;

  BackgroundQueue& queue_;
  /// Shared with the tasks, whose very end may come after their owner's.
  const std::shared_ptr<Tasks> tasks_;
};

/// A counting semaphore whose wait can have a limit.
class Semaphore {
 public:
  void signal();
  /// False when the limit passed first; without a limit that never happens.
  [[nodiscard]] bool wait(std::optional<std::chrono::milliseconds> limit = std::nullopt);

 private:
  Mutex mutex_;
  Condition signalled_;
  std::size_t count_ APPSYNC_GUARDED_BY(mutex_) = 0;
};

}  // namespace appsync
