#pragma once

#include <mutex>
#include <set>
#include <string>
#include <vector>

#include "platform/backup_manager.h"
#include "tests/fakes/call_trace.h"

namespace appsync::fakes {

/// Knows which applications' data is still to be given back.
class FakeBackupManager : public BackupManager {
 public:
  explicit FakeBackupManager(CallTrace& trace) : trace_(trace) {}

  bool restoreDataExists(std::string_view bundleId) noexcept override {
    trace_.add(TraceQuery, callText("BackupManager.restoreDataExists", bundleId));
    const std::scoped_lock lock(mutex_);
    return withData_.contains(std::string(bundleId));
  }

  void cancelApplicationRestore(std::string_view bundleId) noexcept override {
    trace_.add(TraceCall, callText("BackupManager.cancelApplicationRestore", bundleId));
    const std::scoped_lock lock(mutex_);
    withData_.erase(std::string(bundleId));
    canceled_.emplace_back(bundleId);
  }

  void addRestoreData(std::string_view bundleId) {
    const std::scoped_lock lock(mutex_);
    withData_.emplace(bundleId);
  }
  std::vector<std::string> canceledRestores() const {
    const std::scoped_lock lock(mutex_);
    return canceled_;
  }

 private:
  CallTrace& trace_;
  mutable std::mutex mutex_;
  std::set<std::string> withData_;
  std::vector<std::string> canceled_;
};

}  // namespace appsync::fakes
