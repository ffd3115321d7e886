#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "device/state/database.h"
#include "platform/install_coordination.h"

namespace appsync::device {

/// How far a coordinator has come. Stored: values do not change.
enum class Stage {
  Waiting = 0,     ///< for something from its clients, or for its turn
  Installing = 1,  ///< its package; past cancelling
  Completed = 2,   ///< with an error if the install failed
  Cancelled = 3,
};

struct CoordinatorRow {
  std::int64_t number = 0;  ///< 0: not entered yet
  std::string identifier{};
  CoordinatorKind kind = CoordinatorKind::Initiating;
  CoordinationClientId creator = 0;
  Stage stage = Stage::Waiting;
  std::optional<Bytes> options{};
  std::optional<Bytes> initialPromises{};
  std::optional<std::int64_t> package{};
  CoordinationClientId responsible = 0;
  std::optional<std::int64_t> userData{};
  std::optional<std::int64_t> placeholder{};
  std::optional<Bytes> error{};

  bool isLive() const { return stage == Stage::Waiting || stage == Stage::Installing; }
};

/// Stored: values do not change.
enum class PromiseSort { Path = 0, OutOfBand = 1 };

struct PromiseRow {
  std::int64_t number = 0;  ///< 0: not entered yet
  PromiseSort sort = PromiseSort::Path;
  std::string name{};
  CoordinationClientId client = 0;
  std::uint64_t diskSpace = 0;  ///< bytes
  std::optional<std::string> path{};
  bool pathIsDirectory = false;
  double percent = 0;
  bool complete = false;
  bool began = false;
  bool over = false;
};

/// What a placeholder has in the registry. Stored: values do not change.
enum class Presence {
  None = 0,
  Begun = 1,  ///< perhaps there, perhaps not
  Installed = 2,
  Adopted = 3,   ///< all that was left of the application stands in its stead, and is to stay
  Forsaken = 4,  ///< perhaps there; goes like an application that a person uninstalls
};

struct PlaceholderRow {
  std::int64_t number = 0;  ///< 0: not entered yet
  std::string identifier{};
  std::string name{};
  InstallType installType = InstallType::None;
  CoordinationClientId client = 0;
  std::optional<std::int64_t> icon{};
  std::optional<Bytes> attributes{};
  std::optional<Bytes> metadata{};
  std::optional<Bytes> sinf{};
  bool configured = false;
  Presence presence = Presence::None;
  bool over = false;

  bool stands() const { return presence == Presence::Installed || presence == Presence::Adopted; }
};

/// Stored: values do not change.
enum class EventKind {
  PromiseBegan = 0,
  PlaceholderInstalled = 1,
  Completed = 2,
  Prioritize = 3,
  Cancelled = 4,
};

struct EventRow {
  std::int64_t number = 0;
  CoordinatorRow coordinator;
  EventKind kind = EventKind::Completed;
  std::uint64_t promise = 0;
  std::optional<Bytes> reason;
  CoordinationClientId client = 0;
};

/// Makes those of the coordination service's tables that are missing. Throws SQLite::Exception.
void makeCoordinationTables(Connection& database);

// These throw SQLite::Exception and are used within Database's work. "put" enters a row that has no
// number yet and gives it one.

std::optional<CoordinatorRow> findCoordinator(Connection& database, std::int64_t number);
std::optional<CoordinatorRow> findLiveCoordinator(Connection& database,
                                                  std::string_view identifier);
std::vector<CoordinatorRow> allCoordinators(Connection& database);
/// The live coordinators that use a promise for their package, their user data or their
/// placeholder's icon.
std::vector<CoordinatorRow> coordinatorsUsingPromise(Connection& database, std::int64_t promise);
std::optional<CoordinatorRow> coordinatorWithPlaceholder(Connection& database,
                                                         std::int64_t placeholder);
void put(Connection& database, CoordinatorRow& row);

std::optional<PromiseRow> findPromise(Connection& database, std::optional<std::int64_t> number);
void put(Connection& database, PromiseRow& row);

std::optional<PlaceholderRow> findPlaceholder(Connection& database,
                                              std::optional<std::int64_t> number);
void put(Connection& database, PlaceholderRow& row);

void addEvent(Connection& database, const CoordinatorRow& coordinator, EventKind kind,
              std::uint64_t promise = 0, const std::optional<Bytes>& reason = std::nullopt,
              CoordinationClientId client = 0);
/// In the order in which they came about.
std::vector<EventRow> pendingEvents(Connection& database);
void removeEvent(Connection& database, std::int64_t number);

// Values of the coordination service as binary property lists. Those that come from clients may
// hold what no property list can (then nullopt and an error); bytes that are not what was written
// give nullopt.

/// An error whose user info cannot be written keeps its text.
Bytes bytesOf(const Error& error);
std::optional<Error> errorFrom(const Bytes& bytes);

[[nodiscard]] std::optional<Bytes> bytesOf(const InstallOptions& options,
                                           std::optional<Error>* error);
std::optional<InstallOptions> optionsFrom(const Bytes& bytes);

[[nodiscard]] std::optional<Bytes> bytesOf(const PlaceholderAttributes& attributes,
                                           std::optional<Error>* error);
std::optional<PlaceholderAttributes> attributesFrom(const Bytes& bytes);

[[nodiscard]] std::optional<Bytes> bytesOf(const StoreMetadata& metadata,
                                           std::optional<Error>* error);
std::optional<StoreMetadata> metadataFrom(const Bytes& bytes);

std::optional<Bytes> bytesOf(const std::vector<std::int64_t>& numbers);
std::optional<std::vector<std::int64_t>> numbersFrom(const Bytes& bytes);

}  // namespace appsync::device
