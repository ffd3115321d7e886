#include "host/transfer/staging.h"

#include <cerrno>
#include <set>
#include <tuple>

#include "base/identifiers.h"
#include "platform/bundle.h"
#include "platform/existence.h"
#include "platform/property_list_codec.h"
#include "platform/sync_files.h"

namespace appsync::host {
namespace {

/// The ending of a package that came without one.
constexpr std::string_view PlainEnding = ".package";

/// An empty display name would hide the name of the todo list, and without a name the client makes
/// no placeholder, which an update needs: a refused one takes the placeholder away, or else the
/// installed application.
std::optional<Bytes> withoutEmptyName(std::optional<Bytes> infoPlist) {
  if (!infoPlist) return infoPlist;
  auto info = parseDictionary(*infoPlist);
  const std::string* const name = info ? findString(*info, KBBundleDisplayName) : nullptr;
  if (!name || !name->empty()) return infoPlist;
  info->erase(std::string(KBBundleDisplayName));
  return serializePropertyList(std::move(*info), PropertyListFormat::Binary);
}

class Stage {
 public:
  Stage(FileManager& files, std::optional<Error>* error) : files_(files), error_(error) {}

  bool makeDirectory(std::string_view path) {
    return files_.createDirectory(path, true, {}, error_);
  }

  /// The client only ever sees a staging area that is whole, so single files need not be on disk.
  bool write(std::string_view directory, std::string_view name, const std::optional<Bytes>& bytes) {
    if (!bytes) return true;
    const std::string path = joinPath(directory, name);
    if (files_.createFile(path, *bytes, {})) return true;
    return failWith(error_, Error::posix(EIO, path));
  }

  bool writeApplication(const PackageFacts& package) {
    const std::string directory = joinPath(exchange::StagingArea, package.identifier);
    const PackageParts parts = readPackageParts(package.file);
    return makeDirectory(directory) &&
           write(directory, "Info.plist", withoutEmptyName(parts.infoPlist)) &&
           write(directory, parts.iconName, parts.icon) &&
           write(directory, exchange::MetadataName, parts.metadata) &&
           write(directory, exchange::ArtworkName, parts.artwork);
  }

 private:
  FileManager& files_;
  std::optional<Error>* error_;
};

PropertyList todoList(const SyncPlan& plan) {
  PropertyList::Array list;
  for (const PlannedEntry& entry : plan.entries) {
    if (entry.byHost) continue;
    const bool removes = entry.action == Action::Remove;
    PropertyList::Dictionary todo;
    todo.emplace(exchange::TodoIdentifierKey, entry.identifier);
    todo.emplace(exchange::TodoOperationKey,
                 removes ? exchange::TodoRemove : exchange::TodoInstall);
    todo.emplace(exchange::TodoNameKey, entry.name);
    if (!entry.version.empty()) todo.emplace(exchange::TodoVersionKey, entry.version);
    list.emplace_back(std::move(todo));
  }
  return list;
}

std::set<std::string> rememberedPackages(const PropertyList::Dictionary& restoreState) {
  std::set<std::string> paths;
  for (const auto& application : restoreState) {
    const PropertyList::Dictionary* versions = application.second.asDictionary();
    if (!versions) continue;
    for (const auto& version : *versions) {
      const PropertyList* path = version.second.find(exchange::RestorePathKey);
      if (path && path->asString()) paths.insert(*path->asString());
    }
  }
  return paths;
}

/// The application whose package is sent under this name; nullopt when it is no such name.
std::optional<std::string> packagedApplication(const std::string& name) {
  std::string_view ending = packageEnding(name);
  if (ending.empty() && name.ends_with(PlainEnding)) ending = PlainEnding;
  const std::string identifier = name.substr(0, name.size() - ending.size());
  return ending.empty() || !isSendableIdentifier(identifier) ? std::nullopt
                                                             : std::optional(identifier);
}

/// Taken to be so when that cannot be told.
bool isBeingInstalled(const Phone& phone, const std::string& identifier) {
  if (!phone.coordination) return false;
  std::optional<Error> error;
  const auto coordinator = phone.coordination->coordinatorFor(
      CoordinatorKind::Any, identifier, SyncHostClientID, false, nullptr, &error);
  return coordinator || error;
}

}  // namespace

bool stage(FileManager& files, const SyncPlan& plan, const Library& library,
           const std::optional<Bytes>& iconLayout, std::optional<Error>* error) {
  Stage area(files, error);
  std::optional<Error> reason;
  if (!files.removeItem(exchange::StagingArea, &reason) && !isMissing(reason)) {
    return failWith(error, *std::move(reason));
  }
  if (!area.makeDirectory(exchange::StagingArea)) return false;
  for (const PlannedEntry& entry : plan.entries) {
    const PackageFacts* package = library.find(entry.identifier);
    if (entry.action == Action::Remove || entry.byHost || !package) continue;
    if (!area.writeApplication(*package)) return false;
  }
  const auto todo = serializePropertyList(todoList(plan), PropertyListFormat::Binary, error);
  // The list comes last: without it the client does nothing with what else lies here.
  return todo && area.write(exchange::StagingArea, exchange::IconLayoutName, iconLayout) &&
         area.write(exchange::StagingArea, exchange::TodoListName, todo);
}

std::string stagedPackageName(const PackageFacts& package) {
  const std::string_view ending = packageEnding(package.file.filename().string());
  return package.identifier + std::string(ending.empty() ? PlainEnding : ending);
}

std::set<std::string> everSent(const Phone& phone) {
  std::set<std::string> identifiers;
  const auto restoreState = readDictionary(phone.files, exchange::RestoreState, nullptr);
  if (restoreState) {
    for (const auto& application : *restoreState) identifiers.insert(application.first);
  }
  for (const std::string_view directory :
       {std::string_view(exchange::WorkArea), std::string_view(exchange::StagingArea)}) {
    const auto todo = readTodoList(phone.files, directory);
    if (!todo) continue;
    for (const TodoState& entry : *todo) identifiers.insert(entry.identifier);
  }
  const auto present = applicationsPresent(phone, nullptr);
  if (!present) return identifiers;  // what is left over waits for the next sync
  identifiers.insert(present->installed.begin(), present->installed.end());
  for (const auto& placeholder : present->placeholders) identifiers.insert(placeholder.first);
  return identifiers;
}

void removeLeftOverPackages(const Phone& phone, const std::set<std::string>& sent) {
  const auto restoreState = readDictionary(phone.files, exchange::RestoreState, nullptr);
  if (!restoreState) return;
  const std::set<std::string> remembered = rememberedPackages(*restoreState);
  for (const std::string_view directory : {exchange::StagingRoot, exchange::Downloads}) {
    const auto names = phone.incoming.namesIn(directory, nullptr);
    if (!names) continue;
    for (const std::string& name : *names) {
      const std::string path = joinPath(directory, name);
      const auto identifier = packagedApplication(name);
      if (!identifier || !sent.contains(*identifier) || remembered.contains(path) ||
          isBeingInstalled(phone, *identifier)) {
        continue;
      }
      std::ignore = phone.files.removeItem(path);
    }
  }
}

}  // namespace appsync::host
