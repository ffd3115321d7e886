#include "device/journal/history.h"

#include "device/state/clock.h"

namespace appsync::device {
namespace {

/// A device made by an older program has it only after it was opened for writing.
bool hasTable(SQLite::Database& database) {
  return Query(database, "SELECT 1 FROM sqlite_schema WHERE type = 'table' AND name = 'history'")
      .next();
}

HistoryEntry entryOf(const Query& query) {
  HistoryEntry entry;
  entry.number = query.integer(0);
  entry.time = query.real(1);
  entry.event = query.as<HistoryEvent>(2);
  entry.origin = query.as<HistoryOrigin>(3);
  entry.bundleId = query.text(4);
  entry.version = query.optionalText(5);
  entry.replaced = query.optionalText(6);
  entry.reason = query.text(7);
  return entry;
}

}  // namespace

void makeHistoryTable(SQLite::Database& database) {
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

void enterInHistory(SQLite::Database& database, const HistoryEntry& entry) {
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
  std::vector<HistoryEntry> entries;
  const bool read = database.read(
      "the history could not be read",
      [&](SQLite::Database& connection) {
        if (!hasTable(connection)) return;
        Query query(connection,
                    "SELECT number, time, event, origin, identifier, version, replaced, reason "
                    "FROM history ORDER BY number");
        while (query.next()) entries.push_back(entryOf(query));
      },
      error);
  if (!read) entries.clear();
  return entries;
}

}  // namespace appsync::device
