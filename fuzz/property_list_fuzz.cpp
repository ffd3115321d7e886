// Parses arbitrary bytes; what parses must survive both formats unchanged.

#include <cstdint>
#include <cstdlib>
#include <optional>
#include <span>

#include "platform/property_list_codec.h"
#include "tests/platform/same_tree.h"

namespace {

using appsync::ByteView;
using appsync::PropertyList;
using appsync::PropertyListFormat;

void require(bool condition) {
  if (!condition) std::abort();
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
    require(sameTree(*roundTrip(*tree, PropertyListFormat::Binary), *tree));
    // XML rounds dates, once.
    if (const auto rounded = roundTrip(*tree, PropertyListFormat::Xml))
      require(sameTree(*roundTrip(*rounded, PropertyListFormat::Xml), *rounded));
  }
  return 0;
}
