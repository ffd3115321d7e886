#pragma once

#include <condition_variable>
#include <map>
#include <mutex>
#include <optional>
#include <vector>

#include "platform/background_queue.h"
#include "tests/fakes/call_trace.h"
#include "tests/fakes/fake_clock.h"

namespace appsync::fakes {

/// Delays on a clock that only a test moves; tasks run on the thread that moves it.
class FakeBackgroundQueue : public BackgroundQueue {
 public:
  FakeBackgroundQueue(CallTrace& trace, FakeClock& clock) : trace_(trace), clock_(clock) {}

  Token after(std::chrono::milliseconds delay, std::function<void()> task) noexcept override;
  void cancel(Token token) noexcept override;

  /// Moves the clock on, and runs each task at its time, also those that tasks add meanwhile.
  void advance(std::chrono::milliseconds time);
  std::size_t pendingCount() const;
  /// Waits until so many tasks are pending; false when that takes a minute.
  bool waitForPending(std::size_t count);
  /// How long after now the pending tasks are due, soonest first.
  std::vector<std::chrono::milliseconds> pendingDelays() const;

 private:
  struct Task {
    std::chrono::milliseconds due;
    std::function<void()> run;
  };

  /// The soonest task that is due by `end`, taken out and marked as running; the lock is held.
  std::function<void()> takeDue(std::chrono::milliseconds end);

  CallTrace& trace_;
  FakeClock& clock_;
  mutable std::mutex mutex_;
  std::condition_variable changed_;
  std::map<Token, Task> tasks_;
  Token nextToken_ = 1;
  std::optional<Token> running_;
};

}  // namespace appsync::fakes
