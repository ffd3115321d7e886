#include "host/restore/restore.h"

#include "host/phone/demotions.h"
#include "host/restore/restore_data.h"
#include "host/restore/restore_settlement.h"
#include "host/transfer/settlement.h"
#include "host/transfer/shipments.h"
#include "host/transfer/staging.h"

namespace appsync::host {
namespace {

constexpr std::int32_t FromDesktopBackup = 2;
constexpr const char* NotInstalled = "the phone did not install it (appsync log tells more)";

void addUnreadable(const std::optional<Library>& library, Summary& summary) {
  if (!library) return;
  for (const UnreadablePackage& file : library->unreadable) {
    summary.skipped.push_back({file.file, file.reason, false});
  }
  nameFiles(*library, summary);
}

}  // namespace

Restore::Restore(SyncClient& client, HostProcess& host, Phone phone, Reporter& reporter,
                 Interruption& interruption)
    : Visit(client, host, phone, reporter, interruption) {}

SyncResult Restore::run(const RestoreInput& input) {
  for (const auto* library : {&input.packages, &input.catalogue}) {
    if (*library) watch_.nameFilesOf(**library);
  }
  handover_ =
      handOver(phone_, input.backup, input.list, input.overwriteData, reporter_, interruption_);
  host_.transfers().forgetCancelled();
  removeLeftOverPackages(phone_, everSent(phone_));
  failures_ = handover_.failures;
  const bool given = !handover_.broken || breakOff(*handover_.broken);
  if (given && input.overwriteData) overwriteData(input);
  SyncResult result;
  result.completed = given && !interruption_.requested() && callClient(input);
  if (input.catalogue && input.installingAllowed && !broken_) bringFromStore(input);
  if (handover_.layoutRefused && !broken_) breakOff(*handover_.layoutRefused);
  result.summary = settle(input);
  result.completed = result.completed && !broken_;
  return result;
}

void Restore::overwriteData(const RestoreInput& input) {
  for (const BackedUpApplication& app : input.list.applications()) {
    if (!handover_.installed.contains(app.identifier)) continue;
    const auto file = input.backup.data.find(app.identifier);
    if (file == input.backup.data.end()) {
      installedData_[app.identifier] = InstalledData::NoneInBackup;
    } else if (hasData(phone_, app.identifier, file->second)) {
      installedData_[app.identifier] = InstalledData::SameAlready;
    } else if (interruption_.requested()) {
      failures_[app.identifier] = InterruptedReason;
    } else if (const auto failure =
                   host::overwriteData(phone_, app, file->second, reporter_, interruption_)) {
      failures_[app.identifier] = *failure;
    } else {
      installedData_[app.identifier] = InstalledData::Overwritten;
    }
  }
}

bool Restore::callClient(const RestoreInput& input) {
  if (!isServed() || !begin(client_.currentSyncAnchor(), "the phone cannot begin a restore")) {
    return false;
  }
  std::optional<Error> error;
  client_.reconcileRestoreOfType(FromDesktopBackup, &error);
  waitUntilIdle(phone_, handover_.listed);
  if (!claimDownloads(phone_, {}, &error)) return breakOff(CannotTellApplications, error);
  reportPlaceholders(input.list);
  transfer(input);
  return !interruption_.requested();
}

void Restore::transfer(const RestoreInput& input) {
  static const Library None;
  const Library& library = input.packages ? *input.packages : None;
  if (!interruption_.requested()) sendToClient(client_.outstandingAssetTransfers(), library);
  note(sender_.outcome().failures);
  // Also what an earlier restore has sent, whatever the library holds now.
  if (!phone_.coordination && input.installingAllowed) bringPackages(input.list, library);
  waitUntilIdle(phone_, sender_.outcome().sent);
  endTransfers();
}

void Restore::bringFromStore(const RestoreInput& input) {
  const auto present = applicationsNow();
  if (!present) return;
  std::set<std::string> wanted = waitingForStore(phone_, *present);
  for (const std::string& identifier : leftOut(input.list, *present)) wanted.erase(identifier);
  Visit::bringFromStore(*present, *input.catalogue, InstallType::StoreDownload, wanted,
                        InterruptedReason);
}

void Restore::reportPlaceholders(const RestoreList& list) {
  const Demotions demotions(phone_.files);
  const auto present = applicationsNow();
  if (!present) return;
  for (const BackedUpApplication& app : list.applications()) {
    const auto found = present->placeholders.find(app.identifier);
    if (found == present->placeholders.end()) continue;
    reporter_.report(
        PlaceholderStands{app.identifier, app.name, demotions.holdBack(found->second)});
  }
}

std::set<std::string> Restore::leftOut(const RestoreList& list,
                                       const ApplicationsPresent& present) const {
  std::set<std::string> identifiers;
  for (const auto& failure : handover_.failures) identifiers.insert(failure.first);
  if (!list.isPart()) return identifiers;
  for (const auto& placeholder : present.placeholders) {
    if (!list.names(placeholder.first)) identifiers.insert(placeholder.first);
  }
  return identifiers;
}

void Restore::explainPlaceholders(const RestoreInput& input, RestoreEnd& end) {
  end.packagesGiven = input.catalogue || input.packages;
  const bool forbidden = end.packagesGiven && !input.installingAllowed;
  end.missing = forbidden         ? std::string(InstallingForbidden)
                : input.catalogue ? "the store does not have it"
                : input.packages  ? "the library does not have it"
                                  : "waits for its package";
  const std::optional<Library>& library = input.catalogue ? input.catalogue : input.packages;
  const std::set<std::string> owed = phone_.activity.packagesOwedBy(KQClientKiosk);
  const Demotions demotions(phone_.files);
  if (demotions.problem()) breakOff(*demotions.problem());
  for (const auto& [identifier, record] : end.present.placeholders) {
    if (demotions.holdBack(record)) {
      end.heldBack.insert(identifier);
    } else if (record.installType == InstallType::Sync ||
               (input.list.isPart() && !input.list.names(identifier))) {
      continue;
    } else if (!forbidden && library && library->find(identifier)) {
      failures_.emplace(identifier, broken_                     ? *broken_
                                    : interruption_.requested() ? InterruptedReason
                                                                : NotInstalled);
    } else if (phone_.coordination && record.installType == InstallType::Restore &&
               input.list.names(identifier) && !owed.contains(identifier)) {
      failures_.emplace(identifier, "the phone could not make it ready; the next restore does it");
    }
  }
}

Summary Restore::settle(const RestoreInput& input) {
  note(watch_.failures());
  RestoreEnd end;
  end.installedBefore = handover_.installed;
  end.present = applicationsNow().value_or(ApplicationsPresent());
  for (const std::string& identifier : sender_.outcome().sent) {
    if (handover_.installed.contains(identifier)) end.updated.insert(identifier);
  }
  end.installedData = installedData_;
  end.overwritten = handover_.overwritten;
  explainPlaceholders(input, end);
  end.failures = failures_;
  end.interrupted = interruption_.requested();
  end.broken = broken_;
  Summary summary = settleRestore(input.list, end);
  addUnreadable(input.packages, summary);
  addUnreadable(input.catalogue, summary);
  return summary;
}

}  // namespace appsync::host
