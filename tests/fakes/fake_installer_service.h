#pragma once

#include <mutex>
#include <set>

#include "platform/installer_service.h"
#include "tests/fakes/call_trace.h"

namespace appsync::fakes {

/// Remembers what FakeAppRegistry and tests say was uninstalled.
class FakeInstallerService : public InstallerService {
 public:
  explicit FakeInstallerService(CallTrace& trace) : trace_(trace) {}

  std::optional<PropertyList::Dictionary> lookupUninstalled() noexcept override {
    trace_.add(TraceQuery, callText("InstallerService.lookupUninstalled"));
    const std::scoped_lock lock(mutex_);
    if (!answers_) return std::nullopt;
    PropertyList::Dictionary found;
    for (const std::string& id : uninstalled_) found.emplace(id, PropertyList::Dictionary{});
    return found;
  }

  int clearUninstalled(const std::vector<std::string>& bundleIds) noexcept override {
    trace_.add(TraceCall,
               callText("InstallerService.clearUninstalled",
                        description(PropertyList::Array(bundleIds.begin(), bundleIds.end()))));
    const std::scoped_lock lock(mutex_);
    if (clearStatus_ != 0) return clearStatus_;
    for (const std::string& id : bundleIds) uninstalled_.erase(id);
    return 0;
  }

  void addUninstalled(std::string_view bundleId) {
    const std::scoped_lock lock(mutex_);
    uninstalled_.emplace(bundleId);
  }
  /// The application is there again.
  void removeUninstalled(std::string_view bundleId) {
    const std::scoped_lock lock(mutex_);
    uninstalled_.erase(std::string(bundleId));
  }
  /// Whether lookupUninstalled gives an answer at all.
  void setAnswers(bool answers) {
    const std::scoped_lock lock(mutex_);
    answers_ = answers;
  }
  /// With a status other than 0 clearUninstalled forgets nothing.
  void setClearStatus(int status) {
    const std::scoped_lock lock(mutex_);
    clearStatus_ = status;
  }
  std::set<std::string> uninstalled() const {
    const std::scoped_lock lock(mutex_);
    return uninstalled_;
  }

 private:
  CallTrace& trace_;
  mutable std::mutex mutex_;
  std::set<std::string> uninstalled_;
  bool answers_ = true;
  int clearStatus_ = 0;
};

}  // namespace appsync::fakes
