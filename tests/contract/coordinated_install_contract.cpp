// How every coordination service installs, and whom it tells.
#include <cerrno>

#include "tests/contract/coordination_contract.h"

namespace appsync::contract {
namespace {

class CoordinatedInstallContract : public CoordinationContract {
 protected:
  void tap(std::string_view identifier) {
    EXPECT_TRUE(phone->tap(identifier));
    phone->settle(identifier);
  }
  std::unique_ptr<CoordinatorEventListener> listen(CoordinatorObserver& delegate,
                                                   CoordinationClientId client = SyncHostClientID) {
    return coordination.createEventListener("com.corvane.service", {client}, delegate);
  }
};

SERVICE_CONTRACT_OF(CoordinatedInstallContract);

TEST_P(CoordinatedInstallContract, APlaceholderStandsUntilItsPackageTakesItsPlace) {
  const auto coordinator = prepare("com.a");
  phone->settle("com.a");
  EXPECT_TRUE(hasPlaceholder("com.a"));
  EXPECT_EQ(version("com.a"), "none");
  const auto promise = coordinator->appAssetPromise(nullptr);
  deliver(*coordinator, "com.a");
  EXPECT_EQ(recorder.events(),
            (Events{"placeholder com.a", "begin " + std::to_string(promise->identifier()),
                    "complete com.a"}));
  EXPECT_NE(recorder.thread(), std::this_thread::get_id());
  EXPECT_FALSE(hasPlaceholder("com.a"));
  EXPECT_EQ(version("com.a"), "2.0");
  EXPECT_FALSE(coordinator->error());
  EXPECT_EQ(live("com.a"), nullptr) << "what is over is not found";
}

TEST_P(CoordinatedInstallContract, WhatIsOverStaysReadableAndTakesNoMoreChanges) {
  const auto coordinator = prepare("com.a");
  const auto promise = coordinator->appAssetPromise(nullptr);
  deliver(*coordinator, "com.a");
  ASSERT_EQ(version("com.a"), "2.0");
  promise->setPercentComplete(0.5);
  EXPECT_EQ(promise->percentComplete(), 1.0);
  std::optional<Error> error;
  EXPECT_FALSE(coordinator->setAppAssetPromiseResponsibleClient(KQClientKiosk, &error));
  EXPECT_EQ(error.value_or(Error{}).code, ECANCELED);
  EXPECT_EQ(coordinator->appAssetPromiseResponsibleClient(), 0U);
  EXPECT_FALSE(coordinator->cancel(reason, SyncHostClientID)) << "it is past cancelling";
  EXPECT_FALSE(coordinator->error());
  EXPECT_EQ(version("com.a"), "2.0");
}

TEST_P(CoordinatedInstallContract, NothingIsInstalledBeforeTheClientIsReady) {
  const auto coordinator = make("com.a");
  coordinator->setObserver(&recorder);
  ASSERT_TRUE(coordinator->setAppAssetPromise(packagePromise("com.a"), nullptr));
  deliver(*coordinator, "com.a");
  EXPECT_FALSE(hasPlaceholder("com.a")) << "nobody promised one";
  ASSERT_TRUE(coordinator->setPlaceholderPromise(placeholder("com.a"), nullptr));
  phone->settle("com.a");
  EXPECT_TRUE(hasPlaceholder("com.a"));
  EXPECT_EQ(version("com.a"), "none") << "there are no options";
  ASSERT_TRUE(coordinator->setInstallOptions({}, nullptr));
  phone->settle("com.a");
  EXPECT_EQ(version("com.a"), "2.0");
}

TEST_P(CoordinatedInstallContract, ADemotedRestoreEndsWithItsPlaceholder) {
  const auto coordinator = make("com.a", CoordinatorKind::RestoringDemoted);
  coordinator->setObserver(&recorder);
  ASSERT_TRUE(coordinator->setPlaceholderPromise(placeholder("com.a"), nullptr));
  phone->settle("com.a");
  EXPECT_EQ(recorder.events(), (Events{"placeholder com.a", "complete com.a"}));
  EXPECT_TRUE(hasPlaceholder("com.a"));
  EXPECT_EQ(live("com.a"), nullptr);
}

TEST_P(CoordinatedInstallContract, APackageThatDoesNotFitFailsAndLeavesTheOldVersion) {
  ASSERT_TRUE(installPackage("com.a", "1.0"));
  const auto coordinator = prepare("com.a", CoordinatorKind::Updating);
  deliver(*coordinator, "com.other");
  EXPECT_EQ(recorder.count("failed com.a"), 1U);
  EXPECT_EQ(recorder.count("complete"), 0U);
  EXPECT_TRUE(coordinator->error());
  EXPECT_FALSE(hasPlaceholder("com.a"));
  EXPECT_EQ(version("com.a"), "1.0");
  EXPECT_EQ(live("com.a"), nullptr);
}

TEST_P(CoordinatedInstallContract, APersonsTapAndCancelReachTheClientOnce) {
  const auto coordinator = prepare("com.a");
  phone->settle("com.a");
  tap("com.a");
  EXPECT_TRUE(phone->cancelInstall("com.a"));
  EXPECT_FALSE(phone->cancelInstall("com.a")) << "nothing is on its way any more";
  EXPECT_FALSE(phone->tap("com.a"));
  phone->settle("com.a");
  const Events events = recorder.events();
  ASSERT_EQ(events.size(), 3U);
  EXPECT_EQ(events[1], "prioritize com.a");
  EXPECT_TRUE(events[2].starts_with("canceled com.a by "));
  EXPECT_NE(events[2], "canceled com.a by " + std::to_string(SyncHostClientID));
  EXPECT_TRUE(coordinator->error());
  EXPECT_FALSE(hasPlaceholder("com.a"));
}

/// Keeps the reason of a cancellation too.
class ReasonRecorder : public EventRecorder {
 public:
  void coordinatorCanceledWithReason(InstallCoordinator& coordinator, const Error& given,
                                     CoordinationClientId client) noexcept override {
    reason = given;
    EventRecorder::coordinatorCanceledWithReason(coordinator, given, client);
  }
  std::optional<Error> reason;
};

TEST_P(CoordinatedInstallContract, AnotherClientsCancelIsToldWithItsReasonTheCreatorsOwnIsNot) {
  ReasonRecorder others;
  ReasonRecorder own;
  prepare("com.a", CoordinatorKind::Initiating, &others);
  prepare("com.b", CoordinatorKind::Initiating, &own);
  for (const std::string id : {"com.a", "com.b"}) {
    phone->settle(id);
    ASSERT_TRUE(hasPlaceholder(id));
    const bool isOwn = id == "com.b";
    EXPECT_TRUE(live(id)->cancel(reason, isOwn ? SyncHostClientID : KQClientKiosk));
    EXPECT_FALSE(hasPlaceholder(id)) << "its placeholder has gone when cancel returns";
    phone->settle(id);
  }
  EXPECT_EQ(others.events(), (Events{"placeholder com.a", "canceled com.a by 1"}));
  EXPECT_EQ(others.reason, reason);
  EXPECT_EQ(own.events(), Events{"placeholder com.b"});
}

TEST_P(CoordinatedInstallContract, AnEventGoesToTheCoordinatorsObserverElseToAListener) {
  EventRecorder listening;
  const auto listener = listen(listening);
  const auto coordinator = make("com.a");
  tap("com.a");
  coordinator->setObserver(&recorder);
  tap("com.a");
  coordinator->setObserver(nullptr);
  tap("com.a");
  EXPECT_EQ(listening.events(), (Events{"prioritize com.a", "prioritize com.a"}));
  EXPECT_EQ(recorder.events(), Events{"prioritize com.a"});
  EXPECT_NE(listening.thread(), std::this_thread::get_id());
}

TEST_P(CoordinatedInstallContract, AListenerHearsOnlyOfItsClientsCoordinators) {
  EventRecorder stores;
  const auto listener = listen(recorder);
  const auto storesListener = listen(stores, KQClientKiosk);
  make("com.a", CoordinatorKind::Initiating, KQClientKiosk);
  make("com.b");
  EXPECT_TRUE(phone->tap("com.a"));
  EXPECT_TRUE(phone->tap("com.b"));
  phone->settle("com.a");
  phone->settle("com.b");
  EXPECT_EQ(stores.events(), Events{"prioritize com.a"});
  EXPECT_EQ(recorder.events(), Events{"prioritize com.b"});
}

TEST_P(CoordinatedInstallContract, AnEventThatNobodyIsThereForIsKeptAndToldOnce) {
  prepare("com.a", CoordinatorKind::Initiating, nullptr);
  phone->settle("com.a");
  deliver(*live("com.a"), "com.a");
  EXPECT_EQ(version("com.a"), "2.0");
  Events heard;
  for (int times = 0; times < 2; ++times) {
    EventRecorder late;
    const auto listener = listen(late);
    phone->settle("com.a");
    for (const std::string& event : late.events()) heard.push_back(event.substr(0, 5));
  }
  EXPECT_EQ(heard, (Events{"place", "begin", "compl"}));
}

TEST_P(CoordinatedInstallContract, TheBeginningsOfIconAndPackageAreTold) {
  const auto coordinator = make("com.a");
  coordinator->setObserver(&recorder);
  const auto icon = iconPromise("com.a");
  const auto shown = barePlaceholder("com.a");
  ASSERT_TRUE(shown->setIconPromise(icon, nullptr));
  ASSERT_TRUE(shown->setConfigurationComplete(nullptr));
  const auto package = packagePromise("com.a");
  ASSERT_TRUE(coordinator->setInstallOptions({}, nullptr));
  ASSERT_TRUE(coordinator->setAppAssetPromise(package, nullptr));
  ASSERT_TRUE(coordinator->setPlaceholderPromise(shown, nullptr));
  phone->settle("com.a");
  deliver(*coordinator, "com.a");
  const auto begin = [](const PathTransferPromise& promise) {
    return "begin " + std::to_string(promise.identifier());
  };
  EXPECT_EQ(recorder.events(),
            (Events{begin(*icon), "placeholder com.a", begin(*package), "complete com.a"}));
}

TEST_P(CoordinatedInstallContract, AnInstallIsOverWhenItsPlaceholderIsTakenOutOfTheRegistry) {
  const auto first = prepare("com.a", CoordinatorKind::Restoring);
  phone->settle("com.a");
  ASSERT_TRUE(platform.appRegistry.uninstallApplication("com.a", {}));
  bool created = false;
  const auto second = coordination.coordinatorFor(CoordinatorKind::Initiating, "com.a",
                                                  SyncHostClientID, true, &created, nullptr);
  EXPECT_TRUE(created);
  EXPECT_NE(second, first);
  EXPECT_TRUE(first->error());
  phone->settle("com.a");
  EXPECT_EQ(recorder.events(), Events{"placeholder com.a"}) << "nobody is told";
  EXPECT_FALSE(hasPlaceholder("com.a"));
}

TEST_P(CoordinatedInstallContract, ARestoredApplicationWaitsOnWhenItsPackageIsRefused) {
  const auto coordinator = prepare("com.a", CoordinatorKind::Restoring);
  deliver(*coordinator, "com.other");
  EXPECT_EQ(recorder.count("failed com.a"), 1U);
  EXPECT_TRUE(hasPlaceholder("com.a"));
  EXPECT_EQ(live("com.a"), nullptr);
  deliver(*prepare("com.a", CoordinatorKind::Restoring), "com.a");
  EXPECT_EQ(version("com.a"), "2.0");
}

/// All that is left of an application when a sync brings it.
class LastTraceContract : public CoordinatedInstallContract {
 protected:
  LastTraceContract() {
    EXPECT_TRUE(installPlaceholder("com.a", "1.0", InstallType::IntentionalDowngrade));
    coordinator = prepare("com.a");
    phone->settle("com.a");
  }
  /// "1.0 of type 8", or "none".
  std::string placeholderLeft() {
    const auto record = platform.appRegistry.recordForIdentifier("com.a", true);
    if (!record) return "none";
    return record->bundleVersion.value_or("") + " of type " +
           std::to_string(static_cast<std::uint64_t>(record->installType));
  }
  std::shared_ptr<InstallCoordinator> coordinator;
};

SERVICE_CONTRACT_OF(LastTraceContract);

TEST_P(LastTraceContract, StandsInTheSteadOfASyncsPlaceholderUntilThePackageIsIn) {
  EXPECT_EQ(recorder.events(), Events{"placeholder com.a"});
  EXPECT_EQ(placeholderLeft(), "1.0 of type 8");
  deliver(*coordinator, "com.a");
  EXPECT_EQ(recorder.count("complete com.a"), 1U);
  EXPECT_EQ(placeholderLeft(), "none");
  EXPECT_EQ(version("com.a"), "2.0");
}

TEST_P(LastTraceContract, StaysWhenThePackageIsRefused) {
  deliver(*coordinator, "com.other");
  EXPECT_EQ(recorder.count("failed com.a"), 1U);
  EXPECT_EQ(placeholderLeft(), "1.0 of type 8");
}

TEST_P(LastTraceContract, StaysWhenThePersonCancels) {
  ASSERT_TRUE(phone->cancelInstall("com.a"));
  phone->settle("com.a");
  EXPECT_EQ(placeholderLeft(), "1.0 of type 8");
  EXPECT_EQ(live("com.a"), nullptr);
}

TEST_P(CoordinatedInstallContract, NothingIsDeliveredAfterRemovingAnObserverOrAListener) {
  make("com.a")->setObserver(&recorder);
  make("com.b")->setObserver(&recorder);
  coordination.removeObserver(&recorder);
  auto listener = listen(recorder);
  listener.reset();
  for (const char* id : {"com.a", "com.b"}) {
    EXPECT_TRUE(phone->tap(id));
    EXPECT_TRUE(phone->cancelInstall(id));
    phone->settle(id);
  }
  EXPECT_EQ(recorder.events(), Events{});
}

}  // namespace
}  // namespace appsync::contract
