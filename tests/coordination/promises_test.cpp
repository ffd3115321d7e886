// Coordinators, placeholders and promises, one at a time.

#include "tests/coordination/coordination_fixture.h"

namespace appsync::fakes {
namespace {

using testing::ElementsAre;

class CoordinatorLookupTest : public CoordinationTest {
 protected:
  std::shared_ptr<InstallCoordinator> find(bool existingApp, bool create) {
    return client->_initiatingOrUpdatingAppInstallCoordinatorForBundleIdentifier(
        "com.a", existingApp, create, &error);
  }
  std::shared_ptr<InstallCoordinator> findRestoring(bool create) {
    return client->_restoringAppInstallCoordinatorForBundleIdentifier("com.a", create, &error);
  }

  std::optional<Error> error;
};

TEST_F(CoordinatorLookupTest, FindsNothingAndMakesNothingUnasked) {
  EXPECT_EQ(find(false, false), nullptr);
  EXPECT_EQ(error, std::nullopt);
  EXPECT_EQ(phone.installCoordination.coordinatorCount(), 0u);
  EXPECT_THAT(effects(),
              ElementsAre(R"(transaction step 3 party 1 phase 1 ok com.a "Create coordinator")",
                          "InstallCoordination.coordinatorFor(com.a, initiating, 3, look up)",
                          R"(transaction step 3 party 1 phase 2 failed com.a )"
                          R"("Finished creating coordinator")"));
}

TEST_F(CoordinatorLookupTest, AnInstalledApplicationGetsAnUpdatingCoordinator) {
  EXPECT_NE(find(true, true), nullptr);
  EXPECT_THAT(effects(),
              ElementsAre(R"(transaction step 3 party 1 phase 1 ok com.a "Create coordinator")",
                          "InstallCoordination.coordinatorFor(com.a, updating, 3, create)",
                          said("Created updating coordinator <Coordinator com.a> "
                               "(createIfNotExisting:1, existingApp:1) for com.a with error "
                               "(null)"),
                          R"(transaction step 3 party 1 phase 2 ok com.a )"
                          R"("Finished creating coordinator")"));
}

TEST_F(CoordinatorLookupTest, ACoordinatorOfAnotherClientIsDroppedAndLeftAlone) {
  const auto coordinator =
      phone.installCoordination.seedCoordinator(CoordinatorKind::Updating, "com.a", KQClientKiosk);
  EXPECT_EQ(find(true, true), nullptr);
  EXPECT_EQ(coordinator->state().cancellation, std::nullopt);
  EXPECT_THAT(phone.trace.log(),
              ElementsAre(said("IC returned updating coordinator <Coordinator com.a> "
                               "(createIfNotExisting:1, existingApp:1, creatorIdentifier=1) for "
                               "com.a with error (null) - Will not perform install/update for "
                               "this bundle")));
}

TEST_F(CoordinatorLookupTest, ACoordinatorOfAnotherClientIsDroppedAlsoWhenOneIsOnlyLookedFor) {
  const auto coordinator = phone.installCoordination.seedCoordinator(CoordinatorKind::Initiating,
                                                                     "com.a", KQClientKiosk);
  EXPECT_EQ(find(false, false), nullptr);
  EXPECT_EQ(coordinator->state().cancellation, std::nullopt);
  EXPECT_THAT(effects(),
              ElementsAre(R"(transaction step 3 party 1 phase 1 ok com.a "Create coordinator")",
                          "InstallCoordination.coordinatorFor(com.a, initiating, 3, look up)",
                          said("IC returned initiating coordinator <Coordinator com.a> "
                               "(createIfNotExisting:0, existingApp:0, creatorIdentifier=1) for "
                               "com.a with error (null) - Will not perform install/update for "
                               "this bundle"),
                          R"(transaction step 3 party 1 phase 2 failed com.a )"
                          R"("Finished creating coordinator")"));
}

TEST_F(CoordinatorLookupTest, ACoordinatorThatComesWithAnErrorIsReturnedWithIt) {
  phone.installCoordination.giveErrorWithEveryLookup(Refused);
  EXPECT_NE(find(false, true), nullptr);
  EXPECT_EQ(error, Refused);
  error.reset();
  EXPECT_NE(findRestoring(false), nullptr);
  EXPECT_EQ(error, Refused);
  EXPECT_THAT(
      effects(),
      ElementsAre(R"(transaction step 3 party 1 phase 1 ok com.a "Create coordinator")",
                  "InstallCoordination.coordinatorFor(com.a, initiating, 3, create)",
                  said("Created initiating coordinator <Coordinator com.a> (createIfNotExisting:1, "
                       "existingApp:0) for com.a with error Error Domain=Fault Code=7"),
                  R"(transaction step 3 party 1 phase 2 ok com.a "Finished creating coordinator")",
                  R"(transaction step 3 party 1 phase 1 ok com.a "Create restore coordinator")",
                  "InstallCoordination.coordinatorFor(com.a, restoring, 3, look up)",
                  said("Created restore coordinator <Coordinator com.a> (createIfNotExisting:0) "
                       "for com.a with error Error Domain=Fault Code=7"),
                  R"(transaction step 3 party 1 phase 2 ok com.a )"
                  R"("Finished creating restore coordinator")"));
}

TEST_F(CoordinatorLookupTest, ACoordinatorOfAnotherClientThatComesWithAnErrorIsNamedWithIt) {
  phone.installCoordination.seedCoordinator(CoordinatorKind::Updating, "com.a", KQClientKiosk);
  phone.installCoordination.giveErrorWithEveryLookup(Refused);
  EXPECT_EQ(find(true, true), nullptr);
  EXPECT_EQ(error, Refused);
  EXPECT_THAT(phone.trace.log(),
              ElementsAre(said("IC returned updating coordinator <Coordinator com.a> "
                               "(createIfNotExisting:1, existingApp:1, creatorIdentifier=1) for "
                               "com.a with error Error Domain=Fault Code=7 - Will not perform "
                               "install/update for this bundle")));
}

TEST_F(CoordinatorLookupTest, HandsOnTheReasonOfTheService) {
  phone.faults.failEvery("InstallCoordination.coordinatorFor", Refused);
  EXPECT_EQ(find(false, true), nullptr);
  EXPECT_EQ(error, Refused);
  EXPECT_EQ(findRestoring(true), nullptr);
  EXPECT_EQ(error, Refused);
}

TEST_F(CoordinatorLookupTest, TheReasonMayBeUnwanted) {
  phone.faults.failEvery("InstallCoordination.coordinatorFor", Refused);
  EXPECT_EQ(client->_initiatingOrUpdatingAppInstallCoordinatorForBundleIdentifier("com.a", false,
                                                                                  true, nullptr),
            nullptr);
  EXPECT_EQ(client->_restoringAppInstallCoordinatorForBundleIdentifier("com.a", true, nullptr),
            nullptr);
}

TEST_F(CoordinatorLookupTest, MakesARestoringCoordinator) {
  EXPECT_NE(findRestoring(true), nullptr);
  EXPECT_THAT(
      effects(),
      ElementsAre(R"(transaction step 3 party 1 phase 1 ok com.a "Create restore coordinator")",
                  "InstallCoordination.coordinatorFor(com.a, restoring, 3, create)",
                  said("Created restore coordinator <Coordinator com.a> (createIfNotExisting:1) "
                       "for com.a with error (null)"),
                  R"(transaction step 3 party 1 phase 2 ok com.a )"
                  R"("Finished creating restore coordinator")"));
}

TEST_F(CoordinatorLookupTest, ARestoringCoordinatorOfTheStoreIsReturned) {
  const auto coordinator =
      phone.installCoordination.seedCoordinator(CoordinatorKind::Restoring, "com.a", KQClientKiosk);
  EXPECT_EQ(findRestoring(true), coordinator);
}

TEST_F(CoordinatorLookupTest, SaysThatThereIsNoRestoringCoordinator) {
  EXPECT_EQ(findRestoring(false), nullptr);
  EXPECT_THAT(
      effects(),
      ElementsAre(R"(transaction step 3 party 1 phase 1 ok com.a "Create restore coordinator")",
                  "InstallCoordination.coordinatorFor(com.a, restoring, 3, look up)",
                  said("Created restore coordinator (null) (createIfNotExisting:0) for com.a "
                       "with error (null)"),
                  R"(transaction step 3 party 1 phase 2 failed com.a )"
                  R"("Finished creating restore coordinator")"));
}

class PromiseTest : public CoordinationTest {
 protected:
  std::shared_ptr<PathTransferPromise> promiseIcon(InstallPlaceholder* placeholder,
                                                   bool forAppInstall) {
    return client->_createIconPromiseForBundleIdentifier("com.a", "/tmp/Icon.png", 12, placeholder,
                                                         forAppInstall);
  }
  std::shared_ptr<InstallPlaceholder> makePlaceholder() {
    auto placeholder =
        client->_placeHolderForBundleIdentifier("com.a", "Alpha", InstallType::Restore);
    forget();
    return placeholder;
  }

  std::shared_ptr<FakeInstallCoordinator> coordinator = phone.installCoordination.seedCoordinator(
      CoordinatorKind::Initiating, "com.a", SyncHostClientID);
};

TEST_F(PromiseTest, AnAssetPromiseNeedsACoordinator) {
  EXPECT_EQ(client->_createAppAssetPromiseForBundleIdentifier("com.a", "/a.pkg", nullptr), nullptr);
  EXPECT_EQ(effects(), Trace{});
}

TEST_F(PromiseTest, AnAssetPromiseMayNameThePlaceAtOnce) {
  const auto promise =
      client->_createAppAssetPromiseForBundleIdentifier("com.a", "/a.pkg", coordinator.get());
  ASSERT_NE(promise, nullptr);
  EXPECT_EQ(promise->transferPath(), FileLocation::file("/a.pkg"));
  EXPECT_FALSE(promise->isComplete());
  EXPECT_THAT(
      effects(),
      ElementsAre("InstallCoordination.createPathTransferPromise(com.a-Asset, 3, /a.pkg, 0)",
                  "InstallCoordinator.setAppAssetPromise(com.a, com.a-Asset)",
                  said("Added app asset promise to coordinator for 'com.a'")));
}

TEST_F(PromiseTest, ARefusedAssetPromiseIsReportedWithItsPlace) {
  phone.faults.failEvery("InstallCoordinator.setAppAssetPromise", Refused);
  EXPECT_EQ(client->_createAppAssetPromiseForBundleIdentifier("com.a", "/a.pkg", coordinator.get()),
            nullptr);
  EXPECT_THAT(
      phone.trace.log(),
      ElementsAre(complained("Error Error Domain=Fault Code=7 adding app asset promise at /a.pkg "
                             "to 'com.a'"),
                  complained("Cancelling asset promise for 'com.a'")));
}

TEST_F(PromiseTest, UserDataArePromisedAsDeliveredAlready) {
  const auto promise = client->_userDataPromiseForBundleIdentifier("com.a");
  ASSERT_NE(promise, nullptr);
  EXPECT_THAT(
      effects(),
      ElementsAre("InstallCoordination.createOutOfBandTransferPromise(com.a-UserData, 3, 0)",
                  "DataPromise.setPercentComplete(com.a-UserData, 1)",
                  "DataPromise.setComplete(com.a-UserData, true)"));
}

TEST_F(PromiseTest, UserDataThatCannotBePromisedGiveNoPromise) {
  phone.faults.failEvery("InstallCoordination.createOutOfBandTransferPromise", Refused);
  EXPECT_EQ(client->_userDataPromiseForBundleIdentifier("com.a"), nullptr);
  EXPECT_EQ(phone.trace.log(), Trace{});
}

TEST_F(PromiseTest, AnIconPromiseNeedsAPlaceholder) {
  EXPECT_EQ(promiseIcon(nullptr, true), nullptr);
  EXPECT_THAT(effects(),
              ElementsAre(complained("Placeholder to add icon promise is nil for 'com.a'")));
}

TEST_F(PromiseTest, AnIconPromiseIsSatisfiedBeforeItIsHandedOver) {
  const auto placeholder = makePlaceholder();
  EXPECT_NE(promiseIcon(placeholder.get(), true), nullptr);
  EXPECT_THAT(
      effects(),
      ElementsAre("InstallCoordination.createPathTransferPromise(com.a-Icon, 3, /tmp/Icon.png, 12)",
                  "DataPromise.setPercentComplete(com.a-Icon, 1)",
                  "DataPromise.setComplete(com.a-Icon, true)",
                  "InstallPlaceholder.setIconPromise(com.a, com.a-Icon)",
                  said("Added icon promise to placeholder for 'com.a'")));
}

TEST_F(PromiseTest, ARefusedIconPromiseIsCancelledByTheReasonOfTheWork) {
  const auto placeholder = makePlaceholder();
  phone.faults.failEvery("InstallPlaceholder.setIconPromise", Refused);
  EXPECT_EQ(promiseIcon(placeholder.get(), true), nullptr);
  EXPECT_EQ(phone.installCoordination.pathPromise("com.a-Icon")->state().cancellation,
            (Cancellation{errorOf("TWError", 30), 3}));
  EXPECT_EQ(promiseIcon(placeholder.get(), false), nullptr);
  EXPECT_EQ(phone.installCoordination.pathPromise("com.a-Icon")->state().cancellation,
            (Cancellation{errorOf("TWError", 29), 3}));
}

TEST_F(PromiseTest, APlaceholderBearsNameAndInstallType) {
  EXPECT_NE(client->_placeHolderForBundleIdentifier("com.a", "Alpha", InstallType::Restore),
            nullptr);
  EXPECT_THAT(effects(),
              ElementsAre(R"(transaction step 4 party 1 phase 1 ok com.a "Create placeholder")",
                          "InstallCoordination.createAppPlaceholder(com.a, Alpha, 2, 3)",
                          said("Created placeholder <Placeholder com.a> for 'com.a' of type 2"),
                          R"(transaction step 4 party 1 phase 2 ok com.a )"
                          R"("Finished creating placeholder")"));
}

}  // namespace
}  // namespace appsync::fakes
