// Takes over what the desktop staged: deletions and the icon layout at once, installs as transfers
// later.

#include <tuple>

#include "client/apps_client.h"
#include "client/identifier_safety.h"
#include "client/paths.h"
#include "client/unreadable.h"
#include "platform/existence.h"
#include "platform/property_list_codec.h"
#include "platform/todo_entry.h"

namespace appsync {
namespace {

/// A restore from a backup that a desktop made.
constexpr std::int32_t RestoreFromDesktopBackup = 2;

bool isSafeRemoval(const TodoEntry& entry) {
  return isSafe(entry.value(exchange::TodoIdentifierKey)) &&
         entry.hasOperation(exchange::TodoRemove);
}

/// Moves the staging area to the work area, in place of the previous one. none: go on; otherwise
/// the reconcile is over with this result.
std::optional<bool> takeOverStagingArea(FileManager& files, const ClientLog& log,
                                        std::optional<Error>* error) {
  // One that stays is in the way of the move below, which tells.
  std::ignore = files.removeItem(exchange::WorkArea);
  if (!files.createDirectory(exchange::SyncRoot, true, {}, error)) {
    log.error("can't create work area");
    return false;
  }
  // One that cannot be looked at may be there: the move will tell.
  std::optional<Error> reason;
  if (!files.attributesOfItem(exchange::StagingArea, &reason) && isMissing(reason)) {
    log.normal("Nothing to do");
    return true;
  }
  if (!files.moveItem(exchange::StagingArea, exchange::WorkArea, error)) {
    log.error("Can't move staging area");
    return false;
  }
  return std::nullopt;
}

}  // namespace

bool AppsClient::reconcileSync(const PropertyList&, std::string_view newAnchor,
                               const ProgressCallback&, std::optional<Error>* error) noexcept {
  _log.normal("starting to reconcile sync with new anchor %{public}@", newAnchor);
  std::optional<bool> result;
  {
    // A change on its way must not write the old list back over the new one.
    const Lock lock(_stateFileMutex);
    result = takeOverStagingArea(_platform.files, _log, error);
  }
  if (!result) {
    const bool removalAllowed = _appRemovalAllowed();
    std::optional<PropertyList::Array> todoList = _loadPlist(paths::TodoList);
    if (!todoList) {
      _log.normal("Nothing to do from Halvo");
    } else if (!removalAllowed) {
      _log.normal("Not processing deletes because app removal is restricted");
    } else {
      _performDeletions(*todoList);
    }
    _notifyDashel(true);
    _sendIconLayout();
    if (todoList) {
      const std::optional<Bytes> bytes =
          serializePropertyList(std::move(*todoList), PropertyListFormat::Binary);
      if (bytes) std::ignore = _platform.files.writeAtomically(paths::TodoDebugCopy, *bytes);
    }
    result = true;
  }
  _log.normal("finished reconcile sync");
  return *result;
}

void AppsClient::_performDeletions(const PropertyList::Array& todoList) {
  std::vector<std::string> deletions;
  deletions.reserve(8);
  for (const PropertyList& item : todoList) {
    const TodoEntry entry(item);
    if (!isSafeRemoval(entry)) continue;
    deletions.push_back(*entry.identifier());
    _log.normal("%{public}@ targeted for termination", deletions.back());
  }
  if (deletions.empty()) return;

  _log.normal("performing %llu deletions", deletions.size());
  for (const std::string& identifier : deletions) {
    if (_useInstallCoordinator) {
      uninstallAppUsingCoordination(identifier);
      continue;
    }
    const bool removed = _platform.appRegistry.uninstallApplication(identifier, {});
    if (!removed) _log.error("Uninstall of %{public}@ failed.", identifier);
    _platform.transactionLog.logScenario("Halvo Sync", 0, removed, identifier,
                                         removed ? "Uninstall succeeded" : "Uninstall failed");
  }
}

void AppsClient::_sendIconLayout() {
  std::optional<Error> error;
  const std::optional<Bytes> layout = _platform.files.contentsAtPath(paths::IconLayout, &error);
  sayUnreadable(_log, paths::IconLayout, error);
  if (!layout || layout->empty()) return;
  _log.normal("Sending iconlayout to DS");
  const HomeScreenService::Port port = _platform.homeScreen.serverPort();
  // An order that the home screen refuses is no reason to end the sync.
  std::ignore = _platform.homeScreen.setIconState(port, *layout);
}

bool AppsClient::reconcileRestoreOfType(std::int32_t type, std::optional<Error>* error) noexcept {
  _log.normal("reconcileRestoreOfType %d", type);
  _notifyDashel(true);
  // A restore is over for the host whatever came of it; the log tells what failed.
  std::ignore = _platform.files.createDirectory(exchange::SyncRoot, true, {});
  if (type == RestoreFromDesktopBackup) std::ignore = _processHalvoRestoreInfo();
  if (error) error->reset();
  return true;
}

}  // namespace appsync
