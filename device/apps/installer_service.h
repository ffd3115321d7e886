#pragma once

#include "device/state/database.h"
#include "platform/installer_service.h"

namespace appsync::device {

/// The list of uninstalled applications, kept in the device's database.
class DeviceInstallerService final : public InstallerService {
 public:
  explicit DeviceInstallerService(Database& database) : database_(database) {}

  /// Each identifier has a dictionary with the "Date" of the removal.
  std::optional<PropertyList::Dictionary> lookupUninstalled() noexcept override;
  int clearUninstalled(const std::vector<std::string>& bundleIds) noexcept override;

 private:
  Database& database_;
};

// Used within Database's work; these throw SQLite::Exception.

void recordUninstalled(Connection& database, std::string_view identifier);
void forgetUninstalled(Connection& database, std::string_view identifier);

}  // namespace appsync::device
