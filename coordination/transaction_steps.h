#pragma once

#include <cstdint>
#include <string_view>

#include "platform/transaction_log.h"

namespace appsync {

/// The steps of a coordinated install, as the transaction log numbers them.
enum class TransactionStep : std::uint32_t {
  InstallApp = 1,
  RestoreApp = 2,
  CreateCoordinator = 3,
  CreatePlaceholder = 4,
  CopyIcon = 5,
  UninstallApp = 7,
};

inline constexpr std::uint32_t TransactionPartySyncHost = 1;

inline void logStepBegin(TransactionLog& log, TransactionStep step, std::string_view bundleId,
                         std::string_view description) {
  log.logStep(static_cast<std::uint32_t>(step), TransactionPartySyncHost, 1, true, bundleId,
              description);
}

inline void logStepEnd(TransactionLog& log, TransactionStep step, bool success,
                       std::string_view bundleId, std::string_view description) {
  log.logStep(static_cast<std::uint32_t>(step), TransactionPartySyncHost, 2, success, bundleId,
              description);
}

}  // namespace appsync
