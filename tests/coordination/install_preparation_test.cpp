#include "tests/coordination/install_trace.h"

namespace appsync::fakes {
namespace {

using testing::Contains;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::Not;
using testing::StartsWith;

class InstallPreparationTest : public CoordinationTest {
 protected:
  bool prepare(bool existingApp = false) {
    return client->prepareAppForInstallUsingCoordination(asset, existingApp);
  }

  SyncAssetPtr asset = syncedAsset(phone);
};

TEST_F(InstallPreparationTest, SetsUpCoordinatorPromisesAndPlaceholder) {
  EXPECT_TRUE(prepare());
  EXPECT_EQ(effects(), preparedInstall());
}

TEST_F(InstallPreparationTest, ObservesTheCoordinator) {
  prepare();
  const auto coordinator = phone.installCoordination.coordinator("com.a");
  EXPECT_EQ(coordinator->state().observer, static_cast<CoordinatorObserver*>(client.get()));
}

TEST_F(InstallPreparationTest, LeavesThePlaceOfThePackageOpen) {
  prepare();
  const PromiseState promise = phone.installCoordination.pathPromise("com.a-Asset")->state();
  EXPECT_EQ(promise.transferPath, std::nullopt);
  EXPECT_FALSE(promise.complete);
}

TEST_F(InstallPreparationTest, AnUpdateUsesAnUpdatingCoordinatorAndIsRecordedAsUpdate) {
  EXPECT_TRUE(prepare(true));
  const Trace trace = effects();
  EXPECT_EQ(trace, asUpdate(preparedInstall()));
  EXPECT_EQ(trace.at(1), R"(transaction step 1 party 1 phase 1 ok com.a "Update app")");
  EXPECT_EQ(trace.at(3), "InstallCoordination.coordinatorFor(com.a, updating, 3, create)");
  EXPECT_EQ(trace.back(), R"(transaction step 1 party 1 phase 2 ok com.a "Install app")");
}

TEST_F(InstallPreparationTest, ACoordinatorOfTheStoreIsLeftUntouched) {
  const auto coordinator = phone.installCoordination.seedCoordinator(CoordinatorKind::Initiating,
                                                                     "com.a", KQClientKiosk);
  EXPECT_FALSE(prepare());
  EXPECT_EQ(
      effects(),
      joined(
          {upTo(preparedInstall(), "log default SyncBundle|Created initiating"),
           {said("IC returned initiating coordinator <Coordinator com.a> (createIfNotExisting:1, "
                 "existingApp:0, creatorIdentifier=1) for com.a with error (null) - Will not "
                 "perform install/update for this bundle"),
            R"(transaction step 3 party 1 phase 2 failed com.a "Finished creating coordinator")"},
           installGivenUp("(null)")}));
  EXPECT_EQ(coordinator->state().cancellation, std::nullopt);
  EXPECT_EQ(coordinator->state().observer, nullptr);
}

TEST_F(InstallPreparationTest, ACoordinatorOfTheStoreIsLeftUntouchedByAnUpdateToo) {
  const auto coordinator =
      phone.installCoordination.seedCoordinator(CoordinatorKind::Updating, "com.a", KQClientKiosk);
  EXPECT_FALSE(prepare(true));
  EXPECT_EQ(
      effects(),
      joined(
          {asUpdate(upTo(preparedInstall(), "log default SyncBundle|Created initiating")),
           {said("IC returned updating coordinator <Coordinator com.a> (createIfNotExisting:1, "
                 "existingApp:1, creatorIdentifier=1) for com.a with error (null) - Will not "
                 "perform install/update for this bundle"),
            R"(transaction step 3 party 1 phase 2 failed com.a "Finished creating coordinator")"},
           installGivenUp("(null)")}));
  EXPECT_EQ(coordinator->state().cancellation, std::nullopt);
  EXPECT_EQ(coordinator->state().observer, nullptr);
}

TEST_F(InstallPreparationTest, AFurnishedCoordinatorGetsNothingAgain) {
  EXPECT_TRUE(prepare());
  forget();
  EXPECT_TRUE(prepare());
  EXPECT_EQ(
      effects(),
      joined({upTo(preparedInstall(), "InstallCoordinator.setInstallOptions"),
              {said("coordinator for com.a has install options"),
               said("coordinator for com.a has an QPK app asset promise"),
               said("coordinator for com.a has an app asset promise"),
               said("coordinator for com.a has a placeholder promise"),
               said("processing app install for bundle com.a finished with status 1 error (null)"),
               R"(transaction step 1 party 1 phase 2 ok com.a "Install app")"}}));
}

TEST_F(InstallPreparationTest, OptionsThatWereThereLeaveThePlaceholderWithoutStoreMetadata) {
  const auto coordinator = phone.installCoordination.seedCoordinator(CoordinatorKind::Initiating,
                                                                     "com.a", SyncHostClientID);
  coordinator->edit([](auto& state) { state.options.emplace(); });
  EXPECT_TRUE(prepare());
  EXPECT_EQ(phone.installCoordination.placeholders().front()->state().metadata, StoreMetadata{});
}

TEST_F(InstallPreparationTest, AnAssetWithoutNameAndIdentifierIsRefusedAtOnce) {
  asset->identifier.clear();
  asset->prettyName = "";
  asset->infoPlist = std::nullopt;
  EXPECT_FALSE(prepare());
  EXPECT_THAT(effects(),
              ElementsAre("log default Oversize|processing app install for bundle '', title  "
                          "assetplist (null), version 2.0 with install coordination",
                          R"(transaction step 1 party 1 phase 1 ok  "Install App")",
                          said("processing app install for bundle  finished with status 0 error "
                               "(null)"),
                          R"(transaction step 1 party 1 phase 2 failed  "Install app")"));
}

TEST_F(InstallPreparationTest, AnAssetWithoutNameIsCalledAfterItsIdentifier) {
  asset->prettyName = std::nullopt;
  EXPECT_TRUE(prepare());
  EXPECT_EQ(phone.installCoordination.placeholders().front()->state().name, "com.a");
}

TEST_F(InstallPreparationTest, FilesThatCannotBeReadCountAsEmpty) {
  asset->infoPlist = "/staging/com.a/missing.plist";
  phone.files.putFile("/staging/com.a/HalvoMetadata.plist", "no property list");
  asset->variantOptions.clear();
  EXPECT_TRUE(prepare());
  const auto placeholder = phone.installCoordination.placeholders().front()->state();
  EXPECT_EQ(placeholder.attributes, PlaceholderAttributes{});
  EXPECT_EQ(placeholder.metadata, StoreMetadata{});
  EXPECT_EQ(phone.installCoordination.coordinator("com.a")->state().options->storeMetadata,
            StoreMetadata{});
}

TEST_F(InstallPreparationTest, AnAssetWithoutIconGetsAPlaceholderWithoutOne) {
  asset->icon = std::nullopt;
  EXPECT_TRUE(prepare());
  EXPECT_EQ(phone.installCoordination.pathPromise("com.a-Icon"), nullptr);
  EXPECT_THAT(effects(), Not(Contains(StartsWith("transaction step 5"))));
  EXPECT_TRUE(phone.installCoordination.placeholders().front()->state().configurationComplete);
}

TEST_F(InstallPreparationTest, AnEmptyIconFileIsNotPromised) {
  phone.files.putFile("/icons/com.a.png", "");
  EXPECT_TRUE(prepare());
  EXPECT_EQ(phone.installCoordination.pathPromise("com.a-Icon"), nullptr);
}

TEST_F(InstallPreparationTest, TheIconOfAnEarlierAttemptIsReplaced) {
  const std::string icon = "/tmp/com.corvane.twc.Apps/com.a.app/Icon.png";
  phone.files.putFile(icon, "an old icon");
  EXPECT_TRUE(prepare());
  EXPECT_EQ(phone.files.textAt(icon), "12345");
  const auto made = phone.installCoordination.pathPromise("com.a-Icon");
  ASSERT_NE(made, nullptr);
  const PromiseState promise = made->state();
  EXPECT_EQ(promise.transferPath, FileLocation::file(icon));
  EXPECT_EQ(promise.diskSpaceNeeded, 5u);
  EXPECT_TRUE(promise.complete);
}

}  // namespace
}  // namespace appsync::fakes
