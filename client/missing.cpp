#include "client/missing.h"

#include <cerrno>

namespace appsync {

bool isMissing(const std::optional<Error>& reason) {
  return reason && reason->domain == POSIXErrorDomain &&
         (reason->code == ENOENT || reason->code == ENOTDIR);
}

void sayUnreadable(const ClientLog& log, std::string_view path,
                   const std::optional<Error>& reason) {
  if (reason && !isMissing(reason)) log.error("can't read %{public}@: %{public}@", path, reason);
}

}  // namespace appsync
