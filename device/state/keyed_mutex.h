#pragma once

#include <condition_variable>
#include <mutex>
#include <set>
#include <string>

namespace appsync::device {

/// A mutex per key: work on one application excludes other work on the same and none on others.
class KeyedMutex {
 public:
  class Guard {
   public:
    Guard(KeyedMutex& owner, std::string_view key) : owner_(owner), key_(key) {
      std::unique_lock lock(owner_.mutex_);
      owner_.released_.wait(lock, [&] { return owner_.held_.insert(key_).second; });
    }
    ~Guard() {
      {
        const std::lock_guard lock(owner_.mutex_);
        owner_.held_.erase(key_);
      }
      owner_.released_.notify_all();
    }
    Guard(const Guard&) = delete;
    Guard& operator=(const Guard&) = delete;

   private:
    KeyedMutex& owner_;
    const std::string key_;
  };

 private:
  std::mutex mutex_;
  std::condition_variable released_;
  std::set<std::string, std::less<>> held_;
};

}  // namespace appsync::device
