#pragma once

#include <map>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "host/library/events.h"
#include "host/phone/phone_state.h"
#include "host/transfer/package_sender.h"

namespace appsync::host {

/// Why what a sync did not get to was not done.
inline constexpr const char* InterruptedSync = "interrupted; the next sync does it";

/// What is known when a sync is over.
struct SyncEnd {
  std::vector<TodoState> todo;  ///< as the client left it; empty when it never took the list over
  std::optional<ApplicationsPresent> present;  ///< none when they cannot be told
  TransferOutcome transfers;
  std::set<std::string> carriedOut;  ///< installs that the phone itself had still to carry out
  std::map<std::string, std::string> installFailures;  ///< reason by identifier
  bool disabled = false;                               ///< by the phone's restrictions
  bool interrupted = false;
  std::optional<std::string> broken;  ///< why the sync as a whole failed
};

/// Adds to each failure but those of removals the file of the application's package, where the
/// library has one.
void nameFiles(const Library& library, Summary& summary);

/// What became of each entry of the plan and each file of the library. Pure.
Summary settle(const SyncPlan& plan, const Library& library, const SyncEnd& end);

}  // namespace appsync::host
