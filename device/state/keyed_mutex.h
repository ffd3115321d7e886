#pragma once

#include <set>
#include <string>

#include "platform/mutex.h"

namespace appsync::device {

/// A mutex per key: work on one application excludes other work on the same and none on others.
class KeyedMutex {
 public:
  class Guard {
   public:
    Guard(KeyedMutex& owner, std::string_view key) : owner_(owner), key_(key) {
      const Lock lock(owner_.mutex_);
      while (!owner_.held_.insert(key_).second) owner_.released_.wait(owner_.mutex_);
    }
    ~Guard() {
      {
        const Lock lock(owner_.mutex_);
        owner_.held_.erase(key_);
      }
      owner_.released_.notifyAll();
    }
    Guard(const Guard&) = delete;
    Guard& operator=(const Guard&) = delete;

   private:
    KeyedMutex& owner_;
    const std::string key_;
  };

 private:
  Mutex mutex_;
  Condition released_;
  std::set<std::string, std::less<>> held_ APPSYNC_GUARDED_BY(mutex_);
};

}  // namespace appsync::device
