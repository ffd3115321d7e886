#pragma once

#include <optional>
#include <string_view>

#include "client/log_message.h"
#include "platform/error.h"

namespace appsync {

/// Says in the log that the file at `path` may be there but could not be read, if that is what the
/// reason of a read says; a read that went well has none.
void sayUnreadable(const ClientLog& log, std::string_view path, const std::optional<Error>& reason);

}  // namespace appsync
