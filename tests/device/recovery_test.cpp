#include <SQLiteCpp/SQLiteCpp.h>

#include <algorithm>

#include "tests/device/device_test.h"

namespace appsync::device {
namespace {

using Lines = std::vector<std::string>;
constexpr std::string_view Id = "com.example.a";

class RecoveryTest : public DeviceTest {
 protected:
  bool logMentions(std::string_view text) {
    return std::ranges::any_of(
        logTexts(), [&](const std::string& line) { return line.find(text) != std::string::npos; });
  }
};

TEST_F(RecoveryTest, AHalfExtractedContainerIsSweptWhenTheDeviceIsOpened) {
  ASSERT_TRUE(installPackage(Id));
  const std::string half = "/var/mobile/Containers/Applications/HALF";
  putFile(half + "/Sample.app/Info.plist", "not complete");
  reopen(Access::ReadOnly);
  EXPECT_TRUE(device->files().directoryExists(half)) << "a reader changes nothing";
  reopen();
  EXPECT_FALSE(device->files().fileExists(half));
  EXPECT_EQ(containerCount(), 1U);
  EXPECT_EQ(registry(), Lines{"com.example.a 1.0"});
  EXPECT_TRUE(logMentions(half));
}

TEST_F(RecoveryTest, ARowWhoseBundleIsGoneIsDroppedAndNoted) {
  ASSERT_TRUE(installPackage(Id, "1.0"));
  ASSERT_TRUE(installPlaceholder(Id, "2.0"));
  ASSERT_TRUE(installPackage("com.example.b"));
  std::filesystem::remove_all(onDisk(*record(Id)->bundleContainerPath));
  reopen();
  EXPECT_EQ(registry(), (Lines{"com.example.a 2.0 (placeholder)", "com.example.b 1.0"}));
  EXPECT_TRUE(logMentions("com.example.a is dropped"));
}

TEST_F(RecoveryTest, AFileThatWasBeingReceivedIsRemoved) {
  const auto receiver = device->receiveFile("/var/mobile/Media/PublicStaging/a.pkg", &error);
  ASSERT_TRUE(receiver && receiver->append(asBytes("half"), &error));
  const auto staging = onDisk("/var/mobile/Media/PublicStaging");
  ASSERT_FALSE(std::filesystem::is_empty(staging));
  reopen();
  EXPECT_TRUE(std::filesystem::is_empty(staging));
}

TEST_F(RecoveryTest, TemporariesOfTheDeviceGoAndThoseOfApplicationsStay) {
  ASSERT_TRUE(installPackage(Id));
  ASSERT_TRUE(installRestorePlaceholder("com.example.waiting"));
  const std::string waiting = *record("com.example.waiting", true)->bundlePath;
  const std::string left = "/.appsync-0123456789abcdef";
  const std::string data = "/var/mobile/Containers/Data";
  const auto [container, bundle] =
      std::pair(*record(Id)->bundleContainerPath, *record(Id)->bundlePath);
  const std::string media = "/var/mobile/Media";
  const std::string restored = media + "/HalvoRestore/Data";
  const Lines swept = {container + left,
                       waiting + left,
                       data + left + "/half",
                       media + left,
                       media + "/Downloads" + left,
                       media + "/PublicStaging/ApplicationSync/com.example.b" + left,
                       media + "/HalvoRestore" + left,
                       restored + left + "/half"};
  const Lines kept = {bundle + left, bundle + "/inner" + left, data + "/com.example.a" + left,
                      restored + "/com.example.waiting" + left,
                      restored + "/com.example.waiting/inner" + left};
  for (const std::string& path : swept) putFile(path, "half");
  for (const std::string& path : kept) putFile(path, "whole");
  reopen();
  for (const std::string& path : swept) EXPECT_FALSE(device->files().fileExists(path)) << path;
  for (const std::string& path : kept) EXPECT_EQ(textAt(path), "whole") << path;
}

TEST_F(RecoveryTest, ALinkInThePlaceOfAContainerIsRemovedAndNotFollowed) {
  const auto outside = temporary.path() / "outside";
  fakes::putFile(outside / "precious", "kept");
  std::filesystem::create_directory_symlink(outside,
                                            onDisk("/var/mobile/Containers/Applications/LINK"));
  reopen();
  EXPECT_EQ(containerCount(), 0U);
  EXPECT_EQ(fakes::fileText(outside / "precious"), "kept");
}

TEST_F(RecoveryTest, InstallsThatNobodyCarriesOnArePausedAndCanBeTakenUpAgain) {
  ASSERT_TRUE(installRestorePlaceholder(Id));
  const auto progress = device->appRegistry().installProgressSync(*record(Id, true));
  progress->setInstallState(InstallState::Active);
  progress->setTotalUnitCount(1000);
  progress->setCompletedUnitCount(456);
  reopen();
  const auto again = device->appRegistry().installProgressSync(*record(Id, true));
  ASSERT_TRUE(again);
  EXPECT_EQ(again->installState(), InstallState::Paused);
  EXPECT_EQ(again->completedUnitCount(), 456);
  EXPECT_EQ(again->totalUnitCount(), 1000);
  again->setInstallState(InstallState::Active);
  EXPECT_EQ(again->installState(), InstallState::Active);
}

TEST_F(RecoveryTest, AFailedOrCancelledInstallStaysSo) {
  ASSERT_TRUE(installPlaceholder("com.example.failed"));
  ASSERT_TRUE(installPlaceholder("com.example.cancelled"));
  auto& apps = device->appRegistry();
  apps.installProgressSync(*record("com.example.failed", true))
      ->setInstallState(InstallState::Failed);
  apps.installProgressSync(*record("com.example.cancelled", true))->cancel();
  reopen();
  auto& reopened = device->appRegistry();
  EXPECT_EQ(reopened.installProgressSync(*record("com.example.failed", true))->installState(),
            InstallState::Failed);
  EXPECT_EQ(reopened.installProgressSync(*record("com.example.cancelled", true))->installState(),
            InstallState::Canceled);
}

TEST_F(RecoveryTest, DataOfAnApplicationWhoseRemovalBrokeOffIsRemoved) {
  const std::string waiting = "/var/mobile/Media/HalvoRestore/Data/com.example.gone";
  putFile("/var/mobile/Containers/Data/com.example.gone/notes", "old");
  putFile(waiting + "/notes", "older");
  putFile("/var/mobile/Containers/Data/com.example.other/notes", "not named");
  device.reset();
  SQLite::Database((folder / "device.db").string(), SQLite::OPEN_READWRITE)
      .exec("INSERT INTO abandoned_data VALUES ('com.example.gone')");
  reopen();
  EXPECT_FALSE(device->files().fileExists("/var/mobile/Containers/Data/com.example.gone"));
  EXPECT_FALSE(device->files().fileExists(waiting));
  EXPECT_TRUE(device->files().fileExists("/var/mobile/Containers/Data/com.example.other"));
}

TEST_F(RecoveryTest, TheTransactionLogKeepsItsNewestRecords) {
  device.reset();
  SQLite::Database((folder / "device.db").string(), SQLite::OPEN_READWRITE)
      .exec(
          "WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n WHERE i < 20005) "
          "INSERT INTO transactions SELECT i, 0, '', '', 's', NULL, 0, 0, 1, 'a', 'b' FROM n");
  reopen();
  platform().transactionLog.logScenario("s", std::nullopt, true, "a", "last");
  const auto records = device->transactions();
  ASSERT_EQ(records.size(), 20'000U);
  EXPECT_EQ(records.front().number, 7);
  EXPECT_EQ(records.back().description, "last");
}

}  // namespace
}  // namespace appsync::device
