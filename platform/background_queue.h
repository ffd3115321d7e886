#pragma once

#include <chrono>
#include <cstdint>
#include <functional>

namespace appsync {

/// A global queue for delayed work. Called from any thread, also from inside a task.
class BackgroundQueue {
 public:
  using Token = std::uint64_t;

  virtual ~BackgroundQueue() = default;

  /// Runs the task once, on a thread of the queue, when the delay has passed.
  virtual Token after(std::chrono::milliseconds delay, std::function<void()> task) noexcept = 0;

  /// When this returns, the task has run to its end or will never run. Unknown and finished tokens
  /// are passed over. A task must not cancel itself.
  virtual void cancel(Token token) noexcept = 0;
};

}  // namespace appsync
