// What every coordination service promises, shown on the fake.
#include <future>
#include <thread>

#include "tests/fakes/fake_platform.h"

namespace appsync::contract {
namespace {

/// Keeps the events it gets, as text.
class EventRecorder : public CoordinatorObserver {
 public:
  void promiseDidBeginFulfillmentWithIdentifier(std::uint64_t identifier) noexcept override {
    events.push_back("begin " + std::to_string(identifier));
  }
  void coordinatorDidInstallPlaceholder(InstallCoordinator& coordinator) noexcept override {
    add("placeholder", coordinator);
  }
  void coordinatorDidCompleteSuccessfully(InstallCoordinator& coordinator) noexcept override {
    add(coordinator.error() ? "failed" : "complete", coordinator);
  }
  void coordinatorShouldPrioritize(InstallCoordinator& coordinator) noexcept override {
    add("prioritize", coordinator);
  }
  void coordinatorCanceledWithReason(InstallCoordinator& coordinator, const Error& reason,
                                     CoordinationClientId client) noexcept override {
    add("canceled " + reason.domain + " by " + std::to_string(client), coordinator);
  }

  // Written by one event at a time; firing waits for the event.
  std::vector<std::string> events;
  std::thread::id thread;

 private:
  void add(const std::string& event, const InstallCoordinator& coordinator) {
    events.push_back(event + " " + coordinator.bundleIdentifier().value_or("none"));
    thread = std::this_thread::get_id();
  }
};

class InstallCoordinationContract : public testing::Test {
 protected:
  std::shared_ptr<InstallCoordinator> make(std::string_view identifier,
                                           CoordinatorKind kind = CoordinatorKind::Initiating) {
    return coordination.coordinatorFor(kind, identifier, SyncHostClientID, true, nullptr, nullptr);
  }

  fakes::FakePlatform fakes;
  fakes::FakeInstallCoordination& fake = fakes.installCoordination;
  InstallCoordination& coordination = fake;
  const Error reason = Error::withDescription(TWErrorDomain, 30, "given up");
  EventRecorder recorder;
};

using Events = std::vector<std::string>;

TEST_F(InstallCoordinationContract, MakesACoordinatorOnlyWhenAskedTo) {
  bool created = true;
  EXPECT_FALSE(coordination.coordinatorFor(CoordinatorKind::Initiating, "com.a", SyncHostClientID,
                                           false, &created, nullptr));
  EXPECT_FALSE(created);
  const auto one = coordination.coordinatorFor(CoordinatorKind::Initiating, "com.a",
                                               SyncHostClientID, true, &created, nullptr);
  ASSERT_TRUE(one);
  EXPECT_TRUE(created);
  EXPECT_EQ(one->bundleIdentifier(), "com.a");
  EXPECT_EQ(one->creatorIdentifier(), SyncHostClientID);
  EXPECT_FALSE(one->error());
  const auto again = coordination.coordinatorFor(CoordinatorKind::Initiating, "com.a",
                                                 SyncHostClientID, true, &created, nullptr);
  EXPECT_EQ(again, one);
  EXPECT_FALSE(created);
}

TEST_F(InstallCoordinationContract, AnyKindFindsAnExistingCoordinatorAndMakesNone) {
  EXPECT_FALSE(coordination.coordinatorFor(CoordinatorKind::Any, "com.a", SyncHostClientID, true,
                                           nullptr, nullptr));
  const auto made = make("com.a", CoordinatorKind::Updating);
  EXPECT_EQ(coordination.coordinatorFor(CoordinatorKind::Any, "com.a", SyncHostClientID, false,
                                        nullptr, nullptr),
            made);
}

TEST_F(InstallCoordinationContract, AnotherClientsCoordinatorIsGivenOutWhateverItsKind) {
  const auto stores = fake.seedCoordinator(CoordinatorKind::Restoring, "com.a", KQClientKiosk);
  bool created = true;
  const auto found = coordination.coordinatorFor(CoordinatorKind::Initiating, "com.a",
                                                 SyncHostClientID, true, &created, nullptr);
  EXPECT_EQ(found, stores);
  EXPECT_FALSE(created);
  EXPECT_EQ(found->creatorIdentifier(), KQClientKiosk);
}

TEST_F(InstallCoordinationContract, ACoordinatorHasWhatWasSet) {
  const auto coordinator = make("com.a");
  EXPECT_FALSE(coordinator->hasInstallOptions());
  EXPECT_FALSE(coordinator->hasInitialQPKAssetPromises());
  EXPECT_FALSE(coordinator->hasAppAssetPromise());
  EXPECT_FALSE(coordinator->appAssetPromise(nullptr));
  EXPECT_FALSE(coordinator->hasUserDataPromise());
  EXPECT_FALSE(coordinator->hasPlaceholderPromise());
  EXPECT_EQ(coordinator->appAssetPromiseResponsibleClient(), 0U);

  const auto package =
      coordination.createPathTransferPromise("com.a-Asset", SyncHostClientID, std::nullopt, 0);
  const auto data =
      coordination.createOutOfBandTransferPromise("com.a-UserData", SyncHostClientID, 0);
  const auto placeholder =
      coordination.createAppPlaceholder("A", "com.a", InstallType::Sync, SyncHostClientID);
  ASSERT_TRUE(package && data && placeholder);
  EXPECT_TRUE(coordinator->setInstallOptions({}, nullptr));
  EXPECT_TRUE(coordinator->setInitialQPKAssetPromises({}, nullptr));
  EXPECT_TRUE(coordinator->setAppAssetPromise(package, nullptr));
  EXPECT_TRUE(coordinator->setUserDataPromise(data, nullptr));
  EXPECT_TRUE(coordinator->setPlaceholderPromise(placeholder, nullptr));
  EXPECT_TRUE(coordinator->setAppAssetPromiseResponsibleClient(KQClientKiosk, nullptr));

  EXPECT_TRUE(coordinator->hasInstallOptions());
  EXPECT_TRUE(coordinator->hasInitialQPKAssetPromises());
  EXPECT_TRUE(coordinator->hasAppAssetPromise());
  EXPECT_EQ(coordinator->appAssetPromise(nullptr), package);
  EXPECT_TRUE(coordinator->hasUserDataPromise());
  EXPECT_TRUE(coordinator->hasPlaceholderPromise());
  EXPECT_EQ(coordinator->appAssetPromiseResponsibleClient(), KQClientKiosk);
}

TEST_F(InstallCoordinationContract, NoPlaceholderIsRefusedWithAnError) {
  std::optional<Error> error;
  const auto coordinator = make("com.a");
  EXPECT_FALSE(coordinator->setPlaceholderPromise(nullptr, &error));
  EXPECT_TRUE(error);
  EXPECT_FALSE(coordinator->hasPlaceholderPromise());
}

TEST_F(InstallCoordinationContract, APromiseTellsItsProgressAndItsPlace) {
  const auto promise =
      coordination.createPathTransferPromise("com.a-Asset", SyncHostClientID, std::nullopt, 7);
  const auto other = coordination.createPathTransferPromise("com.a-Icon", SyncHostClientID,
                                                            FileLocation::file("/tmp/Icon.png"), 7);
  ASSERT_TRUE(promise && other);
  EXPECT_EQ(promise->name(), "com.a-Asset");
  EXPECT_NE(promise->identifier(), other->identifier());
  EXPECT_FALSE(promise->transferPath());
  EXPECT_EQ(other->transferPath(), FileLocation::file("/tmp/Icon.png"));
  EXPECT_EQ(promise->percentComplete(), 0);
  EXPECT_FALSE(promise->isComplete());
  promise->setTransferPath(FileLocation::file("/tmp/package"));
  promise->setPercentComplete(0.5);
  EXPECT_EQ(promise->percentComplete(), 0.5);
  promise->setComplete(true);
  EXPECT_TRUE(promise->isComplete());
  EXPECT_EQ(promise->transferPath(), FileLocation::file("/tmp/package"));
}

TEST_F(InstallCoordinationContract, CancelledObjectsStayUsableWithoutEffect) {
  const auto promise =
      coordination.createPathTransferPromise("com.a-Asset", SyncHostClientID, std::nullopt, 0);
  promise->cancel(reason, SyncHostClientID);
  promise->setComplete(true);
  promise->setPercentComplete(1.0);
  EXPECT_FALSE(promise->isComplete());
  EXPECT_EQ(promise->percentComplete(), 0);

  const auto coordinator = make("com.a");
  EXPECT_TRUE(coordinator->cancel(reason, SyncHostClientID));
  EXPECT_EQ(coordinator->error(), reason);
  coordinator->setInstallOptions({}, nullptr);
  EXPECT_FALSE(coordinator->hasInstallOptions());
  EXPECT_EQ(coordinator->bundleIdentifier(), "com.a");
}

TEST_F(InstallCoordinationContract, AnEventGoesToTheCoordinatorsObserverElseToAListener) {
  EventRecorder listening;
  const auto listener =
      coordination.createEventListener("com.corvane.service", {SyncHostClientID}, listening);
  make("com.a");
  const auto coordinator = fake.coordinator("com.a");
  fake.fireDidInstallPlaceholder(*coordinator);
  coordinator->setObserver(&recorder);
  fake.fireShouldPrioritize(*coordinator);
  fake.fireDidBeginFulfillment(*coordinator, 42);
  coordinator->setObserver(nullptr);
  fake.fireDidComplete(*coordinator);
  EXPECT_EQ(listening.events, (Events{"placeholder com.a", "complete com.a"}));
  EXPECT_EQ(recorder.events, (Events{"prioritize com.a", "begin 42"}));
  EXPECT_NE(listening.thread, std::this_thread::get_id());
}

TEST_F(InstallCoordinationContract, AListenerHearsOnlyOfItsClientsCoordinators) {
  const auto stores = fake.seedCoordinator(CoordinatorKind::Initiating, "com.a", KQClientKiosk);
  const auto listener =
      coordination.createEventListener("com.corvane.service", {SyncHostClientID}, recorder);
  fake.fireCanceled(*stores, reason, KQClientKiosk);
  EXPECT_EQ(recorder.events, Events{});
}

TEST_F(InstallCoordinationContract, AFailedInstallCompletesWithAnErrorOnTheCoordinator) {
  make("com.a")->setObserver(&recorder);
  fake.fireDidComplete(*fake.coordinator("com.a"), reason);
  fake.fireCanceled(*fake.coordinator("com.a"), reason, KQClientKiosk);
  EXPECT_EQ(recorder.events, (Events{"failed com.a", "canceled TWError by 1 com.a"}));
}

TEST_F(InstallCoordinationContract, NothingIsDeliveredAfterRemovingAnObserverOrAListener) {
  make("com.a")->setObserver(&recorder);
  coordination.removeObserver(&recorder);
  fake.fireDidComplete(*fake.coordinator("com.a"));
  auto listener =
      coordination.createEventListener("com.corvane.service", {SyncHostClientID}, recorder);
  listener.reset();
  fake.fireDidComplete(*fake.coordinator("com.a"));
  EXPECT_EQ(recorder.events, Events{});
}

TEST_F(InstallCoordinationContract, UninstallingTellsTheOutcomeOnAnotherThread) {
  fakes.appRegistry.seedInstalled("com.a");
  std::promise<std::pair<std::optional<Error>, std::thread::id>> told;
  coordination.uninstallApp("com.a", false, [&](const std::optional<Error>& error) {
    told.set_value({error, std::this_thread::get_id()});
  });
  const auto [error, thread] = told.get_future().get();
  EXPECT_FALSE(error);
  EXPECT_NE(thread, std::this_thread::get_id());
  EXPECT_FALSE(fakes.appRegistry.installed("com.a"));
}

TEST_F(InstallCoordinationContract, AnErrorForThePersonCarriesItsCause) {
  const Error shown = coordination.createUserPresentableError(1, 0, reason);
  EXPECT_EQ(shown.code, 1);
  ASSERT_TRUE(shown.underlying);
  EXPECT_EQ(*shown.underlying, reason);
  EXPECT_FALSE(coordination.createUserPresentableError(1, 0, std::nullopt).underlying);
}

}  // namespace
}  // namespace appsync::contract
