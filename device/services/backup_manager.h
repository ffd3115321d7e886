#pragma once

#include "device/state/device_core.h"
#include "platform/backup_manager.h"

namespace appsync::device {

/// The backup service: what a restore has still to give back lies in the phone's files.
class DeviceBackupManager final : public BackupManager {
 public:
  explicit DeviceBackupManager(DeviceCore& core) : core_(core) {}

  bool restoreDataExists(std::string_view bundleId) noexcept override;
  void cancelApplicationRestore(std::string_view bundleId) noexcept override;

 private:
  DeviceCore& core_;
};

}  // namespace appsync::device
