#include "device/coordination/coordination_recovery.h"

#include <fmt/format.h>

#include <cerrno>
#include <tuple>

#include "base/identifiers.h"
#include "device/state/application_rows.h"
#include "platform/existence.h"

namespace appsync::device {
namespace {

constexpr std::int64_t EventsKept = 1'000;
/// Longer ones are cut, since they come from a store that cannot be trusted.
constexpr std::size_t LongestShown = 200;

/// Looks through one coordinator at a time.
class Repair {
 public:
  Repair(DeviceCore& device, Connection& database, Consequences& consequences,
         std::vector<std::string>& notes)
      : device_(device), database_(database), consequences_(consequences), notes_(notes) {}

  void run(CoordinatorRow row) {
    const bool isOver = row.stage == Stage::Completed || row.stage == Stage::Cancelled;
    if (isOver) {
      consequences_.over.insert(row.identifier);
      return;
    }
    if (const auto reason = damage(row)) {
      giveUp(std::move(row), *reason);
      return;
    }
    if (row.error) return complete(database_, row, std::nullopt, consequences_);  // with its error
    if (isInstalled(row)) return complete(database_, row, std::nullopt, consequences_);
    // An install that was broken off has left the old state whole.
    row.stage = Stage::Waiting;
    detachMissing(row);
    put(database_, row);
    if (const auto reason = hopelessness(row)) {
      giveUp(std::move(row), *reason);
    } else {
      noteConsequences(database_, row, consequences_);
    }
  }

 private:
  /// Why the coordinator cannot be carried on; none if it can.
  std::optional<std::string> damage(const CoordinatorRow& row) {
    if (!row.isLive()) return "its stage is unknown";
    if (!isUsableIdentifier(row.identifier)) return "no application can have its identifier";
    if (row.kind < CoordinatorKind::Initiating || row.kind > CoordinatorKind::RestoringDemoted) {
      return "its kind is unknown";
    }
    if (row.options && !optionsFrom(*row.options)) return "its options cannot be read";
    const auto placeholder = findPlaceholder(database_, row.placeholder);
    if (!placeholder) return std::nullopt;
    if (placeholder->identifier != row.identifier || placeholder->over ||
        (placeholder->attributes && !attributesFrom(*placeholder->attributes)) ||
        (placeholder->metadata && !metadataFrom(*placeholder->metadata))) {
      return "its placeholder cannot be read";
    }
    if (!placeholder->configured) return "its placeholder was never configured";
    return std::nullopt;
  }

  /// Whether the package had taken the placeholder's place, which only was not noted any more.
  bool isInstalled(const CoordinatorRow& row) {
    const ApplicationRows present = findApplication(database_, row.identifier);
    return row.stage == Stage::Installing && present.installed && !present.placeholder;
  }

  /// Why nobody will carry a coordinator on that is whole; none if somebody may.
  std::optional<std::string> hopelessness(const CoordinatorRow& row) {
    if (lostItsPlaceholder(database_, row)) return "its placeholder was taken away";
    const auto package = findPromise(database_, row.package);
    const bool isComplete = package && package->complete;
    if (isComplete && (!package->path || isGone(*package->path))) return "its package is gone";
    const auto placeholder = findPlaceholder(database_, row.placeholder);
    // What is left of the application is free for whoever else brings it.
    const bool isAdopted = placeholder && placeholder->presence == Presence::Adopted;
    if (isAdopted && !isComplete) return "its client is gone";
    return std::nullopt;
  }

  void detachMissing(CoordinatorRow& row) {
    const auto detach = [&](std::optional<std::int64_t>& number, bool isThere,
                            std::string_view what) {
      if (!number || isThere) return;
      number.reset();
      note(row, fmt::format("has lost its {} and can be given another", what));
    };
    const auto isKept = [&](const std::optional<std::int64_t>& number) {
      const auto promise = findPromise(database_, number);
      return promise && !promise->over;
    };
    detach(row.package, isKept(row.package), "package promise");
    detach(row.userData, isKept(row.userData), "user data promise");
    detach(row.placeholder, findPlaceholder(database_, row.placeholder).has_value(), "placeholder");
    if (row.initialPromises && !numbersFrom(*row.initialPromises)) {
      row.initialPromises.reset();
      note(row, "has lost its initial promises and can be given others");
    }
  }

  /// Only what is known to be missing counts.
  bool isGone(const std::string& path) { return isThere(device_.files, path, nullptr) == false; }

  /// Nobody is there yet who might have to be told.
  void giveUp(CoordinatorRow row, std::string_view why) {
    row.stage = Stage::Waiting;
    const auto placeholder = findPlaceholder(database_, row.placeholder);
    if (placeholder && waitsOn(database_, row, *placeholder)) {
      setPresence(database_, *placeholder, Presence::Adopted);
    }
    const std::string reason =
        fmt::format("the install of {} was given up: {}", shown(row.identifier), why);
    cancel(database_, row, Error::withDescription(POSIXErrorDomain, ECANCELED, reason), row.creator,
           consequences_);
    note(row, fmt::format("is cancelled: {}", why));
  }

  void note(const CoordinatorRow& row, std::string_view text) {
    notes_.push_back(fmt::format("The install coordinator of {} {}", shown(row.identifier), text));
  }

  static std::string shown(const std::string& identifier) {
    return identifier.substr(0, LongestShown);
  }

  DeviceCore& device_;
  Connection& database_;
  Consequences& consequences_;
  std::vector<std::string>& notes_;
};

// Of those that are over, all but the ones with something to tell, with a placeholder to take away,
// or with a package to take away.
constexpr const char* CoordinatorsOver = R"(
DELETE FROM install_coordinators WHERE stage NOT IN (0, 1) AND number NOT IN
  (SELECT coordinator FROM coordinator_events
  UNION SELECT c.number FROM install_coordinators c
    JOIN install_placeholders p ON p.number = c.placeholder
    WHERE c.error IS NOT NULL AND p.presence <> 0
  UNION SELECT c.number FROM install_coordinators c
    JOIN data_promises p ON p.number = c.package_promise
    WHERE p.complete AND p.path IS NOT NULL)
)";

constexpr const char* PlaceholdersOfNobody = R"(
DELETE FROM install_placeholders WHERE number NOT IN
  (SELECT placeholder FROM install_coordinators WHERE placeholder IS NOT NULL)
)";

// The initial promises' numbers are in a property list; those that are over are not needed.
constexpr const char* PromisesOfNobody = R"(
DELETE FROM data_promises WHERE number NOT IN
  (SELECT package_promise FROM install_coordinators WHERE package_promise IS NOT NULL)
  AND (over OR number NOT IN
    (SELECT user_data_promise FROM install_coordinators WHERE user_data_promise IS NOT NULL
    UNION SELECT icon_promise FROM install_placeholders WHERE icon_promise IS NOT NULL))
)";

/// Cancellations are for the process that was sending the package, which is gone.
void forgetEventsForNobody(Connection& database) {
  Query(database,
        "DELETE FROM coordinator_events WHERE kind NOT BETWEEN ?1 AND ?2 OR "
        "coordinator NOT IN (SELECT number FROM install_coordinators)",
        EventKind::PromiseBegan, EventKind::Prioritize)
      .run();
}

/// How many were too old to be kept.
int forgetOldEvents(Connection& database) {
  return Query(database,
               "DELETE FROM coordinator_events WHERE number <= "
               "(SELECT max(number) FROM coordinator_events) - ?1",
               EventsKept)
      .run();
}

}  // namespace

std::optional<Consequences> repairCoordination(DeviceCore& device) {
  Consequences consequences;
  std::vector<std::string> notes;
  const bool repaired =
      device.database.change("the install coordinators could not be looked through",
                             Database::Commit::OnDisk, [&](Connection& database) {
                               Repair repair(device, database, consequences, notes);
                               for (CoordinatorRow& row : allCoordinators(database))
                                 repair.run(std::move(row));
                             });
  if (!repaired) return std::nullopt;
  for (const std::string& text : notes) {
    device.log.write(LogChannel::TWLogCategoryFramework, LogLevel::Default, text);
  }
  return consequences;
}

void sweepCoordination(DeviceCore& device) {
  int forgotten = 0;
  // Else the next time.
  std::ignore = device.database.change("what install coordinators left could not be swept",
                                       Database::Commit::Ordinary, [&](Connection& database) {
                                         forgetEventsForNobody(database);
                                         forgotten = forgetOldEvents(database);
                                         database.exec(CoordinatorsOver);
                                         database.exec(PlaceholdersOfNobody);
                                         database.exec(PromisesOfNobody);
                                       });
  if (forgotten == 0) return;
  device.log.write(LogChannel::TWLogCategoryFramework, LogLevel::Default,
                   fmt::format("{} events of install coordinators that nobody came to hear are "
                               "forgotten: only the last {} are kept",
                               forgotten, EventsKept));
}

}  // namespace appsync::device
