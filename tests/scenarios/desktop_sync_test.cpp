// A whole desktop sync against the phone in memory: everything that leaves a mark, in order.

#include "tests/client/client_test.h"

namespace appsync {
namespace {

const std::string Staged = StagingRootPath + "/ApplicationSync";

/// The desktop's side of a sync: stages, calls and sends, one package after another.
class DesktopSync : public ClientTest {
 protected:
  struct Wish {
    std::string identifier;
    std::string operation;
    std::string version = "2.0";
  };

  void stage(const std::vector<Wish>& wishes) {
    Array todo;
    for (const Wish& wish : wishes) {
      todo.push_back(Dictionary{{"identifier", wish.identifier},
                                {"operation", wish.operation},
                                {"version", wish.version},
                                {"name", "App " + wish.identifier}});
    }
    phone.files.putPlist(Staged + "/ApplicationsSync.plist", todo);
  }

  void send(const SyncAssetPtr& asset) {
    const std::string file = asset->identifier + ".zip";
    phone.files.putFile(StagingRootPath + "/" + file, "package");
    client().assetTransferUpdatedProgress(asset, 1.0);
    asset->path = file;
    client().assetTransferSucceeded(asset, true, std::nullopt);
    // The next transfer begins when this install is over, so that the trace has one order.
    awaitInstallOf(asset->identifier);
  }

  /// Every call of a sync in the order in which the host makes it.
  PropertyList::Dictionary sync(const std::vector<Wish>& wishes) {
    EXPECT_EQ(client().supportedDataclasses(), std::vector<std::string>{"Application"});
    EXPECT_EQ(client().currentSyncAnchor(), "NO_APP_SYNC_ANCHOR");
    EXPECT_TRUE(client().prepareForSyncWithHostAnchor("", {}, nullptr));
    PropertyList::Dictionary inventory = client().installedAssets();
    stage(wishes);
    EXPECT_TRUE(client().reconcileSync({}, "anchor", {}, nullptr));
    for (const SyncAssetPtr& asset : client().outstandingAssetTransfers()) send(asset);
    client().assetTransferEndedWithSuccess(true);
    client().syncEndedWithSuccess(true);
    return inventory;
  }

  static Array deleted(const Lines& identifiers) {
    Array list;
    for (const std::string& identifier : identifiers) {
      list.push_back(Dictionary{{"KBBundleIdentifier", identifier}});
    }
    return list;
  }

 private:
  void awaitInstallOf(const std::string& identifier) {
    const std::string end =
        "log default SyncBundle|com.corvane.twc.AppsClient|Finished install for " + identifier;
    while (phone.trace.count(end) == 0) std::this_thread::yield();
  }
};

/// What one package adds to the trace from its preparation to its placeholder.
std::vector<std::string> preparationOf(const std::string& id) {
  const std::string staged = WorkAreaPath + "/" + id;
  const std::string bundle = "/tmp/com.corvane.twc.Apps/" + id + ".app";
  const std::string name = "App " + id;
  return {
      "log error SyncBundle|couldn't create bundle from URL",
      "log default SyncBundle|Asset " + id + " (pretty=" + name +
          ", version=2.0) prepped with icon " + staged + "/HalvoArtwork, at " + staged +
          ", meta at " + staged + "/HalvoMetadata.plist, info at " + staged +
          "/Info.plist, storePid=0, isRestore=n",
      "log default SyncBundle|plist " + staged + "/Info.plist",
      "FileManager.createDirectory(" + bundle + ", true, mobile:mobile)",
      "log default SyncBundle|Created app directory for '" + id + "' at " + bundle +
          " with err=(null)",
      "FileManager.removeItem(" + bundle + "/Icon.png)",
      "FileManager.copyItem(" + staged + "/HalvoArtwork, " + bundle + "/Icon.png)",
      "log error SyncBundle|Copying icon from " + staged + "/HalvoArtwork to " + bundle +
          "/Icon.png failed: " + description(Error::posix(2, staged + "/HalvoArtwork")),
      "FileManager.writeAtomically(" + bundle + "/Info.plist)",
      "log default SyncBundle|creating placeholder for '" + id +
          "'. info.plist={KBBundleDisplayName = " + name + "; KBBundleExecutable = " + name +
          "; KBBundleIconFile = Icon.png; KBBundleIdentifier = " + id +
          "; KBBundleVersion = 2.0; SWApplicationLaunchProhibited = 0; UIPeriodixApp = 0}",
      "AppRegistry.installApplication(" + bundle + "/, {KBBundleIdentifier = " + id +
          "; SWInstallType = 4; SWPackageTypeKey = SWPackageTypePlaceholder})",
      "log default SyncBundle|Installed Placeholder app from path " + bundle + ": " + name + " [" +
          id + " 2.0] [isPeriodix: 0]",
      "transaction scenario \"Install placeholder\" ok " + id + " \"Installed placeholder\"",
  };
}

/// What it adds from its transfer to the answer of the home screen.
std::vector<std::string> transferOf(const std::string& id) {
  const std::string progress = "<InstallProgress " + id + "> progress for " + id;
  return {
      "log default SyncBundle|finished transferring 1.000000 for " + id,
      "log error SyncBundle|Returning " + progress,
      "InstallProgress.setInstallState(" + id + ", 1)",
      "InstallProgress.setTotalUnitCount(" + id + ", 1000)",
      "InstallProgress.setCompletedUnitCount(" + id + ", 1000)",
      "log default SyncBundle|transfer for asset " + id +
          " ended with success y error (null) existingApp:0",
      "log error SyncBundle|Returning " + progress,
      "log default SyncBundle|asset transfer succeeded for " + id,
      "AppRegistry.installPhaseFinished(" + id + ")",
      "log default SyncBundle|Received file at " + StagingRootPath + "/" + id + ".zip",
      "log default SyncBundle|Changing " + id + " from install to DOWNLOADED",
      "FileManager.writeAtomically(" + TodoListPath + ")",
      "log default SyncBundle|Installing synced asset " + id,
      "log default SyncBundle|Enqueue install request for " + id,
      "log default SyncBundle|Performing install for " + id,
      "log default SyncBundle|Grabbing assertion for " + id,
      "HomeScreenService.createTerminationAssertion(" + id + ", 0)",
      "log default SyncBundle|Assertion succeeded for " + id,
      "transaction scenario \"Asset install\" step 0 ok " + id + " \"assertion succeeded\"",
      "AppRegistry.installApplication(" + StagingRootPath + "/" + id +
          ".zip, {KBBundleIdentifier = " + id + "; SWPackageTypeKey = SWPackageTypeCustomer})",
  };
}

std::vector<std::string> endOfInstall(const std::string& id) {
  return {"TerminationAssertion.release(" + id + ")",
          "FileManager.removeItem(" + StagingRootPath + "/" + id + ".zip)",
          "log default SyncBundle|Finished install for " + id};
}

/// Lines that the registry's report writes on a thread of its own.
bool isFromReport(const std::string& line) {
  for (const char* text : {"prioritized proxies", "No assets currently", "signaling semaphore"}) {
    if (line.find(text) != std::string::npos) return true;
  }
  return false;
}

const Error Damaged{"InstallerServiceErrorDomain", 2, {}, nullptr};

TEST_F(DesktopSync, NewUpdatedDamagedAndRemovedApplicationsAsOneTrace) {
  phone.appRegistry.seedInstalled("com.old", "1.0");
  phone.appRegistry.seedInstalled("com.unwanted", "1.0");
  phone.appRegistry.failInstall("com.damaged", Damaged);
  phone.homeScreen.setOrder({"com.old"});
  client();
  const PropertyList::Dictionary inventory = sync({{"com.damaged", "install"},
                                                   {"com.new", "install"},
                                                   {"com.old", "install"},
                                                   {"com.unwanted", "remove"}});
  EXPECT_EQ(inventory, (Dictionary{{"_Deleted", Array{}}}));

  const auto entry = [](const std::string& id, const std::string& operation) {
    return "{identifier = " + id + "; name = App " + id + "; operation = " + operation +
           "; version = 2.0}";
  };
  const std::string todo = "(" + entry("com.damaged", "install") + ", " +
                           entry("com.new", "install") + ", " + entry("com.old", "install") + ", " +
                           entry("com.unwanted", "remove") + ")";
  Lines expected = {
      "log default SyncBundle|getting installed assets",
      "log default Oversize|finished getting installed assets toDoList:(null), uninstalled apps "
      "(), "
      "last synced apps(null)",
      "log default SyncBundle|starting to reconcile sync with new anchor anchor",
      "FileManager.removeItem(" + WorkAreaPath + ")",
      "FileManager.createDirectory(" + SyncRootPath + ", true, -:-)",
      "FileManager.moveItem(" + Staged + ", " + WorkAreaPath + ")",
      "log default SyncBundle|com.unwanted targeted for termination",
      "log default SyncBundle|performing 1 deletions",
      "AppRegistry.uninstallApplication(com.unwanted, {})",
      "transaction scenario \"Halvo Sync\" step 0 ok com.unwanted \"Uninstall succeeded\"",
      "SystemNotifier.registerCheck(com.corvane.dashel.twc.wsyncnotify)",
      "log default SyncBundle|Notifying DS we are starting syncing",
      "HomeScreenService.serverPort()",
      "SystemNotifier.setState(com.corvane.dashel.twc.wsyncnotify, 1)",
      "SystemNotifier.post(com.corvane.dashel.twc.wsyncnotify)",
      "FileManager.writeAtomically(" + TodoListPath + "-debug.plist)",
      "log default SyncBundle|finished reconcile sync",
      "log default Oversize|outstandingAssetTransfers starting with todoList " + todo,
      "log default SyncBundle|SystemAppPlaceholders ()",
      "log default Oversize|outstandingAssetTransfers preExistingPlaceHolders {}, idsWeWant {}",
      "AppRegistry.addObserver()",
      "log default SyncBundle|Waiting for -applicationInstallsArePrioritized:arePaused: to "
      "complete...",
      "log default SyncBundle|Wait completed",
      "AppRegistry.removeObserver()",
      "log default SyncBundle|Assets already in progress (not returning these): ()",
      "log default SyncBundle|Assets currently restoring: ()",
      "HomeScreenService.serverPort()",
      "HomeScreenService.getFlattenedIconState(7, 1)",
      "log default SyncBundle|saved icon sort order",
      "FileManager.writeAtomically(" + SyncRootPath + "/AssetSortOrder.plist)",
      "log default SyncBundle|prioritize com.old",
      "log default SyncBundle|lastly com.damaged",
      "log default SyncBundle|lastly com.new",
      "FileManager.removeItem(" + SyncRootPath + "/Icons)",
      "FileManager.createDirectory(" + SyncRootPath + "/Icons, false, -:-)",
  };
  const auto add = [&expected](const Lines& more) {
    expected.insert(expected.end(), more.begin(), more.end());
  };
  const auto installed = [](const std::string& id) {
    return Lines{"log default SyncBundle|" + id + " install succeeded",
                 "log default SyncBundle|Changing " + id + " from DOWNLOADED to INSTALLED",
                 "FileManager.writeAtomically(" + TodoListPath + ")"};
  };
  for (const char* id : {"com.old", "com.damaged", "com.new"}) add(preparationOf(id));
  add(transferOf("com.old"));
  add(installed("com.old"));
  add(endOfInstall("com.old"));
  add(transferOf("com.damaged"));
  add(
      {"log default SyncBundle|com.damaged install failed unrecoverably: Error "
       "Domain=InstallerServiceErrorDomain Code=2",
       "log default SyncBundle|Changing com.damaged from DOWNLOADED to FAILED",
       "FileManager.writeAtomically(" + TodoListPath + ")",
       "AppRegistry.uninstallApplication(com.damaged, {})",
       "transaction scenario \"Aerix restore\" step 0 ok com.damaged \"placeholder removed\""});
  add(endOfInstall("com.damaged"));
  add(transferOf("com.new"));
  add(installed("com.new"));
  add(endOfInstall("com.new"));
  add({"log default SyncBundle|asset transfer ended withsuccess: y",
       "SystemNotifier.registerCheck(com.corvane.dashel.twc.wsyncnotify)",
       "log default SyncBundle|Notifying DS we are done syncing", "HomeScreenService.serverPort()",
       "SystemNotifier.setState(com.corvane.dashel.twc.wsyncnotify, 0)",
       "SystemNotifier.post(com.corvane.dashel.twc.wsyncnotify)",
       "log default SyncBundle|sync ended with success: y",
       "FileManager.touch(" + SyncRootPath + ")",
       "log default SyncBundle|clearing uninstalled apps: ()",
       "InstallerService.clearUninstalled(())",
       "FileManager.removeItem(" + LastSyncStatePath + ")"});

  Lines trace = phone.trace.readable();
  std::erase_if(trace, isFromReport);
  EXPECT_THAT(trace, testing::ElementsAreArray(expected));
  EXPECT_THAT(phone.appRegistry.installedIdentifiers(), testing::ElementsAre("com.new", "com.old"));
  EXPECT_EQ(phone.appRegistry.installed("com.old")->bundleVersion, "2.0");
  EXPECT_THAT(phone.appRegistry.placeholderIdentifiers(), testing::IsEmpty());
}

TEST_F(DesktopSync, AnApplicationUninstalledOnThePhoneIsReportedByTheNextInventory) {
  sync({{"com.a", "install"}, {"com.b", "install"}});
  phone.appRegistry.uninstallApplication("com.a", {});
  const PropertyList::Dictionary inventory = sync({});
  EXPECT_EQ(inventory, (Dictionary{{"_Deleted", deleted({"com.a"})}}));
  // The sync cleared it: it is reported once.
  EXPECT_EQ(sync({}), (Dictionary{{"_Deleted", Array{}}}));
}

TEST_F(DesktopSync, AFailedApplicationIsAskedForAgainByTheNextSync) {
  // The first call installs the placeholder, the second the package.
  phone.faults.failCall("AppRegistry.installApplication", 2, Damaged);
  sync({{"com.a", "install"}});
  EXPECT_EQ(todoOperation("com.a"), "FAILED");
  EXPECT_THAT(phone.appRegistry.placeholderIdentifiers(), testing::IsEmpty());
  sync({{"com.a", "install"}});
  EXPECT_EQ(todoOperation("com.a"), "INSTALLED");
}

}  // namespace
}  // namespace appsync
