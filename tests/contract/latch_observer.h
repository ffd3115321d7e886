#pragma once

#include <chrono>
#include <condition_variable>
#include <functional>
#include <mutex>
#include <thread>
#include <utility>
#include <vector>

#include "platform/app_registry.h"

namespace appsync::contract {

/// Keeps the registry's reports and lets a test wait for one.
class LatchObserver : public AppRegistryObserver {
 public:
  struct Report {
    std::vector<std::string> prioritized;
    std::vector<std::string> paused;
    bool operator==(const Report&) const = default;
  };

  void applicationInstallsArePrioritized(const std::vector<AppRecord>& prioritized,
                                         const std::vector<AppRecord>& paused) noexcept override {
    const std::scoped_lock lock(mutex_);
    reports_.push_back({identifiers(prioritized), identifiers(paused)});
    thread_ = std::this_thread::get_id();
    changed_.notify_all();
  }
  void applicationInstallsDidCancel(const std::vector<AppRecord>& records) noexcept override {
    const std::scoped_lock lock(mutex_);
    for (const AppRecord& record : records) canceled_.push_back(record.applicationIdentifier);
    changed_.notify_all();
  }

  /// Whether, within a minute, the latest report becomes this one.
  bool waitFor(const Report& report) {
    return wait([&] { return !reports_.empty() && reports_.back() == report; });
  }
  bool waitForCanceled(const std::vector<std::string>& expected) {
    return wait([&] { return canceled_ == expected; });
  }
  std::size_t reportCount() {
    const std::scoped_lock lock(mutex_);
    return reports_.size();
  }
  std::thread::id thread() {
    const std::scoped_lock lock(mutex_);
    return thread_;
  }

 private:
  static std::vector<std::string> identifiers(const std::vector<AppRecord>& records) {
    std::vector<std::string> found;
    for (const AppRecord& record : records) found.push_back(record.applicationIdentifier);
    return found;
  }
  bool wait(const std::function<bool()>& condition) {
    std::unique_lock lock(mutex_);
    return changed_.wait_for(lock, std::chrono::minutes(1), condition);
  }

  std::mutex mutex_;
  std::condition_variable changed_;
  std::vector<Report> reports_;
  std::vector<std::string> canceled_;
  std::thread::id thread_;
};

}  // namespace appsync::contract
