#pragma once

#include <map>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/error.h"
#include "tests/fakes/call_trace.h"

namespace appsync::fakes {

/// Which calls of which operations fail, and how. Operations are named as in the trace
/// ("FileManager.writeAtomically"). Called from any thread.
class FaultPlan {
 public:
  explicit FaultPlan(CallTrace& trace) : trace_(trace) {}

  /// Fails one call, counted from 1 and from now on.
  void failCall(std::string_view operation, unsigned number, Error error);
  void failEvery(std::string_view operation, Error error);
  /// Fails every call whose first argument (a path, an identifier) contains `part`.
  void failWhere(std::string_view operation, std::string_view part, Error error);
  /// No more faults.
  void clear();

  /// Counts a call, and gives the error with which it is to fail.
  std::optional<Error> next(std::string_view operation, std::string_view argument);

  /// The same for an operation with an error out-argument: true when it is to fail.
  bool strikes(std::string_view operation, std::string_view argument, std::optional<Error>* error);

 private:
  struct Fault {
    std::optional<unsigned> callsLeft;  // none: every call
    std::string part;
    Error error;
  };

  CallTrace& trace_;
  std::mutex mutex_;
  std::map<std::string, std::vector<Fault>, std::less<>> faults_;
};

}  // namespace appsync::fakes
