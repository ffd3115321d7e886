#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "platform/binary_property_list.h"
#include "platform/bytes.h"
#include "platform/property_list_codec.h"

namespace appsync {

// Checks made on the bytes of a property list before a parser builds anything from them. They are
// pure and need memory in proportion to the bytes only.

/// Deeper trees are refused whatever the limits say: parser and tree recurse.
inline constexpr std::size_t MaximumPropertyListDepth = 512;

/// Why a binary property list is refused, or nullptr. Beyond its structure this bounds what it
/// expands to, since objects may be shared: `limits.objects` objects and `limits.bytes` bytes. Of
/// one that is not refused, `sharesContainers` tells whether an array or a dictionary stands in
/// more than one place.
const char* problemOf(const BinaryPropertyList& list, const PropertyListLimits& limits,
                      bool* sharesContainers = nullptr);

/// The same XML property list without anything that parsers read differently: no comments,
/// attributes, CDATA, blanks between elements or character references; integers in plain decimal.
/// Every container is an array: after `true` come a dictionary's keys and values in turn, after
/// `false` an array's elements. (The library's own XML dictionaries have a hash table of fixed
/// size, which many keys, or keys chosen to collide, make take hours.) nullopt, with `problem` told
/// in one line, when it is malformed or beyond the limits. `document` has no byte-order mark.
[[nodiscard]] std::optional<std::string> canonicalXmlPropertyList(std::string_view document,
                                                                  const PropertyListLimits& limits,
                                                                  std::string& problem);

}  // namespace appsync
