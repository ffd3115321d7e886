#pragma once

#include <optional>
#include <string>

#include "platform/property_list.h"

namespace appsync {

// Identifiers and package paths come from outside and become parts of paths: only a string that
// does not climb ("/..") is usable.

inline bool isSafe(const std::optional<std::string>& value) {
  return value && value->find("/..") == std::string::npos;
}
/// True when the value is there, is a string and holds no "/..".
inline bool isSafe(const PropertyList* value) {
  const std::string* text = value ? value->asString() : nullptr;
  return text && isSafe(*text);
}

}  // namespace appsync
