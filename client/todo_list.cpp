// The todo list: what the desktop wants of each application and how far it has got.

#include <algorithm>
#include <tuple>

#include "client/apps_client.h"
#include "client/paths.h"
#include "client/unreadable.h"
#include "platform/property_list_codec.h"
#include "platform/todo_entry.h"

namespace appsync {
namespace {

/// The property list in a file's bytes. none without `damaged` for an empty one.
std::optional<PropertyList> plistIn(const Bytes& bytes, bool& damaged) {
  if (bytes.empty()) return std::nullopt;
  std::optional<PropertyList> parsed = parsePropertyList(bytes);
  damaged = !parsed;
  return parsed;
}

void sayChange(const ClientLog& log, std::string_view identifier, const PropertyList& from,
               std::string_view to) {
  log.normal("Changing %{public}@ from %{public}@ to %{public}@", identifier, from, to);
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
  const std::optional<Bytes> bytes = _platform.files.contentsAtPath(path, error);
  return bytes ? _listIn(*bytes) : std::nullopt;
}

std::optional<PropertyList::Array> AppsClient::_listIn(const Bytes& bytes) const {
  bool damaged = false;
  std::optional<PropertyList> list = plistIn(bytes, damaged);
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
  const std::optional<Bytes> bytes = _platform.files.contentsAtPath(path, error);
  if (!bytes) return std::nullopt;
  bool damaged = false;
  std::optional<PropertyList> list = plistIn(*bytes, damaged);
  if (damaged) _log.error("couldn't parse demoted apps list");
  if (!list) return std::nullopt;
  PropertyList::Dictionary* dictionary = list->asDictionary();
  if (!dictionary) {
    _log.error("demoted apps list is not a dictionary");
    return std::nullopt;
  }
  return std::move(*dictionary);
}

std::optional<Bytes> AppsClient::_bytesOrSay(std::string_view path) const {
  std::optional<Error> error;
  std::optional<Bytes> bytes = _platform.files.contentsAtPath(path, &error);
  sayUnreadable(_log, path, error);
  return bytes;
}

std::optional<PropertyList::Array> AppsClient::_loadListOrSay(std::string_view path) const {
  const std::optional<Bytes> bytes = _bytesOrSay(path);
  return bytes ? _listIn(*bytes) : std::nullopt;
}

void AppsClient::changeAssetID(std::string_view identifier, std::string_view toDo) {
  TodoChange change{identifier, toDo};
  _todoChanges.serve(change);
}

void AppsClient::_changeTodoList(std::span<TodoChange* const> changes) {
  const Lock lock(_stateFileMutex);
  bool unsaved = false;
  for (const TodoChange* const change : changes) unsaved = _changeTodoFile(*change, unsaved);
  if (!unsaved) return;
  // What cannot be written is asked for again by the next sync.
  std::ignore = _platform.files.writeAtomically(paths::TodoList, _todoFile.bytes());
}

bool AppsClient::_changeTodoFile(const TodoChange& change, bool unsaved) {
  if (!unsaved) {
    std::optional<Bytes> bytes = _bytesOrSay(paths::TodoList);
    if (!bytes) return false;
    if (!_todoFile.take(*bytes)) {
      _changeParsed(*bytes, change);
      return false;
    }
  }
  const std::optional<std::string_view> operation = _todoFile.operationOf(change.identifier);
  if (!operation) return unsaved;
  const PropertyList from(*operation);
  if (!_todoFile.setOperation(change.identifier, change.toDo)) {
    _changeParsed(_todoFile.bytes(), change);
    return false;
  }
  sayChange(_log, change.identifier, from, change.toDo);
  return true;
}

void AppsClient::_changeParsed(const Bytes& list, const TodoChange& change) {
  const auto& [identifier, toDo] = change;
  std::optional<PropertyList::Array> entries = _listIn(list);
  if (!entries) return;
  const auto entry = entryOf(*entries, identifier);
  if (entry == entries->end()) return;

  PropertyList& operation = (*entry->asDictionary())[std::string(exchange::TodoOperationKey)];
  sayChange(_log, identifier, operation, toDo);
  operation = toDo;
  const std::optional<Bytes> bytes =
      serializePropertyList(std::move(*entries), PropertyListFormat::Binary);
  if (bytes) std::ignore = _platform.files.writeAtomically(paths::TodoList, *bytes);
}

std::optional<std::string> AppsClient::_operationStateForIdentifier(
    std::string_view identifier) const {
  const Lock lock(_stateFileMutex);
  std::optional<Bytes> bytes = _bytesOrSay(paths::TodoList);
  if (!bytes) return std::nullopt;
  if (_todoFile.take(*bytes)) {
    const std::optional<std::string_view> operation = _todoFile.operationOf(identifier);
    return operation ? std::optional<std::string>(*operation) : std::nullopt;
  }
  const std::optional<PropertyList::Array> list = _listIn(*bytes);
  if (!list) return std::nullopt;
  const auto entry = entryOf(*list, identifier);
  if (entry == list->end()) return std::nullopt;
  const std::string* operation = TodoEntry(*entry).operation();
  return operation ? std::optional(*operation) : std::nullopt;
}

}  // namespace appsync
