// What the coordination service does beyond keeping what it is given: installs, cancellations and
// uninstalls.
#include <algorithm>
#include <cerrno>

#include "platform/bundle.h"
#include "tests/fakes/fake_install_coordination.h"

namespace appsync::fakes {

namespace {

/// The client that cancels in the service's own name.
constexpr CoordinationClientId ServiceClientID = 16;

FakeInstallPlaceholder::State placeholderOf(const FakeInstallCoordinator::State& state) {
  const auto* const fake = dynamic_cast<const FakeInstallPlaceholder*>(state.placeholder.get());
  return fake ? fake->state() : FakeInstallPlaceholder::State{};
}

std::shared_ptr<FakePathTransferPromise> iconOf(const FakeInstallCoordinator::State& state) {
  return std::dynamic_pointer_cast<FakePathTransferPromise>(placeholderOf(state).iconPromise);
}

std::shared_ptr<FakePathTransferPromise> packageOf(const FakeInstallCoordinator::State& state) {
  return std::dynamic_pointer_cast<FakePathTransferPromise>(state.appAssetPromise);
}

AppRecord recordOf(const FakeInstallPlaceholder::State& placeholder) {
  AppRecord record;
  record.applicationIdentifier = placeholder.bundleIdentifier;
  record.displayName = placeholder.name;
  record.installType = placeholder.installType;
  if (placeholder.attributes) record.bundleVersion = placeholder.attributes->bundleVersion;
  return record;
}

/// Whether the coordinator has the promise, as whatever.
bool uses(const FakeInstallCoordinator::State& state, const DataPromise& promise) {
  return state.appAssetPromise.get() == &promise || state.userDataPromise.get() == &promise ||
         placeholderOf(state).iconPromise.get() == &promise;
}

bool endAlike(CoordinatorKind one, CoordinatorKind other) {
  return (one == CoordinatorKind::RestoringDemoted) == (other == CoordinatorKind::RestoringDemoted);
}

}  // namespace

bool FakeInstallCoordination::isPromisedElsewhere(const DataPromise& promise,
                                                  const FakeInstallCoordinator& coordinator) {
  const std::scoped_lock lock(mutex_);
  return std::ranges::any_of(coordinators_, [&](const auto& other) {
    const FakeInstallCoordinator::State state = other->state();
    return other.get() != &coordinator && state.isLive() && uses(state, promise);
  });
}

bool FakeInstallCoordination::makesRoom(FakeInstallCoordinator& live, CoordinatorKind kind,
                                        CoordinationClientId client,
                                        std::optional<Error>& refusal) {
  const FakeInstallCoordinator::State state = live.state();
  const bool isAlike = endAlike(state.kind, kind);
  const bool isWhole = !state.placeholderStands || registry_.placeholder(*state.bundleIdentifier);
  if (isAlike && isWhole) return false;
  if (state.creator == client) {
    giveUp(live, Error::posix(ECANCELED), client);
    return true;
  }
  if (!isAlike) refusal = Error::posix(EBUSY);
  return false;
}

std::shared_ptr<FakeInstallCoordinator> FakeInstallCoordination::liveCoordinator(
    std::string_view bundleId) const {
  const auto newest = coordinator(bundleId);
  return newest && newest->state().isLive() ? newest : nullptr;
}

void FakeInstallCoordination::carryOn(std::string_view bundleId) {
  const auto found = liveCoordinator(bundleId);
  if (!found) return;
  const FakeInstallCoordinator::State state = found->state();
  const auto package = packageOf(state);
  for (const auto& promise : {iconOf(state), package}) {
    if (promise && promise->begins()) fireDidBeginFulfillment(*found, promise->identifier());
  }
  if (!state.placeholderStands && !installPlaceholder(*found)) return;
  if (state.kind == CoordinatorKind::RestoringDemoted) {
    end(*found, std::nullopt);
  } else if (state.options && package && package->isComplete() && package->transferPath()) {
    installPackage(*found);
  }
}

bool FakeInstallCoordination::installPlaceholder(FakeInstallCoordinator& coordinator) {
  const FakeInstallPlaceholder::State placeholder = placeholderOf(coordinator.state());
  if (!placeholder.configurationComplete) return false;
  const std::optional<AppRecord> left = registry_.placeholder(placeholder.bundleIdentifier);
  const bool adopts = placeholder.installType == InstallType::Sync && left &&
                      left->installType != InstallType::Sync &&
                      !registry_.installed(placeholder.bundleIdentifier);
  if (!adopts) registry_.seedPlaceholder(recordOf(placeholder));
  coordinator.edit([&](FakeInstallCoordinator::State& state) {
    state.placeholderStands = true;
    state.placeholderIsAdopted = adopts;
  });
  fireDidInstallPlaceholder(coordinator);
  return true;
}

void FakeInstallCoordination::installPackage(FakeInstallCoordinator& coordinator) {
  const FakeInstallCoordinator::State state = coordinator.state();
  const PropertyList::Dictionary options{
      {std::string(SWPackageTypeKey), SWPackageTypeCustomer},
      {std::string(KBBundleIdentifier), *state.bundleIdentifier}};
  std::optional<Error> error;
  const FileLocation package = *state.appAssetPromise->transferPath();
  if (registry_.installApplication(package, options, &error)) error.reset();
  end(coordinator, error);
}

void FakeInstallCoordination::end(FakeInstallCoordinator& coordinator,
                                  const std::optional<Error>& error) {
  const bool isRestore = coordinator.state().kind == CoordinatorKind::Restoring;
  settle(coordinator, !error || isRestore);  // what is restored waits on
  fireDidComplete(coordinator, error);
}

void FakeInstallCoordination::settle(FakeInstallCoordinator& coordinator, bool keepPlaceholder) {
  const FakeInstallCoordinator::State state = coordinator.state();
  for (const auto& promise : {iconOf(state), packageOf(state)}) {
    if (promise) promise->settle();
  }
  const auto data = std::dynamic_pointer_cast<FakeOutOfBandTransferPromise>(state.userDataPromise);
  if (data) data->settle();
  const auto placeholder = std::dynamic_pointer_cast<FakeInstallPlaceholder>(state.placeholder);
  if (placeholder) placeholder->settle();
  if (state.placeholderStands && !state.placeholderIsAdopted && !keepPlaceholder) {
    registry_.remove(*state.bundleIdentifier, true);
  }
}

void FakeInstallCoordination::giveUp(FakeInstallCoordinator& coordinator, const Error& reason,
                                     CoordinationClientId client) {
  bool ended = false;
  coordinator.edit([&](FakeInstallCoordinator::State& state) {
    ended = state.isLive();
    if (!ended) return;
    state.cancellation = Cancellation{reason, client};
    state.error = reason;
  });
  if (!ended) return;
  settle(coordinator, false);
  if (client == coordinator.creatorIdentifier()) return;
  post(coordinator,
       [reason, client](CoordinatorObserver& observer, FakeInstallCoordinator& subject) {
         observer.coordinatorCanceledWithReason(subject, reason, client);
       });
}

void FakeInstallCoordination::uninstallApp(
    std::string_view bundleId, bool requestUserConfirmation,
    std::function<void(const std::optional<Error>&)> completion) noexcept {
  constexpr std::string_view operation = "InstallCoordination.uninstallApp";
  std::optional<Error> error;
  if (!context_.faults.strikes(operation, bundleId, &error)) {
    context_.trace.add(TraceCall, callText(operation, bundleId, requestUserConfirmation));
  }
  {
    const std::scoped_lock lock(mutex_);
    if (holdsUninstalls_) {
      heldCompletions_.push_back(std::move(completion));
      return;
    }
  }
  events_.post([this, error, id = std::string(bundleId), completion = std::move(completion)] {
    std::optional<Error> outcome = error;
    if (!outcome) uninstall(id, outcome);
    completion(outcome);
  });
}

void FakeInstallCoordination::uninstall(const std::string& bundleId, std::optional<Error>& error) {
  const auto live = liveCoordinator(bundleId);
  const bool updates = registry_.placeholder(bundleId).has_value();
  if (live) {
    giveUp(*live, Error::withDescription(POSIXErrorDomain, ECANCELED, "uninstalled"),
           ServiceClientID);
  }
  // What a coordinator brought went with it; an installed version below it stays.
  const bool removed = registry_.remove(bundleId, updates);
  if (!removed && !live) error = Error::posix(ENOENT, bundleId);
}

void FakeInstallCoordination::holdUninstalls() {
  const std::scoped_lock lock(mutex_);
  holdsUninstalls_ = true;
}

void FakeInstallCoordination::completeUninstalls(const std::optional<Error>& error) {
  events_.post([this, error] {
    std::unique_lock lock(mutex_);
    const std::vector<Completion> completions = heldCompletions_;
    lock.unlock();
    for (const Completion& completion : completions) completion(error);
  });
  events_.drain();
}

}  // namespace appsync::fakes
