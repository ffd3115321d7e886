#include "device/schema.h"

#include <fmt/format.h>
#include <sqlite3.h>

#include <cctype>

#include "device/coordination/coordination_rows.h"
#include "device/device_folder.h"
#include "device/journal/history.h"

namespace appsync::device {
namespace {

constexpr std::int64_t ApplicationId = 0x41505359;  // in the file's header, for file(1) and us
constexpr std::int64_t FormatVersion = 1;
constexpr int BusyTimeout =
    5000;  // milliseconds; readers meet a lock only while a log is recovered

constexpr const char* Schema = R"(
CREATE TABLE settings (key TEXT PRIMARY KEY, value) WITHOUT ROWID;

-- An application has up to two rows: the installed version and a placeholder.
CREATE TABLE applications (
  identifier TEXT NOT NULL,
  placeholder INTEGER NOT NULL,
  type TEXT NOT NULL,
  container TEXT NOT NULL,       -- directory, as the phone sees it
  bundle TEXT NOT NULL,          -- "<Name>.app" in it
  version TEXT,
  display_name TEXT NOT NULL,
  disk_usage INTEGER NOT NULL,   -- bytes
  install_type INTEGER NOT NULL,
  launch_prohibited INTEGER NOT NULL,
  device_based INTEGER NOT NULL,
  sinf BLOB,
  PRIMARY KEY (identifier, placeholder)
) WITHOUT ROWID;

-- One row per install; those that are over stay until the device is next opened for writing, so
-- that whoever still holds their progress reads the last values.
CREATE TABLE installs (
  number INTEGER PRIMARY KEY AUTOINCREMENT,
  identifier TEXT NOT NULL,
  state INTEGER NOT NULL,
  phase INTEGER NOT NULL,
  total INTEGER NOT NULL,
  completed INTEGER NOT NULL,
  over INTEGER NOT NULL
);
CREATE UNIQUE INDEX installs_running ON installs (identifier) WHERE NOT over;

CREATE TABLE uninstalled (identifier TEXT PRIMARY KEY, time REAL NOT NULL) WITHOUT ROWID;

-- Applications that are gone and whose data, also what a restore still had for them, is to be removed;
-- and the names of data that was set aside for what a restore gave back.
CREATE TABLE abandoned_data (identifier TEXT PRIMARY KEY) WITHOUT ROWID;

CREATE TABLE policies (setting INTEGER PRIMARY KEY, value INTEGER NOT NULL);

-- May name applications that are not on the device: a layout can come before they do.
CREATE TABLE icon_order (
  position INTEGER PRIMARY KEY AUTOINCREMENT,
  identifier TEXT NOT NULL UNIQUE
);

CREATE TABLE transactions (
  number INTEGER PRIMARY KEY AUTOINCREMENT,
  time REAL NOT NULL,
  subsystem TEXT NOT NULL,
  category TEXT NOT NULL,
  scenario TEXT NOT NULL,
  step INTEGER,
  party INTEGER NOT NULL,
  phase INTEGER NOT NULL,
  success INTEGER NOT NULL,
  identifier TEXT NOT NULL,
  description TEXT NOT NULL
);
)";

/// Keeps the write-ahead log and its index when the last connection closes, so that a reader finds
/// them and need not make them.
void keepLogFiles(Connection& database) {
  int keep = 1;
  sqlite3_file_control(database.getHandle(), "main", SQLITE_FCNTL_PERSIST_WAL, &keep);
}

/// A "file:" URI for a path: whatever could be read as syntax is escaped.
std::string uri(const std::filesystem::path& file, std::string_view parameters) {
  std::string text = "file:";
  for (const char c : file.native()) {
    const bool plain = std::isalnum(static_cast<unsigned char>(c)) != 0 ||
                       std::string_view("/._-").find(c) != std::string_view::npos;
    text += plain ? std::string(1, c) : fmt::format("%{:02x}", static_cast<unsigned char>(c));
  }
  return text.append("?").append(parameters);
}

Connection connectForReading(const std::filesystem::path& file) {
  // A copy of a device may lack the log files, and a reader makes none. Whoever opens it for
  // writing makes them first: until then the database file alone is the whole state.
  const bool hasLog = std::filesystem::exists(file.native() + "-wal") &&
                      std::filesystem::exists(file.native() + "-shm");
  return {uri(file, hasLog ? "mode=ro&readonly_shm=1" : "immutable=1"),
          SQLite::OPEN_READONLY | SQLite::OPEN_URI, BusyTimeout};
}

Connection connect(const std::filesystem::path& file, Access access) {
  if (access == Access::ReadOnly) return connectForReading(file);
  Connection database(file.string(), SQLite::OPEN_READWRITE, BusyTimeout);
  keepLogFiles(database);
  database.exec("PRAGMA synchronous=NORMAL");
  return database;
}

std::int64_t pragma(Connection& database, const char* name) {
  return database.execAndGet(fmt::format("PRAGMA {}", name)).getInt64();
}

/// Empty when the database is whole.
std::string damage(Connection& database, Log& log) {
  const std::string found = database.execAndGet("PRAGMA quick_check(1)").getString();
  if (found != "ok") {
    log.write(LogChannel::TWLogCategoryFramework, LogLevel::Error,
              fmt::format("the phone's database is damaged: {}", found));
    return "its database is not whole";
  }
  const auto tables = database.execAndGet(
      "SELECT count(*) FROM sqlite_schema WHERE type = 'table' AND name IN ('settings', "
      "'applications', 'installs', 'uninstalled', 'abandoned_data', 'policies', 'icon_order', "
      "'transactions')");
  return tables.getInt() == 8 ? "" : "tables are missing";
}

bool isCurrentDevice(Connection& database, const std::filesystem::path& folder, Log& log,
                     DeviceError& error) {
  if (pragma(database, "application_id") != ApplicationId) {
    error = file_size(DevicePaths(folder).database) == 0
                ? damagedDevice(folder, "its database is empty")
                : foreignFolder(folder);
    return false;
  }
  const std::int64_t version = pragma(database, "user_version");
  if (version > FormatVersion) {
    error = deviceError(DeviceProblem::Foreign, folder,
                        fmt::format("the phone is of format {}, newer than the {} known here",
                                    version, FormatVersion),
                        "use the version of appsync that made it");
    return false;
  }
  const std::string found =
      version < FormatVersion ? "it has no format version" : damage(database, log);
  if (!found.empty()) error = damagedDevice(folder, found);
  return found.empty();
}

/// Those that the devices of older programs lack.
void makeLaterTables(Connection& database) {
  // What the placeholders were that a person has asked for.
  database.exec(
      "CREATE TABLE IF NOT EXISTS asked_for "
      "(identifier TEXT PRIMARY KEY, install_type INTEGER NOT NULL) WITHOUT ROWID");
  makeCoordinationTables(database);
  makeHistoryTable(database);
}

DeviceError problemOf(const SQLite::Exception& exception, const std::filesystem::path& folder) {
  switch (exception.getErrorCode()) {
    case SQLITE_NOTADB:
      if (!std::filesystem::is_directory(DevicePaths(folder).root)) return foreignFolder(folder);
      [[fallthrough]];
    case SQLITE_CORRUPT:
      return damagedDevice(folder, "its database cannot be read");
    default:
      return unusableFolder(folder, errorOf(exception).localizedDescription());
  }
}

}  // namespace

void createDatabase(const std::filesystem::path& file, const DeviceOptions& options) {
  Connection database(file.string(), SQLite::OPEN_READWRITE | SQLite::OPEN_CREATE, BusyTimeout);
  keepLogFiles(database);
  database.exec("PRAGMA journal_mode=WAL");
  SQLite::Transaction transaction(database);
  database.exec(Schema);
  makeLaterTables(database);
  Query(database, "INSERT INTO settings VALUES ('coordination', ?)", options.coordination).run();
  database.exec(fmt::format("PRAGMA application_id={}; PRAGMA user_version={}", ApplicationId,
                            FormatVersion));
  transaction.commit();
}

std::unique_ptr<Database> openDatabase(const std::filesystem::path& folder,
                                       const std::filesystem::path& file, Access access, Log& log,
                                       DeviceError& error) {
  try {
    Connection connection = connect(file, access);
    if (!isCurrentDevice(connection, folder, log, error)) return nullptr;
    if (access == Access::Write) makeLaterTables(connection);
    return std::make_unique<Database>(std::move(connection), access == Access::Write, log);
  } catch (const SQLite::Exception& exception) {
    log.write(LogChannel::TWLogCategoryFramework, LogLevel::Error,
              fmt::format("the phone's database cannot be opened: {}", exception.what()));
    error = problemOf(exception, folder);
    return nullptr;
  }
}

}  // namespace appsync::device
