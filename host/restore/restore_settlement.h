#pragma once

#include <map>
#include <optional>
#include <set>
#include <string>

#include "host/library/events.h"
#include "host/phone/phone_state.h"
#include "host/restore/restore_list.h"

namespace appsync::host {

inline constexpr const char* LeftAsItIs =
    "is installed: it and its data are left as they are (--overwrite-data gives back the backup's)";

/// What became of the data of an application that was installed before.
enum class InstalledData { LeftAlone, NoneInBackup, SameAlready, Overwritten };

/// What is known when a restore is over.
struct RestoreEnd {
  std::set<std::string, std::less<>> installedBefore;
  std::map<std::string, InstalledData> installedData;  ///< LeftAlone of what is not named
  ApplicationsPresent present;
  std::set<std::string> heldBack;               ///< demoted placeholders
  std::set<std::string> overwritten;            ///< placeholders whose own data gave way
  std::set<std::string> updated;                ///< installed before, and again
  std::map<std::string, std::string> failures;  ///< reason by identifier
  std::string missing;                          ///< why a placeholder has no package
  bool packagesGiven = false;                   ///< by a store or a library
  bool interrupted = false;
  std::optional<std::string> broken;  ///< why the restore as a whole failed
};

/// What became of each application of the backup and of all others that the restore touched. Pure.
Summary settleRestore(const RestoreList& list, const RestoreEnd& end);

}  // namespace appsync::host
