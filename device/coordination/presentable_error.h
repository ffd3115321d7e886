#pragma once

#include "platform/error.h"

namespace appsync::device {

/// Of TWErrorDomain, with the cause's text and a "Flag".
inline Error presentableError(std::int64_t code, std::uint64_t flag,
                              const std::optional<Error>& cause) {
  Error error = Error::withDescription(
      TWErrorDomain, code,
      cause ? cause->localizedDescription() : "The application could not be installed.");
  error.userInfo.emplace("Flag", flag);
  if (cause) error.underlying = std::make_shared<const Error>(*cause);
  return error;
}

}  // namespace appsync::device
