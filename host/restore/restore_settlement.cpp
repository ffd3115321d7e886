#include "host/restore/restore_settlement.h"

#include "host/restore/restore_data.h"

namespace appsync::host {
namespace {

/// Why the phone has nothing at all of an application.
std::string absenceReason(const BackedUpApplication& app, const RestoreEnd& end) {
  if (end.broken) return *end.broken;
  if (end.interrupted) return InterruptedReason;
  if (!app.flaw.empty()) return app.flaw;
  return "the phone made no placeholder of it (appsync log tells more)";
}

/// Whoever names an application and tells where its package is waits for it to come.
void settlePlaceholder(const std::string& identifier, bool named, const RestoreEnd& end,
                       Summary& summary) {
  const bool heldBack = end.heldBack.contains(identifier);
  if (end.overwritten.contains(identifier) && (heldBack || !named || !end.packagesGiven)) {
    summary.dataRestored.push_back(identifier);
  } else if (heldBack) {
    summary.skipped.push_back({identifier, "stays a placeholder until it is asked for", false});
  } else if (named && end.packagesGiven) {
    summary.failed.push_back({identifier, end.missing});
  } else {
    summary.skipped.push_back({identifier, end.missing, false});
  }
}

void settleInstalled(const std::string& identifier, const RestoreEnd& end, Summary& summary) {
  const auto found = end.installedData.find(identifier);
  switch (found == end.installedData.end() ? InstalledData::LeftAlone : found->second) {
    case InstalledData::LeftAlone:
      return summary.skipped.push_back({identifier, LeftAsItIs, false});
    case InstalledData::NoneInBackup:
      return summary.skipped.push_back(
          {identifier, "is installed, and the backup has no data of it", true});
    case InstalledData::SameAlready:
      return summary.skipped.push_back({identifier, "is installed with the backup's data", true});
    case InstalledData::Overwritten:
      return summary.dataRestored.push_back(identifier);
  }
}

}  // namespace

Summary settleRestore(const RestoreList& list, const RestoreEnd& end) {
  Summary summary;
  std::map<std::string, std::string> failures = end.failures;
  for (const std::string& identifier : end.present.installed) {
    if (!end.installedBefore.contains(identifier)) summary.installed.push_back(identifier);
  }
  for (const BackedUpApplication& app : list.applications()) {
    const std::string& identifier = app.identifier;
    if (end.installedBefore.contains(identifier)) {
      if (!failures.contains(identifier)) settleInstalled(identifier, end, summary);
    } else if (end.present.installed.contains(identifier) || failures.contains(identifier)) {
      continue;
    } else if (end.present.placeholders.contains(identifier)) {
      settlePlaceholder(identifier, list.isPart(), end, summary);
    } else {
      failures.emplace(identifier, absenceReason(app, end));
    }
  }
  for (const auto& [identifier, reason] : failures) {
    const bool isNew =
        end.present.installed.contains(identifier) && !end.installedBefore.contains(identifier);
    if (!isNew) summary.failed.push_back({identifier, reason});
  }
  for (const std::string& identifier : end.updated) {
    if (!end.failures.contains(identifier)) summary.updated.push_back(identifier);
  }
  return summary;
}

}  // namespace appsync::host
