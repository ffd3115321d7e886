#pragma once

#include <optional>
#include <string>

#include "platform/property_list.h"

namespace appsync {

// Identifiers and package paths come from outside and become parts of paths: only a string that
// does not climb ("/..") is usable.

/// True when the value is there, is a string and holds no "/..".
bool isSafe(const PropertyList* value);
bool isSafe(const std::optional<std::string>& value);

}  // namespace appsync
