#include "device/coordination/coordination_state.h"

#include "device/state/application_rows.h"

namespace appsync::device {
namespace {

bool isFulfilled(const PromiseRow& package) { return package.complete && package.path; }

void end(Connection& database, std::optional<PromiseRow> promise) {
  if (!promise || promise->over) return;
  promise->over = true;
  put(database, *promise);
}

/// Nothing that belongs to the coordinator changes any more.
void settle(Connection& database, const CoordinatorRow& coordinator) {
  end(database, findPromise(database, coordinator.package));
  end(database, findPromise(database, coordinator.userData));
  if (coordinator.initialPromises) {
    for (const std::int64_t number :
         numbersFrom(*coordinator.initialPromises).value_or(std::vector<std::int64_t>{})) {
      end(database, findPromise(database, number));
    }
  }
  if (auto placeholder = findPlaceholder(database, coordinator.placeholder)) {
    end(database, findPromise(database, placeholder->icon));
    placeholder->over = true;
    put(database, *placeholder);
  }
}

void noteBeginning(Connection& database, const CoordinatorRow& coordinator,
                   std::optional<PromiseRow> promise, Consequences& consequences) {
  if (!promise || promise->over || promise->began) return;
  if (promise->percent <= 0 && !promise->path) return;
  promise->began = true;
  put(database, *promise);
  addEvent(database, coordinator, EventKind::PromiseBegan,
           static_cast<std::uint64_t>(promise->number));
  consequences.events = true;
}

/// A restored application that a person does not want goes with what the restore had for it.
void forsake(Connection& database, const CoordinatorRow& coordinator) {
  const auto placeholder = findPlaceholder(database, coordinator.placeholder);
  const bool waits =
      placeholder && placeholder->installType == InstallType::Restore &&
      (placeholder->presence == Presence::Begun || placeholder->presence == Presence::Installed) &&
      !findApplication(database, coordinator.identifier).installed;
  if (waits) setPresence(database, *placeholder, Presence::Forsaken);
}

}  // namespace

Step nextStep(const CoordinatorState& state) {
  const CoordinatorRow& coordinator = state.coordinator;
  if (coordinator.stage != Stage::Waiting || !state.placeholder || !state.placeholder->configured) {
    return Step::None;
  }
  if (!state.placeholder->stands()) {
    const bool iconIsComing = state.icon && !state.icon->complete && !state.icon->over;
    return iconIsComing ? Step::None : Step::InstallPlaceholder;
  }
  if (coordinator.kind == CoordinatorKind::RestoringDemoted) return Step::Complete;
  const bool ready = coordinator.options && state.package && isFulfilled(*state.package);
  return ready ? Step::InstallPackage : Step::None;
}

CoordinatorState loadState(Connection& database, const CoordinatorRow& coordinator) {
  CoordinatorState state{coordinator, findPlaceholder(database, coordinator.placeholder),
                         std::nullopt, findPromise(database, coordinator.package)};
  if (state.placeholder) state.icon = findPromise(database, state.placeholder->icon);
  return state;
}

void noteConsequences(Connection& database, const CoordinatorRow& coordinator,
                      Consequences& consequences) {
  if (!coordinator.isLive()) return;
  const CoordinatorState state = loadState(database, coordinator);
  noteBeginning(database, coordinator, state.icon, consequences);
  noteBeginning(database, coordinator, state.package, consequences);
  if (nextStep(state) != Step::None) {
    consequences.ready.insert_or_assign(coordinator.identifier, coordinator.number);
  }
}

bool cancel(Connection& database, CoordinatorRow coordinator, const Error& reason,
            CoordinationClientId client, Consequences& consequences) {
  if (coordinator.stage != Stage::Waiting) return false;
  coordinator.stage = Stage::Cancelled;
  coordinator.error = bytesOf(reason);
  put(database, coordinator);
  settle(database, coordinator);
  if (client == PersonClientID) forsake(database, coordinator);
  consequences.over.insert(coordinator.identifier);
  if (client != coordinator.creator) {
    addEvent(database, coordinator, EventKind::Cancelled, 0, coordinator.error, client);
    consequences.events = true;
  }
  return true;
}

void complete(Connection& database, CoordinatorRow coordinator, const std::optional<Error>& error,
              Consequences& consequences) {
  if (!coordinator.isLive()) return;
  coordinator.stage = Stage::Completed;
  if (error) coordinator.error = bytesOf(*error);
  put(database, coordinator);
  settle(database, coordinator);
  addEvent(database, coordinator, EventKind::Completed);
  consequences.events = true;
  consequences.over.insert(coordinator.identifier);
}

bool lostItsPlaceholder(Connection& database, const CoordinatorRow& coordinator) {
  const auto placeholder = findPlaceholder(database, coordinator.placeholder);
  return coordinator.stage == Stage::Waiting && placeholder && placeholder->stands() &&
         !findApplication(database, coordinator.identifier).placeholder;
}

bool waitsOn(Connection& database, const CoordinatorRow& coordinator,
             const PlaceholderRow& placeholder) {
  return coordinator.kind == CoordinatorKind::Restoring && placeholder.stands() &&
         placeholder.identifier == coordinator.identifier &&
         !findApplication(database, coordinator.identifier).installed;
}

void setPresence(Connection& database, PlaceholderRow placeholder, Presence presence) {
  placeholder.presence = presence;
  put(database, placeholder);
}

Leftovers findLeftovers(Connection& database, std::string_view identifier) {
  Leftovers left;
  Query placeholders(database,
                     "SELECT p.number FROM install_placeholders p JOIN install_coordinators c "
                     "ON c.placeholder = p.number WHERE c.identifier = ? "
                     "AND c.error IS NOT NULL AND c.stage NOT IN (0, 1) AND p.presence <> 0",
                     identifier);
  while (placeholders.next()) {
    left.placeholders.push_back(*findPlaceholder(database, placeholders.integer(0)));
  }
  // A file that has been promised anew is no leftover.
  Query packages(database,
                 "SELECT p.number FROM data_promises p JOIN install_coordinators c "
                 "ON c.package_promise = p.number WHERE c.identifier = ? "
                 "AND c.stage NOT IN (0, 1) AND p.complete AND p.path IS NOT NULL "
                 "AND NOT EXISTS (SELECT 1 FROM data_promises q "
                 "WHERE q.path = p.path AND q.number <> p.number AND NOT q.over)",
                 identifier);
  while (packages.next()) left.packages.push_back(*findPromise(database, packages.integer(0)));
  return left;
}

}  // namespace appsync::device
