#include "device/apps/installs.h"

#include <fmt/format.h>

#include <unordered_map>

#include "device/state/application_rows.h"

namespace appsync::device {
namespace {

constexpr std::string_view ReadFailed = "an install's progress could not be read";
constexpr std::string_view ChangeFailed = "an install's progress could not be changed";

/// Reads and writes one row of "installs". A row that is over changes no more and stays readable,
/// which gives holders the last values.
class RowProgress final : public InstallProgress {
 public:
  RowProgress(Database& database, RegistryObservers& observers, std::int64_t number,
              std::string identifier)
      : database_(database),
        observers_(observers),
        number_(number),
        identifier_(std::move(identifier)) {}

  InstallState installState() const noexcept override {
    return static_cast<InstallState>(read("state"));
  }
  void setInstallState(InstallState state) noexcept override {
    if (write("state", static_cast<std::int64_t>(state))) observers_.installsChanged();
  }
  InstallPhase installPhase() const noexcept override {
    return static_cast<InstallPhase>(read("phase"));
  }
  void setInstallPhase(InstallPhase phase) noexcept override {
    if (write("phase", static_cast<std::int64_t>(phase))) observers_.installsChanged();
  }
  std::int64_t totalUnitCount() const noexcept override { return read("total"); }
  void setTotalUnitCount(std::int64_t count) noexcept override { write("total", count); }
  std::int64_t completedUnitCount() const noexcept override { return read("completed"); }
  void setCompletedUnitCount(std::int64_t count) noexcept override { write("completed", count); }
  void cancel() noexcept override;

  std::string description() const override {
    return fmt::format("<{} {}/{} state {} phase {}>", identifier_, completedUnitCount(),
                       totalUnitCount(), static_cast<std::uint64_t>(installState()),
                       static_cast<std::uint64_t>(installPhase()));
  }

 private:
  std::int64_t read(std::string_view column) const noexcept {
    const std::string sql = fmt::format("SELECT {} FROM installs WHERE number = ?", column);
    const auto value = database_.lookUp(ReadFailed, [&](Connection& database) {
      Query query(database, sql.c_str(), number_);
      return query.next() ? query.integer(0) : 0;
    });
    return value.value_or(0);
  }

  /// True when the row changed.
  bool write(std::string_view column, std::int64_t value) noexcept {
    const std::string sql = fmt::format(
        "UPDATE installs SET {0} = ?1 WHERE number = ?2 AND NOT over AND {0} <> ?1", column);
    int changed = 0;
    const auto set = [&](Connection& database) {
      changed = Query(database, sql.c_str(), value, number_).run();
    };
    return database_.change(ChangeFailed, Database::Commit::Ordinary, set) && changed > 0;
  }

  Database& database_;
  RegistryObservers& observers_;
  const std::int64_t number_;
  const std::string identifier_;
};

void RowProgress::cancel() noexcept {
  if (!write("state", static_cast<std::int64_t>(InstallState::Canceled))) return;
  std::vector<AppRecord> records;
  const auto rows = readApplication(database_, identifier_);
  if (rows && rows->any()) {
    records.push_back((rows->placeholder ? rows->placeholder : rows->installed)->record());
  }
  observers_.installsCancelled(records);
  observers_.installsChanged();
}

}  // namespace

void beginInstall(Connection& database, std::string_view identifier) {
  endInstall(database, identifier, InstallState::Canceled);
  Query(database,
        "INSERT INTO installs (identifier, state, phase, total, completed, over) "
        "VALUES (?, ?, ?, 0, 0, 0)",
        identifier, InstallState::Waiting, InstallPhase::Loading)
      .run();
}

bool endInstall(Connection& database, std::string_view identifier, InstallState finalState) {
  return Query(database,
               "UPDATE installs SET over = 1, state = ? WHERE identifier = ? AND NOT over",
               finalState, identifier)
             .run() > 0;
}

bool isInstalling(Connection& database, std::string_view identifier) {
  return Query(database,
               "SELECT 1 FROM installs WHERE identifier = ? AND NOT over AND state IN (?, ?, ?)",
               identifier, InstallState::Waiting, InstallState::Active, InstallState::Paused)
      .next();
}

RegistryObservers::Report reportInstalls(Database& database) {
  const auto look = [](Connection& connection) {
    RegistryObservers::Report report;
    // All at once: one by one would take as long as a sync with thousands of placeholders.
    const std::vector<ApplicationRow> rows = allApplications(connection);
    std::unordered_map<std::string_view, const ApplicationRow*> shown;
    for (const ApplicationRow& row : rows) shown[row.identifier] = &row;  // placeholders come last
    Query query(connection,
                "SELECT identifier, state FROM installs WHERE NOT over AND state IN (?, ?, ?) "
                "ORDER BY number",
                InstallState::Waiting, InstallState::Active, InstallState::Paused);
    while (query.next()) {
      const auto row = shown.find(query.text(0));
      if (row == shown.end()) continue;
      const bool paused = query.as<InstallState>(1) == InstallState::Paused;
      (paused ? report.paused : report.prioritized).push_back(row->second->record());
    }
    return report;
  };
  return database.lookUp("the installs under way could not be read", look)
      .value_or(RegistryObservers::Report());
}

std::shared_ptr<InstallProgress> currentProgress(Database& database, RegistryObservers& observers,
                                                 std::string_view identifier) {
  using Progress = std::shared_ptr<InstallProgress>;
  const auto look = [&](Connection& connection) -> Progress {
    Query query(connection, "SELECT number FROM installs WHERE identifier = ? AND NOT over",
                identifier);
    if (!query.next()) return nullptr;
    return std::make_shared<RowProgress>(database, observers, query.integer(0),
                                         std::string(identifier));
  };
  return database.lookUp(ReadFailed, look).value_or(nullptr);
}

}  // namespace appsync::device
