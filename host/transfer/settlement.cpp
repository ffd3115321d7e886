#include "host/transfer/settlement.h"

#include <algorithm>

namespace appsync::host {
namespace {

std::string operationOf(const std::vector<TodoState>& todo, std::string_view identifier) {
  const auto found = std::find_if(todo.begin(), todo.end(), [&](const TodoState& entry) {
    return entry.identifier == identifier;
  });
  return found == todo.end() ? std::string() : found->operation;
}

const std::string* reasonFor(const std::string& identifier,
                             const std::map<std::string, std::string>& reasons) {
  const auto found = reasons.find(identifier);
  return found == reasons.end() ? nullptr : &found->second;
}

/// Why an application that the phone was to get or to lose stayed as it was.
std::string failureReason(const std::string& identifier, const SyncEnd& end) {
  if (const auto* reason = reasonFor(identifier, end.installFailures)) return *reason;
  if (const auto* reason = reasonFor(identifier, end.transfers.failures)) return *reason;
  if (end.broken) return *end.broken;
  if (end.interrupted) return InterruptedSync;
  return "the phone did not carry it out (appsync log tells more)";
}

void settleRemoval(const PlannedEntry& entry, const SyncEnd& end, Summary& summary) {
  const bool taken = operationOf(end.todo, entry.identifier) == exchange::TodoRemove;
  const bool gone = end.present && !end.present->installed.contains(entry.identifier) &&
                    !end.present->placeholders.contains(entry.identifier);
  if (taken && gone) {
    summary.deleted.push_back(entry.identifier);
  } else {
    summary.failed.push_back({entry.identifier, failureReason(entry.identifier, end), {}, true});
  }
}

/// What nobody named may stay undone.
void notDone(const PlannedEntry& entry, const std::string& reason, Summary& summary) {
  if (entry.named) {
    summary.failed.push_back({entry.identifier, reason, {}, entry.action == Action::Remove});
  } else {
    summary.skipped.push_back({entry.identifier, reason, false});
  }
}

std::vector<std::string>& listFor(Action action, Summary& summary) {
  if (action == Action::Install) return summary.installed;
  return action == Action::Downgrade ? summary.downgraded : summary.updated;
}

void settleInstall(const PlannedEntry& entry, const SyncEnd& end, Summary& summary) {
  const std::string operation = operationOf(end.todo, entry.identifier);
  const bool asked = end.transfers.asked.count(entry.identifier) > 0;
  const bool brought = entry.byHost && end.present &&
                       end.present->installed.contains(entry.identifier) &&
                       !end.installFailures.contains(entry.identifier);
  const bool carriedOut = end.carriedOut.contains(entry.identifier);
  if (brought || carriedOut || operation == exchange::TodoInstalled) {
    listFor(entry.action, summary).push_back(entry.identifier);
  } else if (operation == exchange::TodoInstall && !asked && !end.broken && !end.interrupted) {
    notDone(entry, "the phone did not ask for its package", summary);
  } else {
    summary.failed.push_back({entry.identifier, failureReason(entry.identifier, end)});
  }
}

}  // namespace

void nameFiles(const Library& library, Summary& summary) {
  for (FailedEntry& failure : summary.failed) {
    if (failure.ofRemoval) continue;
    const PackageFacts* package = library.find(failure.identifier);
    if (package && failure.file.empty()) failure.file = package->file.filename().string();
  }
}

Summary settle(const SyncPlan& plan, const Library& library, const SyncEnd& end) {
  Summary summary;
  summary.skipped = plan.skipped;
  summary.failed = plan.failed;
  for (const PackageProblem& file : library.unreadable) {
    if (file.looksLikePackage) {
      summary.failed.push_back({file.file, file.reason, file.file});
    } else {
      summary.skipped.push_back({file.file, file.reason, false});
    }
  }
  for (const PlannedEntry& entry : plan.entries) {
    if (end.disabled) {
      notDone(entry, "the phone's restrictions forbid installing and removing", summary);
    } else if (entry.action == Action::Remove) {
      settleRemoval(entry, end, summary);
    } else {
      settleInstall(entry, end, summary);
    }
  }
  nameFiles(library, summary);
  return summary;
}

}  // namespace appsync::host
