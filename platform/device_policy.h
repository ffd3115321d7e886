#pragma once

namespace appsync {

enum class PolicySetting { AppInstallationAllowed, AppRemovalAllowed };

enum class PolicyValue { NotSet = 0, Yes = 1, ExplicitlyNo = 2 };

/// The device's restrictions. Called from any thread; the answer may change at any time.
class DevicePolicy {
 public:
  virtual ~DevicePolicy() = default;
  virtual PolicyValue effectiveBoolValue(PolicySetting setting) noexcept = 0;
};

}  // namespace appsync
