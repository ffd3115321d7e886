// The restore state: values kept per application and version until its install has ended.

#include <tuple>

#include "client/apps_client.h"
#include "client/paths.h"
#include "client/unreadable.h"
#include "platform/existence.h"
#include "platform/property_list_codec.h"

namespace appsync {
namespace {

/// The key of an application that names no version, as in its placeholder.
const std::string NoVersion;

/// The dictionary under `key`, put there if the value is another or missing.
PropertyList::Dictionary& dictionaryUnder(PropertyList::Dictionary& parent, std::string_view key) {
  PropertyList& child = parent[std::string(key)];
  if (!child.asDictionary()) child = PropertyList::Dictionary{};
  return *child.asDictionary();
}

std::optional<Bytes> readState(FileManager& files, const ClientLog& log,
                               std::optional<Error>& error) {
  std::optional<Bytes> bytes = files.contentsAtPath(exchange::RestoreState, &error);
  sayUnreadable(log, exchange::RestoreState, error);
  return bytes;
}

void writeXml(FileManager& files, PropertyList::Dictionary state) {
  const std::optional<Bytes> bytes =
      serializePropertyList(std::move(state), PropertyListFormat::Xml);
  if (bytes) std::ignore = files.writeAtomically(exchange::RestoreState, *bytes);
}

}  // namespace

std::optional<PropertyList> AppsClient::_restoreStatePropertyForKey(
    std::string_view key, std::string_view identifier,
    const std::optional<std::string>& version) const {
  std::optional<Error> error;
  const std::optional<Bytes> bytes = readState(_platform.files, _log, error);
  const std::optional<PropertyList::Dictionary> state =
      bytes ? parseDictionary(*bytes) : std::nullopt;
  if (!state) return std::nullopt;
  const PropertyList* versions = find(*state, identifier);
  const PropertyList* properties = versions ? versions->find(version.value_or(NoVersion)) : nullptr;
  const PropertyList* value = properties ? properties->find(key) : nullptr;
  return value ? std::optional(*value) : std::nullopt;
}

void AppsClient::_setRestoreStatePropertyValue(const PropertyList& value, std::string_view key,
                                               std::string_view identifier,
                                               const std::optional<std::string>& version) {
  const Lock lock(_stateFileMutex);
  std::optional<Error> error;
  const std::optional<Bytes> bytes = readState(_platform.files, _log, error);
  // What cannot be read now holds what other applications wait for.
  if (!bytes && !isMissing(error)) return;
  // A damaged file is left for the next clean-up to delete.
  std::optional<PropertyList::Dictionary> state =
      bytes ? parseDictionary(*bytes) : PropertyList::Dictionary{};
  if (!state) return;
  PropertyList::Dictionary& versions = dictionaryUnder(*state, identifier);
  dictionaryUnder(versions, version.value_or(NoVersion)).insert_or_assign(std::string(key), value);
  writeXml(_platform.files, std::move(*state));
}

void AppsClient::cleanRestoreStateForIdentifier(std::string_view identifier) {
  const Lock lock(_stateFileMutex);
  std::optional<Error> error;
  const std::optional<Bytes> bytes = readState(_platform.files, _log, error);
  if (!bytes) return;
  // A damaged file counts as empty, so that it goes away here; one that cannot be read stays.
  PropertyList::Dictionary state = parseDictionary(*bytes).value_or(PropertyList::Dictionary{});
  state.erase(std::string(identifier));
  if (state.empty()) {
    std::ignore = _platform.files.removeItem(exchange::RestoreState);
  } else {
    writeXml(_platform.files, std::move(state));
  }
}

}  // namespace appsync
