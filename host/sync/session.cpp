#include "host/sync/session.h"

#include <algorithm>
#include <chrono>
#include <thread>

#include "base/text.h"
#include "host/phone/installed_applications.h"
#include "host/transfer/staging.h"
#include "platform/bundle.h"
#include "platform/property_list_codec.h"

namespace appsync::host {
namespace {

constexpr const char* CancelledOnPhone = "cancelled on the phone";
constexpr std::chrono::milliseconds InstallPoll{10};

using TodoList = std::optional<std::vector<TodoState>>;

/// Taken to be so while the list cannot be read.
bool isDownloaded(const std::string& identifier, const TodoList& todo) {
  return !todo || std::any_of(todo->begin(), todo->end(), [&](const TodoState& entry) {
    return entry.identifier == identifier && entry.operation == exchange::TodoDownloaded;
  });
}

/// The plan's applications; only those that the host brings by itself, or the others, if asked.
std::set<std::string> identifiersOf(const SyncPlan& plan, std::optional<bool> byHost = {}) {
  std::set<std::string> identifiers;
  for (const PlannedEntry& entry : plan.entries) {
    if (entry.byHost == byHost.value_or(entry.byHost)) identifiers.insert(entry.identifier);
  }
  return identifiers;
}

/// Whether the phone has carried an install out since it was planned: that of a sync that was
/// killed.
bool isCarriedOut(AppRegistry& apps, const PlannedEntry& entry) {
  if (entry.action == Action::Remove || entry.version == entry.installedVersion) return false;
  const auto record = apps.recordForIdentifier(entry.identifier, false);
  return record && !record->isPlaceholder && record->bundleVersion == entry.version;
}

}  // namespace

SyncResult Session::run(const SyncInput& input) {
  watch_.nameFilesOf(input.library);
  // What the client hears late, of a killed sync or of a person's cancel, must not reach this sync.
  waitUntilIdle(phone_, identifiersOf(input.plan));
  host_.transfers().forgetCancelled();
  const bool swept = sweepPlaceholders();
  removeLeftOverPackages(phone_, everSent(phone_));
  SyncResult result;
  SyncInput rest = input;
  std::erase_if(rest.plan.entries, [&](const PlannedEntry& entry) {
    const bool isDone = isCarriedOut(phone_.apps, entry);
    if (isDone) carriedOut_.insert(entry.identifier);
    return isDone;
  });
  watch_.tellInstalled(carriedOut_);
  const bool good = swept && callClient(rest);
  result.summary = settle(input.plan, input.library, end());
  result.completed = good && !broken_;
  return result;
}

bool Session::callClient(const SyncInput& input) {
  if (!prepare()) return !broken_;
  bool success = reconcile(input);
  if (reconciled_) success = transfer(input);
  client_.syncEndedWithSuccess(success);
  if (success) writeApplicationsPresent();
  return success && !broken_;
}

bool Session::prepare() {
  if (!isServed()) return false;
  const std::string hostAnchor = client_.currentSyncAnchor();
  const auto disabledTypes = client_.disabledAssetTypes();
  disabled_ = disabledTypes && disabledTypes->count(std::string(ApplicationDataclass)) > 0;
  if (disabled_) return false;
  if (begin(hostAnchor, "the phone cannot begin a sync")) return true;
  client_.syncEndedWithSuccess(false);
  return false;
}

bool Session::reconcile(const SyncInput& input) {
  reportDeletions(client_.installedAssets());
  if (interruption_.requested()) return false;
  std::optional<Error> error;
  if (!stage(phone_.files, input.plan, input.library, input.iconLayout, &error)) {
    return breakOff("the phone did not take the list of what is to be done", error);
  }
  const PropertyList::Dictionary description{{"Dataclass", ApplicationDataclass}};
  reconciled_ = client_.reconcileSync(
      description, input.newAnchor, [](double) {}, &error);
  if (!reconciled_) breakOff("the phone could not take over what is to be done", error);
  return reconciled_;
}

bool Session::transfer(const SyncInput& input) {
  if (!interruption_.requested()) sendWhatIsAskedFor(input);
  // Restored, demoted and asked-for applications whose packages the client leaves to the store.
  const std::set<std::string> waiting = identifiersOf(input.plan, true);
  const auto present = !broken_ && !waiting.empty() ? applicationsNow() : std::nullopt;
  if (present) bringFromStore(*present, input.library, std::nullopt, waiting, InterruptedSync);
  if (phone_.coordination) waitForCoordination(input.plan);
  endTransfers();
  return !broken_ && !interruption_.requested();
}

void Session::sendWhatIsAskedFor(const SyncInput& input) {
  std::optional<Error> error;
  if (!claimDownloads(phone_, identifiersOf(input.plan, false), &error)) {
    breakOff(CannotTellApplications, error);
    return;
  }
  const std::vector<SyncAssetPtr> assets = client_.outstandingAssetTransfers();
  if (phone_.coordination) findCoordinators(assets);
  sendToClient(assets, input.library);
}

/// Before anything is sent, so that an install that is over by then can only have been cancelled.
void Session::findCoordinators(const std::vector<SyncAssetPtr>& assets) {
  for (const SyncAssetPtr& asset : assets) {
    coordinators_[asset->identifier] = phone_.coordination->coordinatorFor(
        CoordinatorKind::Any, asset->identifier, SyncHostClientID, false, nullptr, nullptr);
  }
}

/// A completed install shows in the todo list; a cancelled one leaves no trace there, and one that
/// the phone gave up stays as it is.
bool Session::isSettled(const std::string& identifier,
                        const std::optional<std::vector<TodoState>>& todo,
                        const std::set<std::string>& busy) {
  const auto& coordinator = coordinators_.at(identifier);
  const std::optional<Error> error = coordinator ? coordinator->error() : std::nullopt;
  if (!coordinator || error) {
    failures_[identifier] = error ? oneLine(error->localizedDescription()) : CancelledOnPhone;
    return true;
  }
  if (!isDownloaded(identifier, todo)) return true;
  if (busy.contains(identifier)) return false;
  // Nobody will do more for it, unless it was done since the list was read.
  return isDownloaded(identifier, readTodoList(phone_.files, exchange::WorkArea));
}

/// Coordinators settle, and the phone removes and tidies up, after the client's calls have
/// returned, which would be too late for this sync's result.
void Session::waitForCoordination(const SyncPlan& plan) {
  const std::set<std::string>& sent = sender_.outcome().sent;
  const auto installsSettled = [&] {
    if (interruption_.requested()) return true;
    const auto todo = readTodoList(phone_.files, exchange::WorkArea);
    const std::set<std::string> busy = phone_.activity.busyAmong(sent);
    return std::ranges::all_of(
        sent, [&](const std::string& identifier) { return isSettled(identifier, todo, busy); });
  };
  while (!installsSettled()) std::this_thread::sleep_for(InstallPoll);
  waitUntilIdle(phone_, identifiersOf(plan));
}

/// The client never asks for a package whose placeholder stands already.
bool Session::sweepPlaceholders() {
  std::optional<Error> error;
  const auto records = applicationsOf(phone_, &error);
  if (!records) return breakOff(CannotTellApplications, error);
  std::vector<std::string> leftOver;
  for (const AppRecord& record : *records) {
    if (!record.isPlaceholder || !isLeftOver(phone_, record)) continue;
    const auto progress = phone_.apps.installProgressSync(record);
    const bool onItsWay = progress && progress->installState() == InstallState::Active &&
                          progress->installPhase() == InstallPhase::Installing;
    if (!onItsWay) leftOver.push_back(record.applicationIdentifier);
  }
  for (const std::string& identifier : leftOver) {
    const PropertyList::Dictionary options{{std::string(UninstallPlaceholdersOnlyKey), true}};
    if (phone_.apps.uninstallApplication(identifier, options)) {
      reporter_.report(PlaceholderSwept{identifier});
    }
  }
  return true;
}

void Session::reportDeletions(const PropertyList::Dictionary& inventory) {
  const PropertyList* deleted = find(inventory, "_Deleted");
  if (!deleted || !deleted->asArray()) return;
  for (const PropertyList& item : *deleted->asArray()) {
    const PropertyList::Dictionary* entry = item.asDictionary();
    const std::string* identifier = entry ? findString(*entry, KBBundleIdentifier) : nullptr;
    if (identifier) reporter_.report(DeletedOnPhone{*identifier});
  }
}

/// The next sync's inventory compares what is there with this list. The client deletes the old one
/// when a sync ends.
void Session::writeApplicationsPresent() {
  std::optional<Error> error;
  const auto records = applicationsOf(phone_, &error);
  PropertyList::Array present;
  for (const AppRecord& record : records.value_or(std::vector<AppRecord>{})) {
    if (record.isApplication && !record.isPlaceholder &&
        record.applicationType == ApplicationTypeUser) {
      present.emplace_back(record.applicationIdentifier);
    }
  }
  const auto bytes =
      records ? serializePropertyList(std::move(present), PropertyListFormat::Binary, &error)
              : std::nullopt;
  if (!bytes || !phone_.files.writeAtomically(exchange::LastSyncState, *bytes, &error)) {
    breakOff("the list of applications present could not be written", error);
  }
}

SyncEnd Session::end() {
  SyncEnd end;
  if (reconciled_) {
    std::optional<Error> error;
    const TodoList todo = readTodoList(phone_.files, exchange::WorkArea, &error);
    if (todo) end.todo = *todo;
    if (!todo) breakOff("it cannot be seen what the phone has done", error);
  }
  end.present = applicationsNow();
  end.transfers = sender_.outcome();
  end.installFailures = watch_.failures();
  end.installFailures.insert(failures_.begin(), failures_.end());
  end.carriedOut = carriedOut_;
  end.disabled = disabled_;
  end.interrupted = interruption_.requested();
  end.broken = broken_;
  return end;
}

}  // namespace appsync::host
