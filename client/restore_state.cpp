// The restore state: values kept per application and version until its install has ended.

#include "client/apps_client.h"
#include "client/paths.h"
#include "platform/bundle.h"
#include "platform/property_list_codec.h"

namespace appsync {
namespace {

/// The dictionary under `key`, put there if the value is another or missing.
PropertyList::Dictionary& dictionaryUnder(PropertyList::Dictionary& parent, std::string_view key) {
  PropertyList& child = parent[std::string(key)];
  if (!child.asDictionary()) child = PropertyList::Dictionary{};
  return *child.asDictionary();
}

void writeXml(FileManager& files, PropertyList::Dictionary state) {
  const std::optional<Bytes> bytes =
      serializePropertyList(std::move(state), PropertyListFormat::Xml);
  if (bytes) files.writeAtomically(paths::RestoreState, *bytes);
}

}  // namespace

std::optional<PropertyList> AppsClient::_restoreStatePropertyForKey(
    std::string_view key, std::string_view identifier,
    const std::optional<std::string>& version) const {
  if (!version) return std::nullopt;
  const std::optional<PropertyList::Dictionary> state =
      loadDictionary(_platform.files, paths::RestoreState);
  if (!state) return std::nullopt;
  const PropertyList* versions = find(*state, identifier);
  const PropertyList* properties = versions ? versions->find(*version) : nullptr;
  const PropertyList* value = properties ? properties->find(key) : nullptr;
  return value ? std::optional(*value) : std::nullopt;
}

void AppsClient::_setRestoreStatePropertyValue(const PropertyList& value, std::string_view key,
                                               std::string_view identifier,
                                               const std::optional<std::string>& version) {
  if (!version) return;
  const std::lock_guard lock(_stateFileMutex);
  PropertyList::Dictionary state;
  if (_platform.files.fileExists(paths::RestoreState)) {
    // A file that is there but damaged is left for the next clean-up to delete.
    std::optional<PropertyList::Dictionary> loaded =
        loadDictionary(_platform.files, paths::RestoreState);
    if (!loaded) return;
    state = std::move(*loaded);
  }
  PropertyList::Dictionary& versions = dictionaryUnder(state, identifier);
  dictionaryUnder(versions, *version).insert_or_assign(std::string(key), value);
  writeXml(_platform.files, std::move(state));
}

void AppsClient::cleanRestoreStateForIdentifier(std::string_view identifier) {
  const std::lock_guard lock(_stateFileMutex);
  const std::optional<Bytes> bytes = _platform.files.contentsAtPath(paths::RestoreState);
  if (!bytes) return;
  // A damaged file counts as empty, so that it goes away here; one that cannot be read stays.
  std::optional<PropertyList> parsed = parsePropertyList(*bytes);
  PropertyList::Dictionary* entries = parsed ? parsed->asDictionary() : nullptr;
  PropertyList::Dictionary state = entries ? std::move(*entries) : PropertyList::Dictionary{};
  state.erase(std::string(identifier));
  if (state.empty()) {
    _platform.files.removeItem(paths::RestoreState);
  } else {
    writeXml(_platform.files, std::move(state));
  }
}

}  // namespace appsync
