#include "tests/fakes/event_thread.h"

#include <utility>

namespace appsync::fakes {

EventThread::EventThread() : thread_([this] { run(); }) {}

EventThread::~EventThread() {
  {
    const std::scoped_lock lock(mutex_);
    ending_ = true;
  }
  changed_.notify_all();
  thread_.join();
}

void EventThread::post(std::function<void()> event) {
  {
    const std::scoped_lock lock(mutex_);
    events_.push_back(std::move(event));
  }
  changed_.notify_all();
}

void EventThread::drain() {
  std::unique_lock lock(mutex_);
  changed_.wait(lock, [this] { return events_.empty() && !running_; });
}

void EventThread::run() {
  std::unique_lock lock(mutex_);
  while (true) {
    changed_.wait(lock, [this] { return ending_ || !events_.empty(); });
    if (events_.empty()) return;
    const std::function<void()> event = std::move(events_.front());
    events_.pop_front();
    running_ = true;
    lock.unlock();
    event();
    lock.lock();
    running_ = false;
    changed_.notify_all();
  }
}

}  // namespace appsync::fakes
