#include <SQLiteCpp/SQLiteCpp.h>

#include <future>

#include "tests/device/device_test.h"

namespace appsync::device {
namespace {

class DeviceServicesTest : public DeviceTest {};

TEST_F(DeviceServicesTest, PoliciesAreNotSetAtFirstAndSurviveClosing) {
  EXPECT_EQ(device->policy(PolicySetting::AppInstallationAllowed), PolicyValue::NotSet);
  EXPECT_EQ(device->policy(PolicySetting::AppRemovalAllowed), PolicyValue::NotSet);
  ASSERT_TRUE(
      device->setPolicy(PolicySetting::AppRemovalAllowed, PolicyValue::ExplicitlyNo, &error));
  reopen();
  EXPECT_EQ(platform().devicePolicy.effectiveBoolValue(PolicySetting::AppInstallationAllowed),
            PolicyValue::NotSet);
  EXPECT_EQ(platform().devicePolicy.effectiveBoolValue(PolicySetting::AppRemovalAllowed),
            PolicyValue::ExplicitlyNo);
}

TEST_F(DeviceServicesTest, TransactionRecordsKeepTheirOrderAndAllTheirParts) {
  TransactionLog& log = platform().transactionLog;
  log.initializeWithLog({"com.corvane.appinstallation", "twc.appsync"});
  log.logScenario("Asset install", 0, true, "com.example.a", "assertion succeeded");
  log.logScenario("Install placeholder", std::nullopt, false, "com.example.b", "failed");
  log.logStep(4, 1, 2, true, "com.example.c", "done");
  reopen();
  const auto records = device->transactions();
  ASSERT_EQ(records.size(), 3U);
  EXPECT_EQ(records[0].number, 1);
  EXPECT_EQ(records[0].scenario, "Asset install");
  EXPECT_EQ(records[0].step, 0U);
  EXPECT_TRUE(records[0].success);
  EXPECT_EQ(records[0].bundleId, "com.example.a");
  EXPECT_EQ(records[0].description, "assertion succeeded");
  EXPECT_EQ(records[1].step, std::nullopt);
  EXPECT_FALSE(records[1].success);
  EXPECT_EQ(records[2].scenario, "");
  EXPECT_EQ(records[2].step, 4U);
  EXPECT_EQ(records[2].party, 1U);
  EXPECT_EQ(records[2].phase, 2U);
  EXPECT_GT(records[2].time, 1.7e9);
  EXPECT_GE(records[2].time, records[0].time);
  EXPECT_EQ(device->transactions(2).size(), 1U);
}

TEST_F(DeviceServicesTest, RestoreDataExistsWhileADirectoryWithSomethingInItWaits) {
  BackupManager& backup = platform().backupManager;
  const std::string waiting = "/var/mobile/Media/HalvoRestore/Data/com.example.a";
  EXPECT_FALSE(backup.restoreDataExists("com.example.a"));
  std::filesystem::create_directories(onDisk(waiting));
  EXPECT_FALSE(backup.restoreDataExists("com.example.a"));
  putFile(waiting + "/notes", "from the backup");
  EXPECT_TRUE(backup.restoreDataExists("com.example.a"));
  EXPECT_FALSE(backup.restoreDataExists("com.example.b"));
  backup.cancelApplicationRestore("com.example.b");
  backup.cancelApplicationRestore("com.example.a");
  EXPECT_FALSE(backup.restoreDataExists("com.example.a"));
  EXPECT_FALSE(device->files().fileExists(waiting));
}

TEST_F(DeviceServicesTest, CoordinationIsOffAndRefusesWithAReason) {
  InstallCoordination& coordination = platform().installCoordination;
  EXPECT_FALSE(coordination.coordinationIsEnabled());
  bool created = true;
  EXPECT_EQ(coordination.coordinatorFor(CoordinatorKind::Initiating, "com.example.a",
                                        SyncHostClientID, true, &created, &error),
            nullptr);
  EXPECT_FALSE(created);
  EXPECT_TRUE(error);
  EXPECT_EQ(
      coordination.createAppPlaceholder("A", "com.example.a", InstallType::Sync, SyncHostClientID),
      nullptr);
  std::promise<std::optional<Error>> completed;
  coordination.uninstallApp("com.example.a", false, [&](const std::optional<Error>& reason) {
    completed.set_value(reason);
  });
  EXPECT_TRUE(completed.get_future().get());
  const Error cause = Error::posix(ENOSPC);
  const Error shown = coordination.createUserPresentableError(3, 0, cause);
  EXPECT_EQ(shown.code, 3);
  ASSERT_TRUE(shown.underlying);
  EXPECT_EQ(*shown.underlying, cause);
}

TEST_F(DeviceServicesTest, ADatabaseThatFailsGivesTheDocumentedFailureAndALogLine) {
  ASSERT_TRUE(installPackage("com.example.a"));
  SQLite::Database((folder / "device.db").string(), SQLite::OPEN_READWRITE)
      .exec("DROP TABLE policies; DROP TABLE uninstalled; DROP TABLE applications");
  EXPECT_EQ(device->policy(PolicySetting::AppInstallationAllowed), PolicyValue::ExplicitlyNo)
      << "what may be forbidden is not done";
  EXPECT_FALSE(device->setPolicy(PolicySetting::AppInstallationAllowed, PolicyValue::Yes, &error));
  EXPECT_EQ(error->code, EIO);
  EXPECT_EQ(error->localizedDescription(), "the phone's database: it cannot be read or written");
  EXPECT_FALSE(platform().installerService.lookupUninstalled());
  EXPECT_NE(platform().installerService.clearUninstalled({"com.example.a"}), 0);
  EXPECT_FALSE(record("com.example.a"));
  error.reset();
  EXPECT_TRUE(device->applications(&error).empty() && error);
  error.reset();
  EXPECT_TRUE(!device->opaqueBlob("com.example.a", &error) && error);
  EXPECT_FALSE(installPackage("com.example.b"));
  EXPECT_FALSE(device->uninstall("com.example.a", &error));
  EXPECT_EQ(static_cast<int>(device->homeScreen().createTerminationAssertion("a", 0).outcome), 3);
  EXPECT_FALSE(device->homeScreen().getFlattenedIconState(device->homeScreen().serverPort(), 1));
  EXPECT_EQ(containerCount(), 1U) << "nothing is removed on the word of a broken registry";
  EXPECT_GE(logTexts().size(), 8U);
  EXPECT_EQ(logTexts().front(),
            "the policies could not be read (the phone's database: no such table: policies)");
}

TEST_F(DeviceServicesTest, APhoneThatDoesNotTellHowItWorksIsNotOpened) {
  device.reset();
  SQLite::Database((folder / "device.db").string(), SQLite::OPEN_READWRITE)
      .exec("ALTER TABLE settings RENAME COLUMN value TO worth");
  DeviceError problem;
  EXPECT_FALSE(EmbeddedDevice::open(folder, Access::Write, problem));
  EXPECT_EQ(problem.problem, DeviceProblem::Unusable);
  EXPECT_EQ(
      problem.message,
      folder.string() +
          ": the phone's database: it cannot be read or written; try again, or check the disk");
}

TEST_F(DeviceServicesTest, AReceivedFileArrivesInsideThePhone) {
  auto receiver = device->receiveFile("/var/mobile/Media/new/a.pkg", &error);
  ASSERT_TRUE(receiver) << error->localizedDescription();
  ASSERT_TRUE(receiver->append(asBytes("one "), &error));
  ASSERT_TRUE(receiver->append(asBytes("two"), &error));
  ASSERT_TRUE(receiver->finish(Durability::Cached, &error));
  EXPECT_EQ(textAt("/var/mobile/Media/new/a.pkg"), "one two");
  std::filesystem::create_directory_symlink(temporary.path(), onDisk("/tmp/out"));
  receiver = device->receiveFile("/tmp/out/a.pkg", &error);
  EXPECT_FALSE(std::filesystem::exists(temporary.path() / "a.pkg"));
}

}  // namespace
}  // namespace appsync::device
