#include "tests/fakes/fault_plan.h"

namespace appsync::fakes {

void FaultPlan::failCall(std::string_view operation, unsigned number, Error error) {
  const std::scoped_lock lock(mutex_);
  faults_[std::string(operation)].push_back({number, {}, std::move(error)});
}

void FaultPlan::failEvery(std::string_view operation, Error error) {
  failWhere(operation, {}, std::move(error));
}

void FaultPlan::failWhere(std::string_view operation, std::string_view part, Error error) {
  const std::scoped_lock lock(mutex_);
  faults_[std::string(operation)].push_back({std::nullopt, std::string(part), std::move(error)});
}

void FaultPlan::clear() {
  const std::scoped_lock lock(mutex_);
  faults_.clear();
}

std::optional<Error> FaultPlan::next(std::string_view operation, std::string_view argument) {
  const std::scoped_lock lock(mutex_);
  const auto found = faults_.find(operation);
  if (found == faults_.end()) return std::nullopt;
  std::optional<Error> error;
  for (Fault& fault : found->second) {
    const bool due = fault.callsLeft ? *fault.callsLeft > 0 && --*fault.callsLeft == 0
                                     : argument.find(fault.part) != std::string_view::npos;
    if (due && !error) error = fault.error;
  }
  if (error) trace_.add(TraceCall, "fault " + callText(operation, argument));
  return error;
}

bool FaultPlan::strikes(std::string_view operation, std::string_view argument,
                        std::optional<Error>* error) {
  std::optional<Error> planned = next(operation, argument);
  if (!planned) return false;
  setError(error, std::move(*planned));
  return true;
}

}  // namespace appsync::fakes
