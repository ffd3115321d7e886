#include "client/unreadable.h"

#include "platform/existence.h"

namespace appsync {

void sayUnreadable(const ClientLog& log, std::string_view path,
                   const std::optional<Error>& reason) {
  if (reason && !isMissing(reason)) log.error("can't read %{public}@: %{public}@", path, reason);
}

}  // namespace appsync
