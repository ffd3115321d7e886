#pragma once

#include <optional>
#include <string>
#include <vector>

#include "phone/phone.h"

namespace appsync::host {

/// The applications of the user that are there or to come, sorted by identifier. What a broken-off
/// sync left a placeholder of is neither. Empty, with an error, when they cannot be told.
[[nodiscard]] std::vector<AppRecord> applicationsToSave(const Phone& phone,
                                                        std::optional<Error>* error);

/// What the application is restored from. nullopt, with the reason, when any of it cannot be read.
[[nodiscard]] std::optional<PropertyList::Dictionary> restoreEntry(const Phone& phone,
                                                                   const AppRecord& record,
                                                                   std::string& problem);

/// Which of the applications are to stay placeholders until a person asks for them, by what demoted
/// them. nullopt, with an error, when that cannot be read.
[[nodiscard]] std::optional<PropertyList::Dictionary> demotionsAmong(
    FileManager& files, const std::vector<AppRecord>& applications, std::optional<Error>* error);

}  // namespace appsync::host
