#pragma once

#include <map>
#include <mutex>

#include "platform/device_policy.h"
#include "tests/fakes/call_trace.h"

namespace appsync::fakes {

/// Restrictions as a test sets them; at first none is set.
class FakeDevicePolicy : public DevicePolicy {
 public:
  explicit FakeDevicePolicy(CallTrace& trace) : trace_(trace) {}

  PolicyValue effectiveBoolValue(PolicySetting setting) noexcept override {
    const bool installation = setting == PolicySetting::AppInstallationAllowed;
    trace_.add(TraceQuery, callText("DevicePolicy.effectiveBoolValue",
                                    installation ? "AppInstallationAllowed" : "AppRemovalAllowed"));
    const std::scoped_lock lock(mutex_);
    const auto found = values_.find(setting);
    return found == values_.end() ? PolicyValue::NotSet : found->second;
  }

  void set(PolicySetting setting, PolicyValue value) {
    const std::scoped_lock lock(mutex_);
    values_.insert_or_assign(setting, value);
  }
  void forbidInstalling() { set(PolicySetting::AppInstallationAllowed, PolicyValue::ExplicitlyNo); }
  void forbidRemoving() { set(PolicySetting::AppRemovalAllowed, PolicyValue::ExplicitlyNo); }

 private:
  CallTrace& trace_;
  std::mutex mutex_;
  std::map<PolicySetting, PolicyValue> values_;
};

}  // namespace appsync::fakes
