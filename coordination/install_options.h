#pragma once

#include <utility>

#include "platform/install_coordination.h"

namespace appsync {

/// Options of an install on the device itself.
inline InstallOptions installOptions(InstallType type, StoreMetadata storeMetadata) {
  InstallOptions options;
  options.storeMetadata = std::move(storeMetadata);
  options.installType = type;
  options.installTargetType = 1;
  return options;
}

}  // namespace appsync
