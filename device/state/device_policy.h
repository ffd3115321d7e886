#pragma once

#include "device/state/database.h"
#include "platform/device_policy.h"

namespace appsync::device {

/// The device's restrictions, kept in its database; what was never set is NotSet. What
/// cannot be read is forbidden.
class StoredDevicePolicy final : public DevicePolicy {
 public:
  explicit StoredDevicePolicy(Database& database) : database_(database) {}

  PolicyValue effectiveBoolValue(PolicySetting setting) noexcept override;
  [[nodiscard]] bool set(PolicySetting setting, PolicyValue value,
                         std::optional<Error>* error) noexcept;

 private:
  Database& database_;
};

}  // namespace appsync::device
