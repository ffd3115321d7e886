#pragma once

#include <mutex>
#include <optional>
#include <shared_mutex>
#include <string_view>

#include "phone/phone.h"

namespace appsync::device {

/// Holds the device's watcher. Calls to it run beside one another; replacing it waits for them.
class WatcherSlot {
 public:
  void set(PhoneWatcher* watcher) {
    const std::unique_lock lock(mutex_);
    watcher_ = watcher;
  }

  void assertionDenied(std::string_view identifier) {
    const std::shared_lock lock(mutex_);
    if (watcher_) watcher_->assertionDenied(identifier);
  }

  void installFinished(std::string_view identifier, const std::optional<Error>& error) {
    const std::shared_lock lock(mutex_);
    if (watcher_) watcher_->installFinished(identifier, error);
  }

 private:
  std::shared_mutex mutex_;
  PhoneWatcher* watcher_ = nullptr;
};

}  // namespace appsync::device
