#pragma once

#include <filesystem>
#include <memory>

#include "device/device_opening.h"
#include "device/state/database.h"

namespace appsync::device {

/// Makes the database file of a new device. Throws SQLite::Exception.
void createDatabase(const std::filesystem::path& file, const DeviceOptions& options);

/// Opens a device's database after checking that it is one, of this version, and whole. nullptr
/// with a problem of `folder` otherwise.
[[nodiscard]] std::unique_ptr<Database> openDatabase(const std::filesystem::path& folder,
                                                     const std::filesystem::path& file,
                                                     Access access, Log& log, DeviceError& error);

}  // namespace appsync::device
