#pragma once

#include <atomic>
#include <functional>
#include <thread>

#include "platform/mutex.h"

namespace appsync {

/// The person's wish to end early. Asked from any thread.
class Interruption {
 public:
  bool requested() const noexcept { return requested_; }
  /// Only the first request counts. Runs the listener before it returns.
  void request();

  /// What is to happen at once when the wish comes, now if it has come already; an empty function
  /// for nothing. When this returns, the old listener is not running and never will.
  void setListener(std::function<void()> listener);

 private:
  std::atomic<bool> requested_{false};
  Mutex mutex_;
  std::function<void()> listener_ APPSYNC_GUARDED_BY(mutex_);
};

/// Turns the first SIGINT, SIGTERM or SIGHUP into a request; another SIGINT or SIGTERM ends the
/// process with code 130 at once (a terminal that goes away may hang up more than once). A SIGHUP
/// that the process was started to ignore stays ignored. One at a time in a process. Outside its
/// life the signals do what they did before.
class SignalWatcher {
 public:
  explicit SignalWatcher(Interruption& interruption);
  ~SignalWatcher();
  SignalWatcher(const SignalWatcher&) = delete;
  SignalWatcher& operator=(const SignalWatcher&) = delete;

 private:
  std::thread thread_;
};

/// While true, a process that ends at once first makes the terminal's cursor visible again.
void setCursorHidden(bool hidden) noexcept;

}  // namespace appsync
