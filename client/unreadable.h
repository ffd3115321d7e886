#pragma once

#include "client/log_message.h"
#include "platform/existence.h"

namespace appsync {

/// Says in the log that the file at `path` may be there but could not be read, if that is what the
/// reason of a read says; a read that went well has none.
inline void sayUnreadable(const ClientLog& log, std::string_view path,
                          const std::optional<Error>& reason) {
  if (reason && !isMissing(reason)) log.error("can't read %{public}@: %{public}@", path, reason);
}

}  // namespace appsync
