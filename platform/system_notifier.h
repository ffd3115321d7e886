#pragma once

#include <cstdint>
#include <string_view>

namespace appsync {

/// System-wide named notifications, each with a 64-bit state. Called from any thread.
class SystemNotifier {
 public:
  struct Registration {
    std::uint32_t status = 0;  ///< 0 on success
    int token = 0;             ///< meaningful only on success
  };
  /// Runs on a service thread with the observer that was registered.
  using Callback = void (*)(void* observer) noexcept;

  virtual ~SystemNotifier() = default;

  /// A token to which a state can be attached. It lives as long as the process.
  virtual Registration registerCheck(std::string_view name) noexcept = 0;
  /// Whoever reads the state after the next post sees it.
  virtual void setState(int token, std::uint64_t state) noexcept = 0;
  /// Wakes every subscriber.
  virtual void post(std::string_view name) noexcept = 0;

  /// Calls back on every posting until removeObserver, which returns only when no callback for this
  /// observer and name is running and none will come.
  virtual void addObserver(void* observer, std::string_view name, Callback callback) noexcept = 0;
  virtual void removeObserver(void* observer, std::string_view name) noexcept = 0;
};

}  // namespace appsync
