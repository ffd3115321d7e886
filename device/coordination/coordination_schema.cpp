#include "device/coordination/coordination_schema.h"

namespace appsync::device {
namespace {

// Rows of what is over stay until the device is next opened for writing, so that whoever still
// holds it reads the last values; those of coordinators with events to deliver stay longer.
constexpr const char* Schema = R"(
CREATE TABLE IF NOT EXISTS install_coordinators (
  number INTEGER PRIMARY KEY AUTOINCREMENT,
  identifier TEXT NOT NULL,
  kind INTEGER NOT NULL,
  creator INTEGER NOT NULL,
  stage INTEGER NOT NULL,
  options BLOB,                  -- property list
  initial_promises BLOB,         -- property list: their numbers
  package_promise INTEGER,
  responsible_client INTEGER NOT NULL,
  user_data_promise INTEGER,
  placeholder INTEGER,
  error BLOB                     -- property list
);
CREATE UNIQUE INDEX IF NOT EXISTS install_coordinators_live
  ON install_coordinators (identifier) WHERE stage IN (0, 1);

CREATE TABLE IF NOT EXISTS data_promises (
  number INTEGER PRIMARY KEY AUTOINCREMENT,
  sort INTEGER NOT NULL,
  name TEXT NOT NULL,
  client INTEGER NOT NULL,
  disk_space INTEGER NOT NULL,   -- bytes
  path TEXT,
  path_is_directory INTEGER NOT NULL,
  percent REAL NOT NULL,         -- 1.0 is all
  complete INTEGER NOT NULL,
  began INTEGER NOT NULL,        -- its coordinator's client was told so
  over INTEGER NOT NULL
);

CREATE TABLE IF NOT EXISTS install_placeholders (
  number INTEGER PRIMARY KEY AUTOINCREMENT,
  identifier TEXT NOT NULL,
  name TEXT NOT NULL,
  install_type INTEGER NOT NULL,
  client INTEGER NOT NULL,
  icon_promise INTEGER,
  attributes BLOB,               -- property list
  metadata BLOB,                 -- property list
  sinf BLOB,
  configured INTEGER NOT NULL,
  presence INTEGER NOT NULL,
  over INTEGER NOT NULL
);

-- What is still to be told to somebody.
CREATE TABLE IF NOT EXISTS coordinator_events (
  number INTEGER PRIMARY KEY AUTOINCREMENT,
  coordinator INTEGER NOT NULL,
  kind INTEGER NOT NULL,
  promise INTEGER NOT NULL,
  reason BLOB,                   -- property list
  client INTEGER NOT NULL
);
)";

}  // namespace

void makeCoordinationTables(SQLite::Database& database) { database.exec(Schema); }

}  // namespace appsync::device
