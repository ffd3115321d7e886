#include "restore/halvo_metadata.h"

#include "platform/property_list_codec.h"
#include "restore/placeholder_info.h"

namespace appsync {
namespace {

std::optional<std::string> stringUnder(const PropertyList::Dictionary& dictionary,
                                       std::string_view key) {
  const std::string* text = findString(dictionary, key);
  return text ? std::optional(*text) : std::nullopt;
}

}  // namespace

std::optional<PropertyList::Dictionary> parseDictionary(ByteView bytes,
                                                        std::optional<Error>* error) {
  std::optional<PropertyList> parsed = parsePropertyList(bytes, error);
  if (!parsed) return std::nullopt;
  PropertyList::Dictionary* dictionary = parsed->asDictionary();
  if (!dictionary) {
    setError(error, Error::withDescription(PropertyListErrorDomain, 0, "not a dictionary"));
    return std::nullopt;
  }
  return std::move(*dictionary);
}

std::optional<std::string> metadataVersion(const PropertyList::Dictionary& metadata) {
  return stringUnder(metadata, "bundleVersion");
}

std::optional<std::string> metadataName(const PropertyList::Dictionary& metadata) {
  std::optional<std::string> title = stringUnder(metadata, "title");
  return title ? title : stringUnder(metadata, "itemName");
}

bool metadataProhibitsLaunch(const PropertyList::Dictionary& metadata) {
  const PropertyList* flag = find(metadata, LaunchProhibitedKey);
  if (!flag) flag = find(metadata, "launchProhibited");
  return flag && flag->booleanValue();
}

}  // namespace appsync
