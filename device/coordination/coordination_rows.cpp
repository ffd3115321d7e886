#include "device/coordination/coordination_rows.h"

namespace appsync::device {
namespace {

#define COORDINATOR_COLUMNS                                                             \
  "c.number, c.identifier, c.kind, c.creator, c.stage, c.options, c.initial_promises, " \
  "c.package_promise, c.responsible_client, c.user_data_promise, c.placeholder, c.error"
constexpr int CoordinatorColumns = 12;

std::optional<std::int64_t> optionalInteger(const Query& query, int column) {
  return query.isNull(column) ? std::nullopt : std::optional(query.integer(column));
}

CoordinatorRow coordinatorIn(const Query& query) {
  CoordinatorRow row;
  row.number = query.integer(0);
  row.identifier = query.text(1);
  row.kind = query.as<CoordinatorKind>(2);
  row.creator = query.as<CoordinationClientId>(3);
  row.stage = query.as<Stage>(4);
  row.options = query.optionalBytes(5);
  row.initialPromises = query.optionalBytes(6);
  row.package = optionalInteger(query, 7);
  row.responsible = query.as<CoordinationClientId>(8);
  row.userData = optionalInteger(query, 9);
  row.placeholder = optionalInteger(query, 10);
  row.error = query.optionalBytes(11);
  return row;
}

std::vector<CoordinatorRow> coordinatorsIn(Query query) {
  std::vector<CoordinatorRow> rows;
  while (query.next()) rows.push_back(coordinatorIn(query));
  return rows;
}

std::optional<CoordinatorRow> firstOf(Query query) {
  return query.next() ? std::optional(coordinatorIn(query)) : std::nullopt;
}

/// A row without a number gets the next one.
std::optional<std::int64_t> keyOf(std::int64_t number) {
  return number == 0 ? std::nullopt : std::optional(number);
}

void take(std::int64_t& number, const SQLite::Database& database) {
  if (number == 0) number = database.getLastInsertRowid();
}

}  // namespace

std::optional<CoordinatorRow> findCoordinator(SQLite::Database& database, std::int64_t number) {
  return firstOf(Query(database,
                       "SELECT " COORDINATOR_COLUMNS " FROM install_coordinators c "
                       "WHERE c.number = ?",
                       number));
}

std::optional<CoordinatorRow> findLiveCoordinator(SQLite::Database& database,
                                                  std::string_view identifier) {
  return firstOf(Query(database,
                       "SELECT " COORDINATOR_COLUMNS " FROM install_coordinators c "
                       "WHERE c.identifier = ? AND c.stage IN (0, 1)",
                       identifier));
}

std::vector<CoordinatorRow> allCoordinators(SQLite::Database& database) {
  return coordinatorsIn(Query(
      database, "SELECT " COORDINATOR_COLUMNS " FROM install_coordinators c ORDER BY c.number"));
}

std::vector<CoordinatorRow> coordinatorsUsingPromise(SQLite::Database& database,
                                                     std::int64_t promise) {
  return coordinatorsIn(
      Query(database,
            "SELECT " COORDINATOR_COLUMNS " FROM install_coordinators c "
            "WHERE c.stage IN (0, 1) AND (c.package_promise = ?1 OR c.user_data_promise = ?1 "
            "OR c.placeholder IN "
            "(SELECT number FROM install_placeholders WHERE icon_promise = ?1))",
            promise));
}

std::optional<CoordinatorRow> coordinatorWithPlaceholder(SQLite::Database& database,
                                                         std::int64_t placeholder) {
  return firstOf(Query(database,
                       "SELECT " COORDINATOR_COLUMNS " FROM install_coordinators c "
                       "WHERE c.stage IN (0, 1) AND c.placeholder = ?",
                       placeholder));
}

void put(SQLite::Database& database, CoordinatorRow& row) {
  Query(database,
        "INSERT OR REPLACE INTO install_coordinators VALUES (?, ?, ?, ?, ?, ?, ?, ?, ?, ?, ?, ?)",
        keyOf(row.number), row.identifier, row.kind, row.creator, row.stage, row.options,
        row.initialPromises, row.package, row.responsible, row.userData, row.placeholder, row.error)
      .run();
  take(row.number, database);
}

std::optional<PromiseRow> findPromise(SQLite::Database& database,
                                      std::optional<std::int64_t> number) {
  Query query(database,
              "SELECT number, sort, name, client, disk_space, path, path_is_directory, percent, "
              "complete, began, over FROM data_promises WHERE number = ?",
              number);
  if (!query.next()) return std::nullopt;
  PromiseRow row;
  row.number = query.integer(0);
  row.sort = query.as<PromiseSort>(1);
  row.name = query.text(2);
  row.client = query.as<CoordinationClientId>(3);
  row.diskSpace = query.as<std::uint64_t>(4);
  row.path = query.optionalText(5);
  row.pathIsDirectory = query.boolean(6);
  row.percent = query.real(7);
  row.complete = query.boolean(8);
  row.began = query.boolean(9);
  row.over = query.boolean(10);
  return row;
}

void put(SQLite::Database& database, PromiseRow& row) {
  Query(database, "INSERT OR REPLACE INTO data_promises VALUES (?, ?, ?, ?, ?, ?, ?, ?, ?, ?, ?)",
        keyOf(row.number), row.sort, row.name, row.client, row.diskSpace, row.path,
        row.pathIsDirectory, row.percent, row.complete, row.began, row.over)
      .run();
  take(row.number, database);
}

std::optional<PlaceholderRow> findPlaceholder(SQLite::Database& database,
                                              std::optional<std::int64_t> number) {
  Query query(database,
              "SELECT number, identifier, name, install_type, client, icon_promise, attributes, "
              "metadata, sinf, configured, presence, over FROM install_placeholders "
              "WHERE number = ?",
              number);
  if (!query.next()) return std::nullopt;
  PlaceholderRow row;
  row.number = query.integer(0);
  row.identifier = query.text(1);
  row.name = query.text(2);
  row.installType = query.as<InstallType>(3);
  row.client = query.as<CoordinationClientId>(4);
  row.icon = optionalInteger(query, 5);
  row.attributes = query.optionalBytes(6);
  row.metadata = query.optionalBytes(7);
  row.sinf = query.optionalBytes(8);
  row.configured = query.boolean(9);
  row.presence = query.as<Presence>(10);
  row.over = query.boolean(11);
  return row;
}

void put(SQLite::Database& database, PlaceholderRow& row) {
  Query(database,
        "INSERT OR REPLACE INTO install_placeholders VALUES (?, ?, ?, ?, ?, ?, ?, ?, ?, ?, ?, ?)",
        keyOf(row.number), row.identifier, row.name, row.installType, row.client, row.icon,
        row.attributes, row.metadata, row.sinf, row.configured, row.presence, row.over)
      .run();
  take(row.number, database);
}

void addEvent(SQLite::Database& database, const CoordinatorRow& coordinator, EventKind kind,
              std::uint64_t promise, const std::optional<Bytes>& reason,
              CoordinationClientId client) {
  Query(database, "INSERT INTO coordinator_events VALUES (NULL, ?, ?, ?, ?, ?)", coordinator.number,
        kind, promise, reason, client)
      .run();
}

std::vector<EventRow> pendingEvents(SQLite::Database& database) {
  std::vector<EventRow> events;
  Query query(database, "SELECT " COORDINATOR_COLUMNS
                        ", e.number, e.kind, e.promise, e.reason, e.client "
                        "FROM coordinator_events e JOIN install_coordinators c "
                        "ON c.number = e.coordinator ORDER BY e.number");
  while (query.next()) {
    EventRow event;
    event.coordinator = coordinatorIn(query);
    event.number = query.integer(CoordinatorColumns);
    event.kind = query.as<EventKind>(CoordinatorColumns + 1);
    event.promise = query.as<std::uint64_t>(CoordinatorColumns + 2);
    event.reason = query.optionalBytes(CoordinatorColumns + 3);
    event.client = query.as<CoordinationClientId>(CoordinatorColumns + 4);
    events.push_back(std::move(event));
  }
  return events;
}

void removeEvent(SQLite::Database& database, std::int64_t number) {
  Query(database, "DELETE FROM coordinator_events WHERE number = ?", number).run();
}

}  // namespace appsync::device
