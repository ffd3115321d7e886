#include "device/state/registry_observers.h"

#include <condition_variable>
#include <deque>
#include <thread>

namespace appsync::device {

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
  void run() {
    std::unique_lock lock(mutex_);
    while (!stopping_) {
      if (!cancelled_.empty()) {
        const std::vector<AppRecord> records = std::move(cancelled_.front());
        cancelled_.pop_front();
        lock.unlock();
        observer_.applicationInstallsDidCancel(records);
        lock.lock();
      } else if (reportDue_) {
        reportDue_ = false;
        lock.unlock();
        const Report report = report_();
        observer_.applicationInstallsArePrioritized(report.prioritized, report.paused);
        lock.lock();
      } else {
        changed_.wait(lock);
      }
    }
    ended_ = true;
    changed_.notify_all();
  }

  AppRegistryObserver& observer_;
  const std::function<Report()>& report_;
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
