#pragma once

#include <string>

#include "platform/app_registry.h"

namespace appsync {

// Names of registry values in log lines. An unknown value gives "Unknown Install Type: 9" and so
// on.
std::string installTypeName(InstallType type);
std::string installStateName(InstallState state);
std::string installPhaseName(InstallPhase phase);

}  // namespace appsync
