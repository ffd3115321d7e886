#include "device/services/backup_manager.h"

#include <tuple>

#include "base/identifiers.h"

namespace appsync::device {

bool DeviceBackupManager::restoreDataExists(std::string_view bundleId) noexcept {
  return isUsableIdentifier(bundleId) &&
         core_.containers.dataWaits(bundleId, nullptr).value_or(true);
}

void DeviceBackupManager::cancelApplicationRestore(std::string_view bundleId) noexcept {
  if (!isUsableIdentifier(bundleId) || !core_.database.writable()) return;
  const KeyedMutex::Guard guard(core_.applicationLocks, bundleId);
  // What stays is still said to wait.
  std::ignore = core_.containers.removeWaitingData(bundleId, nullptr);
}

}  // namespace appsync::device
