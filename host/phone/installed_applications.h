#pragma once

#include <optional>
#include <string>
#include <vector>

#include "host/library/sync_plan.h"
#include "host/phone/phone_state.h"

namespace appsync::host {

/// Whether a placeholder is what a broken-off sync left. One that is all that is left of an
/// application with data is not, nor when that cannot be told.
bool isLeftOver(const Phone& phone, const AppRecord& placeholder);

/// What a sync finds on the phone: one per application, sorted by identifier. Placeholders that a
/// broken-off sync left do not count. nullopt, with one line for people, when it cannot be told
/// what is demoted.
[[nodiscard]] std::optional<std::vector<InstalledApplication>> installedApplications(
    const Phone& phone, std::string& problem);

}  // namespace appsync::host
