#include "restore/halvo_metadata.h"

#include "client/usable_text.h"
#include "platform/property_list_codec.h"
#include "restore/placeholder_info.h"

namespace appsync {
namespace {

constexpr std::string_view VersionKey = "bundleVersion";
constexpr std::string_view TitleKey = "title";
constexpr std::string_view ItemNameKey = "itemName";

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

void sayUnexpectedTypesOfMetadata(const ClientLog& log, std::string_view bundleId,
                                  const PropertyList::Dictionary& metadata) {
  sayUnexpectedTypes(log, bundleId, metadata, {VersionKey, TitleKey, ItemNameKey});
}

std::optional<std::string> metadataVersion(const PropertyList::Dictionary& metadata) {
  return usableText(metadata, VersionKey);
}

std::optional<std::string> metadataName(const PropertyList::Dictionary& metadata) {
  std::optional<std::string> title = usableText(metadata, TitleKey);
  return title ? title : usableText(metadata, ItemNameKey);
}

bool metadataProhibitsLaunch(const PropertyList::Dictionary& metadata) {
  const PropertyList* flag = find(metadata, LaunchProhibitedKey);
  if (!flag) flag = find(metadata, "launchProhibited");
  return flag && flag->booleanValue();
}

}  // namespace appsync
