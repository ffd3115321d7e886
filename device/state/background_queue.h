#pragma once

#include <map>
#include <optional>
#include <thread>
#include <utility>

#include "platform/background_queue.h"
#include "platform/mutex.h"

namespace appsync::device {

/// Delays by the steady clock, all tasks on one thread in the order in which they fall due.
class ThreadBackgroundQueue final : public BackgroundQueue {
 public:
  ThreadBackgroundQueue();
  /// Not to be called from a task.
  ~ThreadBackgroundQueue() override;

  Token after(std::chrono::milliseconds delay, std::function<void()> task) noexcept override;
  /// A task that cancels itself all the same is let run to its end.
  void cancel(Token token) noexcept override;

  /// Runs all pending tasks at once, in their order, and later ones without delay.
  void expedite() noexcept;

  /// Drops what is pending and lets a running task end; no other will run. May be called by several
  /// threads; from a task it does not wait.
  void stop() noexcept;
  bool isStopped() noexcept;

 private:
  using Clock = std::chrono::steady_clock;
  using Key = std::pair<Clock::time_point, Token>;
  using Tasks = std::map<Key, std::function<void()>>;

  void run();

  Mutex mutex_;
  Condition changed_;   ///< there is something new to wait for
  Condition finished_;  ///< a task has ended
  Tasks pending_ APPSYNC_GUARDED_BY(mutex_);
  std::map<Token, Clock::time_point> due_ APPSYNC_GUARDED_BY(mutex_);  ///< of what is pending
  Token lastToken_ APPSYNC_GUARDED_BY(mutex_) = 0;
  std::optional<Token> running_ APPSYNC_GUARDED_BY(mutex_);
  bool expedited_ APPSYNC_GUARDED_BY(mutex_) = false;
  bool stopping_ APPSYNC_GUARDED_BY(mutex_) = false;

  std::thread thread_;
};

}  // namespace appsync::device
