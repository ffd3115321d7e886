#pragma once

#include <functional>
#include <map>
#include <memory>
#include <vector>

#include "platform/app_registry.h"
#include "platform/mutex.h"

namespace appsync::device {

/// The registry's observers, each served by a thread of its own so that a slow one delays nobody.
/// Thread-safe.
class RegistryObservers {
 public:
  struct Report {
    std::vector<AppRecord> prioritized;
    std::vector<AppRecord> paused;
  };

  /// `report` gives the present installs; it is called on the observers' threads, once per
  /// delivery, so that an observer always gets the latest.
  explicit RegistryObservers(std::function<Report()> report);
  ~RegistryObservers();

  void add(AppRegistryObserver* observer);
  void remove(AppRegistryObserver* observer);

  /// Each observer gets a new report; changes that come while one is on its way are joined,
  /// and those of up to a second after one that took long.
  void installsChanged();
  void installsCancelled(const std::vector<AppRecord>& records);

 private:
  class Service;

  std::vector<std::shared_ptr<Service>> services();

  const std::function<Report()> report_;
  Mutex mutex_;
  std::map<AppRegistryObserver*, std::shared_ptr<Service>> services_ APPSYNC_GUARDED_BY(mutex_);
};

}  // namespace appsync::device
