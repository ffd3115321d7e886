#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "platform/property_list.h"

namespace appsync {

/// The client's and the sync host's own errors.
inline constexpr std::string_view TWErrorDomain = "TWError";
/// Errors whose code is an errno value.
inline constexpr std::string_view POSIXErrorDomain = "POSIX";
/// User-info key of a text for people.
inline constexpr std::string_view ErrorDescriptionKey = "Description";

/// Why an operation failed. Operations return a boolean, an optional or an empty collection and
/// fill an optional out-argument `std::optional<Error>* error`: it may be null (the reason is not
/// wanted); it is written only on failure unless the operation says otherwise.
struct Error {
  std::string domain;
  std::int64_t code = 0;
  PropertyList::Dictionary userInfo;
  /// The error that caused this one, or nullptr.
  std::shared_ptr<const Error> underlying;

  /// An error with a text for people under ErrorDescriptionKey.
  static Error withDescription(std::string_view domain, std::int64_t code, std::string_view text);
  /// An error of POSIXErrorDomain: `errnoValue`'s system text, and `path` in front of it if not
  /// empty.
  static Error posix(int errnoValue, std::string_view path = {});

  /// The text under ErrorDescriptionKey, or "domain error code".
  std::string localizedDescription() const;

  bool operator==(const Error& other) const;
};

/// "Error Domain=TWError Code=1 {…}", with the underlying error behind it.
std::string description(const Error& error);

/// Fills `*error` if the caller wants it.
inline void setError(std::optional<Error>* error, Error reason) {
  if (error) *error = std::move(reason);
}
/// The same, for an operation that is false when it fails: false.
[[nodiscard]] inline bool failWith(std::optional<Error>* error, Error reason) {
  setError(error, std::move(reason));
  return false;
}

}  // namespace appsync
