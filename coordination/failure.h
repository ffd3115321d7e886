#pragma once

#include <cstdint>
#include <memory>
#include <string_view>

#include "client/log_message.h"
#include "platform/install_coordination.h"

namespace appsync {

/// Codes of TWErrorDomain with which the client gives up what it coordinates.
enum class FailureCode : std::int64_t {
  InstallFailed = 1,
  RestoreCancelled = 2,
  RestoreFailed = 29,
  TransferFailed = 30,
};

inline Error failure(FailureCode code) {
  Error error;
  error.domain = TWErrorDomain;
  error.code = static_cast<std::int64_t>(code);
  return error;
}

/// Passes over a null coordinator.
inline void cancelCoordinator(const ClientLog& log, std::string_view bundleId,
                              const std::shared_ptr<InstallCoordinator>& coordinator,
                              const Error& reason) {
  if (!coordinator) return;
  log.normal("Cancelling coordinator for appBundleIdentifier:%{public}@", bundleId);
  coordinator->cancel(reason, SyncHostClientID);
}

/// Passes over a null placeholder.
inline void cancelPlaceholder(const ClientLog& log, std::string_view bundleId,
                              const std::shared_ptr<InstallPlaceholder>& placeholder,
                              const Error& reason) {
  if (!placeholder) return;
  log.normal("Cancelling placeholder for appBundleIdentifier:%{public}@", bundleId);
  placeholder->cancel(reason, SyncHostClientID);
}

}  // namespace appsync
