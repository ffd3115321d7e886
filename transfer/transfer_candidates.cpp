#include "transfer/transfer_candidates.h"

#include "client/identifier_safety.h"
#include "client/paths.h"
#include "client/usable_text.h"
#include "platform/bundle.h"
#include "platform/todo_entry.h"

namespace appsync {
namespace {

constexpr std::string_view PathKey = "Path";
constexpr std::string_view ContainerKey = "Container";
constexpr std::string_view NameFromHalvoKey = "NameFromHalvo";
constexpr std::string_view IsRestoreKey = "IsRestore";
constexpr std::string_view IntentionallyDemotedKey = "intentional_demoted_app";
constexpr std::string_view AutoDemotedKey = "auto_demoted_app";
constexpr std::string_view SystemAppKey = "system_app";

void put(PropertyList::Dictionary& entry, std::string_view key,
         const std::optional<std::string>& value) {
  if (value) entry.emplace(key, *value);
}

/// Takes over a value of the todo list as it stands, if there is one.
void putFrom(PropertyList::Dictionary& entry, std::string_view key, const TodoEntry& source,
             std::string_view sourceKey) {
  if (const PropertyList* value = source.value(sourceKey)) entry.emplace(key, *value);
}

PropertyList::Dictionary todoEntry(const PropertyList& item, const std::string& identifier,
                                   const ClientLog& log) {
  sayUnexpectedTypes(log, identifier, *item.asDictionary(),
                     {exchange::TodoVersionKey, exchange::TodoNameKey});
  const TodoEntry todo(item);
  const std::string path = std::string(exchange::InWorkArea) + identifier;
  PropertyList::Dictionary entry;
  entry.emplace(PathKey, path);
  entry.emplace(ContainerKey, path);
  entry.emplace(KBBundleIdentifier, identifier);
  putFrom(entry, KBBundleVersion, todo, exchange::TodoVersionKey);
  putFrom(entry, NameFromHalvoKey, todo, exchange::TodoNameKey);
  return entry;
}

std::optional<std::string> stringOf(const PropertyList::Dictionary& entry, std::string_view key) {
  const std::string* value = findString(entry, key);
  return value ? std::optional(*value) : std::nullopt;
}

std::optional<std::string> displayNameOf(FileManager& files,
                                         const std::optional<std::string>& bundlePath) {
  if (!bundlePath) return std::nullopt;
  const std::optional<Bundle> bundle = Bundle::open(files, FileLocation::directory(*bundlePath));
  return bundle ? stringOf(bundle->infoDictionary(), KBBundleDisplayName) : std::nullopt;
}

}  // namespace

PropertyList::Dictionary placeholderEntry(const AppRecord& record) {
  PropertyList::Dictionary entry;
  put(entry, KBBundleVersion, record.bundleVersion);
  put(entry, KBBundleIdentifier, record.bundleIdentifier);
  put(entry, ContainerKey, record.bundleContainerPath);
  put(entry, PathKey, record.bundlePath);
  const InstallType type = record.installType;
  entry.emplace(IsRestoreKey, type == InstallType::Restore);
  entry.emplace(IntentionallyDemotedKey, type == InstallType::IntentionalDowngrade);
  entry.emplace(AutoDemotedKey, type == InstallType::Downgrade);
  entry.emplace(SystemAppKey, record.applicationType == ApplicationTypeSystem);
  return entry;
}

void addTodoEntries(const PropertyList::Array& todoList, CandidateEntries& entries,
                    const ClientLog& log) {
  for (const PropertyList& item : todoList) {
    const TodoEntry todo(item);
    if (!todo.hasOperation(exchange::TodoInstall)) continue;
    const PropertyList* value = todo.value(exchange::TodoIdentifierKey);
    if (!isSafe(value)) {
      log.normal("Ignoring invalid path: %{public}@", value ? *value : PropertyList::null());
      continue;
    }
    const std::string& identifier = *value->asString();
    entries.wanted.insert(identifier);
    if (entries.all.contains(identifier)) {
      log.normal("%{public}@ already has a placeholder - skipping", identifier);
    } else {
      entries.all.emplace(identifier, todoEntry(item, identifier, log));
    }
  }
}

std::optional<TransferCandidate> readCandidate(const PropertyList& value, FileManager& files) {
  const PropertyList::Dictionary* entry = value.asDictionary();
  const std::string* identifier = entry ? findString(*entry, KBBundleIdentifier) : nullptr;
  if (!identifier) return std::nullopt;
  TransferCandidate candidate;
  candidate.identifier = *identifier;
  candidate.bundlePath = stringOf(*entry, PathKey);
  candidate.container = stringOf(*entry, ContainerKey);
  candidate.version = usableText(*entry, KBBundleVersion);
  candidate.displayName = displayNameOf(files, candidate.bundlePath);
  candidate.nameFromHalvo = usableText(*entry, NameFromHalvoKey);
  candidate.iconPath = joinPath(paths::IconScratch, *identifier + ".png");
  candidate.isRestore = findFlag(*entry, IsRestoreKey);
  candidate.isAutoDemoted = findFlag(*entry, AutoDemotedKey);
  candidate.isIntentionallyDemoted = findFlag(*entry, IntentionallyDemotedKey);
  candidate.isSystemApp = findFlag(*entry, SystemAppKey);
  return candidate;
}

}  // namespace appsync
