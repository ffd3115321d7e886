#include "client/identifier_safety.h"

namespace appsync {
namespace {

bool climbs(std::string_view path) { return path.find("/..") != std::string_view::npos; }

}  // namespace

bool isSafe(const PropertyList* value) {
  const std::string* text = value ? value->asString() : nullptr;
  return text && !climbs(*text);
}

bool isSafe(const std::optional<std::string>& value) { return value && !climbs(*value); }

}  // namespace appsync
