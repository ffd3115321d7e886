#pragma once

#include <vector>

#include "host/library/sync_plan.h"
#include "host/phone/phone.h"

namespace appsync::host {

/// What a sync finds on the phone: one per application, sorted by identifier. Placeholders that a
/// broken-off sync left do not count.
std::vector<InstalledApplication> installedApplications(const Phone& phone);

}  // namespace appsync::host
