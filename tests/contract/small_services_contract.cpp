// BackupManager and DevicePolicy.
#include "tests/contract/phone.h"

namespace appsync::contract {
namespace {

SERVICE_CONTRACT(BackupManagerContract);

TEST_P(BackupManagerContract, TellsForWhichApplicationsDataIsStillToBeGivenBack) {
  phone->addRestoreData("com.a");
  EXPECT_TRUE(platform.backupManager.restoreDataExists("com.a"));
  EXPECT_FALSE(platform.backupManager.restoreDataExists("com.b"));
  EXPECT_FALSE(platform.backupManager.restoreDataExists(""));
}

TEST_P(BackupManagerContract, ACancelledRestoreGivesNothingBack) {
  phone->addRestoreData("com.a");
  phone->addRestoreData("com.b");
  platform.backupManager.cancelApplicationRestore("com.a");
  platform.backupManager.cancelApplicationRestore("com.unknown");
  EXPECT_FALSE(platform.backupManager.restoreDataExists("com.a"));
  EXPECT_TRUE(platform.backupManager.restoreDataExists("com.b"));
}

TEST_P(BackupManagerContract, AnIdentifierThatClimbsOutOfItsFolderTouchesNothing) {
  phone->addRestoreData("com.a");
  EXPECT_FALSE(platform.backupManager.restoreDataExists("../Data"));
  platform.backupManager.cancelApplicationRestore("../Data");
  platform.backupManager.cancelApplicationRestore(".");
  platform.backupManager.cancelApplicationRestore("");
  EXPECT_TRUE(platform.backupManager.restoreDataExists("com.a"));
}

SERVICE_CONTRACT(DevicePolicyContract);

TEST_P(DevicePolicyContract, NothingIsSetOnANewPhone) {
  EXPECT_EQ(platform.devicePolicy.effectiveBoolValue(PolicySetting::AppInstallationAllowed),
            PolicyValue::NotSet);
  EXPECT_EQ(platform.devicePolicy.effectiveBoolValue(PolicySetting::AppRemovalAllowed),
            PolicyValue::NotSet);
}

TEST_P(DevicePolicyContract, EachSettingChangesByItselfAtAnyTime) {
  for (const PolicyValue value :
       {PolicyValue::ExplicitlyNo, PolicyValue::Yes, PolicyValue::NotSet}) {
    phone->setPolicy(PolicySetting::AppRemovalAllowed, value);
    EXPECT_EQ(platform.devicePolicy.effectiveBoolValue(PolicySetting::AppRemovalAllowed), value);
    EXPECT_EQ(platform.devicePolicy.effectiveBoolValue(PolicySetting::AppInstallationAllowed),
              PolicyValue::NotSet);
  }
}

}  // namespace
}  // namespace appsync::contract
