#include "tests/coordination/restore_trace.h"

namespace appsync::fakes {
namespace {

using testing::Contains;

TEST_F(RestoreTest, AnApplicationGetsPlaceholderAndUserDataAndIsLeftToTheStore) {
  EXPECT_TRUE(restore());
  EXPECT_EQ(effects(), restored());
}

TEST_F(RestoreTest, ADemotedApplicationGetsItsPlaceholderButNoPackage) {
  EXPECT_TRUE(restore(DemotionStatus::Automatic));
  EXPECT_EQ(effects(), restoredDemoted());
}

TEST_F(RestoreTest, TheSortOfDemotionDecidesThePlaceholdersInstallType) {
  EXPECT_TRUE(restore(DemotionStatus::Intentional));
  EXPECT_EQ(placeholder().installType, InstallType::IntentionalDowngrade);
}

TEST_F(RestoreTest, AnApplicationThatTheStoreBringsAlreadyIsLeftAsItIs) {
  const auto coordinator = seed();
  coordinator->edit([](auto& state) { state.responsibleClient = KQClientKiosk; });
  EXPECT_TRUE(restore());
  EXPECT_EQ(effects(),
            joined({restoreBegun(),
                    {"InstallCoordination.coordinatorFor(com.r, restoring, 3, create)",
                     said("App asset DRI for com.r is set to 1 - nothing more for twc to do"),
                     R"(transaction step 2 party 1 phase 2 ok com.r "Restore app")"}}));
}

TEST_F(RestoreTest, ADemotedApplicationIsPreparedWhoeverBringsThePackage) {
  const auto coordinator = seed(CoordinatorKind::RestoringDemoted);
  coordinator->edit([](auto& state) { state.responsibleClient = KQClientKiosk; });
  EXPECT_TRUE(restore(DemotionStatus::Automatic));
  EXPECT_EQ(effects(), restoredDemoted());
}

TEST_F(RestoreTest, ACoordinatorOfAnotherClientIsUsedAsItIs) {
  phone.installCoordination.seedCoordinator(CoordinatorKind::Restoring, "com.r", 5);
  EXPECT_TRUE(restore());
  EXPECT_EQ(effects(), restored());
}

TEST_F(RestoreTest, WhatTheCoordinatorHasIsNotSetAgain) {
  const auto coordinator = seed();
  EXPECT_TRUE(restore());
  coordinator->edit([](auto& state) { state.responsibleClient = 0; });
  forget();
  EXPECT_TRUE(restore());
  EXPECT_EQ(effects(), joined({restoreBegun(),
                               {"InstallCoordination.coordinatorFor(com.r, restoring, 3, create)",
                                said("Coordinator for com.r has a valid user data promise"),
                                said("Coordinator for com.r has a valid install options"),
                                said("Coordinator for com.r has a valid placeholder promise")},
                               packageLeftToStore(),
                               restoreEnded(true, "(null)")}));
}

TEST_F(RestoreTest, WhatADemotedApplicationsCoordinatorHasIsNotSetAgain) {
  EXPECT_TRUE(restore(DemotionStatus::Intentional));
  forget();
  EXPECT_TRUE(restore(DemotionStatus::Intentional));
  EXPECT_EQ(effects(),
            joined({demotedRestoreBegun(),
                    {"InstallCoordination.coordinatorFor(com.r, restoring demoted, 3, create)",
                     said("Coordinator for com.r has a valid user data promise"),
                     said("Coordinator for com.r has a valid placeholder promise")},
                    demotedRestoreEnded(true, "(null)")}));
}

TEST_F(RestoreTest, AnApplicationWithoutBlobAndIconGetsNone) {
  sinf = std::nullopt;
  icon = std::nullopt;
  EXPECT_TRUE(restore());
  EXPECT_EQ(phone.installCoordination.coordinator("com.r")->state().options->sinfData,
            std::nullopt);
  EXPECT_EQ(placeholder().sinfData, std::nullopt);
  EXPECT_EQ(placeholder().iconPromise, nullptr);
  EXPECT_TRUE(placeholder().configurationComplete);
  EXPECT_THAT(effects(), Contains(complained("no icon data for 'com.r'")));
}

struct NameCase {
  PropertyList::Dictionary metadata;
  const char* name;
};

TEST_F(RestoreTest, ThePlaceholderIsCalledByTitleElseItemNameElseIdentifier) {
  const NameCase cases[] = {{{{"title", "Rho"}, {"itemName", "Item"}}, "Rho"},
                            {{{"itemName", "Item"}}, "Item"},
                            {{{"title", 5}, {"itemName", "Item"}}, "5"},
                            {{{"title", true}, {"itemName", "Item"}}, "Item"},
                            {{}, "com.r"}};
  for (const NameCase& given : cases) {
    client->_placeHolderForBundleIdentifier("com.r", given.metadata, sinf, icon,
                                            DemotionStatus::NotDemoted);
    EXPECT_EQ(phone.installCoordination.placeholders().back()->state().name, given.name);
  }
}

TEST_F(RestoreTest, LaunchingIsProhibitedByEitherKeyTheFirstOneWinning) {
  struct {
    PropertyList::Dictionary metadata;
    bool prohibited;
  } const cases[] = {
      {{}, false},
      {{{"SWApplicationLaunchProhibited", true}}, true},
      {{{"launchProhibited", "yes"}}, true},
      {{{"SWApplicationLaunchProhibited", false}, {"launchProhibited", true}}, false},
  };
  for (const auto& given : cases) {
    client->_placeHolderForBundleIdentifier("com.r", given.metadata, sinf, icon,
                                            DemotionStatus::NotDemoted);
    const auto state = phone.installCoordination.placeholders().back()->state();
    EXPECT_EQ(state.attributes->launchProhibited, given.prohibited);
    EXPECT_EQ(state.attributes->bundleVersion, std::nullopt);
  }
}

}  // namespace
}  // namespace appsync::fakes
