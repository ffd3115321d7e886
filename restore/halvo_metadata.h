#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "client/log_message.h"
#include "platform/property_list.h"

namespace appsync {

// What an application's store metadata says of it. A version or a name that is a number is taken in
// digits; of another type it counts as missing.

/// Says in the log which of them are no strings.
void sayUnexpectedTypesOfMetadata(const ClientLog& log, std::string_view bundleId,
                                  const PropertyList::Dictionary& metadata);

std::optional<std::string> metadataVersion(const PropertyList::Dictionary& metadata);
/// The title or, failing that, the item's name.
std::optional<std::string> metadataName(const PropertyList::Dictionary& metadata);
bool metadataProhibitsLaunch(const PropertyList::Dictionary& metadata);

}  // namespace appsync
