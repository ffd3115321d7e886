#include "transfer/install_plan.h"

#include "client/log_message.h"

namespace appsync {

InstallPlan installPlanFor(AssertionOutcome outcome, std::string_view identifier) {
  using Next = InstallPlan::Next;
  switch (outcome) {
    case AssertionOutcome::Success:
      return {Next::Install, LogLevel::Default,
              logMessage("Assertion succeeded for %{public}@", identifier), true,
              "assertion succeeded"};
    case AssertionOutcome::NotFound:
      return {Next::Install, LogLevel::Default,
              logMessage("Assertion not found for %{public}@, installing anyway...", identifier),
              true, "assertion not found"};
    case AssertionOutcome::Denied:
      return {Next::Retry, LogLevel::Error,
              logMessage("Assertion denied for %{public}@", identifier), true, "assertion denied"};
  }
  return {Next::Fail, LogLevel::Error,
          logMessage("Unknown error %d getting assertion for %{public}@",
                     static_cast<std::int32_t>(outcome), identifier),
          false, "unknown error grabbing assertion"};
}

}  // namespace appsync
