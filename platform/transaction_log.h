#pragma once

#include <cstdint>
#include <optional>
#include <string_view>

#include "platform/log.h"

namespace appsync {

/// The record of install milestones. Called from any thread; a record that cannot be kept is
/// dropped.
class TransactionLog {
 public:
  virtual ~TransactionLog() = default;

  /// Called once before any record; keeps its own copy of what the handle names.
  virtual void initializeWithLog(const LogHandle& handle) noexcept = 0;

  /// One step of a named scenario; `step` is nullopt where the scenario has no steps.
  virtual void logScenario(std::string_view scenario, std::optional<std::uint32_t> step,
                           bool success, std::string_view bundleId,
                           std::string_view description) noexcept = 0;

  /// One step of a coordinated install. `party` 1 is the sync host; `phase` is 1 at its begin, 2 at
  /// its end.
  virtual void logStep(std::uint32_t step, std::uint32_t party, std::uint32_t phase, bool success,
                       std::string_view bundleId, std::string_view description) noexcept = 0;
};

}  // namespace appsync
