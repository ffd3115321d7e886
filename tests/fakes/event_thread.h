#pragma once

#include <condition_variable>
#include <deque>
#include <functional>
#include <mutex>
#include <thread>

namespace appsync::fakes {

/// A service's own thread, on which its events run one after another.
class EventThread {
 public:
  EventThread();
  /// Runs what was posted, then ends.
  ~EventThread();
  EventThread(const EventThread&) = delete;
  EventThread& operator=(const EventThread&) = delete;

  void post(std::function<void()> event);
  /// Waits until everything posted so far has run. Not to be called by an event.
  void drain();

 private:
  void run();

  std::mutex mutex_;
  std::condition_variable changed_;
  std::deque<std::function<void()>> events_;
  bool running_ = false;
  bool ending_ = false;
  std::thread thread_;
};

}  // namespace appsync::fakes
