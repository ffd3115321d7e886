#include <SQLiteCpp/SQLiteCpp.h>

#include "device/embedded_device.h"
#include "tests/device/device_test.h"

namespace appsync::device {
namespace {

using Lines = std::vector<std::string>;
constexpr std::string_view Id = "com.example.a";

class HistoryTest : public DeviceTest {
 protected:
  bool remove(bool placeholdersOnly = false) {
    PropertyList::Dictionary options;
    if (placeholdersOnly) options.emplace(UninstallPlaceholdersOnlyKey, true);
    return device->appRegistry().uninstallApplication(Id, options);
  }

  void changeDatabase(const char* sql) {
    device.reset();
    SQLite::Database((folder / "device.db").string(), SQLite::OPEN_READWRITE).exec(sql);
    reopen();
  }
};

TEST_F(HistoryTest, TellsWhatHappenedToAnApplicationWithItsVersionsAndByWhom) {
  ASSERT_TRUE(installPlaceholder(Id, "1.0"));
  ASSERT_TRUE(installPackage(Id, "1.0"));
  ASSERT_TRUE(installPackage(Id, "2.0"));
  ASSERT_TRUE(remove());
  ASSERT_TRUE(installPackage(Id, "3.0"));
  ASSERT_TRUE(device->demote(Id, &error));
  ASSERT_TRUE(device->uninstall(Id, &error));
  EXPECT_EQ(history(),
            (Lines{"installed sync com.example.a 1.0", "installed sync com.example.a 2.0<1.0",
                   "removed sync com.example.a 2.0", "installed sync com.example.a 3.0",
                   "demoted person com.example.a 3.0", "removed person com.example.a 3.0"}));
}

TEST_F(HistoryTest, AnInstallThatDidNotComeToItsEndLeavesNothingButItsFailure) {
  ASSERT_TRUE(installPlaceholder(Id, "1.0"));
  ASSERT_FALSE(installPackage(PackageArchive().addApplication("com.other", "1.0"), Id));
  const std::string reason = error.value().localizedDescription();
  EXPECT_TRUE(remove(true));
  error.reset();
  EXPECT_EQ(history(), Lines{"failed sync com.example.a 1.0: " + reason});
}

TEST_F(HistoryTest, TellsOfPlaceholdersThatCameFromABackupAndOfTheStore) {
  ASSERT_TRUE(installRestorePlaceholder(Id));
  ASSERT_TRUE(installRestorePlaceholder(Id));  // once more
  ASSERT_TRUE(device->appRegistry().installApplication(
      stage(PackageArchive().addApplication(Id, "2.0")),
      {{std::string(SWPackageTypeKey), SWPackageTypeCustomer},
       {std::string(KBBundleIdentifier), Id},
       {std::string(SWInstallTypeKey), 1}},
      &error));
  ASSERT_TRUE(remove());
  ASSERT_TRUE(installRestorePlaceholder(Id));
  ASSERT_TRUE(remove(true));
  EXPECT_EQ(history(),
            (Lines{"restored sync com.example.a 1.0", "installed store com.example.a 2.0",
                   "removed sync com.example.a 2.0", "restored sync com.example.a 1.0",
                   "removed sync com.example.a 1.0"}));
}

TEST_F(HistoryTest, KeepsItsNewestEntries) {
  ASSERT_TRUE(installPackage(Id));
  changeDatabase(
      "WITH RECURSIVE n(i) AS (SELECT 2 UNION ALL SELECT i + 1 FROM n WHERE i < 10005) "
      "INSERT INTO history SELECT i, 2e9, 2, 2, 'com.x', '1', NULL, '' FROM n");
  EXPECT_EQ(device->history().size(), 10'005U);
  ASSERT_TRUE(remove());
  const auto entries = device->history();
  ASSERT_EQ(entries.size(), 10'000U);
  EXPECT_EQ(entries.front().number, 7);
  EXPECT_EQ(entries.back().bundleId, Id);
}

TEST_F(HistoryTest, OfAnOlderProgramsDeviceIsEmptyUntilItIsOpenedForWriting) {
  device.reset();
  SQLite::Database((folder / "device.db").string(), SQLite::OPEN_READWRITE)
      .exec("DROP TABLE history");
  reopen(Access::ReadOnly);
  EXPECT_EQ(history(), Lines{});
  reopen();
  ASSERT_TRUE(installPackage(Id));
  EXPECT_EQ(history(), Lines{"installed sync com.example.a 1.0"});
}

TEST_F(HistoryTest, ThatCannotBeReadIsAnError) {
  changeDatabase("DROP TABLE history; CREATE TABLE history (other)");
  EXPECT_TRUE(device->history(&error).empty());
  EXPECT_TRUE(error);
}

}  // namespace
}  // namespace appsync::device
