#pragma once

#include <optional>

#include "platform/bytes.h"
#include "platform/error.h"
#include "platform/property_list.h"

namespace appsync {

inline constexpr std::string_view PropertyListErrorDomain = "PropertyListError";

enum class PropertyListFormat { Xml, Binary };

/// What a property list from outside may hold; more is refused before it is built.
struct PropertyListLimits {
  std::size_t bytes = std::size_t{64} << 20;
  std::size_t objects = 2'000'000;
  std::size_t depth = 128;  ///< arrays and dictionaries inside each other; never above 512
};

/// Parses an XML or binary property list. Bytes that are neither, exceed the limits, hold a
/// reference cycle, an offset outside the file or a value that no property list has (a UID) give
/// nullopt and an error of PropertyListErrorDomain; hostile bytes never crash. Thread-safe, keeps
/// nothing.
std::optional<PropertyList> parsePropertyList(ByteView bytes, std::optional<Error>* error = nullptr,
                                              const PropertyListLimits& limits = {});

/// The dictionary that the bytes hold. nullopt and an error when they are no property list or hold
/// something else.
std::optional<PropertyList::Dictionary> parseDictionary(ByteView bytes,
                                                        std::optional<Error>* error = nullptr,
                                                        const PropertyListLimits& limits = {});

/// Serialises a tree, so that parsing gives an equal one. Fails (nullopt, error) on what a reader
/// could not have back: a null anywhere, a string or key with a NUL byte or that is no UTF-8, a
/// date that is no finite number, a tree beyond the parser's default limits; in XML also a control
/// character other than tab, line feed and carriage return, and a date outside the years 1000 to
/// 9999. XML holds dates in whole seconds (rounded down) and neither a negative zero nor the bits
/// of a NaN. Thread-safe.
[[nodiscard]] std::optional<Bytes> serializePropertyList(const PropertyList& value,
                                                         PropertyListFormat format,
                                                         std::optional<Error>* error = nullptr);

}  // namespace appsync
