#pragma once

#include <map>
#include <optional>
#include <set>
#include <string>

#include "base/interruption.h"
#include "host/library/events.h"
#include "host/phone/phone_state.h"
#include "host/restore/restore_list.h"

namespace appsync::host {

/// What a phone got of a backup before its client is called.
struct Handover {
  std::set<std::string, std::less<>> installed;  ///< was on the phone before, all applications
  std::set<std::string> listed;                  ///< the client is to make placeholders of these
  std::set<std::string> overwritten;             ///< had data of their own, and the backup's waits
  std::map<std::string, std::string> failures;   ///< reason by identifier of what was left out
  std::optional<std::string> broken;             ///< why it was broken off, for people
  std::optional<std::string> layoutRefused;      ///< why the home screen stays as it is, for people
};

/// Gives a phone what it lacks of a backup: first each application's data, then the order of the
/// home screen (unless it is a part of a backup) and the demoted applications, and last the list
/// that sets the client off. Broken off or killed anywhere, it has done no harm, and the next one
/// carries on. What is installed is left alone, with its data. So is the data that any other
/// application has of its own, unless `overwriteData`: then the backup's waits for it, and takes
/// the place of its own when its package comes.
Handover handOver(const Phone& phone, const Backup& backup, const RestoreList& list,
                  bool overwriteData, Reporter& reporter, const Interruption& interruption);

}  // namespace appsync::host
