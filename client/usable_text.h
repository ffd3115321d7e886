#pragma once

#include <initializer_list>
#include <optional>
#include <string>
#include <string_view>

#include "client/log_message.h"
#include "platform/property_list.h"

namespace appsync {

// Names and versions come from outside, and some write them as numbers.

/// The text under `key`: a string as it stands, a number in digits. nullopt for anything else.
std::optional<std::string> usableText(const PropertyList::Dictionary& values, std::string_view key);

/// Says in the log which of these keys hold no string in what is known of an application. A missing
/// key is not worth a line.
void sayUnexpectedTypes(const ClientLog& log, std::string_view bundleId,
                        const PropertyList::Dictionary& values,
                        std::initializer_list<std::string_view> keys);

}  // namespace appsync
