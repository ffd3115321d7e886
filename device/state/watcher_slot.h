#pragma once

#include <optional>
#include <string_view>

#include "phone/phone.h"
#include "platform/mutex.h"

namespace appsync::device {

/// Holds the device's watcher. Calls to it run beside one another; replacing it waits for them.
class WatcherSlot {
 public:
  void set(PhoneWatcher* watcher) {
    const Lock lock(mutex_);
    watcher_ = watcher;
  }

  void assertionDenied(std::string_view identifier) {
    const SharedLock lock(mutex_);
    if (watcher_) watcher_->assertionDenied(identifier);
  }

  void installFinished(std::string_view identifier, const std::optional<Error>& error) {
    const SharedLock lock(mutex_);
    if (watcher_) watcher_->installFinished(identifier, error);
  }

 private:
  SharedMutex mutex_;
  PhoneWatcher* watcher_ APPSYNC_GUARDED_BY(mutex_) = nullptr;
};

}  // namespace appsync::device
