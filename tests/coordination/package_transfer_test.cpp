// Progress, end and failure of a coordinated package; the end of a sync; uninstalls.

#include "tests/coordination/coordination_fixture.h"

namespace appsync::fakes {
namespace {

using testing::Contains;
using testing::ElementsAre;
using testing::Not;
using testing::StartsWith;

constexpr std::string_view Package = "/var/mobile/Media/PublicStaging/com.a.pkg";

/// The lines of one look at the coordinator.
Trace lookedUp(std::string_view kind = "initiating", int existing = 0) {
  return {R"(transaction step 3 party 1 phase 1 ok com.a "Create coordinator")",
          "InstallCoordination.coordinatorFor(com.a, " + std::string(kind) + ", 3, look up)",
          said("Created " + std::string(kind) +
               " coordinator <Coordinator com.a> (createIfNotExisting:0, existingApp:" +
               std::to_string(existing) + ") for com.a with error (null)"),
          R"(transaction step 3 party 1 phase 2 ok com.a "Finished creating coordinator")"};
}

/// The same when another client made it.
Trace lookedUpInVain() {
  return {R"(transaction step 3 party 1 phase 1 ok com.a "Create coordinator")",
          "InstallCoordination.coordinatorFor(com.a, initiating, 3, look up)",
          said("IC returned initiating coordinator <Coordinator com.a> (createIfNotExisting:0, "
               "existingApp:0, creatorIdentifier=1) for com.a with error (null) - Will not perform "
               "install/update for this bundle"),
          R"(transaction step 3 party 1 phase 2 failed com.a "Finished creating coordinator")"};
}

/// A promise is made for the package where it lies.
Trace promiseMade() {
  return {"InstallCoordination.createPathTransferPromise(com.a-Asset, 3, " + std::string(Package) +
              ", 0)",
          "InstallCoordinator.setAppAssetPromise(com.a, com.a-Asset)",
          said("Added app asset promise to coordinator for 'com.a'")};
}

/// The coordinator does not take it.
Trace promiseRefused() {
  return joined({upTo(promiseMade(), "InstallCoordinator.setAppAssetPromise"),
                 {"fault InstallCoordinator.setAppAssetPromise(com.a)",
                  complained("Error Error Domain=Fault Code=7 adding app asset promise at " +
                             std::string(Package) + " to 'com.a'"),
                  complained("Cancelling asset promise for 'com.a'"),
                  "DataPromise.cancel(com.a-Asset, Error Domain=TWError Code=30, 3)"}});
}

/// The promise cannot be had from the coordinator.
const Trace PromiseWithheld = {"fault InstallCoordinator.appAssetPromise(com.a)"};

class PackageTransferTest : public CoordinationTest {
 protected:
  PackageTransferTest() { asset->path = Package; }

  std::shared_ptr<FakeInstallCoordinator> seed(CoordinatorKind kind = CoordinatorKind::Initiating) {
    return phone.installCoordination.seedCoordinator(kind, "com.a", SyncHostClientID);
  }
  /// A coordinator with a promise that waits for the package.
  std::shared_ptr<FakeInstallCoordinator> seedPromised() {
    auto coordinator = seed();
    client->_createAppAssetPromiseForBundleIdentifier("com.a", std::nullopt, coordinator.get());
    forget();
    return coordinator;
  }
  std::shared_ptr<FakePathTransferPromise> promise() {
    return phone.installCoordination.pathPromise("com.a-Asset");
  }

  SyncAssetPtr asset = syncedAsset(phone);
};

TEST_F(PackageTransferTest, ProgressGoesToThePromise) {
  seedPromised();
  promise()->setPercentComplete(0.125);
  forget();
  asset->downloadProgress = 0.5;
  EXPECT_TRUE(client->updateTransferProgressForApp(asset, false));
  EXPECT_EQ(effects(), joined({lookedUp(),
                               {said("Updating download progress: 0.500000 install "
                                     "progress:0.125000 for com.a"),
                                "DataPromise.setPercentComplete(com.a-Asset, 0.5)"}}));
}

TEST_F(PackageTransferTest, ProgressOfAnUpdateLooksForAnUpdatingCoordinator) {
  seed(CoordinatorKind::Updating);
  EXPECT_TRUE(client->updateTransferProgressForApp(asset, true));
  EXPECT_EQ(upTo(effects(), "InstallCoordination.createPathTransferPromise"),
            lookedUp("updating", 1));
}

TEST_F(PackageTransferTest, ProgressMakesAMissingPromise) {
  seed();
  asset->downloadProgress = 0.25;
  EXPECT_TRUE(client->updateTransferProgressForApp(asset, false));
  EXPECT_EQ(
      effects(),
      joined({lookedUp(),
              promiseMade(),
              {said("Updating download progress: 0.250000 install progress:0.000000 for com.a"),
               "DataPromise.setPercentComplete(com.a-Asset, 0.25)"}}));
}

TEST_F(PackageTransferTest, ProgressWithoutAPromiseIsNotPassedOn) {
  seed();
  phone.faults.failEvery("InstallCoordination.createPathTransferPromise", Refused);
  EXPECT_FALSE(client->updateTransferProgressForApp(asset, false));
  EXPECT_EQ(effects().back(), complained("Error creating asset promise for 'com.a'"));
}

TEST_F(PackageTransferTest, ProgressReplacesAPromiseThatTheCoordinatorDoesNotGive) {
  const auto coordinator = seedPromised();
  const auto withheld = promise();
  phone.faults.failEvery("InstallCoordinator.appAssetPromise", Refused);
  asset->downloadProgress = 0.25;
  EXPECT_TRUE(client->updateTransferProgressForApp(asset, false));
  EXPECT_EQ(
      effects(),
      joined({lookedUp(),
              PromiseWithheld,
              promiseMade(),
              {said("Updating download progress: 0.250000 install progress:0.000000 for com.a"),
               "DataPromise.setPercentComplete(com.a-Asset, 0.25)"}}));
  EXPECT_EQ(coordinator->state().appAssetPromise, promise());
  EXPECT_EQ(withheld->percentComplete(), 0);
}

TEST_F(PackageTransferTest, ProgressForARefusedPromiseIsNotPassedOn) {
  const auto coordinator = seed();
  phone.faults.failEvery("InstallCoordinator.setAppAssetPromise", Refused);
  EXPECT_FALSE(client->updateTransferProgressForApp(asset, false));
  EXPECT_EQ(effects(), joined({lookedUp(), promiseRefused()}));
  EXPECT_EQ(coordinator->state().cancellation, std::nullopt);
}

TEST_F(PackageTransferTest, ACoordinatorOfAnotherClientHearsNothingOfTheTransfer) {
  const auto coordinator = phone.installCoordination.seedCoordinator(CoordinatorKind::Initiating,
                                                                     "com.a", KQClientKiosk);
  EXPECT_FALSE(client->updateTransferProgressForApp(asset, false));
  client->transferCompleteForApp(asset, std::nullopt, false);
  client->transferCompleteForApp(asset, Refused, false);
  EXPECT_EQ(effects(), joined({lookedUpInVain(), lookedUpInVain(), lookedUpInVain()}));
  EXPECT_EQ(coordinator->state().appAssetPromise, nullptr);
  EXPECT_EQ(coordinator->state().cancellation, std::nullopt);
}

TEST_F(PackageTransferTest, ProgressOfASatisfiedPromiseIsNotPassedOn) {
  seedPromised();
  promise()->setComplete(true);
  forget();
  EXPECT_FALSE(client->updateTransferProgressForApp(asset, false));
  EXPECT_EQ(effects(),
            joined({lookedUp(), {said("Asset promise is already satisfied for com.a")}}));
}

TEST_F(PackageTransferTest, ProgressWithoutACoordinatorIsNotPassedOn) {
  EXPECT_FALSE(client->updateTransferProgressForApp(asset, false));
  EXPECT_EQ(phone.installCoordination.coordinatorCount(), 0u);
}

TEST_F(PackageTransferTest, ProgressOfAFailedCoordinatorIsNotPassedOn) {
  seedPromised()->edit([](auto& state) { state.error = Refused; });
  EXPECT_FALSE(client->updateTransferProgressForApp(asset, false));
  EXPECT_EQ(effects(), lookedUp());
}

TEST_F(PackageTransferTest, AReceivedPackageSatisfiesThePromise) {
  seedPromised();
  client->transferCompleteForApp(asset, std::nullopt, false);
  EXPECT_EQ(effects(),
            joined({lookedUp(),
                    {"DataPromise.setTransferPath(com.a-Asset, " + std::string(Package) + ")",
                     said("Satisfying asset promise for com.a"),
                     "DataPromise.setPercentComplete(com.a-Asset, 1)",
                     "DataPromise.setComplete(com.a-Asset, true)"}}));
  EXPECT_EQ(promise()->transferPath(), FileLocation::file(std::string(Package)));
}

TEST_F(PackageTransferTest, AReceivedPackageMakesAMissingPromise) {
  seed(CoordinatorKind::Updating);
  client->transferCompleteForApp(asset, std::nullopt, true);
  EXPECT_EQ(effects(), joined({lookedUp("updating", 1),
                               promiseMade(),
                               {said("Satisfying asset promise for com.a"),
                                "DataPromise.setPercentComplete(com.a-Asset, 1)",
                                "DataPromise.setComplete(com.a-Asset, true)"}}));
}

TEST_F(PackageTransferTest, AReceivedPackageThatCannotBePromisedSatisfiesNothing) {
  seed();
  phone.faults.failEvery("InstallCoordination.createPathTransferPromise", Refused);
  client->transferCompleteForApp(asset, std::nullopt, false);
  EXPECT_EQ(effects().back(), complained("Error creating asset promise for 'com.a'"));
}

TEST_F(PackageTransferTest, AReceivedPackageReplacesAPromiseThatTheCoordinatorDoesNotGive) {
  const auto coordinator = seedPromised();
  const auto withheld = promise();
  phone.faults.failEvery("InstallCoordinator.appAssetPromise", Refused);
  client->transferCompleteForApp(asset, std::nullopt, false);
  EXPECT_EQ(effects(), joined({lookedUp(),
                               PromiseWithheld,
                               promiseMade(),
                               {said("Satisfying asset promise for com.a"),
                                "DataPromise.setPercentComplete(com.a-Asset, 1)",
                                "DataPromise.setComplete(com.a-Asset, true)"}}));
  EXPECT_EQ(coordinator->state().appAssetPromise, promise());
  EXPECT_FALSE(withheld->isComplete());
}

TEST_F(PackageTransferTest, AReceivedPackageWhosePromiseIsRefusedSatisfiesNothing) {
  const auto coordinator = seed();
  phone.faults.failEvery("InstallCoordinator.setAppAssetPromise", Refused);
  client->transferCompleteForApp(asset, std::nullopt, false);
  EXPECT_EQ(effects(), joined({lookedUp(), promiseRefused()}));
  EXPECT_FALSE(promise()->isComplete());
  EXPECT_EQ(coordinator->state().cancellation, std::nullopt);
}

TEST_F(PackageTransferTest, ASatisfiedPromiseIsNotSatisfiedAgain) {
  seedPromised();
  client->transferCompleteForApp(asset, std::nullopt, false);
  forget();
  client->transferCompleteForApp(asset, std::nullopt, false);
  EXPECT_EQ(effects(),
            joined({lookedUp(), {said("Asset promise is already satisfied for com.a")}}));
}

TEST_F(PackageTransferTest, AFailedTransferCancelsTheCoordinatorForThePersonToSee) {
  const auto coordinator = seedPromised();
  client->transferCompleteForApp(asset, Refused, false);
  Error shown = errorOf("UserPresentable", 1);
  shown.userInfo.emplace("Flag", 0);
  shown.underlying = std::make_shared<const Error>(Refused);
  EXPECT_EQ(
      effects(),
      joined({lookedUp(), {"InstallCoordinator.cancel(com.a, " + description(shown) + ", 3)"}}));
  EXPECT_EQ(phone.trace.count("InstallCoordination.createUserPresentableError(1, 0, "), 1u);
}

TEST_F(PackageTransferTest, TheEndOfATransferPassesOverMissingAndFailedCoordinators) {
  client->transferCompleteForApp(asset, Refused, false);
  EXPECT_THAT(effects(), Not(Contains(StartsWith("InstallCoordinator.cancel"))));
  forget();
  seedPromised()->edit([](auto& state) { state.error = Refused; });
  client->transferCompleteForApp(asset, Refused, false);
  client->transferCompleteForApp(asset, std::nullopt, false);
  EXPECT_EQ(effects(), joined({lookedUp(), lookedUp()}));
}

class SyncEndTest : public CoordinationTest {};

TEST_F(SyncEndTest, AFailedSyncCancelsWhatIsLeft) {
  phone.installCoordination.seedCoordinator(CoordinatorKind::Initiating, "com.a", SyncHostClientID);
  phone.installCoordination.seedCoordinator(CoordinatorKind::Updating, "com.c", SyncHostClientID);
  client->assetSyncFinishedWithStatus(false, {"com.a", "com.b", "com.c"});
  EXPECT_THAT(
      effects(),
      ElementsAre("InstallCoordination.coordinatorFor(com.a, any, 3, look up)",
                  said("Cancelling coordinator with error Error Domain=TWError Code=30 for com.a"),
                  "InstallCoordinator.cancel(com.a, Error Domain=TWError Code=30, 3)",
                  "InstallCoordination.coordinatorFor(com.b, any, 3, look up)",
                  "InstallCoordination.coordinatorFor(com.c, any, 3, look up)",
                  said("Cancelling coordinator with error Error Domain=TWError Code=30 for com.c"),
                  "InstallCoordinator.cancel(com.c, Error Domain=TWError Code=30, 3)"));
}

TEST_F(SyncEndTest, AFailedSyncCancelsTheCoordinatorOfAnotherClientToo) {
  const auto coordinator =
      phone.installCoordination.seedCoordinator(CoordinatorKind::Restoring, "com.a", KQClientKiosk);
  client->assetSyncFinishedWithStatus(false, {"com.a"});
  EXPECT_THAT(
      effects(),
      ElementsAre("InstallCoordination.coordinatorFor(com.a, any, 3, look up)",
                  said("Cancelling coordinator with error Error Domain=TWError Code=30 for com.a"),
                  "InstallCoordinator.cancel(com.a, Error Domain=TWError Code=30, 3)"));
  EXPECT_EQ(coordinator->state().cancellation, (Cancellation{errorOf("TWError", 30), 3}));
}

TEST_F(SyncEndTest, ASuccessfulSyncCancelsNothing) {
  const auto coordinator = phone.installCoordination.seedCoordinator(CoordinatorKind::Initiating,
                                                                     "com.a", SyncHostClientID);
  client->assetSyncFinishedWithStatus(true, {"com.a"});
  EXPECT_EQ(coordinator->state().cancellation, std::nullopt);
  EXPECT_EQ(phone.trace.log(), Trace{});
}

class CoordinatedUninstallTest : public CoordinationTest {
 protected:
  Trace uninstall() {
    client->uninstallAppUsingCoordination("com.a");
    phone.installCoordination.waitForEvents();
    return effects();
  }
};

TEST_F(CoordinatedUninstallTest, AsksNoPersonAndRecordsTheEnd) {
  phone.appRegistry.seedInstalled("com.a");
  EXPECT_THAT(uninstall(),
              ElementsAre(R"(transaction step 7 party 1 phase 1 ok com.a "Uninstall app")",
                          "InstallCoordination.uninstallApp(com.a, false)",
                          said("Uninstall of com.a with install coordinator succeeded wiht error "
                               "(null)."),
                          R"(transaction step 7 party 1 phase 2 ok com.a "Uninstall app")"));
}

TEST_F(CoordinatedUninstallTest, AFailureIsLoggedInTheSameWordsButRecordedAsFailure) {
  phone.faults.failEvery("InstallCoordination.uninstallApp", Refused);
  EXPECT_THAT(uninstall(),
              ElementsAre(R"(transaction step 7 party 1 phase 1 ok com.a "Uninstall app")",
                          "fault InstallCoordination.uninstallApp(com.a)",
                          said("Uninstall of com.a with install coordinator succeeded wiht error "
                               "Error Domain=Fault Code=7."),
                          R"(transaction step 7 party 1 phase 2 failed com.a "Uninstall app")"));
}

}  // namespace
}  // namespace appsync::fakes
