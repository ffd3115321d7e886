#include "tests/host/session_fixture.h"

#include <fmt/format.h>

#include <algorithm>

#include "host/phone/installed_applications.h"
#include "platform/bundle.h"

namespace appsync::host::testing {
namespace {

std::string reasonText(const std::optional<std::string>& reason) {
  return reason ? " failed: " + *reason : "";
}

std::vector<TodoState> todoOf(fakes::FakePlatform& phone) {
  return readTodoList(phone.files, exchange::WorkArea).value();
}

std::string lineOf(const Event& event) {
  return std::visit(
      Overloaded{
          [](const PackageProblem& e) { return "unreadable " + e.file; },
          [](const PlannedEntry& e) { return "plan " + e.identifier; },
          [](const PlaceholderSwept& e) { return "swept " + e.identifier; },
          [](const DeletedOnPhone& e) { return "deleted-on-phone " + e.identifier; },
          [](const TransferProgress& e) { return "progress " + e.identifier; },
          [](const TransferEnded& e) { return "sent " + e.identifier + reasonText(e.failure); },
          [](const DataProgress& e) { return "data " + e.identifier; },
          [](const DataEnded& e) { return "data-ended " + e.identifier + reasonText(e.failure); },
          [](const SavingProgress& e) {
            return fmt::format("saving {} {}/{} {}", e.identifier, e.number, e.count, e.bytes);
          },
          [](const ApplicationSaved& e) { return "saved " + e.identifier + reasonText(e.failure); },
          [](const PlaceholderStands& e) {
            return (e.demoted ? "demoted " : "placeholder ") + e.identifier + " " + e.name;
          },
          [](const Notice& e) { return "notice " + e.text; },
          [](const InstallWaiting& e) { return "waiting " + e.identifier; },
          [](const InstallEnded& e) { return "install " + e.identifier + reasonText(e.failure); },
          [](const ClientLogLine& e) { return "log " + e.text; },
          [](const Interrupted&) { return std::string("interrupted"); },
          [](const SyncBroken& e) { return "broken " + e.reason; },
          [](const Summary&) { return std::string("summary"); },
          [](const BackupSummary&) { return std::string("backup summary"); },
      },
      event);
}

std::vector<std::string> beginningWith(std::vector<std::string> lines, std::string_view beginning) {
  std::erase_if(lines, [&](const std::string& line) { return !line.starts_with(beginning); });
  return lines;
}

}  // namespace

std::vector<std::string> RecordingClient::supportedDataclasses() noexcept {
  note("supportedDataclasses");
  return dataclasses;
}

std::string RecordingClient::currentSyncAnchor() noexcept {
  note("currentSyncAnchor");
  return "ANCHOR";
}

bool RecordingClient::prepareForSyncWithHostAnchor(std::string_view hostAnchor,
                                                   const ProgressCallback&,
                                                   std::optional<Error>* error) noexcept {
  note(fmt::format("prepareForSyncWithHostAnchor({})", hostAnchor));
  if (prepareError) setError(error, *prepareError);
  return !prepareError;
}

std::optional<std::set<std::string>> RecordingClient::disabledAssetTypes() noexcept {
  note("disabledAssetTypes");
  return disabled;
}

PropertyList::Dictionary RecordingClient::installedAssets() noexcept {
  note("installedAssets");
  if (onInventory) onInventory();
  PropertyList::Array list;
  for (const auto& identifier : deleted) {
    list.emplace_back(PropertyList::Dictionary{{std::string(KBBundleIdentifier), identifier}});
  }
  return {{"_Deleted", list}};
}

bool RecordingClient::reconcileSync(const PropertyList&, std::string_view newAnchor,
                                    const ProgressCallback&, std::optional<Error>* error) noexcept {
  note(fmt::format("reconcileSync({})", newAnchor));
  if (onTakingOver) onTakingOver();
  if (reconcileError) {
    setError(error, *reconcileError);
    return false;
  }
  phone_.files.erase(exchange::WorkArea);
  phone_.files.putCopy(exchange::StagingArea, exchange::WorkArea);
  phone_.files.erase(exchange::StagingArea);
  for (const TodoState& entry : todoOf(phone_)) {
    if (entry.operation == "remove" && removes)
      phone_.appRegistry.uninstallApplication(entry.identifier, {});
  }
  return true;
}

std::vector<SyncAssetPtr> RecordingClient::outstandingAssetTransfers() noexcept {
  note("outstandingAssetTransfers");
  std::vector<SyncAssetPtr> assets;
  for (const TodoState& entry : todoOf(phone_)) {
    if (entry.operation == "install" && notAskedFor.count(entry.identifier) == 0) {
      assets.push_back(host_.makeDownload(entry.identifier, "Application", std::nullopt));
    }
  }
  for (const auto& identifier : alsoAskedFor) {
    assets.push_back(host_.makeDownload(identifier, "Application", std::nullopt));
  }
  if (onOutstanding) onOutstanding();
  return assets;
}

void RecordingClient::assetTransferUpdatedProgress(const SyncAssetPtr& asset,
                                                   double fraction) noexcept {
  note(fmt::format("assetTransferUpdatedProgress({}, {:.2f})", asset->identifier, fraction));
  if (onProgress) onProgress(asset, fraction);
}

void RecordingClient::assetTransferSucceeded(const SyncAssetPtr& asset, bool succeeded,
                                             const std::optional<Error>& error) noexcept {
  note(fmt::format("assetTransferSucceeded({}, {}, {})", asset->identifier,
                   succeeded ? asset->path.value_or("no path") : "failed",
                   error ? fmt::format("{} {}", error->domain, error->code) : "none"));
  if (succeeded && installsAtOnce) install(*asset);
  if (succeeded && onSent) onSent(asset);
}

void RecordingClient::install(const SyncAsset& asset) {
  const auto refused = refusedPackages.find(asset.identifier);
  const bool good = refused == refusedPackages.end();
  setOperation(asset.identifier, good ? "INSTALLED" : "FAILED");
  if (good) phone_.appRegistry.seedInstalled(asset.identifier, "new");
  phone_.files.erase(joinPath(exchange::StagingRoot, *asset.path));
  if (!watcher) return;
  watcher->installFinished(asset.identifier,
                           good ? std::nullopt : std::optional<Error>(refused->second));
}

void RecordingClient::setOperation(const std::string& identifier, const std::string& operation) {
  const std::string path = joinPath(exchange::WorkArea, exchange::TodoListName);
  auto list = phone_.files.plistAt(path);
  if (!list || !list->asArray()) return;
  for (PropertyList& item : *list->asArray()) {
    auto& entry = *item.asDictionary();
    if (*findString(entry, "identifier") == identifier) entry["operation"] = operation;
  }
  phone_.files.putPlist(path, *list);
}

void RecordingClient::assetTransferEndedWithSuccess(bool success) noexcept {
  note(fmt::format("assetTransferEndedWithSuccess({})", success));
  if (onTransfersEnd) onTransfersEnd();
}

void RecordingClient::syncEndedWithSuccess(bool success) noexcept {
  note(fmt::format("syncEndedWithSuccess({})", success));
}

void RecordingReporter::report(const Event& event) {
  const std::lock_guard lock(mutex_);
  lines_.push_back(lineOf(event));
}

std::vector<std::string> RecordingReporter::lines() const {
  const std::lock_guard lock(mutex_);
  return lines_;
}

std::vector<std::string> RecordingReporter::lines(std::string_view beginning) const {
  return beginningWith(lines(), beginning);
}

std::string text(const Summary& summary) {
  std::string result;
  const auto add = [&](std::string_view what, const auto& entries, const auto& entryText) {
    if (entries.empty()) return;
    result += (result.empty() ? "" : "; ") + std::string(what) + ":";
    for (const auto& entry : entries) result += " " + entryText(entry);
  };
  const auto plain = [](const std::string& identifier) { return identifier; };
  const auto withReason = [](const auto& entry) {
    return entry.identifier + " (" + entry.reason + ")";
  };
  add("installed", summary.installed, plain);
  add("updated", summary.updated, plain);
  add("downgraded", summary.downgraded, plain);
  add("data restored", summary.dataRestored, plain);
  add("deleted", summary.deleted, plain);
  add("failed", summary.failed, withReason);
  add("skipped", summary.skipped, withReason);
  return result;
}

SessionTest::SessionTest() {
  hostsView.onWatcher = [this](PhoneWatcher* watcher) { client.watcher = watcher; };
}

SyncResult SessionTest::sync() {
  std::string problem;
  SyncInput input{readLibrary(folder.path(), problem).value(), {}, iconLayout, "NEW"};
  input.plan = makePlan(input.library, installedApplications(hostsView.phone(), problem).value(),
                        options, problem)
                   .value();
  Session session(client, host, hostsView.phone(), reporter, interruption);
  return session.run(input);
}

void SessionTest::offer(const std::string& identifier, const std::string& version,
                        std::size_t bodySize) {
  packSample(folder / (identifier + ".tar"), identifier, version, bodySize);
}

void SessionTest::putTodo(const std::vector<TodoState>& entries) {
  PropertyList::Array list;
  for (const TodoState& entry : entries) {
    list.emplace_back(
        PropertyList::Dictionary{{"identifier", entry.identifier}, {"operation", entry.operation}});
  }
  phone.files.putPlist(joinPath(exchange::WorkArea, exchange::TodoListName), list);
}

std::shared_ptr<InstallCoordinator> SessionTest::makeCoordinator(std::string_view identifier) {
  return phone.installCoordination.coordinatorFor(CoordinatorKind::Initiating, identifier,
                                                  SyncHostClientID, true, nullptr, nullptr);
}

std::vector<std::string> SessionTest::trace() const {
  auto lines = phone.trace.lines(fakes::TraceCall | fakes::TraceFile);
  for (std::string& line : lines) {
    const std::size_t place = line.find(exchange::StagingRoot);
    if (place != std::string::npos) line.replace(place, exchange::StagingRoot.size(), "STAGING");
  }
  return lines;
}

std::vector<std::string> SessionTest::trace(std::string_view beginning) const {
  return beginningWith(trace(), beginning);
}

}  // namespace appsync::host::testing
