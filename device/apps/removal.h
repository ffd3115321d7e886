#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "device/state/device_core.h"

namespace appsync::device {

// Ways for an application to leave the device. Each is on disk when it returns true. The identifier
// is usable, and the caller holds its application lock; recovery needs none, since it runs before
// anyone else has the device.

/// What the registry's clients ask for: takes the placeholder if there is one, else (unless
/// `placeholderOnly`) the application with its data. A placeholder that is all that is left of an
/// application counts as that: unless `placeholderOnly`, its data goes too, and what a restore
/// still had for it.
[[nodiscard]] bool removeForClient(DeviceCore& core, const std::string& identifier,
                                   bool placeholderOnly, std::optional<Error>* error);

/// Whether the policy lets a person remove applications; else with an error.
[[nodiscard]] bool mayRemove(DeviceCore& core, std::optional<Error>* error);

/// What a person does, if the policy lets them: takes the application, its placeholder, its data
/// and what a restore still had for it. Observers hear of an install that this breaks off.
[[nodiscard]] bool removeForPerson(DeviceCore& core, const std::string& identifier,
                                   std::optional<Error>* error);

/// Removes what a restore had for an application of which the registry knows nothing any more.
[[nodiscard]] bool forgetWaitingData(DeviceCore& core, const std::string& identifier,
                                     std::optional<Error>* error);

/// Notes that an application's data, and what a restore still had for it, is to be removed, or what
/// was set aside of it (Containers::asideName). It is only named in this change, so that a crash
/// before all of it is gone is made good later.
void abandonData(Connection& database, std::string_view name);
/// Whether that was noted and is not done; nullopt with an error.
[[nodiscard]] std::optional<bool> isAbandoned(DeviceCore& core, std::string_view name,
                                              std::optional<Error>* error);
/// Ends the removal of data that was noted, if there is such. Comes before anything new is put in
/// its place.
[[nodiscard]] bool removeAbandonedData(DeviceCore& core, const std::string& name,
                                       std::optional<Error>* error);

}  // namespace appsync::device
