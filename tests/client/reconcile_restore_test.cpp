// The counterpart of a reconcile after a device restore.
#include "tests/client/client_test.h"

namespace appsync {
namespace {

class ReconcileRestore : public ClientTest {
 protected:
  /// The whole trace for a type, with what comes of the restored list at its end.
  static Lines notifiedAndRooted(const std::string& type, const Lines& more) {
    Lines lines{"log default SyncBundle|reconcileRestoreOfType " + type,
                "SystemNotifier.registerCheck(com.corvane.dashel.twc.wsyncnotify)",
                "log default SyncBundle|Notifying DS we are starting syncing",
                "HomeScreenService.serverPort()",
                "SystemNotifier.setState(com.corvane.dashel.twc.wsyncnotify, 1)",
                "SystemNotifier.post(com.corvane.dashel.twc.wsyncnotify)",
                "FileManager.createDirectory(" + SyncRootPath + ", true, -:-)"};
    lines.insert(lines.end(), more.begin(), more.end());
    return lines;
  }

  static inline const std::string NoRestoreList =
      "log default SyncBundle|no halvo restore plist found - skipping processing of halvo restored "
      "apps";
};

TEST_F(ReconcileRestore, FromADesktopBackupProcessesTheRestoredList) {
  EXPECT_TRUE(client().reconcileRestoreOfType(2, nullptr));
  expectTrace(notifiedAndRooted("2", {NoRestoreList}));
  EXPECT_TRUE(phone.files.exists(SyncRootPath));
}

TEST_F(ReconcileRestore, OfAnyOtherTypeOnlyNotifiesAndMakesTheSyncRoot) {
  for (const std::int32_t type : {0, 1, 3, -1}) {
    phone.files.putPlist("/var/mobile/Media/HalvoRestore/RestoreApplications.plist",
                         Dictionary{{"com.a", Dictionary{}}});
    EXPECT_TRUE(client().reconcileRestoreOfType(type, nullptr));
    expectTrace(notifiedAndRooted(std::to_string(type), {}));
  }
}

TEST_F(ReconcileRestore, ClearsTheCallersError) {
  std::optional<Error> error = Error::posix(5);
  EXPECT_TRUE(client().reconcileRestoreOfType(2, &error));
  EXPECT_EQ(error, std::nullopt);
}

TEST_F(ReconcileRestore, IgnoresThatTheSyncRootCannotBeMade) {
  phone.faults.failEvery("FileManager.createDirectory", Error::posix(28));
  std::optional<Error> error = Error::posix(5);
  EXPECT_TRUE(client().reconcileRestoreOfType(2, &error));
  EXPECT_EQ(error, std::nullopt);
  Lines expected = notifiedAndRooted("2", {NoRestoreList});
  expected[6] = "fault FileManager.createDirectory(" + SyncRootPath + ")";
  expectTrace(expected);
}

TEST_F(ReconcileRestore, SucceedsThoughTheRestoredListIsDamaged) {
  phone.files.putFile("/var/mobile/Media/HalvoRestore/RestoreApplications.plist", "damaged");
  std::optional<Error> error;
  EXPECT_TRUE(client().reconcileRestoreOfType(2, &error));
  EXPECT_EQ(error, std::nullopt);
}

}  // namespace
}  // namespace appsync
