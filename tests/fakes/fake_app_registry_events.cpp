// The reports that FakeAppRegistry sends to its observers.
#include <algorithm>

#include "tests/fakes/fake_app_registry.h"

namespace appsync::fakes {

void FakeAppRegistry::addObserver(AppRegistryObserver* observer) noexcept {
  trace_.add(TraceCall, callText("AppRegistry.addObserver"));
  {
    const std::scoped_lock lock(mutex_);
    observers_.push_back({observer, std::nullopt});
  }
  postReport();
}

void FakeAppRegistry::removeObserver(AppRegistryObserver* observer) noexcept {
  trace_.add(TraceCall, callText("AppRegistry.removeObserver"));
  std::unique_lock lock(mutex_);
  std::erase_if(observers_, [&](const Observer& entry) { return entry.observer == observer; });
  delivered_.wait(lock, [&] { return delivering_ != observer; });
}

FakeAppRegistry::Report FakeAppRegistry::currentReport() const {
  if (scripted_) return *scripted_;
  std::vector<const Application*> waiting;
  for (const auto& [identifier, application] : applications_) {
    const bool going = application.progress && !application.progress->isOver();
    if (going && application.placeholder) waiting.push_back(&application);
  }
  std::ranges::sort(waiting, {}, &Application::order);
  Report report;
  for (const Application* application : waiting) {
    const InstallState state = application->progress->installState();
    if (state == InstallState::Paused) report.paused.push_back(*application->placeholder);
    if (state == InstallState::Waiting || state == InstallState::Active) {
      report.prioritized.push_back(*application->placeholder);
    }
  }
  return report;
}

void FakeAppRegistry::postReport() {
  events_.post([this] { deliverReport(); });
}

void FakeAppRegistry::deliverReport() {
  std::unique_lock lock(mutex_);
  const Report report = currentReport();
  std::vector<std::string> summary;
  for (const AppRecord& record : report.prioritized) {
    summary.push_back("prioritized " + record.applicationIdentifier);
  }
  for (const AppRecord& record : report.paused) {
    summary.push_back("paused " + record.applicationIdentifier);
  }
  std::vector<AppRegistryObserver*> told;
  for (Observer& entry : observers_) {
    if (entry.lastReport == summary) continue;
    entry.lastReport = summary;
    told.push_back(entry.observer);
  }
  lock.unlock();
  deliver([&](AppRegistryObserver& observer) {
    if (std::ranges::find(told, &observer) != told.end()) {
      observer.applicationInstallsArePrioritized(report.prioritized, report.paused);
    }
  });
}

void FakeAppRegistry::deliver(const std::function<void(AppRegistryObserver&)>& event) {
  std::unique_lock lock(mutex_);
  const std::vector<Observer> observers = observers_;
  for (const Observer& entry : observers) {
    const auto same = [&](const Observer& other) { return other.observer == entry.observer; };
    if (std::ranges::none_of(observers_, same)) continue;
    delivering_ = entry.observer;
    lock.unlock();
    event(*entry.observer);
    lock.lock();
    delivering_ = nullptr;
    delivered_.notify_all();
  }
}

void FakeAppRegistry::progressChanged(const std::string& identifier, bool canceled) {
  postReport();
  if (!canceled) return;
  const std::scoped_lock lock(mutex_);
  const auto found = applications_.find(identifier);
  if (found == applications_.end() || !found->second.placeholder) return;
  events_.post([this, records = std::vector<AppRecord>{*found->second.placeholder}] {
    deliver([&](AppRegistryObserver& observer) { observer.applicationInstallsDidCancel(records); });
  });
}

void FakeAppRegistry::scriptReport(std::vector<AppRecord> prioritized,
                                   std::vector<AppRecord> paused) {
  const std::scoped_lock lock(mutex_);
  scripted_ = Report{std::move(prioritized), std::move(paused)};
}

void FakeAppRegistry::reportInstalls(const std::vector<AppRecord>& prioritized,
                                     const std::vector<AppRecord>& paused) {
  events_.post([=, this] {
    deliver([&](AppRegistryObserver& observer) {
      observer.applicationInstallsArePrioritized(prioritized, paused);
    });
  });
  events_.drain();
}

void FakeAppRegistry::reportCancellation(const std::vector<AppRecord>& records) {
  events_.post([=, this] {
    deliver([&](AppRegistryObserver& observer) { observer.applicationInstallsDidCancel(records); });
  });
  events_.drain();
}

std::size_t FakeAppRegistry::observerCount() const {
  const std::scoped_lock lock(mutex_);
  return observers_.size();
}

}  // namespace appsync::fakes
