#pragma once

#include <string>

#include "device/state/device_core.h"

namespace appsync::device {

/// If the policy lets a person remove: takes an application's package away and leaves its data and
/// a placeholder of InstallType::IntentionalDowngrade with its icon and metadata. A crash on the
/// way leaves it installed; done again, it comes to its end. The identifier is usable and the
/// caller holds its application lock.
[[nodiscard]] bool demoteForPerson(DeviceCore& core, const std::string& identifier,
                                   std::optional<Error>* error);

}  // namespace appsync::device
