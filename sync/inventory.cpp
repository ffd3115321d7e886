// What the host asks about the applications that are on the device.

#include <map>

#include "client/apps_client.h"
#include "client/paths.h"
#include "platform/bundle.h"
#include "platform/todo_entry.h"

namespace appsync {
namespace {

/// The first todo entry of each identifier.
class TodoIndex {
 public:
  explicit TodoIndex(const std::optional<PropertyList::Array>& todoList) {
    if (!todoList) return;
    for (const PropertyList& item : *todoList) {
      const TodoEntry entry(item);
      if (const std::string* identifier = entry.identifier()) first_.emplace(*identifier, entry);
    }
  }

  bool holds(std::string_view identifier) const { return first_.contains(identifier); }

  bool hasOperation(std::string_view identifier, std::string_view operation) const {
    const auto entry = first_.find(identifier);
    return entry != first_.end() && entry->second.hasOperation(operation);
  }

 private:
  std::map<std::string_view, TodoEntry> first_;
};

/// The value under `key` if `typed` accepts it; a value of another type is reported and dropped.
template <typename Value>
const Value* checked(const ClientLog& log, const PropertyList::Dictionary* parent,
                     std::string_view key, std::string_view reportedName,
                     const Value* (PropertyList::*typed)() const) {
  const PropertyList* value = parent ? find(*parent, key) : nullptr;
  if (!value) return nullptr;
  const Value* expected = (value->*typed)();
  if (!expected) log.frameworkError("unexpected type for %{public}@", reportedName);
  return expected;
}

using DictionaryOf = const PropertyList::Dictionary* (PropertyList::*)() const;

void addAccounts(const ClientLog& log, FileManager& files, const AppRecord& record,
                 std::set<std::string>& accounts) {
  std::optional<std::string> path;
  if (record.bundleContainerPath)
    path = joinPath(*record.bundleContainerPath, exchange::MetadataName);
  const auto metadata = path ? loadDictionary(files, *path) : std::nullopt;
  const PropertyList::Dictionary* root = metadata ? &*metadata : nullptr;
  const DictionaryOf dictionary = &PropertyList::asDictionary;

  const std::string* own = checked(log, root, "corvaneId", "corvaneID", &PropertyList::asString);
  const auto* download =
      checked(log, root, "com.corvane.HalvoStore.downloadInfo", "downloadInfo", dictionary);
  const auto* account = checked(log, download, "accountInfo", "accountInfo", dictionary);
  const std::string* nested =
      checked(log, account, "CorvaneID", "CorvaneID", &PropertyList::asString);

  if (own && nested && *own != *nested) {
    log.normal("mismatched CorvaneID keys for %{public}@: %{public}@ vs %{public}@",
               record.applicationIdentifier, *own, *nested);
  }
  if (own) accounts.insert(*own);
  if (nested) accounts.insert(*nested);
  if (!own && !nested) {
    log.normal("unknown CorvaneID for %{public}@ (plist at %{public}@)",
               record.applicationIdentifier, path);
  }
}

}  // namespace

PropertyList::Dictionary AppsClient::installedAssets() noexcept {
  _log.normal("getting installed assets");
  PropertyList::Array deleted;
  const std::optional<PropertyList::Array> todoList = _loadListOrSay(paths::TodoList);
  const std::optional<PropertyList::Array> lastSynced = _loadListOrSay(exchange::LastSyncState);

  std::set<std::string> candidates;
  if (const auto uninstalled = _platform.installerService.lookupUninstalled()) {
    _uninstalledApps.emplace();
    for (const auto& [identifier, ignored] : *uninstalled) _uninstalledApps->push_back(identifier);
    candidates.insert(_uninstalledApps->begin(), _uninstalledApps->end());
  } else {
    _log.error("DeployaLookupUninstalled returned NULL");
  }
  for (const PropertyList& item : lastSynced.value_or(PropertyList::Array{})) {
    const std::string* identifier = item.asString();
    if (identifier && !_platform.appRegistry.isApplicationInstalled(*identifier)) {
      candidates.insert(*identifier);
    }
  }

  const TodoIndex todo(todoList);
  for (const std::string& candidate : candidates) {
    const bool found = todo.holds(candidate);
    const bool failed = todo.hasOperation(candidate, exchange::TodoFailed);
    const bool previouslyInstalled = todo.hasOperation(candidate, exchange::TodoInstalled);
    if (found && !failed && !previouslyInstalled) {
      _log.normal("%{public}@ not installed, but is in our todo list. Not marking deleted",
                  candidate);
      continue;
    }
    _log.normal(
        "%{public}@ not installed, and no todo (found=%d pi=%d failed=%d) Marking as deleted",
        candidate, found, previouslyInstalled, failed);
    deleted.push_back(PropertyList::Dictionary{{std::string(KBBundleIdentifier), candidate}});
  }

  _log.oversize(
      "finished getting installed assets toDoList:%{public}@, uninstalled apps %{public}@, last "
      "synced apps%{public}@",
      todoList, _uninstalledApps, lastSynced);
  return {{"_Deleted", std::move(deleted)}};
}

PropertyList::Dictionary AppsClient::installedAssetMetrics() noexcept {
  std::uint64_t count = 0;
  std::uint64_t bytes = 0;
  // Reported, but nothing on this device counts as purgeable.
  const std::uint64_t purgeable = 0;
  _platform.appRegistry.enumerateBundles(BundleKind::User, [&](const AppRecord& record, bool&) {
    if (record.applicationType != ApplicationTypeUser) return;
    bytes += record.staticDiskUsage;
    ++count;
  });
  _log.normal("found %ld apps using %lld bytes (%lld purgeable)", static_cast<std::int64_t>(count),
              static_cast<std::int64_t>(bytes), static_cast<std::int64_t>(purgeable));
  return {{"_Count", count}, {"_PhysicalSize", bytes}, {"_PurgeableSize", purgeable}};
}

std::set<std::string> AppsClient::corvaneIDsForAssets() noexcept {
  _log.normal("getting id's for assets");
  std::set<std::string> accounts;
  _platform.appRegistry.enumerateBundles(BundleKind::User, [&](const AppRecord& record, bool&) {
    addAccounts(_log, _platform.files, record, accounts);
  });
  _log.normal("Returning corvane ID set: %{public}@", accounts);
  return accounts;
}

}  // namespace appsync
