#include "tests/contract/phone.h"

namespace appsync::contract {
namespace {

class InstallProgressContract : public ServiceContract {
 protected:
  AppRegistry& registry = platform.appRegistry;

  std::shared_ptr<InstallProgress> progressOf(std::string_view identifier) {
    const auto record = registry.recordForIdentifier(identifier, true);
    return record ? registry.installProgress(*record, InstallPhase::Loading) : nullptr;
  }
};

SERVICE_CONTRACT_OF(InstallProgressContract);

TEST_P(InstallProgressContract, APlaceholdersInstallBeginsByLoading) {
  ASSERT_TRUE(installPlaceholder("com.a"));
  const auto progress = progressOf("com.a");
  ASSERT_TRUE(progress);
  EXPECT_EQ(progress->installPhase(), InstallPhase::Loading);
  EXPECT_EQ(progress->installState(), InstallState::Waiting);
  EXPECT_EQ(progress->completedUnitCount(), 0);
  EXPECT_FALSE(progress->description().empty());
}

TEST_P(InstallProgressContract, AnApplicationThatIsNotBeingInstalledHasNone) {
  ASSERT_TRUE(installPackage("com.a"));
  const auto record = registry.recordForIdentifier("com.a", false);
  ASSERT_TRUE(record);
  EXPECT_FALSE(registry.installProgress(*record, InstallPhase::Loading));
  EXPECT_FALSE(registry.installProgressSync(*record));
  AppRecord unknown;
  unknown.applicationIdentifier = "com.unknown";
  EXPECT_FALSE(registry.installProgress(unknown, InstallPhase::Loading));
  EXPECT_FALSE(registry.installProgressSync(unknown));
}

TEST_P(InstallProgressContract, EveryHandleChangesAndReadsTheRegistrysOwnValues) {
  ASSERT_TRUE(installPlaceholder("com.a"));
  const auto one = progressOf("com.a");
  const auto other = registry.installProgressSync(*registry.recordForIdentifier("com.a", true));
  ASSERT_TRUE(one && other);
  one->setInstallState(InstallState::Active);
  one->setInstallPhase(InstallPhase::RestoringData);
  one->setTotalUnitCount(1000);
  one->setCompletedUnitCount(456);
  EXPECT_EQ(other->installState(), InstallState::Active);
  EXPECT_EQ(other->installPhase(), InstallPhase::RestoringData);
  EXPECT_EQ(other->totalUnitCount(), 1000);
  EXPECT_EQ(other->completedUnitCount(), 456);
}

TEST_P(InstallProgressContract, AFinishedLoadingPhaseIsFollowedByInstalling) {
  for (const InstallState state : {InstallState::Active, InstallState::Finished}) {
    ASSERT_TRUE(installPlaceholder("com.a"));
    const auto progress = progressOf("com.a");
    ASSERT_TRUE(progress);
    progress->setInstallState(state);
    registry.installPhaseFinished(*progress);
    EXPECT_EQ(progress->installPhase(), InstallPhase::Installing);
    ASSERT_TRUE(registry.uninstallApplication("com.a", {}));
  }
}

TEST_P(InstallProgressContract, AFailedOrCanceledLoadingPhaseIsFollowedByNothing) {
  for (const InstallState state : {InstallState::Failed, InstallState::Canceled}) {
    ASSERT_TRUE(installPlaceholder("com.a"));
    const auto progress = progressOf("com.a");
    ASSERT_TRUE(progress);
    progress->setInstallState(state);
    registry.installPhaseFinished(*progress);
    EXPECT_EQ(progress->installPhase(), InstallPhase::Loading);
    EXPECT_EQ(progress->installState(), state);
    ASSERT_TRUE(registry.uninstallApplication("com.a", {}));
  }
}

TEST_P(InstallProgressContract, OnceTheInstallIsOverChangesHaveNoEffect) {
  ASSERT_TRUE(installPlaceholder("com.a"));
  const auto progress = progressOf("com.a");
  ASSERT_TRUE(progress);
  progress->setTotalUnitCount(1000);
  ASSERT_TRUE(installPackage("com.a"));
  const auto last = std::pair(progress->installState(), progress->installPhase());
  progress->setInstallState(InstallState::Paused);
  progress->setInstallPhase(InstallPhase::RestoringData);
  progress->setTotalUnitCount(7);
  progress->cancel();
  registry.installPhaseFinished(*progress);
  EXPECT_EQ(std::pair(progress->installState(), progress->installPhase()), last);
  EXPECT_EQ(progress->totalUnitCount(), 1000);
  EXPECT_TRUE(registry.isApplicationInstalled("com.a"));
}

TEST_P(InstallProgressContract, HoldingItKeepsNoApplicationAlive) {
  ASSERT_TRUE(installPlaceholder("com.a"));
  const auto progress = progressOf("com.a");
  ASSERT_TRUE(registry.uninstallApplication("com.a", {}));
  EXPECT_FALSE(registry.isApplicationInstalled("com.a"));
  ASSERT_TRUE(installPlaceholder("com.a"));
  progress->setInstallState(InstallState::Paused);
  EXPECT_EQ(progressOf("com.a")->installState(), InstallState::Waiting);
}

}  // namespace
}  // namespace appsync::contract
