#include "device/coordination/coordination_store.h"

#include <cerrno>

namespace appsync::device {
namespace {

constexpr std::string_view ChangeFailed = "an install's coordination could not be changed";

Refused isOver(std::string_view what) {
  return {Error::withDescription(POSIXErrorDomain, ECANCELED, what)};
}

}  // namespace

bool CoordinationStore::change(const std::function<void(Connection&, Consequences&)>& work,
                               std::optional<Error>* error, Database::Commit commit) {
  Consequences consequences;
  const bool changed = database_.change(
      ChangeFailed, commit, [&](Connection& database) { work(database, consequences); }, error);
  if (changed) carryOut_(consequences);
  return changed;
}

bool CoordinationStore::changeCoordinator(std::int64_t number, const CoordinatorChange& work,
                                          std::optional<Error>* error) {
  return change(
      [&](Connection& database, Consequences& consequences) {
        auto row = findCoordinator(database, number);
        if (!row || !row->isLive()) throw isOver("the install is over");
        if (row->stage != Stage::Waiting) throw isOver("the package is being installed already");
        work(database, *row);
        put(database, *row);
        noteConsequences(database, *row, consequences);
      },
      error);
}

bool CoordinationStore::changePromise(std::int64_t number, const PromiseChange& work,
                                      std::optional<Error>* error) {
  return change(
      [&](Connection& database, Consequences& consequences) {
        auto row = findPromise(database, number);
        if (!row || row->over) return;
        work(*row);
        put(database, *row);
        for (const CoordinatorRow& coordinator : coordinatorsUsingPromise(database, number)) {
          noteConsequences(database, coordinator, consequences);
          if (coordinator.package != number) continue;
          consequences.progress.insert_or_assign(coordinator.identifier, row->percent);
        }
      },
      error);
}

bool CoordinationStore::changePlaceholder(std::int64_t number, const PlaceholderChange& work,
                                          std::optional<Error>* error) {
  return change(
      [&](Connection& database, Consequences& consequences) {
        auto row = findPlaceholder(database, number);
        if (!row || row->over) throw isOver("the placeholder is over");
        work(database, *row);
        put(database, *row);
        if (const auto coordinator = coordinatorWithPlaceholder(database, number)) {
          noteConsequences(database, *coordinator, consequences);
        }
      },
      error);
}

bool CoordinationStore::cancelCoordinator(std::int64_t number, const Error& reason,
                                          CoordinationClientId client) {
  bool cancelled = false;
  const bool changed = change(
      [&](Connection& database, Consequences& consequences) {
        const auto row = findCoordinator(database, number);
        cancelled = row && (row->stage == Stage::Cancelled ||
                            device::cancel(database, *row, reason, client, consequences));
      },
      nullptr);
  return changed && cancelled;
}

bool CoordinationStore::cancelPromise(std::int64_t number, const Error& reason,
                                      CoordinationClientId client) {
  return change(
      [&](Connection& database, Consequences& consequences) {
        auto row = findPromise(database, number);
        if (!row || row->over) return;
        const auto users = coordinatorsUsingPromise(database, number);
        for (const CoordinatorRow& user : users) {
          // The package that is being installed cannot be taken back.
          if (user.stage == Stage::Installing) return;
        }
        row->over = true;
        put(database, *row);
        for (const CoordinatorRow& user : users) {
          if (user.package == number) {
            device::cancel(database, user, reason, client, consequences);
          } else {
            noteConsequences(database, user, consequences);  // a placeholder does without its icon
          }
        }
      },
      nullptr);
}

bool CoordinationStore::cancelPlaceholder(std::int64_t number, const Error& reason,
                                          CoordinationClientId client) {
  bool cancelled = true;
  const bool changed = change(
      [&](Connection& database, Consequences& consequences) {
        auto row = findPlaceholder(database, number);
        if (!row || row->over) return;
        if (const auto coordinator = coordinatorWithPlaceholder(database, number)) {
          cancelled = device::cancel(database, *coordinator, reason, client, consequences);
        } else {
          row->over = true;
          put(database, *row);
        }
      },
      nullptr);
  return changed && cancelled;
}

void CoordinationStore::noteTrouble(std::int64_t coordinator, const Error& error) {
  const Lock lock(mutex_);
  troubles_.insert_or_assign(coordinator, error);
}

void CoordinationStore::noteTroubleWithPromise(std::int64_t promise, const Error& error) {
  const auto users =
      lookUp([&](Connection& database) { return coordinatorsUsingPromise(database, promise); });
  if (!users) return;
  for (const CoordinatorRow& user : *users) noteTrouble(user.number, error);
}

std::optional<Error> CoordinationStore::trouble(std::int64_t coordinator) {
  const Lock lock(mutex_);
  const auto found = troubles_.find(coordinator);
  return found == troubles_.end() ? std::nullopt : std::optional(found->second);
}

}  // namespace appsync::device
