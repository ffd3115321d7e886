#include "host/restore/restore_handover.h"

#include "base/identifiers.h"
#include "host/restore/restore_data.h"
#include "platform/property_list_codec.h"
#include "platform/sync_files.h"

namespace appsync::host {
namespace {

/// The backup's demotions; of a part of it those beside the phone's own of other applications.
std::optional<Bytes> demotionsOf(const Backup& backup, const RestoreList& list, FileManager& files,
                                 std::optional<Error>* error) {
  if (!list.isPart()) return backup.demotions;
  const auto onPhone = readDictionary(files, exchange::DemotedApplications, error);
  if (!onPhone) return std::nullopt;
  const auto inBackup = parseDictionary(backup.demotions).value_or(PropertyList::Dictionary());
  PropertyList::Dictionary merged;
  for (const std::string_view key :
       {exchange::AutomaticDowngradesKey, exchange::IntentionalDowngradesKey}) {
    PropertyList::Array names;
    const auto take = [&](const PropertyList::Dictionary& lists, bool named) {
      for (std::string& name : findStrings(lists, key)) {
        if (list.names(name) == named) names.emplace_back(std::move(name));
      }
    };
    take(*onPhone, false);
    take(inBackup, true);
    merged.emplace(key, std::move(names));
  }
  return serializePropertyList(std::move(merged), PropertyListFormat::Xml, error);
}

class HandoverInProgress {
 public:
  HandoverInProgress(const Phone& phone, const Backup& backup, const RestoreList& list,
                     bool overwriteData, Reporter& reporter, const Interruption& interruption)
      : phone_(phone),
        backup_(backup),
        list_(list),
        overwriteData_(overwriteData),
        reporter_(reporter),
        interruption_(interruption) {}

  Handover run() {
    if (!look()) return std::move(result_);
    sweepPlaceholders();
    chooseForClient();
    giveBackData();
    if (!interruption_.requested()) putBack();
    return std::move(result_);
  }

 private:
  /// What a restore that was killed began is carried on by the phone itself.
  bool look() {
    std::set<std::string> all;
    for (const BackedUpApplication& app : list_.applications()) all.insert(app.identifier);
    waitUntilIdle(phone_, all);
    std::optional<Error> error;
    auto present = applicationsPresent(phone_, &error);
    if (!present) {
      breakOff(CannotTellApplications, error);
      return false;
    }
    result_.installed = std::move(present->installed);
    placeholders_ = std::move(present->placeholders);
    return true;
  }

  /// A broken-off sync's would keep the client from making a restore's.
  void sweepPlaceholders() {
    if (phone_.coordination) return;
    for (const BackedUpApplication& app : list_.applications()) {
      const auto found = placeholders_.find(app.identifier);
      if (found == placeholders_.end() || found->second.installType != InstallType::Sync) continue;
      const PropertyList::Dictionary options{{std::string(UninstallPlaceholdersOnlyKey), true}};
      if (!phone_.apps.uninstallApplication(app.identifier, options)) continue;
      placeholders_.erase(found);
      reporter_.report(PlaceholderSwept{app.identifier});
    }
  }

  void chooseForClient() {
    owed_ = phone_.activity.packagesOwedBy(KQClientKiosk);
    for (const BackedUpApplication& app : list_.applications()) {
      if (result_.installed.contains(app.identifier) || isRestoring(app.identifier)) continue;
      if (!isSendableIdentifier(app.identifier)) {
        result_.failures[app.identifier] = app.flaw;
        continue;
      }
      result_.listed.insert(app.identifier);
      reporter_.report(
          PlannedEntry{Action::Install, app.identifier, app.version, std::string(), app.name});
    }
  }

  /// Whether the client has done all that it can for the application.
  bool isRestoring(const std::string& identifier) const {
    const auto placeholder = placeholders_.find(identifier);
    if (placeholder == placeholders_.end()) return false;
    const InstallType type = placeholder->second.installType;
    if (type == InstallType::Sync) return false;
    // A coordinated restore's placeholder may stand before its package is left to the store.
    return !phone_.coordination || type != InstallType::Restore || owed_.contains(identifier);
  }

  void giveBackData() {
    for (const BackedUpApplication& app : list_.applications()) {
      if (interruption_.requested()) return;
      if (result_.installed.contains(app.identifier) || result_.failures.contains(app.identifier)) {
        continue;
      }
      if (const auto failure = giveBackData(app)) {
        // Without its data it would come back for good and forget what it was.
        result_.listed.erase(app.identifier);
        result_.failures[app.identifier] = *failure;
      }
    }
  }

  /// Why the application's data is neither there nor waits.
  std::optional<std::string> giveBackData(const BackedUpApplication& app) {
    std::optional<Error> error;
    const auto owns = ownsData(phone_, app.identifier, &error);
    if (!owns) return withReason("its data on the phone could not be looked at", error);
    const auto found = backup_.data.find(app.identifier);
    const BackupFile* file = found == backup_.data.end() ? nullptr : &found->second;
    const bool overwrites =
        *owns && overwriteData_ && file && !hasData(phone_, app.identifier, *file);
    if (*owns && !overwrites) return std::nullopt;
    const auto failure = host::giveBackData(phone_, app, file, reporter_, interruption_);
    if (!failure && overwrites) result_.overwritten.insert(app.identifier);
    return failure;
  }

  void putBack() {
    if (result_.listed.empty()) {
      // An older list would make the client do what is not wanted any more.
      std::optional<Error> error;
      const auto older = isThere(phone_.files, exchange::RestoreList, &error);
      if (older == false || (older && phone_.files.removeItem(exchange::RestoreList, &error))) {
        return;
      }
      return breakOff("an older list of applications to restore could not be removed", error);
    }
    if (!list_.isPart()) putBackLayout();
    std::optional<Error> error;
    const auto demotions = demotionsOf(backup_, list_, phone_.files, &error);
    const auto list = list_.only(result_.listed, &error);
    const bool done = demotions && write(exchange::DemotedApplications, *demotions, &error) &&
                      list && write(exchange::RestoreList, *list, &error);
    if (!done) breakOff("the phone does not take the backup", error);
  }

  void breakOff(std::string_view what, const std::optional<Error>& error) {
    result_.broken = withReason(what, error);
  }

  /// The home screen keeps places for what is still to come.
  void putBackLayout() {
    if (backup_.iconLayout.empty()) return;
    const int status =
        phone_.homeScreen.setIconState(phone_.homeScreen.serverPort(), backup_.iconLayout);
    if (status == 0) return;
    result_.layoutRefused =
        withReason("the home screen does not take its layout", Error::posix(status));
  }

  bool write(std::string_view path, const Bytes& bytes, std::optional<Error>* error) {
    const std::string_view directory = path.substr(0, path.rfind('/'));
    return phone_.files.createDirectory(directory, true, {}, error) &&
           phone_.files.writeAtomically(path, bytes, error);
  }

  const Phone& phone_;
  const Backup& backup_;
  const RestoreList& list_;
  const bool overwriteData_;
  Reporter& reporter_;
  const Interruption& interruption_;
  std::map<std::string, AppRecord, std::less<>> placeholders_;
  std::set<std::string> owed_;  // by the store
  Handover result_;
};

}  // namespace

Handover handOver(const Phone& phone, const Backup& backup, const RestoreList& list,
                  bool overwriteData, Reporter& reporter, const Interruption& interruption) {
  return HandoverInProgress(phone, backup, list, overwriteData, reporter, interruption).run();
}

}  // namespace appsync::host
