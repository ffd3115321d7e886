#pragma once

#include <optional>
#include <string_view>

#include "device/state/database.h"
#include "platform/file_manager.h"

namespace appsync::device {

/// Why a person cannot bring the application to the foreground; none if they can.
[[nodiscard]] std::optional<Error> objectionToLaunch(Database& database, FileManager& files,
                                                     std::string_view identifier);

}  // namespace appsync::device
