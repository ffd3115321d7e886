#pragma once

#include <string_view>

namespace appsync {

/// The backup service. Called from any thread.
class BackupManager {
 public:
  virtual ~BackupManager() = default;

  /// Whether the restored backup holds data that is still to be given back to the application; true
  /// also when that cannot be looked at just now, so that nobody goes on without it.
  virtual bool restoreDataExists(std::string_view bundleId) noexcept = 0;
  /// Gives up restoring the application; its data is not given back.
  virtual void cancelApplicationRestore(std::string_view bundleId) noexcept = 0;
};

}  // namespace appsync
