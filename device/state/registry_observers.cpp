#include "device/state/registry_observers.h"

#include <algorithm>
#include <chrono>
#include <condition_variable>
#include <deque>
#include <thread>

namespace appsync::device {
namespace {

/// Between two reports; one that waited long for the registry shall not keep the next one away.
constexpr std::chrono::seconds LongestPause{1};

}  // namespace

class RegistryObservers::Service {
 public:
  Service(AppRegistryObserver& observer, const std::function<Report()>& report)
      : observer_(observer), report_(report), thread_([this] { run(); }) {}
  ~Service() {
    stop();
    thread_.join();
  }

  void installsChanged() {
    const std::lock_guard lock(mutex_);
    reportDue_ = true;
    changed_.notify_all();
  }

  void installsCancelled(const std::vector<AppRecord>& records) {
    const std::lock_guard lock(mutex_);
    cancelled_.push_back(records);
    changed_.notify_all();
  }

  bool isStopping() {
    const std::lock_guard lock(mutex_);
    return stopping_;
  }

  /// Returns when no event is running and none will come; may be called by several threads.
  void stop() {
    std::unique_lock lock(mutex_);
    stopping_ = true;
    changed_.notify_all();
    changed_.wait(lock, [this] { return ended_; });
  }

 private:
  using Clock = std::chrono::steady_clock;

  void run() {
    std::unique_lock lock(mutex_);
    while (!stopping_) {
      if (!cancelled_.empty()) {
        const std::vector<AppRecord> records = std::move(cancelled_.front());
        cancelled_.pop_front();
        lock.unlock();
        observer_.applicationInstallsDidCancel(records);
        lock.lock();
      } else if (reportDue_ && Clock::now() < nextReport_) {
        changed_.wait_until(lock, nextReport_);
      } else if (reportDue_) {
        reportDue_ = false;
        lock.unlock();
        const Report report = timedReport();
        observer_.applicationInstallsArePrioritized(report.prioritized, report.paused);
        lock.lock();
      } else {
        changed_.wait(lock);
      }
    }
    ended_ = true;
    changed_.notify_all();
  }

  /// Those who change installs wait for the registry that a report reads: it may take a tenth of
  /// the time and no more.
  Report timedReport() {
    const Clock::time_point begin = Clock::now();
    Report report = report_();
    const Clock::time_point end = Clock::now();
    nextReport_ = end + std::min<Clock::duration>(9 * (end - begin), LongestPause);
    return report;
  }

  AppRegistryObserver& observer_;
  const std::function<Report()>& report_;
  Clock::time_point nextReport_;  ///< only used by the thread
  std::mutex mutex_;
  std::condition_variable changed_;
  // Guarded by mutex_.
  bool reportDue_ = true;  // a new observer gets one without being asked for
  std::deque<std::vector<AppRecord>> cancelled_;
  bool stopping_ = false;
  bool ended_ = false;

  std::thread thread_;
};

RegistryObservers::RegistryObservers(std::function<Report()> report) : report_(std::move(report)) {}

RegistryObservers::~RegistryObservers() = default;

void RegistryObservers::add(AppRegistryObserver* observer) {
  if (!observer) return;
  const std::lock_guard lock(mutex_);
  std::shared_ptr<Service>& service = services_[observer];
  // One that is on its way out, in another thread's remove, does not stand for this observer.
  if (!service || service->isStopping()) {
    service = std::make_shared<Service>(*observer, report_);
  }
}

void RegistryObservers::remove(AppRegistryObserver* observer) {
  std::shared_ptr<Service> service;
  {
    const std::lock_guard lock(mutex_);
    const auto found = services_.find(observer);
    if (found == services_.end()) return;
    service = found->second;
  }
  service->stop();
  const std::lock_guard lock(mutex_);
  const auto found = services_.find(observer);
  if (found != services_.end() && found->second == service) services_.erase(found);
}

std::vector<std::shared_ptr<RegistryObservers::Service>> RegistryObservers::services() {
  const std::lock_guard lock(mutex_);
  std::vector<std::shared_ptr<Service>> all;
  for (const auto& [observer, service] : services_) all.push_back(service);
  return all;
}

void RegistryObservers::installsChanged() {
  for (const auto& service : services()) service->installsChanged();
}

void RegistryObservers::installsCancelled(const std::vector<AppRecord>& records) {
  for (const auto& service : services()) service->installsCancelled(records);
}

}  // namespace appsync::device
