#include "device/state/application_rows.h"

#include "platform/bundle.h"

namespace appsync::device {
namespace {

#define APPLICATION_COLUMNS                                                               \
  "identifier, placeholder, type, container, bundle, version, display_name, disk_usage, " \
  "install_type, launch_prohibited, device_based, sinf"

constexpr std::string_view ReadFailed = "the registry could not be read";

ApplicationRow rowOf(const Query& query) {
  ApplicationRow row;
  query.take(0, row.identifier, row.placeholder, row.type, row.container, row.bundle, row.version,
             row.displayName, row.diskUsage, row.installType, row.launchProhibited, row.deviceBased,
             row.sinf);
  return row;
}

}  // namespace

AppRecord ApplicationRow::record() const {
  AppRecord record;
  record.applicationIdentifier = identifier;
  record.bundleIdentifier = identifier;
  record.bundleVersion = version;
  record.bundlePath = bundlePath();
  record.bundleContainerPath = container;
  record.applicationType = type;
  record.displayName = displayName;
  record.staticDiskUsage = diskUsage;
  record.installType = installType;
  record.isPlaceholder = placeholder;
  record.isDeviceBasedAssignment = deviceBased;
  return record;
}

std::string ApplicationRows::type() const {
  if (installed) return installed->type;
  return placeholder ? placeholder->type : std::string(ApplicationTypeUser);
}

void describe(ApplicationRow& row, const PropertyList::Dictionary& info) {
  const std::string* version = findString(info, KBBundleVersion);
  const std::string* name = findString(info, KBBundleDisplayName);
  if (version) row.version = *version;
  if (name) row.displayName = *name;
  row.launchProhibited = findFlag(info, "SWApplicationLaunchProhibited");
}

ApplicationRows findApplication(Connection& database, std::string_view identifier) {
  ApplicationRows rows;
  Query query(database, "SELECT " APPLICATION_COLUMNS " FROM applications WHERE identifier = ?",
              identifier);
  while (query.next()) {
    ApplicationRow row = rowOf(query);
    (row.placeholder ? rows.placeholder : rows.installed) = std::move(row);
  }
  return rows;
}

std::vector<ApplicationRow> allApplications(Connection& database) {
  return Query(database,
               "SELECT " APPLICATION_COLUMNS " FROM applications ORDER BY identifier, placeholder")
      .all(rowOf);
}

void putApplication(Connection& database, const ApplicationRow& row) {
  Query(database,
        "INSERT OR REPLACE INTO applications (" APPLICATION_COLUMNS
        ") VALUES (?, ?, ?, ?, ?, ?, ?, ?, ?, ?, ?, ?)",
        row.identifier, row.placeholder, row.type, row.container, row.bundle, row.version,
        row.displayName, row.diskUsage, row.installType, row.launchProhibited, row.deviceBased,
        row.sinf)
      .run();
}

void eraseApplication(Connection& database, const ApplicationRow& row) {
  Query(database, "DELETE FROM applications WHERE identifier = ? AND placeholder = ?",
        row.identifier, row.placeholder)
      .run();
  if (row.placeholder) {
    Query(database, "DELETE FROM asked_for WHERE identifier = ?", row.identifier).run();
  }
}

std::optional<ApplicationRows> readApplication(Database& database, std::string_view identifier,
                                               std::optional<Error>* error) {
  return database.lookUp(
      ReadFailed, [&](Connection& connection) { return findApplication(connection, identifier); },
      error);
}

std::optional<std::vector<ApplicationRow>> readApplications(Database& database,
                                                            std::optional<Error>* error) {
  return database.lookUp(ReadFailed, allApplications, error);
}

}  // namespace appsync::device
