#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string_view>

#include "platform/bytes.h"

namespace appsync {

/// Outcome of asking for a termination assertion; other values are unknown errors.
enum class AssertionOutcome : std::int32_t { Success = 0, Denied = 1, NotFound = 2 };

/// While it is held, the home screen keeps the application from running. Destroying it releases it.
class TerminationAssertion {
 public:
  virtual ~TerminationAssertion() = default;
};

/// The home screen. Called from any thread.
class HomeScreenService {
 public:
  using Port = std::uint32_t;
  struct AssertionResult {
    std::unique_ptr<TerminationAssertion> assertion;  ///< may be null, whatever the outcome
    AssertionOutcome outcome = AssertionOutcome::Success;
  };

  virtual ~HomeScreenService() = default;

  /// The service port; waits, if need be, until the home screen can be reached.
  virtual Port serverPort() noexcept = 0;

  /// Adopts an icon layout (a property list, parsed here). The status is 0 on success.
  [[nodiscard]] virtual int setIconState(Port port, ByteView layout) noexcept = 0;

  /// With format 1, a property list whose top level is an array of bundle identifiers in the order
  /// in which the home screen shows them. nullopt when the home screen does not answer.
  virtual std::optional<Bytes> getFlattenedIconState(Port port, int format) noexcept = 0;

  /// Asks that the application be ended and kept from running. Denied: it is in the foreground.
  virtual AssertionResult createTerminationAssertion(std::string_view bundleId,
                                                     std::uint32_t flags) noexcept = 0;
};

}  // namespace appsync
