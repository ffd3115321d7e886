#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "host/library/library.h"

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
  bool byHost = false;  ///< its placeholder waits, and the client does not ask for its package
  bool named = false;   ///< somebody asked for just this
};

/// Why nothing is installed.
inline constexpr std::string_view InstallingForbidden =
    "installing applications is forbidden on the phone (appsync policy --installing allow)";
/// Why a demoted application stays as it is.
inline constexpr std::string_view StaysDemoted = "stays a placeholder until it is asked for";

struct SkippedEntry {
  std::string identifier;
  std::string reason;
  bool upToDate = false;  ///< there was simply nothing to do
};

struct FailedEntry {
  std::string identifier;  ///< a file name where no identifier could be read
  std::string reason;
  std::string file{};      ///< name of the package's file; empty when there is none
  bool ofRemoval = false;  ///< no package has to do with it
};

/// What a sync is to do, in the order in which the phone is told.
struct SyncPlan {
  std::vector<PlannedEntry> entries;
  std::vector<SkippedEntry> skipped;
  std::vector<FailedEntry> failed;  ///< somebody asked for it, and it cannot be
};

/// An application as the phone knows it before the sync.
struct InstalledApplication {
  std::string identifier;
  std::string version;
  std::string name;
  bool isSystem = false;
  bool isPlaceholder = false;  ///< no version of it is installed yet
  bool isDemoted = false;      ///< and is to stay so until somebody asks for it
  bool waits = false;          ///< for a package that the client does not ask the host for
  bool isDamaged = false;      ///< its executable is gone
  bool isUntold = false;       ///< a sync installed it and was broken off before it told so
};

struct PlanOptions {
  std::vector<std::string> install;  ///< only these; empty: every package that is new or newer
  std::vector<std::string> remove;
  bool mirror = false;
  bool installingAllowed = true;
  bool removingAllowed = true;
};

/// Pure. nullopt, with one line for people, when the wishes contradict each other or the library.
[[nodiscard]] std::optional<SyncPlan> makePlan(const Library& library,
                                               const std::vector<InstalledApplication>& installed,
                                               const PlanOptions& options, std::string& problem);

}  // namespace appsync::host
