#pragma once

#include <map>
#include <set>

#include "device/coordination/coordination_rows.h"

namespace appsync::device {

/// Clients beside those that the platform names.
inline constexpr CoordinationClientId PersonClientID = 15;  ///< the person, on the home screen
inline constexpr CoordinationClientId DeviceClientID = 16;  ///< the coordination service itself

/// A coordinator with what decides on its next step.
struct CoordinatorState {
  CoordinatorRow coordinator;
  std::optional<PlaceholderRow> placeholder;
  std::optional<PromiseRow> icon;
  std::optional<PromiseRow> package;
};

/// What the service can do for a coordinator by itself.
enum class Step {
  None,
  InstallPlaceholder,
  InstallPackage,
  Complete,  ///< nothing is to follow the placeholder
};
Step nextStep(const CoordinatorState& state);

/// What is to be done when a change has been committed.
struct Consequences {
  std::map<std::string, std::int64_t> ready;  ///< applications with a next step; coordinators
  std::set<std::string> over;                 ///< applications with something to tidy up
  std::map<std::string, double> progress;  ///< how far applications' packages have come: 1.0 is all
  bool events = false;
};

// Changes of state. These throw SQLite::Exception and are used within Database's work.

CoordinatorState loadState(Connection& database, const CoordinatorRow& coordinator);

/// To be called when anything has changed that a live coordinator depends on: enters the events
/// that this brings about.
void noteConsequences(Connection& database, const CoordinatorRow& coordinator,
                      Consequences& consequences);

/// False when the coordinator is past cancelling.
bool cancel(Connection& database, CoordinatorRow coordinator, const Error& reason,
            CoordinationClientId client, Consequences& consequences);

/// The coordinator has come to its end, with an error if it failed.
void complete(Connection& database, CoordinatorRow coordinator, const std::optional<Error>& error,
              Consequences& consequences);

/// Whether what stood in the registry for the coordinator was taken away by somebody else. While a
/// package is being installed it goes by itself.
bool lostItsPlaceholder(Connection& database, const CoordinatorRow& coordinator);

/// Whether a restored application waits on, as its placeholder, when its package does not come.
bool waitsOn(Connection& database, const CoordinatorRow& coordinator,
             const PlaceholderRow& placeholder);

/// Changes a placeholder's presence.
void setPresence(Connection& database, PlaceholderRow placeholder, Presence presence);

/// What coordinators that are over leave behind.
struct Leftovers {
  std::vector<PlaceholderRow> placeholders;  ///< that nobody wants; perhaps in the registry
  std::vector<PromiseRow> packages;          ///< with a path to a file that is the service's
};
Leftovers findLeftovers(Connection& database, std::string_view identifier);

}  // namespace appsync::device
