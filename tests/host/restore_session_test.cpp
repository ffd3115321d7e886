// Whole restores with a fake phone: the client's calls in their order, and what is told of them.
#include <cerrno>

#include "tests/host/restore_fixture.h"

namespace appsync::host {
namespace {

using namespace testing;
using ::testing::AllOf;
using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::Not;

TEST_F(RestoreTest, CallsTheClientInOrder) {
  backUp("com.a", "data of a");
  backUp("com.b", {}, true);
  EXPECT_EQ(restore(),
            "skipped: com.a (waits for its package) com.b (stays a placeholder until it is asked "
            "for)");
  EXPECT_THAT(
      trace(),
      ElementsAre(
          "phone.restoreData(com.a, data of a)", "HomeScreenService.serverPort()",
          "HomeScreenService.setIconState(7)",
          "FileManager.createDirectory(/var/mobile/Library/Preferences, true, -:-)",
          "FileManager.writeAtomically(/var/mobile/Library/Preferences/"
          "com.corvane.Safekeep.DemotedApps.plist)",
          "FileManager.createDirectory(/var/mobile/Media/HalvoRestore, true, -:-)",
          "FileManager.writeAtomically(/var/mobile/Media/HalvoRestore/RestoreApplications.plist)",
          "client.supportedDataclasses", "client.currentSyncAnchor",
          "client.prepareForSyncWithHostAnchor(ANCHOR)", "client.reconcileRestoreOfType(2)",
          "client.outstandingAssetTransfers", "client.assetTransferEndedWithSuccess(true)"));
  EXPECT_THAT(reporter.lines(),
              ElementsAre("plan com.a", "plan com.b", "data com.a", "data-ended com.a",
                          "placeholder com.a Name of com.a", "demoted com.b Name of com.b"));
}

TEST_F(RestoreTest, SecondRestoreOnlyAsksTheClient) {
  backUp("com.a", "data of a");
  backUp("com.b", "data of b");
  phone.appRegistry.seedInstalled("com.a");
  restore();
  phone.trace.clear();
  EXPECT_EQ(restore(),
            "skipped: com.a (" + std::string(LeftAsItIs) + ") com.b (waits for its package)");
  EXPECT_THAT(trace(),
              ElementsAre("client.supportedDataclasses", "client.currentSyncAnchor",
                          "client.prepareForSyncWithHostAnchor(ANCHOR)",
                          "client.reconcileRestoreOfType(2)", "client.outstandingAssetTransfers",
                          "client.assetTransferEndedWithSuccess(true)"));
}

TEST_F(RestoreTest, TellsWhenNoPlaceholderWasMade) {
  backUp("com.a");
  backUp("com.b");
  entries["com.c"] = PropertyList::Dictionary{{"HalvoMetadata", Bytes(3)}};
  client.unwilling = {"com.b", "com.c"};
  EXPECT_EQ(restore(),
            "failed: com.b (the phone made no placeholder of it (appsync log tells more)) com.c "
            "(its metadata cannot be read); skipped: com.a (waits for its package)");
}

TEST_F(RestoreTest, SendsWhatABrokenOffSyncStillOwes) {
  backUp("com.a");
  client.alsoAskedFor = {"com.left"};
  offer("com.left");
  packages = true;
  EXPECT_EQ(restore(), "installed: com.left; skipped: com.a (the library does not have it)");
  EXPECT_THAT(trace("phone.received"), ElementsAre("phone.received(STAGING/com.left.tar)"));
}

TEST_F(RestoreTest, FailsWhatABrokenOffSyncOwesAndNobodyHas) {
  client.alsoAskedFor = {"com.left"};
  EXPECT_EQ(restore(), "failed: com.left (the library has no package for it)");
}

TEST_F(RestoreTest, TellsWhenThePlugInServesNoApplications) {
  backUp("com.a");
  client.dataclasses = {"Book"};
  EXPECT_EQ(restore(), "failed: com.a (the plug-in does not serve applications)");
  EXPECT_THAT(trace("client"), ElementsAre("client.supportedDataclasses"));
}

TEST_F(RestoreTest, TellsWhenThePhoneCannotBegin) {
  backUp("com.a");
  client.prepareError = Error::withDescription("Test", 1, "no room");
  EXPECT_EQ(restore(), "failed: com.a (the phone cannot begin a restore: no room)");
  EXPECT_THAT(trace("client.reconcile"), IsEmpty());
  EXPECT_THAT(reporter.lines("broken"),
              ElementsAre("broken the phone cannot begin a restore: no room"));
}

TEST_F(RestoreTest, AsksTheClientNothingWhenThePhoneTakesNoList) {
  backUp("com.a");
  store = true;
  phone.faults.failWhere("FileManager.writeAtomically", exchange::RestoreList, Error::posix(EIO));
  EXPECT_THAT(restore(), HasSubstr("failed: com.a (the phone does not take the backup: "));
  EXPECT_THAT(trace("client"), IsEmpty());
}

TEST_F(RestoreTest, EndsTheTransfersWhenInterruptedAfterThePlaceholders) {
  backUp("com.a");
  backUp("com.b");
  offer("com.a");
  store = true;
  client.onReconcile = [this] { interruption.request(); };
  EXPECT_EQ(restore(),
            "failed: com.a (interrupted; the next restore does it); skipped: com.b (the store does "
            "not have it)");
  EXPECT_THAT(trace("client.outstanding"), IsEmpty());
  EXPECT_THAT(trace("client.assetTransferEnded"),
              ElementsAre("client.assetTransferEndedWithSuccess(false)"));
  EXPECT_THAT(trace("phone"), ElementsAre("phone.expedite"));
  EXPECT_THAT(reporter.lines("interrupted"), ElementsAre("interrupted"));
}

TEST_F(RestoreTest, AsksTheClientNothingWhenInterruptedBefore) {
  backUp("com.a");
  interruption.request();
  EXPECT_EQ(restore(), "failed: com.a (interrupted; the next restore does it)");
  EXPECT_THAT(trace("client"), IsEmpty());
}

TEST_F(RestoreTest, TellsOfPlaceholdersBeforePackages) {
  backUp("com.a");
  offer("com.a");
  packages = true;
  restore();
  EXPECT_THAT(reporter.lines(), ElementsAre("plan com.a", "placeholder com.a Name of com.a",
                                            "progress com.a", "sent com.a", "install com.a"));
}

TEST_F(RestoreTest, OverwritesTheDataOfInstalledApplicationsWhenAsked) {
  backUp("com.a", "data of a");
  backUp("com.b", "data of b");
  backUp("com.c");
  for (const char* identifier : {"com.a", "com.b", "com.c"}) {
    phone.appRegistry.seedInstalled(identifier);
    owned[identifier] = "own";
  }
  owned["com.b"] = "data of b";
  EXPECT_EQ(restore(), "skipped: com.a (" + std::string(LeftAsItIs) + ") com.b (" + LeftAsItIs +
                           ") com.c (" + LeftAsItIs + ")");
  EXPECT_EQ(owned["com.a"], "own");
  overwriteData = true;
  EXPECT_EQ(restore(),
            "data restored: com.a; skipped: com.b (is installed with the backup's data) com.c (is "
            "installed, and the backup has no data of it)");
  EXPECT_THAT(trace("phone."), ElementsAre("phone.overwriteData(com.a, data of a)"));
  EXPECT_EQ(owned["com.c"], "own");
}

TEST_F(RestoreTest, TellsWhyTheDataOfAnInstalledApplicationStays) {
  backUp("com.a", "data of a");
  backUp("com.b", "data of b");
  for (const char* identifier : {"com.a", "com.b"}) phone.appRegistry.seedInstalled(identifier);
  overwriteData = true;
  phone.faults.failWhere("phone.overwriteData", "com.a",
                         Error::withDescription(POSIXErrorDomain, EBUSY, "com.a is open"));
  EXPECT_EQ(
      restore(),
      "data restored: com.b; failed: com.a (its data could not be given back: com.a is open)");
}

TEST_F(RestoreTest, RestoresOnlyWhatIsNamed) {
  backUp("com.a", "data of a");
  backUp("com.b", "data of b", true);
  backUp("com.c", {}, true);
  seedRestoring("com.other");
  phone.files.putPlist(exchange::DemotedApplications,
                       PropertyList::Dictionary{
                           {"AutomaticDowngrades", PropertyList::Array{"com.b", "com.other2"}}});
  for (const char* identifier : {"com.a", "com.b", "com.other"}) offer(identifier);
  only = {"com.a", "com.b"};
  packages = store = true;
  EXPECT_EQ(restore(),
            "installed: com.a; skipped: com.b (stays a placeholder until it is asked for)");
  const PropertyList::Dictionary demoted{{"AutomaticDowngrades", PropertyList::Array{"com.other2"}},
                                         {"IntentionalDowngrades", PropertyList::Array{"com.b"}}};
  EXPECT_EQ(phone.files.plistAt(exchange::DemotedApplications), PropertyList(demoted));
}

TEST_F(RestoreTest, IsNotCompleteWhenTheHomeScreenTakesNoLayout) {
  backUp("com.a");
  Backup damaged = backup();
  damaged.iconLayout = toBytes("damaged");
  std::string problem;
  const RestoreList list = RestoreList::of(damaged, problem).value();
  Restore session(client, host, hostsView.phone(), reporter, interruption);
  EXPECT_FALSE(session.run({damaged, list, {}, {}, false}).completed);
  EXPECT_THAT(reporter.lines("broken"),
              ElementsAre(HasSubstr("broken the home screen does not take its layout: ")));
}

TEST_F(RestoreTest, IsBrokenOffWhereverTheApplicationsCannotBeTold) {
  backUp("com.a");
  offer("com.a");
  store = true;
  const std::string reason = "the phone's applications cannot be told: Too many open files";
  // When it begins, before the client is asked, before and after that for what stands, and at the
  // end.
  std::size_t told = 0;
  for (const unsigned call : {1U, 3U, 4U, 5U, 6U}) {
    SCOPED_TRACE(call);
    phone.appRegistry.removeAll("com.a");
    phone.faults.failCall("phone.applications", call, Error::posix(EMFILE));
    restore();
    phone.faults.clear();
    EXPECT_THAT(reporter.lines("broken"), ::testing::SizeIs(++told));
    EXPECT_EQ(reporter.lines("broken").back(), "broken " + reason);
  }
}

TEST_F(RestoreTest, IsNotCompleteWhenItCannotBeSeenWhatIsDemoted) {
  backUp("com.a");
  offer("com.a");
  store = true;
  phone.faults.failWhere("FileManager.contentsAtPath", exchange::DemotedApplications,
                         Error::posix(EMFILE));
  EXPECT_EQ(restore(), "skipped: com.a (stays a placeholder until it is asked for)");
  EXPECT_THAT(reporter.lines("broken"),
              ElementsAre("broken the phone's list of demoted applications could not be looked at: "
                          "Too many open files"));
}

TEST_F(RestoreTest, FailsWhatTheStoreHasAndThePhoneDidNotInstall) {
  coordination = true;
  backUp("com.a");
  backUp("com.b");
  offer("com.a");
  store = true;
  client.onReconcile = [this] {
    phone.files.erase(exchange::RestoreList);
    seedRestoring("com.a", InstallType::Migration);
    auto record = *phone.appRegistry.recordForIdentifier("com.a", true);
    record.applicationIdentifier = "com.b";
    record.installType = InstallType::Restore;
    phone.appRegistry.seedPlaceholder(record);
  };
  EXPECT_EQ(
      restore(),
      "failed: com.a (the phone did not install it (appsync log tells more)) com.b (the phone "
      "could not make it ready; the next restore does it)");
}

TEST_F(RestoreTest, BringsNothingToAnApplicationWhoseDataIsDamaged) {
  backUp("com.a", "data");
  seedRestoring("com.a");
  offer("com.a");
  packages = store = true;
  phone.faults.failEvery("phone.restoreData", Error::posix(EIO));
  EXPECT_EQ(restore(), "failed: com.a (its data could not be given back: Input/output error)");
  coordination = true;
  seedRestoring("com.b");
  entries.clear();
  data.clear();
  backUp("com.b", "data");
  offer("com.b");
  std::filesystem::remove(folder / "com.a.tar");
  EXPECT_EQ(restore(), "failed: com.b (its data could not be given back: Input/output error)");
}

}  // namespace
}  // namespace appsync::host
