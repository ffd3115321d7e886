#pragma once

#include <chrono>
#include <deque>
#include <functional>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

#include "platform/mutex.h"

namespace appsync::device {

/// Threads that do jobs: those of one key one after another, those of different keys beside one
/// another. Thread-safe.
class KeyedWorkers {
 public:
  using Job = std::function<void()>;

  explicit KeyedWorkers(std::size_t threads);
  ~KeyedWorkers() { stop(); }

  /// After stop, the job is dropped.
  void add(std::string_view key, Job job,
           std::chrono::milliseconds delay = std::chrono::milliseconds(0));
  /// Does the job on the calling thread while none of the same key runs; at once if this is itself
  /// called from a job of the key.
  void exclusively(std::string_view key, const Job& job);

  /// Whether a job of the key runs or is due, now or later.
  bool isBusy(std::string_view key);

  /// Does delayed jobs at once, and later ones without delay.
  void expedite();
  /// Does all that was added, without delay, and ends the threads. Not to be called from a job.
  void stop();

  using Clock = std::chrono::steady_clock;
  struct Pending {
    std::string key;
    Job job;
    Clock::time_point due;
  };
  /// When a worker that finds nothing to do is to look again by itself; none when only a change can
  /// bring something: a job that is due already waits for its key, whose end is a change.
  static std::optional<Clock::time_point> nextLook(const std::deque<Pending>& pending,
                                                   Clock::time_point now);

 private:
  void run();
  /// The first job that may run now; end() when there is none.
  std::deque<Pending>::iterator next() APPSYNC_REQUIRES(mutex_);
  /// Until something changes or the next job falls due.
  void waitForChange() APPSYNC_REQUIRES(mutex_);
  void perform(const std::string& key, const Job& job) APPSYNC_REQUIRES(mutex_);
  /// Whether this is called from a job of the key.
  bool isRunHere(std::string_view key);

  Mutex mutex_;
  Condition changed_;
  std::deque<Pending> pending_ APPSYNC_GUARDED_BY(mutex_);
  std::map<std::string, std::thread::id, std::less<>> running_ APPSYNC_GUARDED_BY(mutex_);
  bool expedited_ APPSYNC_GUARDED_BY(mutex_) = false;
  bool stopping_ APPSYNC_GUARDED_BY(mutex_) = false;

  std::vector<std::thread> threads_;
};

}  // namespace appsync::device
