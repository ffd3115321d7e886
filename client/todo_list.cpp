// The todo list: what the desktop wants of each application and how far it has got.

#include <algorithm>

#include "client/apps_client.h"
#include "client/paths.h"
#include "client/unreadable.h"
#include "platform/property_list_codec.h"
#include "platform/todo_entry.h"

namespace appsync {
namespace {

/// The property list in a file. none without `damaged` for a missing or empty file; `error` tells
/// why it could not be read.
std::optional<PropertyList> readPlist(FileManager& files, std::string_view path,
                                      std::optional<Error>* error, bool& damaged) {
  const std::optional<Bytes> bytes = files.contentsAtPath(path, error);
  if (!bytes || bytes->empty()) return std::nullopt;
  std::optional<PropertyList> parsed = parsePropertyList(*bytes);
  damaged = !parsed;
  return parsed;
}

/// The first entry of the identifier, which is the one that counts.
template <typename List>
auto entryOf(List& list, std::string_view identifier) {
  return std::ranges::find_if(
      list, [&](const PropertyList& item) { return TodoEntry(item).isFor(identifier); });
}

}  // namespace

std::optional<PropertyList::Array> AppsClient::_loadPlist(std::string_view path,
                                                          std::optional<Error>* error) const {
  bool damaged = false;
  std::optional<PropertyList> list = readPlist(_platform.files, path, error, damaged);
  if (damaged) _log.error("couldn't parse todo list");
  if (!list) return std::nullopt;
  PropertyList::Array* array = list->asArray();
  if (!array) {
    _log.error("todo list is not an array");
    return std::nullopt;
  }
  return std::move(*array);
}

std::optional<PropertyList::Dictionary> AppsClient::_loadDemotedAppsPlist(
    std::string_view path, std::optional<Error>* error) const {
  bool damaged = false;
  std::optional<PropertyList> list = readPlist(_platform.files, path, error, damaged);
  if (damaged) _log.error("couldn't parse demoted apps list");
  if (!list) return std::nullopt;
  PropertyList::Dictionary* dictionary = list->asDictionary();
  if (!dictionary) {
    _log.error("demoted apps list is not a dictionary");
    return std::nullopt;
  }
  return std::move(*dictionary);
}

std::optional<PropertyList::Array> AppsClient::_loadListOrSay(std::string_view path) const {
  std::optional<Error> error;
  std::optional<PropertyList::Array> list = _loadPlist(path, &error);
  sayUnreadable(_log, path, error);
  return list;
}

void AppsClient::changeAssetID(std::string_view identifier, std::string_view toDo) {
  const std::lock_guard lock(_stateFileMutex);
  std::optional<PropertyList::Array> list = _loadListOrSay(paths::TodoList);
  if (!list) return;
  const auto entry = entryOf(*list, identifier);
  if (entry == list->end()) return;

  PropertyList& operation = (*entry->asDictionary())[std::string(exchange::TodoOperationKey)];
  _log.normal("Changing %{public}@ from %{public}@ to %{public}@", identifier, operation, toDo);
  operation = toDo;
  const std::optional<Bytes> bytes =
      serializePropertyList(std::move(*list), PropertyListFormat::Binary);
  if (bytes) _platform.files.writeAtomically(paths::TodoList, *bytes);
}

std::optional<std::string> AppsClient::_operationStateForIdentifier(
    std::string_view identifier) const {
  const std::optional<PropertyList::Array> list = _loadListOrSay(paths::TodoList);
  if (!list) return std::nullopt;
  const auto entry = entryOf(*list, identifier);
  if (entry == list->end()) return std::nullopt;
  const std::string* operation = TodoEntry(*entry).operation();
  return operation ? std::optional(*operation) : std::nullopt;
}

}  // namespace appsync
