#pragma once

#include <string>
#include <string_view>

#include "platform/home_screen_service.h"
#include "platform/log.h"

namespace appsync {

/// What follows from the home screen's answer to an install's request for a termination assertion.
struct InstallPlan {
  enum class Next { Install, Retry, Fail };

  Next next = Next::Install;
  LogLevel level = LogLevel::Default;
  std::string line;  ///< to be logged at `level`
  // To be recorded in the transaction log.
  bool recordSuccess = true;
  std::string_view recordDescription;
};

/// Pure. "Not found" is no obstacle; "denied" waits until the application has left the foreground.
InstallPlan installPlanFor(AssertionOutcome outcome, std::string_view identifier);

}  // namespace appsync
