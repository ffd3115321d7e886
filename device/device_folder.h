#pragma once

#include <filesystem>
#include <memory>
#include <string_view>

#include "base/file_descriptor.h"
#include "device/device_opening.h"

namespace appsync::device {

/// Where things lie in a device's folder.
struct DevicePaths {
  explicit DevicePaths(const std::filesystem::path& folder);

  std::filesystem::path folder;
  std::filesystem::path database;
  std::filesystem::path root;        ///< what the phone sees as "/"
  std::filesystem::path log;         ///< the log files
  std::filesystem::path foreground;  ///< which applications run or may not
  std::filesystem::path lock;        ///< locked, with the process id in it, while one writes
  std::filesystem::path unfinished;  ///< stands while the device is being made
};

/// "folder: reason; remedy", on one line whatever the folder's name holds.
DeviceError deviceError(DeviceProblem problem, const std::filesystem::path& folder,
                        std::string_view reason, std::string_view remedy);
DeviceError unusableFolder(const std::filesystem::path& folder, std::string_view reason);
DeviceError foreignFolder(const std::filesystem::path& folder);
DeviceError damagedDevice(const std::filesystem::path& folder, std::string_view damage);

/// The right to write a device. The system takes it back when the process ends, however it ends.
class WriteLock {
 public:
  /// nullptr (Busy, naming the process that has it, or Unusable) when it cannot be had.
  [[nodiscard]] static std::unique_ptr<WriteLock> take(const DevicePaths& paths,
                                                       DeviceError& error);

 private:
  explicit WriteLock(FileDescriptor file) : file_(std::move(file)) {}
  FileDescriptor file_;
};

/// Makes a new device in a folder that is missing, empty, or left by a making that was broken off.
[[nodiscard]] bool makeDeviceFolder(const DevicePaths& paths, const DeviceOptions& options,
                                    DeviceError& error);

/// Whether the folder looks like a finished device; its database is looked at elsewhere.
[[nodiscard]] bool checkDeviceFolder(const DevicePaths& paths, DeviceError& error);

}  // namespace appsync::device
