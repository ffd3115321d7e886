#include "tests/fakes/fake_install_coordination.h"

#include <algorithm>

namespace appsync::fakes {

namespace {

std::string_view kindName(CoordinatorKind kind) {
  switch (kind) {
    case CoordinatorKind::Any:
      return "any";
    case CoordinatorKind::Initiating:
      return "initiating";
    case CoordinatorKind::Updating:
      return "updating";
    case CoordinatorKind::Restoring:
      return "restoring";
    case CoordinatorKind::RestoringDemoted:
      return "restoring demoted";
  }
  return "unknown";
}

}  // namespace

class FakeInstallCoordination::Listener : public CoordinatorEventListener {
 public:
  Listener(FakeInstallCoordination& service, std::set<CoordinationClientId> forClients,
           CoordinatorObserver& receiver)
      : clients(std::move(forClients)), delegate(receiver), service_(service) {}
  ~Listener() override { service_.removeListener(this); }

  const std::set<CoordinationClientId> clients;
  CoordinatorObserver& delegate;

 private:
  FakeInstallCoordination& service_;
};

bool FakeInstallCoordination::coordinationIsEnabled() noexcept {
  context_.trace.add(TraceQuery, callText("InstallCoordination.coordinationIsEnabled"));
  const std::scoped_lock lock(mutex_);
  return enabled_;
}

std::shared_ptr<InstallCoordinator> FakeInstallCoordination::coordinatorFor(
    CoordinatorKind kind, std::string_view bundleId, CoordinationClientId client,
    bool createIfNotExisting, bool* created, std::optional<Error>* error) noexcept {
  constexpr std::string_view operation = "InstallCoordination.coordinatorFor";
  if (created) *created = false;
  if (context_.faults.strikes(operation, bundleId, error)) return nullptr;
  context_.trace.add(TraceCall, callText(operation, bundleId, kindName(kind), client,
                                         createIfNotExisting ? "create" : "look up"));
  const std::scoped_lock lock(mutex_);
  if (lookupError_) setError(error, *lookupError_);
  const bool create = createIfNotExisting && kind != CoordinatorKind::Any;
  for (const auto& coordinator : coordinators_) {
    const FakeInstallCoordinator::State state = coordinator->state();
    if (state.bundleIdentifier != bundleId || !state.isLive()) continue;
    std::optional<Error> refusal;
    if (!create || !makesRoom(*coordinator, kind, client, refusal)) {
      if (!refusal) return coordinator;
      setError(error, *refusal);
      return nullptr;
    }
  }
  if (!create) return nullptr;
  FakeInstallCoordinator::State state;
  state.kind = kind;
  state.bundleIdentifier = bundleId;
  state.creator = client;
  coordinators_.push_back(std::make_shared<FakeInstallCoordinator>(context_, std::move(state)));
  if (created) *created = true;
  return coordinators_.back();
}

PromiseState FakeInstallCoordination::newPromise(std::string_view name, CoordinationClientId client,
                                                 std::uint64_t diskSpaceNeeded) {
  PromiseState state;
  state.name = name;
  state.client = client;
  state.identifier = nextPromise_++;
  state.diskSpaceNeeded = diskSpaceNeeded;
  return state;
}

std::shared_ptr<PathTransferPromise> FakeInstallCoordination::createPathTransferPromise(
    std::string_view name, CoordinationClientId client,
    const std::optional<FileLocation>& transferPath, std::uint64_t diskSpaceNeeded) noexcept {
  constexpr std::string_view operation = "InstallCoordination.createPathTransferPromise";
  if (context_.faults.next(operation, name)) return nullptr;
  context_.trace.add(TraceCall, callText(operation, name, client, transferPath, diskSpaceNeeded));
  const std::scoped_lock lock(mutex_);
  PromiseState state = newPromise(name, client, diskSpaceNeeded);
  state.transferPath = transferPath;
  pathPromises_.push_back(std::make_shared<FakePathTransferPromise>(context_, std::move(state)));
  return pathPromises_.back();
}

std::shared_ptr<OutOfBandTransferPromise> FakeInstallCoordination::createOutOfBandTransferPromise(
    std::string_view name, CoordinationClientId client, std::uint64_t diskSpaceNeeded) noexcept {
  constexpr std::string_view operation = "InstallCoordination.createOutOfBandTransferPromise";
  if (context_.faults.next(operation, name)) return nullptr;
  context_.trace.add(TraceCall, callText(operation, name, client, diskSpaceNeeded));
  const std::scoped_lock lock(mutex_);
  PromiseState state = newPromise(name, client, diskSpaceNeeded);
  outOfBandPromises_.push_back(
      std::make_shared<FakeOutOfBandTransferPromise>(context_, std::move(state)));
  return outOfBandPromises_.back();
}

std::shared_ptr<InstallPlaceholder> FakeInstallCoordination::createAppPlaceholder(
    std::string_view appName, std::string_view bundleId, InstallType installType,
    CoordinationClientId client) noexcept {
  constexpr std::string_view operation = "InstallCoordination.createAppPlaceholder";
  if (context_.faults.next(operation, bundleId)) return nullptr;
  context_.trace.add(TraceCall, callText(operation, bundleId, appName,
                                         static_cast<std::uint64_t>(installType), client));
  FakeInstallPlaceholder::State state;
  state.name = appName;
  state.bundleIdentifier = bundleId;
  state.installType = installType;
  state.client = client;
  const std::scoped_lock lock(mutex_);
  placeholders_.push_back(std::make_shared<FakeInstallPlaceholder>(context_, std::move(state)));
  return placeholders_.back();
}

Error FakeInstallCoordination::createUserPresentableError(
    std::int64_t code, std::uint64_t flag, const std::optional<Error>& underlying) noexcept {
  context_.trace.add(TraceQuery, callText("InstallCoordination.createUserPresentableError", code,
                                          flag, underlying));
  Error error{"UserPresentable", code, {{"Flag", flag}}, nullptr};
  if (underlying) error.underlying = std::make_shared<const Error>(*underlying);
  return error;
}

std::unique_ptr<CoordinatorEventListener> FakeInstallCoordination::createEventListener(
    std::string_view serviceName, const std::set<CoordinationClientId>& clients,
    CoordinatorObserver& delegate) noexcept {
  constexpr std::string_view operation = "InstallCoordination.createEventListener";
  if (context_.faults.next(operation, serviceName)) return nullptr;
  PropertyList::Array shown(clients.begin(), clients.end());
  context_.trace.add(TraceCall, callText(operation, serviceName, description(shown)));
  auto listener = std::make_unique<Listener>(*this, clients, delegate);
  {
    const std::scoped_lock lock(mutex_);
    listeners_.push_back(listener.get());
  }
  observerChanged();
  return listener;
}

void FakeInstallCoordination::removeObserver(CoordinatorObserver* observer) noexcept {
  context_.trace.add(TraceCall, callText("InstallCoordination.removeObserver"));
  std::unique_lock lock(mutex_);
  for (const auto& coordinator : coordinators_) {
    coordinator->edit([&](FakeInstallCoordinator::State& state) {
      if (state.observer == observer) state.observer = nullptr;
    });
  }
  delivered_.wait(lock, [&] { return delivering_ != observer; });
  lock.unlock();
  observerChanged();  // a listener may be there for what the observer would have had
}

void FakeInstallCoordination::removeListener(Listener* listener) {
  std::unique_lock lock(mutex_);
  std::erase(listeners_, listener);
  delivered_.wait(lock, [&] { return delivering_ != &listener->delegate; });
}

CoordinatorObserver* FakeInstallCoordination::receiver(
    const FakeInstallCoordinator& coordinator) const {
  const FakeInstallCoordinator::State state = coordinator.state();
  if (state.observer) return state.observer;
  for (Listener* listener : listeners_) {
    if (listener->clients.contains(state.creator)) return &listener->delegate;
  }
  return nullptr;
}

void FakeInstallCoordination::post(FakeInstallCoordinator& coordinator, Event event) {
  {
    const std::scoped_lock lock(mutex_);
    pending_.push_back({coordinator.shared_from_this(), std::move(event)});
  }
  observerChanged();
}

void FakeInstallCoordination::fire(FakeInstallCoordinator& coordinator, Event event) {
  post(coordinator, std::move(event));
  events_.drain();
}

void FakeInstallCoordination::observerChanged() {
  events_.post([this] { deliverPending(); });
}

void FakeInstallCoordination::deliverPending() {
  std::unique_lock lock(mutex_);
  while (true) {
    CoordinatorObserver* observer = nullptr;
    const auto next = std::ranges::find_if(pending_, [&](const PendingEvent& pending) {
      observer = receiver(*pending.coordinator);
      return observer != nullptr;
    });
    if (next == pending_.end()) return;
    const PendingEvent event = std::move(*next);
    pending_.erase(next);
    delivering_ = observer;
    lock.unlock();
    event.event(*observer, *event.coordinator);
    lock.lock();
    delivering_ = nullptr;
    delivered_.notify_all();
  }
}

void FakeInstallCoordination::fireDidBeginFulfillment(FakeInstallCoordinator& coordinator,
                                                      std::uint64_t promise) {
  fire(coordinator, [promise](CoordinatorObserver& observer, FakeInstallCoordinator&) {
    observer.promiseDidBeginFulfillmentWithIdentifier(promise);
  });
}

void FakeInstallCoordination::fireDidInstallPlaceholder(FakeInstallCoordinator& coordinator) {
  fire(coordinator, [](CoordinatorObserver& observer, FakeInstallCoordinator& subject) {
    observer.coordinatorDidInstallPlaceholder(subject);
  });
}

void FakeInstallCoordination::fireDidComplete(FakeInstallCoordinator& coordinator,
                                              std::optional<Error> error) {
  coordinator.edit([&](FakeInstallCoordinator::State& state) {
    state.completed = true;
    if (error) state.error = error;
  });
  fire(coordinator, [](CoordinatorObserver& observer, FakeInstallCoordinator& subject) {
    observer.coordinatorDidCompleteSuccessfully(subject);
  });
}

void FakeInstallCoordination::fireShouldPrioritize(FakeInstallCoordinator& coordinator) {
  fire(coordinator, [](CoordinatorObserver& observer, FakeInstallCoordinator& subject) {
    observer.coordinatorShouldPrioritize(subject);
  });
}

void FakeInstallCoordination::fireCanceled(FakeInstallCoordinator& coordinator, const Error& reason,
                                           CoordinationClientId client) {
  fire(coordinator,
       [reason, client](CoordinatorObserver& observer, FakeInstallCoordinator& subject) {
         observer.coordinatorCanceledWithReason(subject, reason, client);
       });
}

void FakeInstallCoordination::setEnabled(bool enabled) {
  const std::scoped_lock lock(mutex_);
  enabled_ = enabled;
}

void FakeInstallCoordination::giveErrorWithEveryLookup(Error error) {
  const std::scoped_lock lock(mutex_);
  lookupError_ = std::move(error);
}

std::shared_ptr<FakeInstallCoordinator> FakeInstallCoordination::seedCoordinator(
    CoordinatorKind kind, std::optional<std::string> bundleId, CoordinationClientId creator) {
  FakeInstallCoordinator::State state;
  state.kind = kind;
  state.bundleIdentifier = std::move(bundleId);
  state.creator = creator;
  const std::scoped_lock lock(mutex_);
  coordinators_.push_back(std::make_shared<FakeInstallCoordinator>(context_, std::move(state)));
  return coordinators_.back();
}

std::shared_ptr<FakeInstallCoordinator> FakeInstallCoordination::coordinator(
    std::string_view bundleId) const {
  const std::scoped_lock lock(mutex_);
  const auto found = std::find_if(
      coordinators_.rbegin(), coordinators_.rend(),
      [&](const auto& coordinator) { return coordinator->bundleIdentifier() == bundleId; });
  return found == coordinators_.rend() ? nullptr : *found;
}

std::size_t FakeInstallCoordination::coordinatorCount() const {
  const std::scoped_lock lock(mutex_);
  return coordinators_.size();
}

std::vector<std::shared_ptr<FakePathTransferPromise>> FakeInstallCoordination::pathPromises()
    const {
  const std::scoped_lock lock(mutex_);
  return pathPromises_;
}

std::vector<std::shared_ptr<FakeOutOfBandTransferPromise>>
FakeInstallCoordination::outOfBandPromises() const {
  const std::scoped_lock lock(mutex_);
  return outOfBandPromises_;
}

std::vector<std::shared_ptr<FakeInstallPlaceholder>> FakeInstallCoordination::placeholders() const {
  const std::scoped_lock lock(mutex_);
  return placeholders_;
}

std::shared_ptr<FakePathTransferPromise> FakeInstallCoordination::pathPromise(
    std::string_view name) const {
  const std::scoped_lock lock(mutex_);
  const auto found = std::find_if(pathPromises_.rbegin(), pathPromises_.rend(),
                                  [&](const auto& promise) { return promise->name() == name; });
  return found == pathPromises_.rend() ? nullptr : *found;
}

std::size_t FakeInstallCoordination::listenerCount() const {
  const std::scoped_lock lock(mutex_);
  return listeners_.size();
}

}  // namespace appsync::fakes
