// The end of a sync, and clearing everything.
#include <functional>
#include <latch>
#include <thread>
#include <utility>

#include "tests/client/client_test.h"
#include "tests/client/turns.h"

namespace appsync {
namespace {

const std::string TouchRoot = "FileManager.touch(" + SyncRootPath + ")";
const std::string RemoveLastSync = "FileManager.removeItem(" + LastSyncStatePath + ")";

class SyncEnd : public ClientTest {
 protected:
  SyncEnd() {
    phone.files.putPlist(LastSyncStatePath, Array{"com.a"});
    phone.files.setModificationTime(SyncRootPath, 0);
  }

  /// An inventory that finds these uninstalled.
  void takeInventory(const std::vector<std::string>& uninstalled) {
    for (const std::string& identifier : uninstalled) {
      phone.installerService.addUninstalled(identifier);
    }
    client().installedAssets();
    forgetTrace();
  }

  static inline const std::string Succeeded = "log default SyncBundle|sync ended with success: y";
};

TEST_F(SyncEnd, WithSuccessMarksTheSyncRootAndForgetsTheLastSync) {
  client().syncEndedWithSuccess(true);
  expectTrace({Succeeded, TouchRoot, RemoveLastSync}, fakes::TraceAll);
  EXPECT_FALSE(phone.files.exists(LastSyncStatePath));
  EXPECT_EQ(phone.files.attributesAt(SyncRootPath)->modificationTime, phone.clock.seconds());
  EXPECT_EQ(phone.files.attributesAt(SyncRootPath)->accessTime, phone.clock.seconds());
}

TEST_F(SyncEnd, WithoutSuccessChangesNothingOnDiskAndKeepsTheUninstalledList) {
  takeInventory({"com.gone"});
  const auto before = phone.files.files();
  client().syncEndedWithSuccess(false);
  expectTrace({"log default SyncBundle|sync ended with success: n"}, fakes::TraceAll);
  EXPECT_EQ(phone.files.files(), before);
  EXPECT_EQ(phone.files.attributesAt(SyncRootPath)->modificationTime, 0);

  client().syncEndedWithSuccess(true);
  EXPECT_EQ(phone.trace.count("InstallerService.clearUninstalled((com.gone))"), 1u);
}

TEST_F(SyncEnd, ClearsTheInstallersListThatTheInventorySaw) {
  takeInventory({"com.b", "com.a"});
  phone.installerService.addUninstalled("com.later");
  client().syncEndedWithSuccess(true);
  expectTrace({Succeeded, TouchRoot,
               "log default SyncBundle|clearing uninstalled apps: (com.a, com.b)",
               "InstallerService.clearUninstalled((com.a, com.b))", RemoveLastSync});
  EXPECT_EQ(phone.installerService.uninstalled(), std::set<std::string>{"com.later"});
}

TEST_F(SyncEnd, ClearsAnEmptyListToo) {
  takeInventory({});
  client().syncEndedWithSuccess(true);
  expectTrace({Succeeded, TouchRoot, "log default SyncBundle|clearing uninstalled apps: ()",
               "InstallerService.clearUninstalled(())", RemoveLastSync});
}

TEST_F(SyncEnd, ClearsTheListOnlyOnce) {
  takeInventory({"com.a"});
  client().syncEndedWithSuccess(true);
  forgetTrace();
  client().syncEndedWithSuccess(true);
  expectTrace({Succeeded, TouchRoot, RemoveLastSync});
}

TEST_F(SyncEnd, AFailureOfTheInstallerIsTriedAgainAfterTheNextSuccessfulSync) {
  takeInventory({"com.a"});
  phone.installerService.setClearStatus(5);
  client().syncEndedWithSuccess(true);
  expectTrace({Succeeded, TouchRoot, "log default SyncBundle|clearing uninstalled apps: (com.a)",
               "InstallerService.clearUninstalled((com.a))",
               "log error SyncBundle|Failed to clear uninstalled apps from Deploya.",
               RemoveLastSync});
  phone.installerService.setClearStatus(0);
  client().syncEndedWithSuccess(true);
  EXPECT_TRUE(phone.installerService.uninstalled().empty());
  forgetTrace();
  client().syncEndedWithSuccess(true);
  EXPECT_EQ(phone.trace.count("InstallerService"), 0u);
}

TEST_F(SyncEnd, AListThatCouldNotBeClearedGivesWayToANewInventory) {
  takeInventory({"com.a"});
  phone.installerService.setClearStatus(5);
  client().syncEndedWithSuccess(true);
  phone.installerService.setClearStatus(0);
  phone.installerService.removeUninstalled("com.a");
  takeInventory({"com.b"});
  client().syncEndedWithSuccess(true);
  EXPECT_EQ(phone.trace.count("InstallerService.clearUninstalled((com.b))"), 1u);
}

TEST_F(SyncEnd, SaysWhyTheSyncRootCouldNotBeMarked) {
  phone.files.erase(SyncRootPath);
  client().syncEndedWithSuccess(true);
  expectTrace({Succeeded, TouchRoot,
               "log error SyncBundle|Failed to update utimes of "
               "\"/var/mobile/Library/ApplicationSync\": No such file or directory",
               RemoveLastSync});
}

TEST_F(SyncEnd, SaysWhyInOtherWordsForAnErrorThatIsNotTheSystems) {
  phone.faults.failCall("FileManager.touch", 1, Error{"Storage", 7, {}, nullptr});
  phone.faults.failCall("FileManager.touch", 2, Error::withDescription("Storage", 7, "worn out"));
  client().syncEndedWithSuccess(true);
  client().syncEndedWithSuccess(true);
  EXPECT_THAT(phone.log.texts(LogLevel::Error),
              testing::ElementsAre("Failed to update utimes of "
                                   "\"/var/mobile/Library/ApplicationSync\": Storage error 7",
                                   "Failed to update utimes of "
                                   "\"/var/mobile/Library/ApplicationSync\": worn out"));
}

TEST_F(SyncEnd, IsTheSameWithoutAListOfTheLastSync) {
  phone.files.erase(LastSyncStatePath);
  client().syncEndedWithSuccess(true);
  expectTrace({Succeeded, TouchRoot, RemoveLastSync});
}

class ClearSyncData : public ClientTest {
 protected:
  static Lines begun(const Lines& more) {
    Lines lines{"log default SyncBundle|blasting work area",
                "FileManager.removeItem(" + SyncRootPath + ")",
                "log default SyncBundle|Uninstalling all placeholder apps"};
    lines.insert(lines.end(), more.begin(), more.end());
    return lines;
  }
};

TEST_F(ClearSyncData, RemovesAllStateEveryPlaceholderAndTheInstallersList) {
  putTodo({{"com.a", "install"}});
  phone.files.putFile(RestoreStatePath, "state");
  phone.appRegistry.seedInstalled("com.keep");
  phone.appRegistry.seedInstalled("com.updating");
  phone.appRegistry.seedPlaceholder("com.updating");
  phone.appRegistry.seedPlaceholder("com.new", InstallType::Restore);
  AppRecord system;
  system.applicationIdentifier = "com.system";
  system.applicationType = ApplicationTypeSystem;
  phone.appRegistry.seedPlaceholder(system);
  phone.installerService.addUninstalled("com.b");
  phone.installerService.addUninstalled("com.a");

  client().clearSyncData();
  expectTrace(begun({"AppRegistry.uninstallApplication(com.new, {})",
                     "log default SyncBundle|Uninstall com.new = y",
                     "AppRegistry.uninstallApplication(com.system, {})",
                     "log default SyncBundle|Uninstall com.system = y",
                     "AppRegistry.uninstallApplication(com.updating, {})",
                     "log default SyncBundle|Uninstall com.updating = y",
                     "InstallerService.clearUninstalled((com.a, com.b))"}));
  EXPECT_FALSE(phone.files.exists(SyncRootPath));
  EXPECT_TRUE(phone.appRegistry.placeholderIdentifiers().empty());
  EXPECT_EQ(phone.appRegistry.installedIdentifiers(), (Lines{"com.keep", "com.updating"}));
  EXPECT_TRUE(phone.installerService.uninstalled().empty());
}

TEST_F(ClearSyncData, AFailedUninstallDoesNotStopTheOthers) {
  phone.appRegistry.seedPlaceholder("com.a");
  phone.appRegistry.seedPlaceholder("com.b");
  phone.appRegistry.failUninstall("com.a");
  client().clearSyncData();
  expectTrace(begun(
      {"AppRegistry.uninstallApplication(com.a, {})", "log default SyncBundle|Uninstall com.a = n",
       "AppRegistry.uninstallApplication(com.b, {})", "log default SyncBundle|Uninstall com.b = y",
       "InstallerService.clearUninstalled(())"}));
}

TEST_F(ClearSyncData, RemovesAPlaceholderWithoutABundleIdentifierUnderItsOtherOne) {
  phone.appRegistry.seedPlaceholder("com.a");
  phone.appRegistry.edit("com.a", [](AppRecord& record) { record.bundleIdentifier.reset(); });
  phone.appRegistry.seedPlaceholder("com.b");
  phone.appRegistry.edit("com.b", [](AppRecord& record) { record.bundleContainerPath.reset(); });
  client().clearSyncData();
  expectTrace(begun(
      {"AppRegistry.uninstallApplication(com.a, {})", "log default SyncBundle|Uninstall com.a = y",
       "AppRegistry.uninstallApplication(com.b, {})", "log default SyncBundle|Uninstall com.b = y",
       "InstallerService.clearUninstalled(())"}));
  EXPECT_TRUE(phone.appRegistry.placeholderIdentifiers().empty());
}

TEST_F(ClearSyncData, LeavesRecordsThatAreNoApplicationsAlone) {
  AppRecord extension;
  extension.applicationIdentifier = "com.extension";
  extension.isApplication = false;
  extension.isPlaceholder = true;
  phone.appRegistry.seedOther(extension);
  client().clearSyncData();
  expectTrace(begun({"InstallerService.clearUninstalled(())"}));
}

TEST_F(ClearSyncData, SaysThatTheInstallerGaveNoList) {
  phone.installerService.setAnswers(false);
  client().clearSyncData();
  expectTrace(begun({"log error SyncBundle|Failed to fetch uninstalled apps list to clear it"}));
}

TEST_F(ClearSyncData, SaysThatTheInstallersListCouldNotBeCleared) {
  phone.installerService.addUninstalled("com.a");
  phone.installerService.setClearStatus(5);
  client().clearSyncData();
  expectTrace(begun({"InstallerService.clearUninstalled((com.a))",
                     "log error SyncBundle|Failed to clear uninstalled apps list"}));
}

TEST_F(ClearSyncData, GoesOnWhenTheSyncRootCannotBeRemoved) {
  phone.files.putDirectory(SyncRootPath);
  phone.faults.failEvery("FileManager.removeItem", Error::posix(13));
  phone.appRegistry.seedPlaceholder("com.a");
  client().clearSyncData();
  EXPECT_TRUE(phone.appRegistry.placeholderIdentifiers().empty());
}

/// Has something happen between the read and the write of a change.
class InterruptedFiles : public fakes::FaultyFileManager {
 public:
  using FaultyFileManager::FaultyFileManager;
  std::optional<Bytes> contentsAtPath(std::string_view path,
                                      std::optional<Error>* error) noexcept override {
    std::optional<Bytes> bytes = FaultyFileManager::contentsAtPath(path, error);
    if (const auto now = std::exchange(afterRead, nullptr)) now();
    return bytes;
  }

  std::function<void()> afterRead;
};

/// Tells when the clearing has begun.
class ClearingLog : public fakes::FakeLog {
 public:
  using FakeLog::FakeLog;
  void write(LogChannel channel, LogLevel level, std::string_view text) noexcept override {
    FakeLog::write(channel, level, text);
    if (text.ends_with("blasting work area")) began.count_down();
  }

  std::latch began{1};
};

TEST_F(ClearSyncData, WaitsForTheEndOfAChangeThatIsUnderWay) {
  putTodo({{"com.a", "install"}});
  InterruptedFiles files(phone.files, phone.faults);
  ClearingLog log(phone.trace);
  AppsClient clearing(with(with(phone.platform(), files), log));
  forgetTrace();
  std::thread other;
  files.afterRead = [&] {
    other = std::thread([&clearing] { clearing.clearSyncData(); });
    log.began.wait();
    seenInTurns([this] { return phone.trace.count("FileManager.removeItem") > 0; });
  };
  clearing.changeAssetID("com.a", "SENT");
  other.join();
  expectTrace({"FileManager.writeAtomically(" + TodoListPath + ")",
               "FileManager.removeItem(" + SyncRootPath + ")"},
              fakes::TraceFile);
}

TEST_F(ClearSyncData, LeavesTheListOfTheInventoryToTheNextSyncEnd) {
  phone.installerService.addUninstalled("com.a");
  client().installedAssets();
  client().clearSyncData();
  forgetTrace();
  client().syncEndedWithSuccess(true);
  EXPECT_EQ(phone.trace.count("InstallerService.clearUninstalled((com.a))"), 1u);
}

}  // namespace
}  // namespace appsync
