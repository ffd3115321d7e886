#pragma once

#include <algorithm>
#include <cmath>

#include "platform/property_list.h"

namespace appsync {

/// Equality that also holds for a NaN, which differs from itself.
inline bool sameTree(const PropertyList& a, const PropertyList& b) {
  if (a.type() != b.type()) return false;
  if (const auto* array = a.asArray()) return std::ranges::equal(*array, *b.asArray(), sameTree);
  if (const auto* dictionary = a.asDictionary()) {
    return std::ranges::equal(
        *dictionary, *b.asDictionary(), [](const auto& left, const auto& right) {
          return left.first == right.first && sameTree(left.second, right.second);
        });
  }
  const bool bothNan =
      a.type() == PropertyList::Type::Real && std::isnan(*a.asReal()) && std::isnan(*b.asReal());
  return a == b || bothNan;
}

}  // namespace appsync
