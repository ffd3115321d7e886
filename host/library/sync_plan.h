#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "host/library/library.h"
#include "platform/app_registry.h"

namespace appsync::host {

enum class Action { Install, Update, Reinstall, Downgrade, Remove };

/// "install", "update", "reinstall", "downgrade", "remove".
std::string_view name(Action action);

struct PlannedEntry {
  Action action = Action::Install;
  std::string identifier;
  std::string version;           ///< of the package; of the installed application for a removal
  std::string installedVersion;  ///< empty for a new application
  std::string name;
};

struct SkippedEntry {
  std::string identifier;
  std::string reason;
  bool upToDate = false;  ///< there was simply nothing to do
};

/// What a sync is to do, in the order in which the phone is told.
struct SyncPlan {
  std::vector<PlannedEntry> entries;
  std::vector<SkippedEntry> skipped;
};

/// An application as the phone knows it before the sync.
struct InstalledApplication {
  std::string identifier;
  std::string version;
  std::string name;
  bool isSystem = false;
  bool isPlaceholder = false;  ///< no version of it is installed yet
};

/// One per application, sorted by identifier. Placeholders that a broken-off sync left do not
/// count.
std::vector<InstalledApplication> installedApplications(AppRegistry& registry);

struct PlanOptions {
  std::vector<std::string> install;  ///< only these; empty: every package that is new or newer
  std::vector<std::string> remove;
  bool mirror = false;
  bool installingAllowed = true;
  bool removingAllowed = true;
};

/// Pure. nullopt, with one line for people, when the wishes contradict each other or the library.
std::optional<SyncPlan> makePlan(const Library& library,
                                 const std::vector<InstalledApplication>& installed,
                                 const PlanOptions& options, std::string& problem);

}  // namespace appsync::host
