#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "device/state/database.h"
#include "platform/app_registry.h"

namespace appsync::device {

/// One row of the registry: an installed application or a placeholder.
struct ApplicationRow {
  std::string identifier;
  bool placeholder = false;
  std::string type{ApplicationTypeUser};
  std::string container;  ///< directory, as the phone sees it
  std::string bundle;     ///< "<Name>.app" in it
  std::optional<std::string> version;
  std::string displayName;
  std::uint64_t diskUsage = 0;  ///< bytes
  InstallType installType = InstallType::None;
  bool launchProhibited = false;
  bool deviceBased = false;
  std::optional<Bytes> sinf;

  std::string bundlePath() const { return joinPath(container, bundle); }
  AppRecord record() const;
};

/// What an application has in the registry.
struct ApplicationRows {
  std::optional<ApplicationRow> installed;
  std::optional<ApplicationRow> placeholder;

  bool any() const { return installed || placeholder; }
  /// The type of whichever there is; a new application is the user's.
  std::string type() const;
};

/// Whether a placeholder of this type is what a demotion left.
inline bool isDemotion(InstallType placeholder) {
  return placeholder == InstallType::Downgrade || placeholder == InstallType::IntentionalDowngrade;
}

/// Takes over what a bundle's information dictionary says.
void describe(ApplicationRow& row, const PropertyList::Dictionary& info);

// These throw SQLite::Exception and are used within Database's work.

ApplicationRows findApplication(Connection& database, std::string_view identifier);
/// Sorted by identifier, the placeholder after the installed version.
std::vector<ApplicationRow> allApplications(Connection& database);
/// Replaces the row of the same sort, if there is one.
void putApplication(Connection& database, const ApplicationRow& row);
void eraseApplication(Connection& database, const ApplicationRow& row);

// The same as work of their own. nullopt, with an error, when the registry cannot be read.

[[nodiscard]] std::optional<ApplicationRows> readApplication(Database& database,
                                                             std::string_view identifier,
                                                             std::optional<Error>* error = nullptr);
[[nodiscard]] std::optional<std::vector<ApplicationRow>> readApplications(
    Database& database, std::optional<Error>* error = nullptr);

}  // namespace appsync::device
