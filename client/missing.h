#pragma once

#include <optional>
#include <string_view>

#include "client/log_message.h"
#include "platform/error.h"

namespace appsync {

// What cannot be looked at just now is not therefore missing.

/// Whether a failed look or read failed because nothing is there. Any other reason, or none, leaves
/// that open.
bool isMissing(const std::optional<Error>& reason);

/// Says in the log that the file at `path` may be there but could not be read, if that is what the
/// reason of a read says; a read that went well has none.
void sayUnreadable(const ClientLog& log, std::string_view path, const std::optional<Error>& reason);

}  // namespace appsync
