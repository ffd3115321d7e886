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
  std::size_t depth = 128;
};

/// Parses an XML or binary property list. Bytes that are neither, exceed the limits, hold a
/// reference cycle, an offset outside the file or a value that no property list has (a UID) give
/// nullopt and an error of PropertyListErrorDomain; hostile bytes never crash. Thread-safe, keeps
/// nothing.
std::optional<PropertyList> parsePropertyList(ByteView bytes, std::optional<Error>* error = nullptr,
                                              const PropertyListLimits& limits = {});

/// Serialises a tree. Fails (nullopt, error) on a null anywhere in it, a string or key with a NUL
/// byte or that is no UTF-8, or a nesting that the parser's default limits would refuse.
/// Thread-safe.
std::optional<Bytes> serializePropertyList(const PropertyList& value, PropertyListFormat format,
                                           std::optional<Error>* error = nullptr);

}  // namespace appsync
