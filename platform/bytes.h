#pragma once

#include <cstddef>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace appsync {

/// Raw file or message contents, owned.
using Bytes = std::vector<std::byte>;
/// Raw contents borrowed for the length of a call.
using ByteView = std::span<const std::byte>;

inline ByteView asBytes(std::string_view text) {
  return std::as_bytes(std::span(text.data(), text.size()));
}

inline std::string_view asText(ByteView bytes) {
  return {reinterpret_cast<const char*>(bytes.data()), bytes.size()};
}

inline Bytes toBytes(std::string_view text) {
  const ByteView view = asBytes(text);
  return {view.begin(), view.end()};
}

}  // namespace appsync
