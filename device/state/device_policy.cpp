#include "device/state/device_policy.h"

namespace appsync::device {

PolicyValue StoredDevicePolicy::effectiveBoolValue(PolicySetting setting) noexcept {
  PolicyValue value = PolicyValue::NotSet;
  const bool read = database_.read("the policies could not be read", [&](Connection& database) {
    Query query(database, "SELECT value FROM policies WHERE setting = ?", setting);
    if (query.next()) value = query.as<PolicyValue>(0);
  });
  return read ? value : PolicyValue::ExplicitlyNo;
}

bool StoredDevicePolicy::set(PolicySetting setting, PolicyValue value,
                             std::optional<Error>* error) noexcept {
  return database_.change(
      "a policy could not be set", Database::Commit::OnDisk,
      [&](Connection& database) {
        Query(database, "INSERT OR REPLACE INTO policies VALUES (?, ?)", setting, value).run();
      },
      error);
}

}  // namespace appsync::device
