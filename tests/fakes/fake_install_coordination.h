#pragma once

#include <atomic>
#include <condition_variable>
#include <deque>
#include <functional>
#include <memory>
#include <mutex>
#include <vector>

#include "platform/install_coordination.h"
#include "tests/fakes/event_thread.h"
#include "tests/fakes/fake_app_registry.h"
#include "tests/fakes/fake_coordination_objects.h"

namespace appsync::fakes {

/// The coordination service: keeps what clients set and installs nothing by itself. Besides those
/// of `carryOn`, and of cancellations by others than the creator, events come only when a test
/// fires them; they run on the service's own thread, and firing waits for them. One that nobody is
/// there for is kept until somebody is. Any operation can be made to fail through the fault plan
/// under its trace name ("InstallCoordination.createAppPlaceholder",
/// "InstallCoordinator.setInstallOptions").
class FakeInstallCoordination : public InstallCoordination, private CoordinatorOwner {
 public:
  FakeInstallCoordination(CallTrace& trace, FaultPlan& faults, FakeAppRegistry& registry)
      : context_{trace, faults, *this}, registry_(registry) {}

  // InstallCoordination
  bool coordinationIsEnabled() noexcept override;
  std::shared_ptr<InstallCoordinator> coordinatorFor(CoordinatorKind kind,
                                                     std::string_view bundleId,
                                                     CoordinationClientId client,
                                                     bool createIfNotExisting, bool* created,
                                                     std::optional<Error>* error) noexcept override;
  void removeObserver(CoordinatorObserver* observer) noexcept override;
  std::shared_ptr<PathTransferPromise> createPathTransferPromise(
      std::string_view name, CoordinationClientId client,
      const std::optional<FileLocation>& transferPath,
      std::uint64_t diskSpaceNeeded) noexcept override;
  std::shared_ptr<OutOfBandTransferPromise> createOutOfBandTransferPromise(
      std::string_view name, CoordinationClientId client,
      std::uint64_t diskSpaceNeeded) noexcept override;
  std::shared_ptr<InstallPlaceholder> createAppPlaceholder(
      std::string_view appName, std::string_view bundleId, InstallType installType,
      CoordinationClientId client) noexcept override;
  /// Takes the registry's placeholder, else the application, and ends a live coordinator.
  void uninstallApp(std::string_view bundleId, bool requestUserConfirmation,
                    std::function<void(const std::optional<Error>&)> completion) noexcept override;
  /// Domain "UserPresentable", with the flag in the user info.
  Error createUserPresentableError(std::int64_t code, std::uint64_t flag,
                                   const std::optional<Error>& underlying) noexcept override;
  std::unique_ptr<CoordinatorEventListener> createEventListener(
      std::string_view serviceName, const std::set<CoordinationClientId>& clients,
      CoordinatorObserver& delegate) noexcept override;

  /// Off at first.
  void setEnabled(bool enabled);
  /// From now on it is laxer than its contract: placeholders need not be configured.
  void takeUnfinishedPlaceholders() { takesUnfinished_ = true; }
  /// From now on lookups give this error as well, whether or not a coordinator comes with it.
  void giveErrorWithEveryLookup(Error error);
  /// A coordinator that somebody made before; none: one whose application is not known any more.
  std::shared_ptr<FakeInstallCoordinator> seedCoordinator(CoordinatorKind kind,
                                                          std::optional<std::string> bundleId,
                                                          CoordinationClientId creator);

  /// The newest coordinator of the application, also a cancelled one; nullptr when there is none.
  std::shared_ptr<FakeInstallCoordinator> coordinator(std::string_view bundleId) const;
  std::size_t coordinatorCount() const;
  /// Everything made so far, oldest first.
  std::vector<std::shared_ptr<FakePathTransferPromise>> pathPromises() const;
  std::vector<std::shared_ptr<FakeOutOfBandTransferPromise>> outOfBandPromises() const;
  std::vector<std::shared_ptr<FakeInstallPlaceholder>> placeholders() const;
  /// The newest promise of the name.
  std::shared_ptr<FakePathTransferPromise> pathPromise(std::string_view name) const;
  std::size_t listenerCount() const;

  // Events go to the coordinator's observer if one is set, else to a listener for its creator.
  void fireDidBeginFulfillment(FakeInstallCoordinator& coordinator, std::uint64_t promise);
  void fireDidInstallPlaceholder(FakeInstallCoordinator& coordinator);
  /// The coordinator is over, and carries the error.
  void fireDidComplete(FakeInstallCoordinator& coordinator, std::optional<Error> error = {});
  void fireShouldPrioritize(FakeInstallCoordinator& coordinator);
  void fireCanceled(FakeInstallCoordinator& coordinator, const Error& reason,
                    CoordinationClientId client);

  /// Does what there is to do for the application's live coordinator, as far as its client has
  /// come: tells of a beginning, installs the placeholder, then the package.
  void carryOn(std::string_view bundleId);
  /// nullptr when there is none.
  std::shared_ptr<FakeInstallCoordinator> liveCoordinator(std::string_view bundleId) const;

  /// From now on completions of uninstalls are called only by completeUninstalls.
  void holdUninstalls();
  /// Calls all completions that are held, in order and on the service's thread; they stay, and can
  /// be called again.
  void completeUninstalls(const std::optional<Error>& error);

  /// Waits until every event and completion so far has run.
  void waitForEvents() { events_.drain(); }

 private:
  class Listener;
  using Event = std::function<void(CoordinatorObserver&, FakeInstallCoordinator&)>;
  using Completion = std::function<void(const std::optional<Error>&)>;
  struct PendingEvent {
    std::shared_ptr<FakeInstallCoordinator> coordinator;
    Event event;
  };

  // CoordinatorOwner
  void observerChanged() override;
  void giveUp(FakeInstallCoordinator& coordinator, const Error& reason,
              CoordinationClientId client) override;
  bool isPromisedElsewhere(const DataPromise& promise,
                           const FakeInstallCoordinator& coordinator) override;
  bool takesUnfinishedPlaceholders() const override { return takesUnfinished_; }
  /// Ends a live coordinator that does not serve who asks for one of this kind; an error when it
  /// is not this client's to end. Neither if it does. The lock is held.
  bool makesRoom(FakeInstallCoordinator& live, CoordinatorKind kind, CoordinationClientId client,
                 std::optional<Error>& refusal);

  /// The lock is held.
  PromiseState newPromise(std::string_view name, CoordinationClientId client,
                          std::uint64_t diskSpaceNeeded);
  void fire(FakeInstallCoordinator& coordinator, Event event);
  void post(FakeInstallCoordinator& coordinator, Event event);
  void deliverPending();
  void uninstall(const std::string& bundleId, std::optional<Error>& error);
  bool installPlaceholder(FakeInstallCoordinator& coordinator);
  void installPackage(FakeInstallCoordinator& coordinator);
  void end(FakeInstallCoordinator& coordinator, const std::optional<Error>& error);
  void settle(FakeInstallCoordinator& coordinator, bool keepPlaceholder);

  /// The lock is held.
  CoordinatorObserver* receiver(const FakeInstallCoordinator& coordinator) const;
  void removeListener(Listener* listener);

  CoordinationContext context_;
  FakeAppRegistry& registry_;
  mutable std::mutex mutex_;
  std::condition_variable delivered_;
  bool enabled_ = false;
  std::atomic<bool> takesUnfinished_ = false;
  std::optional<Error> lookupError_;
  std::uint64_t nextPromise_ = 1;
  std::vector<std::shared_ptr<FakeInstallCoordinator>> coordinators_;
  std::vector<std::shared_ptr<FakePathTransferPromise>> pathPromises_;
  std::vector<std::shared_ptr<FakeOutOfBandTransferPromise>> outOfBandPromises_;
  std::vector<std::shared_ptr<FakeInstallPlaceholder>> placeholders_;
  std::vector<Listener*> listeners_;
  std::deque<PendingEvent> pending_;
  const CoordinatorObserver* delivering_ = nullptr;
  bool holdsUninstalls_ = false;
  std::vector<Completion> heldCompletions_;
  EventThread events_;  // last: its events use all of the above
};

}  // namespace appsync::fakes
