#pragma once

#include <condition_variable>
#include <functional>
#include <mutex>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

#include "platform/install_coordination.h"

namespace appsync::fakes {

/// Keeps the events it gets, as text ("placeholder com.a", "complete com.a", "failed com.a: ENTRY",
/// "canceled com.a by 15", "prioritize com.a", "begin 7"), and lets a test wait for them.
class EventRecorder : public CoordinatorObserver {
 public:
  using Events = std::vector<std::string>;

  void promiseDidBeginFulfillmentWithIdentifier(std::uint64_t identifier) noexcept override;
  void coordinatorDidInstallPlaceholder(InstallCoordinator& coordinator) noexcept override;
  void coordinatorDidCompleteSuccessfully(InstallCoordinator& coordinator) noexcept override;
  void coordinatorShouldPrioritize(InstallCoordinator& coordinator) noexcept override;
  void coordinatorCanceledWithReason(InstallCoordinator& coordinator, const Error& reason,
                                     CoordinationClientId client) noexcept override;

  Events events();
  /// Whether, within a minute, an event comes that begins so; those before it stay.
  bool waitFor(std::string_view beginning);
  std::size_t count(std::string_view beginning);
  std::thread::id thread();

  /// Called with each event, on the service's thread.
  std::function<void(const std::string& event)> during;

 private:
  void add(std::string event);
  std::size_t countNow(std::string_view beginning) const;

  std::mutex mutex_;
  std::condition_variable changed_;
  Events events_;
  std::thread::id thread_;
};

}  // namespace appsync::fakes
