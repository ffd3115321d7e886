#pragma once

#include "host/cli/cli.h"

namespace appsync::host {

/// The command "status": one object, or a few lines for people.
ExitCode runStatus(CommandContext& context);

}  // namespace appsync::host
