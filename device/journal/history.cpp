#include "device/journal/history.h"

#include "device/state/clock.h"

namespace appsync::device {
namespace {

/// A device made by an older program has it only after it was opened for writing.
bool hasTable(Connection& database) {
  return Query(database, "SELECT 1 FROM sqlite_schema WHERE type = 'table' AND name = 'history'")
      .next();
}

HistoryEntry entryOf(const Query& query) {
  HistoryEntry entry;
  query.take(0, entry.number, entry.time, entry.event, entry.origin, entry.bundleId, entry.version,
             entry.replaced, entry.reason);
  return entry;
}

}  // namespace

void makeHistoryTable(Connection& database) {
  database.exec(R"(
CREATE TABLE IF NOT EXISTS history (
  number INTEGER PRIMARY KEY AUTOINCREMENT,
  time REAL NOT NULL,
  event INTEGER NOT NULL,
  origin INTEGER NOT NULL,
  identifier TEXT NOT NULL,
  version TEXT,
  replaced TEXT,
  reason TEXT NOT NULL
))");
}

void enterInHistory(Connection& database, const HistoryEntry& entry) {
  Query(database,
        "INSERT INTO history (time, event, origin, identifier, version, replaced, reason) "
        "VALUES (?, ?, ?, ?, ?, ?, ?)",
        secondsSince1970(), entry.event, entry.origin, entry.bundleId, entry.version,
        entry.replaced, entry.reason)
      .run();
  Query(database, "DELETE FROM history WHERE number <= last_insert_rowid() - ?", HistoryEntriesKept)
      .run();
}

std::vector<HistoryEntry> readHistory(Database& database, std::optional<Error>* error) {
  const auto allEntries = [](Connection& connection) {
    if (!hasTable(connection)) return std::vector<HistoryEntry>();
    return Query(connection,
                 "SELECT number, time, event, origin, identifier, version, replaced, reason "
                 "FROM history ORDER BY number")
        .all(entryOf);
  };
  return database.lookUp("the history could not be read", allEntries, error)
      .value_or(std::vector<HistoryEntry>());
}

}  // namespace appsync::device
