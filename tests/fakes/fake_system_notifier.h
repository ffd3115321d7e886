#pragma once

#include <condition_variable>
#include <map>
#include <mutex>
#include <string>
#include <vector>

#include "platform/system_notifier.h"
#include "tests/fakes/call_trace.h"

namespace appsync::fakes {

/// Calls subscribers back on the thread that posts, before post returns.
class FakeSystemNotifier : public SystemNotifier {
 public:
  explicit FakeSystemNotifier(CallTrace& trace) : trace_(trace) {}

  Registration registerCheck(std::string_view name) noexcept override;
  void setState(int token, std::uint64_t state) noexcept override;
  void post(std::string_view name) noexcept override;
  void addObserver(void* observer, std::string_view name, Callback callback) noexcept override;
  void removeObserver(void* observer, std::string_view name) noexcept override;

  /// With a status other than 0, registerCheck fails.
  void setRegistrationStatus(std::uint32_t status);
  /// 0 at first.
  std::uint64_t stateOf(std::string_view name) const;
  /// The state at each posting of the name.
  std::vector<std::uint64_t> postedStates(std::string_view name) const;
  std::size_t observerCount(std::string_view name) const;

 private:
  struct Observer {
    void* observer;
    std::string name;
    Callback callback;
    bool operator==(const Observer&) const = default;
  };

  CallTrace& trace_;
  mutable std::mutex mutex_;
  std::condition_variable finished_;
  std::uint32_t registrationStatus_ = 0;
  std::vector<std::string> tokens_;
  std::map<std::string, std::uint64_t, std::less<>> states_;
  std::vector<std::pair<std::string, std::uint64_t>> posts_;
  std::vector<Observer> observers_;
  std::vector<Observer> running_;
};

}  // namespace appsync::fakes
