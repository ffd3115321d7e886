#pragma once

#include <optional>
#include <string_view>

#include "platform/error.h"

namespace appsync::device {

/// Told of things that a person watching the device would see, on the threads that bring them
/// about and before the call that does so returns. Must not replace the watcher.
class DeviceWatcher {
 public:
  virtual ~DeviceWatcher() = default;
  /// A termination assertion was denied because the application is in the foreground.
  virtual void assertionDenied(std::string_view bundleId) noexcept { (void)bundleId; }
  /// A package was installed (error none) or refused.
  virtual void installFinished(std::string_view bundleId,
                               const std::optional<Error>& error) noexcept {
    (void)bundleId, (void)error;
  }
};

}  // namespace appsync::device
