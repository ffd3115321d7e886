#include "tests/fakes/fake_home_screen.h"

#include "platform/property_list_codec.h"

namespace appsync::fakes {

namespace {

void flatten(const PropertyList& value, PropertyList::Array& order) {
  if (value.asString()) order.push_back(value);
  if (const PropertyList::Array* array = value.asArray()) {
    for (const PropertyList& item : *array) flatten(item, order);
  }
  if (const PropertyList::Dictionary* dictionary = value.asDictionary()) {
    for (const auto& [key, item] : *dictionary) flatten(item, order);
  }
}

}  // namespace

class FakeHomeScreen::Assertion : public TerminationAssertion {
 public:
  Assertion(CallTrace& trace, std::shared_ptr<Held> held, std::string_view bundleId)
      : trace_(trace), held_(std::move(held)), bundleId_(bundleId) {
    const std::scoped_lock lock(held_->mutex);
    held_->identifiers.insert(bundleId_);
  }
  ~Assertion() override {
    trace_.add(TraceCall, callText("TerminationAssertion.release", bundleId_));
    const std::scoped_lock lock(held_->mutex);
    held_->identifiers.erase(held_->identifiers.find(bundleId_));
  }

 private:
  CallTrace& trace_;
  std::shared_ptr<Held> held_;
  std::string bundleId_;
};

HomeScreenService::Port FakeHomeScreen::serverPort() noexcept {
  trace_.add(TraceCall, callText("HomeScreenService.serverPort"));
  return 7;
}

int FakeHomeScreen::setIconState(Port port, ByteView layout) noexcept {
  trace_.add(TraceCall, callText("HomeScreenService.setIconState", port));
  const std::optional<PropertyList> parsed = parsePropertyList(layout);
  if (!parsed) return 1;
  PropertyList::Array order;
  flatten(*parsed, order);
  const std::scoped_lock lock(mutex_);
  layout_.emplace(layout.begin(), layout.end());
  flattened_ = serializePropertyList(std::move(order), PropertyListFormat::Binary);
  return 0;
}

std::optional<Bytes> FakeHomeScreen::getFlattenedIconState(Port port, int format) noexcept {
  trace_.add(TraceCall, callText("HomeScreenService.getFlattenedIconState", port, format));
  const std::scoped_lock lock(mutex_);
  return flattened_;
}

HomeScreenService::AssertionResult FakeHomeScreen::createTerminationAssertion(
    std::string_view bundleId, std::uint32_t flags) noexcept {
  trace_.add(TraceCall, callText("HomeScreenService.createTerminationAssertion", bundleId, flags));
  const std::scoped_lock lock(mutex_);
  AssertionResult result;
  if (foreground_.contains(bundleId)) result.outcome = AssertionOutcome::Denied;
  if (const auto found = outcomes_.find(bundleId);
      found != outcomes_.end() && !found->second.empty()) {
    result.outcome = found->second.front();
    found->second.pop_front();
  }
  if (result.outcome == AssertionOutcome::Success || refusalsCarryAssertion_) {
    result.assertion = std::make_unique<Assertion>(trace_, held_, bundleId);
  }
  return result;
}

void FakeHomeScreen::queueOutcomes(std::string_view bundleId,
                                   const std::vector<AssertionOutcome>& outcomes) {
  const std::scoped_lock lock(mutex_);
  auto& queue = outcomes_[std::string(bundleId)];
  queue.insert(queue.end(), outcomes.begin(), outcomes.end());
}

bool FakeHomeScreen::launch(std::string_view bundleId) {
  if (heldAssertions().contains(std::string(bundleId))) return false;
  const std::scoped_lock lock(mutex_);
  foreground_.emplace(bundleId);
  return true;
}

void FakeHomeScreen::quit(std::string_view bundleId) {
  const std::scoped_lock lock(mutex_);
  foreground_.erase(std::string(bundleId));
}

void FakeHomeScreen::setRefusalsCarryAssertion(bool carry) {
  const std::scoped_lock lock(mutex_);
  refusalsCarryAssertion_ = carry;
}

void FakeHomeScreen::setFlattenedIconState(std::optional<Bytes> state) {
  const std::scoped_lock lock(mutex_);
  flattened_ = std::move(state);
}

void FakeHomeScreen::setOrder(const std::vector<std::string>& bundleIds) {
  setFlattenedIconState(serializePropertyList(
      PropertyList::Array(bundleIds.begin(), bundleIds.end()), PropertyListFormat::Binary));
}

std::optional<Bytes> FakeHomeScreen::iconLayout() const {
  const std::scoped_lock lock(mutex_);
  return layout_;
}

std::multiset<std::string> FakeHomeScreen::heldAssertions() const {
  const std::scoped_lock lock(held_->mutex);
  return held_->identifiers;
}

}  // namespace appsync::fakes
