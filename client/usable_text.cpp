#include "client/usable_text.h"

namespace appsync {

std::optional<std::string> usableText(const PropertyList::Dictionary& values,
                                      std::string_view key) {
  const PropertyList* value = find(values, key);
  if (!value) return std::nullopt;
  if (const std::string* text = value->asString()) return *text;
  const PropertyList::Type type = value->type();
  const bool isNumber = type == PropertyList::Type::Integer || type == PropertyList::Type::Real;
  return isNumber ? std::optional(description(*value)) : std::nullopt;
}

void sayUnexpectedTypes(const ClientLog& log, std::string_view bundleId,
                        const PropertyList::Dictionary& values,
                        std::initializer_list<std::string_view> keys) {
  for (const std::string_view key : keys) {
    const PropertyList* value = find(values, key);
    if (!value || value->asString()) continue;
    log.error("unexpected type for %{public}@ of %{public}@: %{public}@", key, bundleId, *value);
  }
}

}  // namespace appsync
