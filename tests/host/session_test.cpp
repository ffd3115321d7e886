#include <atomic>
#include <cerrno>
#include <thread>

#include "tests/host/session_fixture.h"

namespace appsync::host {
namespace {

using namespace testing;
using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

TEST_F(SessionTest, RunsTheWholeSyncInOrder) {
  packSample(folder / "a.zip", "com.a");
  packSample(folder / "b.tar.gz", "com.b", "2.0");
  phone.appRegistry.seedInstalled("com.b", "1.0");
  phone.appRegistry.seedInstalled("com.c", "1.0");
  phone.appRegistry.seedPlaceholder("com.left", InstallType::Sync);
  options.remove = {"com.c"};
  iconLayout = toBytes("layout");
  client.deleted = {"com.gone"};

  const SyncResult result = sync();

  EXPECT_THAT(
      trace(),
      ElementsAre(
          "AppRegistry.uninstallApplication(com.left, {UninstallPlaceholdersOnly = 1})",
          "client.supportedDataclasses", "client.currentSyncAnchor", "client.disabledAssetTypes",
          "client.prepareForSyncWithHostAnchor(ANCHOR)", "client.installedAssets",
          "FileManager.removeItem(STAGING/ApplicationSync)",
          "FileManager.createDirectory(STAGING/ApplicationSync, true, -:-)",
          "FileManager.createDirectory(STAGING/ApplicationSync/com.a, true, -:-)",
          "FileManager.createFile(STAGING/ApplicationSync/com.a/Info.plist, -:-)",
          "FileManager.createFile(STAGING/ApplicationSync/com.a/Icon.png, -:-)",
          "FileManager.createFile(STAGING/ApplicationSync/com.a/HalvoMetadata.plist, -:-)",
          "FileManager.createFile(STAGING/ApplicationSync/com.a/HalvoArtwork, -:-)",
          "FileManager.createDirectory(STAGING/ApplicationSync/com.b, true, -:-)",
          "FileManager.createFile(STAGING/ApplicationSync/com.b/Info.plist, -:-)",
          "FileManager.createFile(STAGING/ApplicationSync/com.b/Icon.png, -:-)",
          "FileManager.createFile(STAGING/ApplicationSync/com.b/HalvoMetadata.plist, -:-)",
          "FileManager.createFile(STAGING/ApplicationSync/com.b/HalvoArtwork, -:-)",
          "FileManager.createFile(STAGING/ApplicationSync/DashelIconState.plist, -:-)",
          "FileManager.createFile(STAGING/ApplicationSync/ApplicationsSync.plist, -:-)",
          "client.reconcileSync(NEW)", "AppRegistry.uninstallApplication(com.c, {})",
          "client.outstandingAssetTransfers", "phone.receive(STAGING/com.a.zip)",
          "phone.received(STAGING/com.a.zip)", "client.assetTransferUpdatedProgress(com.a, 1.00)",
          "client.assetTransferSucceeded(com.a, com.a.zip, none)",
          "phone.receive(STAGING/com.b.tar.gz)", "phone.received(STAGING/com.b.tar.gz)",
          "client.assetTransferUpdatedProgress(com.b, 1.00)",
          "client.assetTransferSucceeded(com.b, com.b.tar.gz, none)",
          "client.assetTransferEndedWithSuccess(true)", "FileManager.removeItem(STAGING/com.a.zip)",
          "FileManager.removeItem(STAGING/com.b.tar.gz)", "client.syncEndedWithSuccess(true)",
          "FileManager.writeAtomically(/var/mobile/Library/ApplicationSync/"
          "LastSyncAppState.plist)"));
  EXPECT_THAT(reporter.lines(), ElementsAre("swept com.left", "deleted-on-phone com.gone",
                                            "progress com.a", "sent com.a", "install com.a",
                                            "progress com.b", "sent com.b", "install com.b"));
  EXPECT_TRUE(result.completed);
  EXPECT_EQ(text(result.summary), "installed: com.a; updated: com.b; deleted: com.c");
}

TEST_F(SessionTest, StagesWhatTheClientTakesOver) {
  packSample(folder / "a.zip", "com.a", "1.5");
  iconLayout = toBytes("layout");
  sync();

  const std::string area = std::string(exchange::WorkArea) + "/";
  EXPECT_EQ(phone.files.textAt(area + "com.a/Icon.png"), "icon of com.a");
  EXPECT_EQ(phone.files.textAt(area + "com.a/HalvoArtwork"), "artwork");
  EXPECT_EQ(phone.files.textAt(area + "com.a/Info.plist"),
            xmlText(appInfo("com.a", "1.5", "Sample")));
  EXPECT_EQ(phone.files.textAt(area + "DashelIconState.plist"), "layout");
  const PropertyList::Dictionary entry{
      {"identifier", "com.a"}, {"operation", "INSTALLED"}, {"version", "1.5"}, {"name", "Sample"}};
  EXPECT_EQ(phone.files.plistAt(area + "ApplicationsSync.plist"),
            PropertyList(PropertyList::Array{entry}));
}

TEST_F(SessionTest, StagesNoEmptyName) {
  Entries entries = sampleEntries("com.a", "1.5", "");
  pack(folder / "a.zip", entries);
  sync();
  PropertyList::Dictionary info = appInfo("com.a", "1.5", "");
  info.erase(std::string(KBBundleDisplayName));
  EXPECT_EQ(phone.files.plistAt(std::string(exchange::WorkArea) + "/com.a/Info.plist"),
            PropertyList(info));
}

TEST_F(SessionTest, ReplacesAStaleStagingArea) {
  offer("com.a");
  phone.files.putFile(std::string(exchange::StagingArea) + "/com.stale/Info.plist", "old");
  sync();
  EXPECT_FALSE(phone.files.exists(std::string(exchange::WorkArea) + "/com.stale"));
}

TEST_F(SessionTest, IsBrokenWhenItCannotBeSeenWhatThePhoneHasDone) {
  offer("com.a");
  client.onTransfersEnd = [this] {
    phone.faults.failWhere("FileManager.contentsAtPath", exchange::WorkArea, Error::posix(EMFILE));
  };
  const SyncResult result = sync();
  EXPECT_FALSE(result.completed);
  EXPECT_EQ(text(result.summary),
            "failed: com.a (it cannot be seen what the phone has done: Too many open files)");
}

TEST_F(SessionTest, IsBrokenWhereverTheApplicationsCannotBeTold) {
  // Before the client is called, before it is asked, for the next inventory, and at the end.
  const std::map<unsigned, std::string> calls{
      {2, "the phone's applications cannot be told: Too many open files"},
      {4, "the phone's applications cannot be told: Too many open files"},
      {5, "the list of applications present could not be written: Too many open files"},
      {6, "the phone's applications cannot be told: Too many open files"}};
  phone.appRegistry.seedInstalled("com.old");
  offer("com.a");
  options.remove = {"com.old"};
  for (const auto& [call, reason] : calls) {
    SCOPED_TRACE(call);
    phone.appRegistry.removeAll("com.a");
    phone.appRegistry.seedInstalled("com.old");
    phone.faults.failCall("phone.applications", call, Error::posix(EMFILE));
    const SyncResult result = sync();
    EXPECT_FALSE(result.completed);
    EXPECT_EQ(result.summary.deleted.empty(), call == 2 || call == 6);
    EXPECT_THAT(reporter.lines(), Contains("broken " + reason));
    phone.faults.clear();
  }
}

TEST_F(SessionTest, WritesTheApplicationsPresentAfterTheEnd) {
  offer("com.a");
  phone.appRegistry.seedInstalled("com.b", "1.0");
  phone.appRegistry.seedPlaceholder("com.restoring", InstallType::Restore);
  AppRecord system;
  system.applicationIdentifier = "com.system";
  system.applicationType = ApplicationTypeSystem;
  phone.appRegistry.seedInstalled(system);
  sync();
  EXPECT_EQ(phone.files.plistAt(exchange::LastSyncState),
            PropertyList(PropertyList::Array{"com.a", "com.b"}));
}

TEST_F(SessionTest, RemovesPackagesThatWereLeftBehind) {
  phone.files.putPlist(
      exchange::RestoreState,
      PropertyList::Dictionary{
          {"com.kept",
           PropertyList::Dictionary{
               {"1.0", PropertyList::Dictionary{{"path", std::string(Root) + "com.kept.zip"}}}}}});
  putTodo({{"com.left", "install"}, {"com.waits", "DOWNLOADED"}});
  phone.files.putPlist(joinPath(exchange::StagingArea, exchange::TodoListName),
                       PropertyList::Array{PropertyList::Dictionary{{"identifier", "com.staged"},
                                                                    {"operation", "install"}}});
  phone.appRegistry.seedInstalled("com.there", "1.0");
  phone.appRegistry.seedPlaceholder("com.restoring", InstallType::Restore);
  for (const char* name :
       {"com.left.zip", "com.left.package", "com.kept.zip", "com.kept.tar", "com.restoring.zip",
        "com.staged.zip", "com.there.zip", "notes.txt", "com.waits.tar.gz"}) {
    phone.files.putFile(std::string(Root) + name, "package");
  }
  phone.files.putFile("/var/mobile/Media/Downloads/com.left.zip", "package");
  for (const char* own : {"holiday.zip", "thesis.tar.gz"}) {
    phone.files.putFile(std::string(Root) + own, "a person's");
    phone.files.putFile(joinPath(exchange::Downloads, own), "a person's");
  }
  coordination = true;
  makeCoordinator("com.waits");
  sync();
  EXPECT_THAT(trace("FileManager.removeItem"),
              ElementsAre("FileManager.removeItem(STAGING/com.kept.tar)",
                          "FileManager.removeItem(STAGING/com.left.package)",
                          "FileManager.removeItem(STAGING/com.left.zip)",
                          "FileManager.removeItem(STAGING/com.restoring.zip)",
                          "FileManager.removeItem(STAGING/com.staged.zip)",
                          "FileManager.removeItem(STAGING/com.there.zip)",
                          "FileManager.removeItem(/var/mobile/Media/Downloads/com.left.zip)",
                          "FileManager.removeItem(STAGING/ApplicationSync)"));
  for (const char* own : {"holiday.zip", "thesis.tar.gz"}) {
    EXPECT_TRUE(phone.files.exists(std::string(Root) + own)) << own;
    EXPECT_TRUE(phone.files.exists(joinPath(exchange::Downloads, own))) << own;
  }
}

TEST_F(SessionTest, RemovesNoPackageWhenItCannotBeSeenWhetherItIsBeingInstalled) {
  putTodo({{"com.left", "install"}});
  phone.files.putFile(std::string(Root) + "com.left.zip", "package");
  coordination = true;
  phone.faults.failWhere("InstallCoordination.coordinatorFor", "com.left", Error::posix(EMFILE));
  sync();
  EXPECT_TRUE(phone.files.exists(std::string(Root) + "com.left.zip"));
}

TEST_F(SessionTest, RemovesNoPackageWhenItCannotBeSeenWhatIsRemembered) {
  putTodo({{"com.left", "install"}});
  phone.files.putFile(std::string(Root) + "com.left.zip", "package");
  phone.faults.failWhere("FileManager.contentsAtPath", exchange::RestoreState,
                         Error::posix(EMFILE));
  sync();
  EXPECT_TRUE(phone.files.exists(std::string(Root) + "com.left.zip"));
}

TEST_F(SessionTest, LeavesAPlaceholderWhosePackageIsBeingInstalled) {
  phone.appRegistry.seedPlaceholder("com.coming", InstallType::Sync);
  phone.appRegistry.seedPlaceholder("com.restoring", InstallType::Restore);
  const auto progress = phone.appRegistry.progress("com.coming");
  progress->begin(InstallState::Active, InstallPhase::Installing);
  sync();
  EXPECT_THAT(phone.appRegistry.placeholderIdentifiers(),
              ElementsAre("com.coming", "com.restoring"));
}

TEST_F(SessionTest, LeavesAPlaceholderThatIsAllThatIsLeftOfAnApplication) {
  for (const char* identifier : {"com.left", "com.demoted", "com.unseen", "com.updated"}) {
    phone.appRegistry.seedPlaceholder(identifier, InstallType::Sync);
  }
  phone.appRegistry.seedInstalled("com.updated", "1.0");
  owned = {{"com.demoted", "notes"}, {"com.updated", "notes"}};
  phone.faults.failWhere("phone.saveData", "com.unseen", Error::posix(EMFILE));
  sync();
  EXPECT_THAT(phone.appRegistry.placeholderIdentifiers(), ElementsAre("com.demoted", "com.unseen"));
  EXPECT_THAT(reporter.lines(), ElementsAre("swept com.left", "swept com.updated"));
}

TEST_F(SessionTest, SendsNothingWhenRestrictionsSwitchTheSyncOff) {
  offer("com.a");
  client.disabled = {"Application"};
  const SyncResult result = sync();
  EXPECT_TRUE(result.completed);
  EXPECT_EQ(text(result.summary),
            "skipped: com.a (the phone's restrictions forbid installing and removing)");
  EXPECT_THAT(trace("client."),
              ElementsAre("client.supportedDataclasses", "client.currentSyncAnchor",
                          "client.disabledAssetTypes"));
}

TEST_F(SessionTest, WhatRestrictionsForbidIsNeitherDoneNorUpToDate) {
  offer("com.a");
  phone.appRegistry.seedInstalled("com.old", "1.0");
  options.mirror = true;
  client.disabled = {"Application"};
  const Summary summary = sync().summary;
  EXPECT_EQ(text(summary),
            "skipped: com.old (the phone's restrictions forbid installing and removing) com.a (the "
            "phone's restrictions forbid installing and removing)");
  for (const SkippedEntry& entry : summary.skipped) EXPECT_FALSE(entry.upToDate);
}

TEST_F(SessionTest, SkipsWhatThePhoneDoesNotAskFor) {
  offer("com.a");
  offer("com.b");
  client.notAskedFor = {"com.a"};
  const SyncResult result = sync();
  EXPECT_EQ(text(result.summary),
            "installed: com.b; skipped: com.a (the phone did not ask for its package)");
}

TEST_F(SessionTest, FailsWhatWasNamedAndThePhoneDoesNotAskFor) {
  offer("com.a");
  options.install = {"com.a"};
  client.notAskedFor = {"com.a"};
  EXPECT_EQ(text(sync().summary), "failed: com.a (the phone did not ask for its package)");
  client.disabled = {"Application"};
  EXPECT_EQ(text(sync().summary),
            "failed: com.a (the phone's restrictions forbid installing and removing)");
}

TEST_F(SessionTest, NamesTheFileOfAPackageThatFailed) {
  offer("com.a");
  putFile(folder / "broken.zip", "garbage");
  client.refusedPackages = {{"com.a", Error::withDescription("I", 2, "damaged")}};
  const Summary summary = sync().summary;
  ASSERT_THAT(summary.failed, ::testing::SizeIs(2));
  EXPECT_EQ(summary.failed[0].file, "broken.zip");
  EXPECT_EQ(summary.failed[1].file, "com.a.tar");
}

TEST_F(SessionTest, TellsDowngradesFromUpdates) {
  offer("com.a", "1.0");
  offer("com.b", "1.0");
  phone.appRegistry.seedInstalled("com.a", "2.0");
  phone.appRegistry.seedInstalled("com.b", "1.0");
  options.install = {"com.a", "com.b"};
  EXPECT_EQ(text(sync().summary), "updated: com.b; downgraded: com.a");
}

TEST_F(SessionTest, FailsAnAssetThatTheLibraryLacks) {
  client.alsoAskedFor = {"com.unknown"};
  sync();
  EXPECT_THAT(trace("client.assetTransferSucceeded"),
              ElementsAre("client.assetTransferSucceeded(com.unknown, failed, POSIX 2)"));
}

TEST_F(SessionTest, ReportsARefusedPackageAndInstallsTheRest) {
  offer("com.a");
  offer("com.b");
  client.refusedPackages = {{"com.a", Error::withDescription("I", 2, "damaged: bad block\n")}};
  const SyncResult result = sync();
  EXPECT_TRUE(result.completed);
  EXPECT_EQ(text(result.summary), "installed: com.b; failed: com.a (damaged: bad block)");
  EXPECT_THAT(reporter.lines(), Contains("install com.a failed: damaged: bad block"));
}

TEST_F(SessionTest, ReportsFilesOfTheLibraryThatAreNoPackages) {
  putFile(folder / "broken.zip", "garbage");
  putFile(folder / "notes.txt", "buy milk");
  const SyncResult result = sync();
  EXPECT_EQ(text(result.summary),
            "failed: broken.zip (it is neither a zip nor a tar archive); "
            "skipped: notes.txt (it is neither a zip nor a tar archive)");
}

TEST_F(SessionTest, WaitsForCoordinatedInstalls) {
  offer("com.a");
  coordination = true;
  client.installsAtOnce = false;
  std::thread coordinator;
  std::atomic<bool> done = false;
  const auto set = [this](const char* operation) { putTodo({{"com.a", operation}}); };
  client.onSent = [&](const SyncAssetPtr&) {
    set("DOWNLOADED");
    coordinator = std::thread([&] {
      set("INSTALLED");
      done = true;
    });
  };
  isBusyWith = [&](std::string_view) { return coordinator.joinable() && !done; };
  makeCoordinator("com.a");
  const SyncResult result = sync();
  coordinator.join();
  EXPECT_EQ(text(result.summary), "installed: com.a");
}

TEST_F(SessionTest, WaitsForAPhoneThatRemovesByAndBy) {
  phone.appRegistry.seedInstalled("com.old", "1.0");
  options.remove = {"com.old"};
  coordination = true;
  client.removes = false;
  int looks = 0;
  client.onOutstanding = [&] { looks = 3; };
  isBusyWith = [&](std::string_view identifier) {
    EXPECT_EQ(identifier, "com.old");
    if (looks == 1) phone.appRegistry.uninstallApplication("com.old", {});
    return looks > 0 && --looks > 0;
  };
  EXPECT_EQ(text(sync().summary), "deleted: com.old");
}

TEST_F(SessionTest, BeginsOnlyWhenThePhoneHasDoneWhatAKilledSyncLeft) {
  offer("com.a");
  int looks = 3;
  isBusyWith = [&](std::string_view) {
    if (looks > 0) {
      EXPECT_THAT(trace("client."), ::testing::IsEmpty());
      --looks;
    }
    return looks > 0;
  };
  EXPECT_EQ(text(sync().summary), "installed: com.a");
  EXPECT_EQ(looks, 0);
}

TEST_F(SessionTest, AnInstallThatThePhoneCarriesOnFromAKilledSyncIsNotDoneTwice) {
  offer("com.a");
  offer("com.b");
  isBusyWith = [&](std::string_view) {
    phone.appRegistry.seedInstalled("com.a", "1.0");
    return false;
  };
  EXPECT_EQ(text(sync().summary), "installed: com.a com.b");
  EXPECT_THAT(reporter.lines(),
              ElementsAre("install com.a", "progress com.b", "sent com.b", "install com.b"));
}

TEST_F(SessionTest, ACoordinatedInstallThatThePhoneGaveUpIsNotWaitedFor) {
  offer("com.a");
  coordination = true;
  client.installsAtOnce = false;
  client.onSent = [&](const SyncAssetPtr&) { putTodo({{"com.a", "DOWNLOADED"}}); };
  makeCoordinator("com.a");
  EXPECT_EQ(text(sync().summary),
            "failed: com.a (the phone did not carry it out (appsync log tells more))");
}

TEST_F(SessionTest, ACoordinatedInstallThatWasCancelledIsNotWaitedFor) {
  coordination = true;
  client.installsAtOnce = false;
  for (const char* identifier : {"com.before", "com.meanwhile"}) offer(identifier);
  const auto coordinator = makeCoordinator("com.meanwhile");
  client.onSent = [&](const SyncAssetPtr& asset) {
    putTodo({{"com.before", "DOWNLOADED"}, {"com.meanwhile", "DOWNLOADED"}});
    if (asset->identifier != "com.meanwhile") return;
    coordinator->cancel(Error::withDescription(POSIXErrorDomain, ECANCELED, "not wanted"), 15);
  };
  EXPECT_EQ(text(sync().summary),
            "failed: com.before (cancelled on the phone) com.meanwhile (not wanted)");
}

}  // namespace
}  // namespace appsync::host
