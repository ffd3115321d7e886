#include <signal.h>
#include <unistd.h>

#include "tests/device/coordination_test.h"

namespace appsync::device {
namespace {

using Lines = std::vector<std::string>;
constexpr std::string_view Id = "com.example.a";

/// Opens the device anew after each step, as a client whose process is killed over and over.
class CoordinationRecoveryTest : public CoordinationTest {
 protected:
  /// A coordinator with all but its package, whose placeholder stands.
  void prepareAndClose(CoordinatorKind kind = CoordinatorKind::Initiating) {
    prepare(Id, kind);
    EXPECT_TRUE(recorder.waitFor("placeholder"));
    waitUntilIdle(Id);
    device.reset();
  }
  /// An update whose package has come and waits for the application to be closed.
  void makeWaitingUpdate() {
    ASSERT_TRUE(installPackage(Id, "1.0"));
    ASSERT_TRUE(launch(Id));
    WaitingWatcher watcher;
    device->setWatcher(&watcher);
    const auto coordinator = prepare(Id, CoordinatorKind::Updating);
    package = stageApplication(Id);
    deliver(*coordinator, package);
    ASSERT_TRUE(watcher.waitFor("denied com.example.a"));
    device.reset();
  }
  void listen() {
    listener = service().createEventListener("com.corvane.test", {SyncHostClientID}, listening);
  }

  FileLocation package;
  EventRecorder listening;
  std::unique_ptr<CoordinatorEventListener> listener;
};

TEST_F(CoordinationRecoveryTest, AnInstallThatIsInterruptedAfterEachStepComesToItsEnd) {
  coordinatorFor(Id);
  reopen();
  ASSERT_TRUE(live(Id));
  EXPECT_EQ(live(Id)->creatorIdentifier(), SyncHostClientID);
  const InstallOptions options{StoreMetadata{{{"itemName", "A"}}}, InstallType::Sync, 1,
                               toBytes("sinf")};
  ASSERT_TRUE(live(Id)->setInstallOptions(options, nullptr));
  reopen();
  EXPECT_TRUE(live(Id)->hasInstallOptions());
  EXPECT_FALSE(live(Id)->hasInitialQPKAssetPromises());
  ASSERT_TRUE(live(Id)->setInitialQPKAssetPromises({}, nullptr));
  reopen();
  EXPECT_TRUE(live(Id)->hasInitialQPKAssetPromises());
  ASSERT_TRUE(live(Id)->setAppAssetPromise(packagePromise(Id), nullptr));
  ASSERT_TRUE(live(Id)->setUserDataPromise(
      service().createOutOfBandTransferPromise("data", SyncHostClientID, 0), nullptr));
  ASSERT_TRUE(live(Id)->setAppAssetPromiseResponsibleClient(KQClientKiosk, nullptr));
  const std::uint64_t promise = live(Id)->appAssetPromise(nullptr)->identifier();
  reopen();
  EXPECT_EQ(live(Id)->appAssetPromise(nullptr)->identifier(), promise);
  EXPECT_EQ(live(Id)->appAssetPromiseResponsibleClient(), KQClientKiosk);
  EXPECT_TRUE(live(Id)->hasUserDataPromise());
  EXPECT_FALSE(live(Id)->hasPlaceholderPromise());
  EXPECT_EQ(registry(), Lines{});
  ASSERT_TRUE(live(Id)->setPlaceholderPromise(completePlaceholder(Id), nullptr));
  live(Id)->setObserver(&recorder);
  ASSERT_TRUE(recorder.waitFor("placeholder"));
  reopen();
  EXPECT_EQ(registry(), Lines{"com.example.a 2.0 (placeholder)"});
  live(Id)->appAssetPromise(nullptr)->setPercentComplete(0.5);
  reopen();
  EXPECT_EQ(live(Id)->appAssetPromise(nullptr)->percentComplete(), 0.5);
  live(Id)->setObserver(&recorder);
  deliver(*live(Id), Id);
  ASSERT_TRUE(recorder.waitFor("complete"));
  EXPECT_EQ(registry(), Lines{"com.example.a 2.0"});
}

TEST_F(CoordinationRecoveryTest, APackageThatHasComeIsInstalledAfterARestart) {
  makeWaitingUpdate();
  quit(Id);
  reopen();
  listen();
  ASSERT_TRUE(listening.waitFor("complete com.example.a"));
  EXPECT_EQ(version(Id), "2.0");
  waitUntilIdle(Id);
  EXPECT_FALSE(device->files().fileExists(package.path));
}

TEST_F(CoordinationRecoveryTest, AKilledProcessLosesNothing) {
  device.reset();
  const int status = inOtherProcess([&] {
    reopen();
    prepare(Id);
    if (!recorder.waitFor("placeholder")) return 1;
    return kill(getpid(), SIGKILL);
  });
  EXPECT_EQ(status, 128 + SIGKILL);
  reopen();
  EXPECT_EQ(registry(), Lines{"com.example.a 2.0 (placeholder)"});
  listen();
  ASSERT_TRUE(live(Id));
  deliver(*live(Id), Id);
  EXPECT_TRUE(listening.waitFor("complete com.example.a"));
}

TEST_F(CoordinationRecoveryTest, AnInstallThatACrashBrokeOffIsDoneAgain) {
  makeWaitingUpdate();
  quit(Id);
  edit("UPDATE install_coordinators SET stage = 1");
  reopen();
  listen();
  ASSERT_TRUE(listening.waitFor("complete com.example.a"));
  EXPECT_EQ(version(Id), "2.0");
}

TEST_F(CoordinationRecoveryTest, APlaceholderThatACrashBrokeOffIsInstalledAgain) {
  prepareAndClose();
  edit("UPDATE install_placeholders SET presence = 1");
  reopen();
  listen();
  ASSERT_TRUE(listening.waitFor("placeholder com.example.a"));
  EXPECT_EQ(registry(), Lines{"com.example.a 2.0 (placeholder)"});
  EXPECT_EQ(containerCount(), 1U);
}

TEST_F(CoordinationRecoveryTest, ACancelThatACrashBrokeOffIsFinished) {
  makeWaitingUpdate();
  edit("UPDATE install_coordinators SET stage = 3, error = x'00'");
  reopen();
  EXPECT_EQ(registry(), Lines{"com.example.a 1.0"});
  EXPECT_FALSE(device->files().fileExists(package.path));
  EXPECT_EQ(live(Id), nullptr);
}

TEST_F(CoordinationRecoveryTest, APackageThatHasGoneCancelsItsCoordinator) {
  makeWaitingUpdate();
  std::filesystem::remove(onDisk(package.path));
  reopen();
  EXPECT_EQ(live(Id), nullptr);
  EXPECT_EQ(registry(), Lines{"com.example.a 1.0"});
  EXPECT_TRUE(
      logMentions("The install coordinator of com.example.a is cancelled: its package is gone"));
}

TEST_F(CoordinationRecoveryTest, ARestoredApplicationWhosePackageHasGoneWaitsOn) {
  prepareAndClose(CoordinatorKind::Restoring);
  edit("UPDATE data_promises SET complete = 1, path = '/tmp/gone.qpk' WHERE name LIKE '%-Asset'");
  reopen();
  EXPECT_EQ(live(Id), nullptr);
  waitUntilIdle(Id);
  EXPECT_TRUE(
      logMentions("The install coordinator of com.example.a is cancelled: its package is gone"));
  EXPECT_EQ(registry(), Lines{"com.example.a 2.0 (placeholder)"});
  reopen();
  EXPECT_EQ(registry(), Lines{"com.example.a 2.0 (placeholder)"});
}

TEST_F(CoordinationRecoveryTest, APlaceholderThatWasTakenAwayEndsItsCoordinatorUntold) {
  prepareAndClose(CoordinatorKind::Restoring);
  reopen();
  device->appRegistry().uninstallApplication(Id, {});
  reopen();
  EXPECT_EQ(live(Id), nullptr);
  EXPECT_TRUE(logMentions(
      "The install coordinator of com.example.a is cancelled: its placeholder was taken away"));
  listen();
  waitUntilIdle(Id);
  EXPECT_EQ(listening.events(), Events{});
  EXPECT_EQ(registry(), Lines{});
}

TEST_F(CoordinationRecoveryTest, WhatIsLeftOfAnApplicationIsFreeWhenTheSyncThatBringsItIsKilled) {
  ASSERT_TRUE(installPackage(Id, "1.0"));
  ASSERT_TRUE(device->demote(Id, nullptr));
  prepareAndClose();
  reopen();
  EXPECT_EQ(live(Id), nullptr);
  EXPECT_TRUE(
      logMentions("The install coordinator of com.example.a is cancelled: its client is gone"));
  EXPECT_EQ(registry(), Lines{"com.example.a 1.0 (placeholder)"});
  EXPECT_EQ(record(Id, true)->installType, InstallType::IntentionalDowngrade);
}

TEST_F(CoordinationRecoveryTest, AnInstallThatWasInButNotNotedIsOnlyNoted) {
  makeWaitingUpdate();
  quit(Id);
  edit(
      "UPDATE install_coordinators SET stage = 1; DELETE FROM applications WHERE placeholder; "
      "DELETE FROM installs");
  reopen();
  listen();
  ASSERT_TRUE(listening.waitFor("complete com.example.a"));
  waitUntilIdle(Id);
  EXPECT_EQ(version(Id), "1.0") << "nothing was installed once more";
  EXPECT_EQ(live(Id), nullptr);
  EXPECT_FALSE(device->files().fileExists(package.path));
}

TEST_F(CoordinationRecoveryTest, AnInstallWhoseFailureWasOnRecordIsNotTriedAgain) {
  makeWaitingUpdate();
  quit(Id);
  edit("UPDATE install_coordinators SET stage = 1, error = x'00'");
  reopen();
  listen();
  ASSERT_TRUE(listening.waitFor("failed com.example.a"));
  waitUntilIdle(Id);
  EXPECT_EQ(registry(), Lines{"com.example.a 1.0"});
  EXPECT_EQ(live(Id), nullptr);
}

TEST_F(CoordinationRecoveryTest, APackageThatIsCompleteWithoutAPlaceCancelsItsCoordinator) {
  prepareAndClose();
  edit("UPDATE data_promises SET complete = 1 WHERE name LIKE '%-Asset'");
  reopen();
  EXPECT_EQ(live(Id), nullptr);
  EXPECT_EQ(registry(), Lines{});
}

TEST_F(CoordinationRecoveryTest, ADamagedCoordinatorIsCancelledWithItsPlaceholderAndTheLogSaysWhy) {
  const std::vector<std::pair<std::string, std::string>> damages = {
      {"UPDATE install_coordinators SET options = x'62706c'", "its options cannot be read"},
      {"UPDATE install_coordinators SET options = 7", "its options cannot be read"},
      {"UPDATE install_coordinators SET kind = 77", "its kind is unknown"},
      {"UPDATE install_coordinators SET kind = 'text'", "its kind is unknown"},
      {"UPDATE install_coordinators SET stage = 9", "its stage is unknown"},
      {"UPDATE install_placeholders SET attributes = 'no list'", "its placeholder cannot be read"},
      {"UPDATE install_placeholders SET metadata = zeroblob(9)", "its placeholder cannot be read"},
      {"UPDATE install_placeholders SET identifier = '../x'", "its placeholder cannot be read"},
      {"UPDATE install_placeholders SET over = 1", "its placeholder cannot be read"},
      {"UPDATE install_placeholders SET configured = 0", "its placeholder was never configured"},
  };
  for (const auto& [sql, why] : damages) {
    SCOPED_TRACE(sql);
    EventRecorder events;
    prepare(Id, CoordinatorKind::Initiating, &events);
    ASSERT_TRUE(events.waitFor("placeholder"));
    device.reset();
    edit(sql);
    std::filesystem::remove_all(folder / "log");
    reopen();
    EXPECT_EQ(live(Id), nullptr);
    EXPECT_EQ(registry(), Lines{});
    EXPECT_TRUE(logMentions("The install coordinator of com.example.a is cancelled: " + why));
  }
}

TEST_F(CoordinationRecoveryTest, AnIdentifierThatNoApplicationCanHaveIsNeverUsed) {
  prepareAndClose();
  edit("UPDATE install_coordinators SET identifier = '../../precious'");
  reopen();
  EXPECT_TRUE(logMentions("no application can have its identifier"));
  EXPECT_EQ(live("../../precious"), nullptr);
}

TEST_F(CoordinationRecoveryTest, WhatACoordinatorHasLostCanBeGivenAgain) {
  const std::vector<std::pair<std::string, std::string>> losses = {
      {"DELETE FROM data_promises WHERE name LIKE '%-Asset'", "package promise"},
      {"UPDATE data_promises SET over = 1 WHERE name LIKE '%-Asset'", "package promise"},
      {"DELETE FROM install_placeholders", "placeholder"},
      {"UPDATE install_coordinators SET initial_promises = x'11'", "initial promises"},
      {"UPDATE install_coordinators SET user_data_promise = 4711", "user data promise"},
  };
  for (const auto& [sql, what] : losses) {
    SCOPED_TRACE(sql);
    EventRecorder events;
    prepare(Id, CoordinatorKind::Initiating, &events);
    ASSERT_TRUE(events.waitFor("placeholder"));
    device.reset();
    edit(sql);
    std::filesystem::remove_all(folder / "log");
    reopen();
    EXPECT_TRUE(logMentions("The install coordinator of com.example.a has lost its " + what));
    const auto coordinator = live(Id);
    ASSERT_TRUE(coordinator);
    EventRecorder again;
    coordinator->setObserver(&again);
    if (!coordinator->hasAppAssetPromise()) {
      ASSERT_TRUE(coordinator->setAppAssetPromise(packagePromise(Id), nullptr));
    }
    if (!coordinator->hasPlaceholderPromise()) {
      ASSERT_TRUE(coordinator->setPlaceholderPromise(completePlaceholder(Id), nullptr));
    }
    deliver(*coordinator, Id);
    EXPECT_TRUE(again.waitFor("complete"));
    service().removeObserver(&again);
  }
}

TEST_F(CoordinationRecoveryTest, MissingTablesAreMadeAgain) {
  prepareAndClose();
  edit("DROP TABLE install_coordinators; DROP TABLE coordinator_events;");
  reopen();
  EXPECT_EQ(live(Id), nullptr);
  const auto coordinator = prepare(Id);
  deliver(*coordinator, Id);
  EXPECT_TRUE(recorder.waitFor("complete"));
}

TEST_F(CoordinationRecoveryTest, EventsOfNobodyOrOfNoKindAreDropped) {
  prepareAndClose();
  edit(
      "INSERT INTO coordinator_events VALUES (NULL, 4711, 2, 0, NULL, 0); "
      "INSERT INTO coordinator_events VALUES (NULL, 1, 99, 0, x'00', 0)");
  reopen();
  listen();
  ASSERT_TRUE(service().tap(Id));
  ASSERT_TRUE(listening.waitFor("prioritize"));
  EXPECT_EQ(listening.events(), Events{"prioritize com.example.a"});
}

TEST_F(CoordinationRecoveryTest, WhatNobodyCanReachAnyMoreIsSwept) {
  packagePromise(Id);
  placeholderOf(Id);
  deliver(*prepare("com.example.b"), "com.example.b");
  ASSERT_TRUE(recorder.waitFor("complete"));
  ASSERT_TRUE(coordinatorFor("com.example.c")->cancel(reason, SyncHostClientID));
  waitUntilIdle("com.example.b");
  reopen();
  device.reset();
  edit(
      "CREATE TABLE settings2 AS SELECT (SELECT count(*) FROM install_coordinators) + "
      "(SELECT count(*) FROM data_promises) + (SELECT count(*) FROM install_placeholders) + "
      "(SELECT count(*) FROM coordinator_events) AS n; "
      "CREATE TABLE all_swept (n CHECK (n = 0)); INSERT INTO all_swept SELECT n FROM settings2");
}

TEST_F(CoordinationRecoveryTest, ADeviceThatIsOnlyReadHasNoService) {
  prepareAndClose();
  reopen(Access::ReadOnly);
  EXPECT_FALSE(platform().installCoordination.coordinationIsEnabled());
  EXPECT_EQ(registry(), Lines{"com.example.a 2.0 (placeholder)"});
}

}  // namespace
}  // namespace appsync::device
