#pragma once

#include <memory>
#include <optional>

#include "device/device_folder.h"
#include "device/journal/log_files.h"
#include "device/state/database.h"

namespace appsync::device {

/// A folder that has been found to be a device, open. `lock` is there only for writing.
struct OpenFolder {
  DevicePaths paths;
  std::unique_ptr<WriteLock> lock;
  std::unique_ptr<LogFiles> log;
  std::unique_ptr<Database> database;
  DeviceOptions options;
};

[[nodiscard]] std::optional<OpenFolder> openFolder(const std::filesystem::path& folder,
                                                   Access access, DeviceError& error);

}  // namespace appsync::device
