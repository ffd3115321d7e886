// The counterpart of a reconcile after a device restore.
#include "tests/client/client_test.h"
#include "tests/coordination/restore_list.h"
#include "tests/coordination/restore_trace.h"

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

  /// What the list leads to when "com.r" alone is in it; then it is put aside.
  static Lines listProcessed(const std::string& demoted, const std::string& status,
                             const Lines& application) {
    return fakes::joined(
        {{"log default SyncBundle|processing halvo restore info",
          "log default Oversize|Demoted Apps: " + demoted,
          "log default SyncBundle|processing halvo restore info for 'com.r' demotionStatus :" +
              status},
         application,
         fakes::listKept()});
  }

  /// The restored backup as a phone with this one application left it.
  void putRestoredBackup(bool demoted) {
    phone.files.putDirectory("/var/mobile/Library/Logs/Vellum");
    phone.files.putPlist(fakes::RestoreList,
                         Dictionary{{"com.r", fakes::entryWith(fakes::plainMetadata())}});
    if (!demoted) return;
    phone.files.putPlist(fakes::DemotedApps, Dictionary{{"AutomaticDowngrades", Array{"com.r"}}});
  }
  void expectListPutAside() {
    EXPECT_FALSE(phone.files.exists(fakes::RestoreList));
    EXPECT_TRUE(phone.files.exists(fakes::KeptCopy));
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

TEST_F(ReconcileRestore, MakesAPlaceholderOfEachRestoredApplication) {
  putRestoredBackup(true);
  EXPECT_TRUE(client().reconcileRestoreOfType(2, nullptr));
  const std::string bundle = "/tmp/com.corvane.twc.Apps/com.r.app";
  const Dictionary options{{"SWPackageTypeKey", SWPackageTypePlaceholder},
                           {"KBBundleIdentifier", "com.r"},
                           {"SWInstallType", 2},
                           {"SWHalvoMetadataKey", fakes::plistBytes(fakes::plainMetadata())},
                           {"SWApplicationSINFKey", toBytes("sinf")}};
  // Without coordination the demotion is only named.
  expectTrace(notifiedAndRooted(
      "2",
      listProcessed(
          "{AutomaticDowngrades = (com.r)}", "2",
          {"log default SyncBundle|processing app restore info for 'com.r'",
           "FileManager.createDirectory(" + bundle + ", true, mobile:mobile)",
           "log default SyncBundle|Created app directory for 'com.r' at " + bundle +
               " with err=(null)",
           "FileManager.createFile(" + bundle + "/Icon.png, mobile:mobile)",
           "log default SyncBundle|icon data for 'com.r' was writen to " + bundle +
               "/Icon.png with status:1 fileSize:4",
           "log default SyncBundle|creating placeholder for 'com.r'. info.plist="
           "{KBBundleDisplayName = Rho; KBBundleExecutable = Rho; KBBundleIconFile = Icon.png; "
           "KBBundleIdentifier = com.r; KBBundleVersion = 3; SWApplicationLaunchProhibited = 0; "
           "UIPeriodixApp = 0}",
           "FileManager.writeAtomically(" + bundle + "/Info.plist)",
           fakes::callText("AppRegistry.installApplication", FileLocation::directory(bundle),
                           options),
           "log default SyncBundle|Installed Placeholder app from path " + bundle +
               ": Rho [com.r 3] [isPeriodix: 0]",
           R"(transaction scenario "Halvo App Restore" ok com.r "Installed placeholder")"})));
  expectListPutAside();
}

TEST_F(ReconcileRestore, WithCoordinationHandsEachRestoredApplicationToACoordinator) {
  phone.installCoordination.setEnabled(true);
  putRestoredBackup(false);
  EXPECT_TRUE(client().reconcileRestoreOfType(2, nullptr));
  expectTrace(notifiedAndRooted("2", listProcessed("(null)", "0", fakes::restored())));
  expectListPutAside();
}

TEST_F(ReconcileRestore, WithCoordinationKeepsADemotedApplicationDemoted) {
  phone.installCoordination.setEnabled(true);
  putRestoredBackup(true);
  EXPECT_TRUE(client().reconcileRestoreOfType(2, nullptr));
  expectTrace(notifiedAndRooted(
      "2", listProcessed("{AutomaticDowngrades = (com.r)}", "2", fakes::restoredDemoted())));
  expectListPutAside();
}

TEST_F(ReconcileRestore, SucceedsThoughTheRestoredListIsDamaged) {
  for (const bool coordinated : {false, true}) {
    SCOPED_TRACE(coordinated);
    phone.installCoordination.setEnabled(coordinated);
    destroyClient();
    putRestoredBackup(true);
    phone.files.putFile(fakes::RestoreList, "damaged");
    std::optional<Error> reason;
    ASSERT_FALSE(parsePropertyList(toBytes("damaged"), &reason));
    std::optional<Error> error = Error::posix(5);
    EXPECT_TRUE(client().reconcileRestoreOfType(2, &error));
    EXPECT_EQ(error, std::nullopt);
    // The demotions are not asked for: there is nobody to demote.
    expectTrace(notifiedAndRooted(
        "2", fakes::joined({{"log default SyncBundle|processing halvo restore info",
                             "log default SyncBundle|failed to parse halvo app restore info. err=" +
                                 description(*reason)},
                            fakes::listKept()})));
    EXPECT_EQ(phone.files.textAt(fakes::KeptCopy), "damaged");
  }
}

}  // namespace
}  // namespace appsync
