#pragma once

#include <cstdint>
#include <functional>
#include <span>
#include <utility>
#include <vector>

#include "platform/mutex.h"

namespace appsync {

/// Work that costs about the same for many requests as for one, such as putting a file on disk.
/// Requests that come while it is being done for others wait and are then served together.
/// Thread-safe; the work runs on one thread at a time, on that of somebody who asks.
template <typename Request>
class SharedWork {
 public:
  /// Serves all the requests, in the order in which they came. Must not throw nor ask for itself.
  using Work = std::function<void(std::span<Request* const>)>;

  explicit SharedWork(Work work) : work_(std::move(work)) {}

  /// Returns when a run of the work that began after this call has served the request, which is
  /// borrowed until then.
  void serve(Request& request) {
    const Lock lock(mutex_);
    waiting_.push_back(&request);
    const std::uint64_t mine = nextRun_;
    while (running_ && lastRun_ < mine) ended_.wait(mutex_);
    if (lastRun_ >= mine) return;
    running_ = true;
    ++nextRun_;
    const std::vector<Request*> together = std::exchange(waiting_, {});
    {
      const Unlock unlock(mutex_);
      work_(together);
    }
    running_ = false;
    lastRun_ = mine;
    ended_.notifyAll();
  }

  /// How many requests wait for the next run.
  std::size_t waiting() const {
    const Lock lock(mutex_);
    return waiting_.size();
  }

 private:
  const Work work_;
  mutable Mutex mutex_;
  Condition ended_;
  std::vector<Request*> waiting_ APPSYNC_GUARDED_BY(mutex_);
  bool running_ APPSYNC_GUARDED_BY(mutex_) = false;
  /// The one that serves those who wait.
  std::uint64_t nextRun_ APPSYNC_GUARDED_BY(mutex_) = 1;
  /// The last that has ended.
  std::uint64_t lastRun_ APPSYNC_GUARDED_BY(mutex_) = 0;
};

}  // namespace appsync
