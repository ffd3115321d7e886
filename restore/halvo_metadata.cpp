#include "restore/halvo_metadata.h"

#include "client/usable_text.h"
#include "restore/placeholder_info.h"

namespace appsync {
namespace {

constexpr std::string_view VersionKey = "bundleVersion";
constexpr std::string_view TitleKey = "title";
constexpr std::string_view ItemNameKey = "itemName";

}  // namespace

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
  return findFlag(metadata,
                  find(metadata, LaunchProhibitedKey) ? LaunchProhibitedKey : "launchProhibited");
}

}  // namespace appsync
