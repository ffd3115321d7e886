#include "device/state/registry_observers.h"

#include <algorithm>
#include <atomic>
#include <chrono>

#include "device/state/background_queue.h"

namespace appsync::device {
namespace {

/// Between two reports; one that waited long for the registry shall not keep the next one away.
constexpr std::chrono::seconds LongestPause{1};

}  // namespace

class RegistryObservers::Service {
 public:
  /// The observer gets a report without any change.
  Service(AppRegistryObserver& observer, const std::function<Report()>& report)
      : observer_(observer), report_(report) {
    installsChanged();
  }

  void installsChanged() {
    if (!reportDue_.exchange(true)) deliverReport(Clock::duration::zero());
  }

  void installsCancelled(const std::vector<AppRecord>& records) {
    queue_.after({}, [this, records] { observer_.applicationInstallsDidCancel(records); });
  }

  bool isStopping() { return queue_.isStopped(); }

  /// Returns when no event is running and none will come; may be called by several threads.
  void stop() { queue_.stop(); }

 private:
  using Clock = std::chrono::steady_clock;

  /// Those who change installs wait for the registry that a report reads: it may take a tenth of
  /// the time and no more.
  void deliverReport(Clock::duration delay) {
    queue_.after(std::chrono::ceil<std::chrono::milliseconds>(delay), [this] {
      if (const auto early = nextReport_ - Clock::now(); early > Clock::duration::zero()) {
        deliverReport(early);
        return;
      }
      reportDue_ = false;
      const Clock::time_point begin = Clock::now();
      const Report report = report_();
      const Clock::time_point end = Clock::now();
      nextReport_ = end + std::min<Clock::duration>(9 * (end - begin), LongestPause);
      observer_.applicationInstallsArePrioritized(report.prioritized, report.paused);
    });
  }

  AppRegistryObserver& observer_;
  const std::function<Report()>& report_;
  Clock::time_point nextReport_;  ///< only used by the queue's thread
  std::atomic<bool> reportDue_ = false;

  ThreadBackgroundQueue queue_;
};

RegistryObservers::RegistryObservers(std::function<Report()> report) : report_(std::move(report)) {}

RegistryObservers::~RegistryObservers() = default;

void RegistryObservers::add(AppRegistryObserver* observer) {
  if (!observer) return;
  const Lock lock(mutex_);
  std::shared_ptr<Service>& service = services_[observer];
  // One that is on its way out, in another thread's remove, does not stand for this observer.
  if (!service || service->isStopping()) {
    service = std::make_shared<Service>(*observer, report_);
  }
}

void RegistryObservers::remove(AppRegistryObserver* observer) {
  std::shared_ptr<Service> service;
  {
    const Lock lock(mutex_);
    const auto found = services_.find(observer);
    if (found == services_.end()) return;
    service = found->second;
  }
  service->stop();
  const Lock lock(mutex_);
  const auto found = services_.find(observer);
  if (found != services_.end() && found->second == service) services_.erase(found);
}

std::vector<std::shared_ptr<RegistryObservers::Service>> RegistryObservers::services() {
  const Lock lock(mutex_);
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
