// Parses arbitrary bytes; what parses must survive both formats unchanged.

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <cstdlib>

#include "platform/property_list_codec.h"

namespace {

using appsync::ByteView;
using appsync::PropertyList;
using appsync::PropertyListFormat;

void require(bool condition) {
  if (!condition) std::abort();
}

/// Equality that also holds for a NaN, which differs from itself.
bool same(const PropertyList& a, const PropertyList& b) {
  if (a.type() != b.type()) return false;
  if (const auto* array = a.asArray())
    return std::equal(array->begin(), array->end(), b.asArray()->begin(), b.asArray()->end(), same);
  if (const auto* dictionary = a.asDictionary()) {
    const auto sameEntry = [](const auto& left, const auto& right) {
      return left.first == right.first && same(left.second, right.second);
    };
    return std::equal(dictionary->begin(), dictionary->end(), b.asDictionary()->begin(),
                      b.asDictionary()->end(), sameEntry);
  }
  const bool bothNan =
      a.type() == PropertyList::Type::Real && std::isnan(*a.asReal()) && std::isnan(*b.asReal());
  return a == b || bothNan;
}

/// nullopt when XML cannot hold the tree.
std::optional<PropertyList> roundTrip(const PropertyList& tree, PropertyListFormat format) {
  const auto file = appsync::serializePropertyList(tree, format);
  require(file || format == PropertyListFormat::Xml);
  if (!file) return std::nullopt;
  auto again = appsync::parsePropertyList(*file);
  require(again.has_value());
  return again;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  if (const auto tree = appsync::parsePropertyList(std::as_bytes(std::span(data, size)))) {
    (void)description(*tree);
    require(same(*roundTrip(*tree, PropertyListFormat::Binary), *tree));
    // XML rounds dates, once.
    if (const auto rounded = roundTrip(*tree, PropertyListFormat::Xml))
      require(same(*roundTrip(*rounded, PropertyListFormat::Xml), *rounded));
  }
  return 0;
}
