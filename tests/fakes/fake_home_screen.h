#pragma once

#include <atomic>
#include <deque>
#include <map>
#include <memory>
#include <mutex>
#include <set>
#include <string>
#include <vector>

#include "platform/home_screen_service.h"
#include "tests/fakes/call_trace.h"

namespace appsync::fakes {

/// A home screen whose answers a test decides. Assertions succeed unless told otherwise.
class FakeHomeScreen : public HomeScreenService {
 public:
  explicit FakeHomeScreen(CallTrace& trace) : trace_(trace) {}

  Port serverPort() noexcept override;
  /// A layout is any nesting of arrays and dictionaries whose strings are bundle identifiers.
  int setIconState(Port port, ByteView layout) noexcept override;
  std::optional<Bytes> getFlattenedIconState(Port port, int format) noexcept override;
  AssertionResult createTerminationAssertion(std::string_view bundleId,
                                             std::uint32_t flags) noexcept override;

  /// The outcomes of the next assertions for the application, in order; then Success again.
  void queueOutcomes(std::string_view bundleId, const std::vector<AssertionOutcome>& outcomes);
  /// Brings the application to the foreground, where assertions for it are denied. False while an
  /// assertion keeps it from running.
  bool launch(std::string_view bundleId);
  void quit(std::string_view bundleId);
  /// Whether a refusal still comes with an assertion object.
  void setRefusalsCarryAssertion(bool carry);

  /// What the next getFlattenedIconState gives; nullopt: no answer.
  void setFlattenedIconState(std::optional<Bytes> state);
  void setOrder(const std::vector<std::string>& bundleIds);
  /// The bytes of the last layout taken over.
  std::optional<Bytes> iconLayout() const;
  /// The applications whose assertion is held right now.
  std::multiset<std::string> heldAssertions() const;

 private:
  struct Held {
    std::mutex mutex;
    std::multiset<std::string> identifiers;
  };
  class Assertion;

  CallTrace& trace_;
  mutable std::mutex mutex_;
  std::map<std::string, std::deque<AssertionOutcome>, std::less<>> outcomes_;
  std::set<std::string, std::less<>> foreground_;
  bool refusalsCarryAssertion_ = false;
  std::optional<Bytes> layout_;
  std::optional<Bytes> flattened_;
  std::shared_ptr<Held> held_ = std::make_shared<Held>();
};

}  // namespace appsync::fakes
