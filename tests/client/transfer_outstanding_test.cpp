#include "tests/client/outstanding_transfers.h"

namespace appsync {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

TEST_F(OutstandingTransfers, WholeTraceOfOneNewApplication) {
  stage("com.a", "Alpha");
  putEntries({install("com.a")});
  const std::vector<SyncAssetPtr> assets = client().outstandingAssetTransfers();
  const std::string todo = "({identifier = com.a; operation = install; version = 2.0})";
  const std::string staged = WorkAreaPath + "/com.a";
  const std::string bundle = "/tmp/com.corvane.twc.Apps/com.a.app";
  const std::string info =
      "{KBBundleDisplayName = Alpha; KBBundleExecutable = Alpha; KBBundleIconFile = Icon.png; "
      "KBBundleIdentifier = com.a; KBBundleVersion = 2.0; SWApplicationLaunchProhibited = 0; "
      "UIPeriodixApp = 0}";
  Lines trace = phone.trace.readable();
  // Lines of the registry's report come on a thread of its own.
  std::erase_if(trace, [](const std::string& line) {
    return line.find("prioritized proxies") != std::string::npos ||
           line.find("No assets currently") != std::string::npos ||
           line.find("signaling semaphore") != std::string::npos;
  });
  EXPECT_THAT(
      trace,
      ElementsAre(
          "log default Oversize|outstandingAssetTransfers starting with todoList " + todo,
          "log default SyncBundle|SystemAppPlaceholders ()",
          "log default Oversize|outstandingAssetTransfers preExistingPlaceHolders {}, idsWeWant {}",
          "AppRegistry.addObserver()",
          "log default SyncBundle|Waiting for -applicationInstallsArePrioritized:arePaused: to "
          "complete...",
          "log default SyncBundle|Wait completed", "AppRegistry.removeObserver()",
          "log default SyncBundle|Assets already in progress (not returning these): ()",
          "log default SyncBundle|Assets currently restoring: ()", "HomeScreenService.serverPort()",
          "HomeScreenService.getFlattenedIconState(7, 1)",
          "log default SyncBundle|saved icon sort order",
          "FileManager.writeAtomically(" + SyncRootPath + "/AssetSortOrder.plist)",
          "log default SyncBundle|lastly com.a", "FileManager.removeItem(" + IconsPath + ")",
          "FileManager.createDirectory(" + IconsPath + ", false, -:-)",
          "FileManager.writeAtomically(" + IconsPath + "/com.a.png)",
          "log default SyncBundle|Asset com.a (pretty=Alpha, version=2.0) prepped with icon " +
              IconsPath + "/com.a.png, at " + staged + ", meta at " + staged +
              "/HalvoMetadata.plist, info at " + staged + "/Info.plist, storePid=0, isRestore=n",
          "log default SyncBundle|plist " + staged + "/Info.plist",
          "FileManager.createDirectory(" + bundle + ", true, mobile:mobile)",
          "log default SyncBundle|Created app directory for 'com.a' at " + bundle +
              " with err=(null)",
          "FileManager.removeItem(" + bundle + "/Icon.png)",
          "FileManager.copyItem(" + IconsPath + "/com.a.png, " + bundle + "/Icon.png)",
          "FileManager.writeAtomically(" + bundle + "/Info.plist)",
          "log default SyncBundle|creating placeholder for 'com.a'. info.plist=" + info,
          "AppRegistry.installApplication(" + bundle +
              "/, {KBBundleIdentifier = com.a; SWInstallType = 4; SWPackageTypeKey = "
              "SWPackageTypePlaceholder})",
          "log default SyncBundle|Installed Placeholder app from path " + bundle +
              ": Alpha [com.a 2.0] [isPeriodix: 0]",
          "transaction scenario \"Install placeholder\" ok com.a \"Installed placeholder\""));

  ASSERT_EQ(assets.size(), 1u);
  const SyncAsset& asset = *assets.front();
  EXPECT_EQ(asset.identifier, "com.a");
  EXPECT_EQ(asset.dataclass, "Application");
  EXPECT_EQ(asset.prettyName, "Alpha");
  EXPECT_EQ(asset.icon, FileLocation::file(IconsPath + "/com.a.png"));
  EXPECT_FALSE(asset.isRestore);
  EXPECT_EQ(asset.variantOptions, (Dictionary{{"AssetParts", 1}, {"Version", "2.0"}}));
  EXPECT_EQ(asset.storePlist, staged + "/HalvoMetadata.plist");
  EXPECT_EQ(asset.infoPlist, staged + "/Info.plist");
  EXPECT_TRUE(phone.appRegistry.placeholder("com.a"));
}

TEST_F(OutstandingTransfers, MissingTodoListConsidersOnlyExistingPlaceholders) {
  seedRestore("com.r");
  EXPECT_THAT(requested(), IsEmpty());
  EXPECT_TRUE(
      loggedMessage("Not creating a placeholder app for com.r because we already have one"));
  EXPECT_TRUE(
      logged("log default Oversize|com.corvane.twc.AppsClient|outstandingAssetTransfers "
             "starting with todoList (null)"));
}

TEST_F(OutstandingTransfers, EntriesOfAnotherOperationContributeNothing) {
  putEntries({Dictionary{{"operation", "remove"}, {"identifier", "com.a"}},
              Dictionary{{"operation", "INSTALLED"}, {"identifier", "com.b"}},
              Dictionary{{"operation", 1}, {"identifier", "com.c"}},
              Dictionary{{"identifier", "com.d"}}, "no entry"});
  EXPECT_THAT(requested(), IsEmpty());
  EXPECT_THAT(phone.host.made(), IsEmpty());
}

TEST_F(OutstandingTransfers, UnsafeIdentifiersAreLoggedAndContributeNothing) {
  putEntries({install("com.x/../y"), install(7), Dictionary{{"operation", "install"}}});
  EXPECT_THAT(requested(), IsEmpty());
  EXPECT_TRUE(loggedMessage("Ignoring invalid path: com.x/../y"));
  EXPECT_TRUE(loggedMessage("Ignoring invalid path: 7"));
  EXPECT_TRUE(loggedMessage("Ignoring invalid path: (null)"));
}

TEST_F(OutstandingTransfers, IdentifiersThatLeaveTheFolderTheyAreJoinedToAreIgnored) {
  phone.files.putFile(SyncRootPath + "/x.png", "of another");
  phone.files.putFile("/var/mobile/evil.png", "of another");
  seedRestore("com.evil");
  phone.appRegistry.edit("com.evil",
                         [](AppRecord& record) { record.bundleIdentifier = "../../../evil"; });
  putEntries({install("../x"), install("..")});
  EXPECT_THAT(requested(), IsEmpty());
  EXPECT_TRUE(loggedMessage("Ignoring invalid path: ../../../evil"));
  EXPECT_TRUE(loggedMessage("Ignoring invalid path: ../x"));
  EXPECT_TRUE(loggedMessage("Ignoring invalid path: .."));
  EXPECT_EQ(phone.files.textAt(SyncRootPath + "/x.png"), "of another");
  EXPECT_EQ(phone.files.textAt("/var/mobile/evil.png"), "of another");
  EXPECT_EQ(phone.trace.count("AppRegistry.installApplication"), 0u);
}

TEST_F(OutstandingTransfers, ARecordWithoutBundleOrContainerNamesNoFileOfThePhonesRoot) {
  seedRestore("com.a");
  seedRestore("com.b");
  phone.appRegistry.edit("com.a", [](AppRecord& record) { record.bundlePath.reset(); });
  phone.appRegistry.edit("com.b", [](AppRecord& record) { record.bundleContainerPath.reset(); });
  EXPECT_THAT(requested(), IsEmpty());
  EXPECT_THAT(phone.trace.log(), testing::Contains("log error SyncBundle|missing bundlePath"));
  const std::vector<SyncAssetPtr> made = phone.host.made();
  ASSERT_THAT(made, testing::SizeIs(2));
  const SyncAsset& withoutBundle = *made.front();
  EXPECT_EQ(withoutBundle.infoPlist, std::nullopt);
  EXPECT_NE(withoutBundle.storePlist, std::nullopt);
  const SyncAsset& withoutContainer = *made.back();
  EXPECT_EQ(withoutContainer.storePlist, std::nullopt);
  EXPECT_NE(withoutContainer.infoPlist, std::nullopt);
}

TEST_F(OutstandingTransfers, AVersionOrNameThatIsANumberIsTakenInDigitsAndSaid) {
  putEntries({Dictionary{
      {"operation", "install"}, {"identifier", "com.a"}, {"version", 3}, {"name", 2048}}});
  const std::vector<SyncAssetPtr> assets = client().outstandingAssetTransfers();
  ASSERT_THAT(identifiersOf(assets), ElementsAre("com.a"));
  EXPECT_EQ(assets[0]->prettyName, "2048");
  EXPECT_EQ(assets[0]->variantOptions, (Dictionary{{"AssetParts", 1}, {"Version", "3"}}));
  EXPECT_THAT(phone.trace.log(),
              testing::IsSupersetOf({"log error SyncBundle|unexpected type for version of com.a: 3",
                                     "log error SyncBundle|unexpected type for name of com.a: "
                                     "2048"}));
}

TEST_F(OutstandingTransfers, AVersionOrNameOfAnUnusableTypeIsSaidAndCountsAsMissing) {
  putEntries({Dictionary{
      {"operation", "install"}, {"identifier", "com.a"}, {"version", true}, {"name", Array{"A"}}}});
  const std::vector<SyncAssetPtr> assets = client().outstandingAssetTransfers();
  ASSERT_THAT(identifiersOf(assets), ElementsAre("com.a"));
  EXPECT_EQ(assets[0]->prettyName, "com.a");
  EXPECT_EQ(assets[0]->variantOptions, (Dictionary{{"AssetParts", 1}}));
  EXPECT_THAT(phone.trace.log(),
              testing::IsSupersetOf({"log error SyncBundle|unexpected type for version of com.a: 1",
                                     "log error SyncBundle|unexpected type for name of com.a: "
                                     "(A)"}));
}

TEST_F(OutstandingTransfers, ApplicationWithAPlaceholderIsWantedButNotRequestedAgain) {
  phone.appRegistry.seedPlaceholder("com.a", InstallType::Sync);
  putEntries({install("com.a")});
  EXPECT_THAT(requested(), IsEmpty());
  EXPECT_TRUE(loggedMessage("com.a already has a placeholder - skipping"));
  EXPECT_TRUE(
      loggedMessage("Not creating a placeholder app for com.a because we already have one"));
}

TEST_F(OutstandingTransfers, InProgressIsMissingFromTheResultAndRestoringIsNot) {
  stage("com.busy", "Busy");
  stage("com.back", "Back");
  putEntries({install("com.busy"), install("com.back")});
  phone.appRegistry.seedPlaceholder("com.busy", InstallType::StoreDownload);
  phone.appRegistry.progress("com.busy")->begin(InstallState::Active, InstallPhase::Installing);
  const AppRecord busy = *phone.appRegistry.placeholder("com.busy");
  phone.appRegistry.seedPlaceholder("com.back", InstallType::Restore);
  phone.appRegistry.progress("com.back")->begin(InstallState::Active, InstallPhase::Loading);
  const AppRecord back = *phone.appRegistry.placeholder("com.back");
  phone.appRegistry.scriptReport({busy, back}, {});
  requested();
  EXPECT_TRUE(loggedMessage("Assets already in progress (not returning these): (com.busy)"));
  EXPECT_TRUE(loggedMessage("Assets currently restoring: (com.back)"));
  EXPECT_FALSE(loggedMessage("lastly com.busy"));
  EXPECT_FALSE(
      loggedMessage("Not creating a placeholder app for com.busy because we already have one"));
  EXPECT_TRUE(loggedMessage("lastly com.back"));
}

TEST_F(OutstandingTransfers, ComeInHomeScreenOrderThenTheRest) {
  for (const char* identifier : {"com.a", "com.b", "com.c"}) stage(identifier, identifier);
  putEntries({install("com.a"), install("com.b"), install("com.c")});
  phone.homeScreen.setOrder({"com.c", "com.other", "com.b"});
  EXPECT_THAT(requested(), ElementsAre("com.c", "com.b", "com.a"));
}

TEST_F(OutstandingTransfers, InstallationDisabledSkipsASyncEntryAndNotARestore) {
  phone.policy.set(PolicySetting::AppInstallationAllowed, PolicyValue::ExplicitlyNo);
  stage("com.a", "Alpha");
  seedRestore("com.r");
  putEntries({install("com.a")});
  requested();
  EXPECT_TRUE(loggedMessage("skipping com.a - its not a restore and app installation is disabled"));
  EXPECT_TRUE(loggedMessage("Asset com.r (pretty="));
}

TEST_F(OutstandingTransfers, RestoreWithoutRememberedPackageAsksForBothParts) {
  seedRestore("com.r");
  requested();
  ASSERT_EQ(phone.host.made().size(), 1u);
  EXPECT_TRUE(phone.host.made().front()->isRestore);
  EXPECT_EQ(phone.host.made().front()->variantOptions,
            (Dictionary{{"AssetParts", 3}, {"Version", "1.0"}}));
}

TEST_F(OutstandingTransfers, RestoreWhoseRememberedPackageIsThereAsksForDataOnly) {
  seedRestore("com.r");
  phone.files.putFile("/var/mobile/Media/r.pkg", "package");
  rememberPath("com.r", "/var/mobile/Media/r.pkg");
  requested();
  EXPECT_TRUE(loggedMessage("Recovered download path for com.r at /var/mobile/Media/r.pkg"));
  EXPECT_EQ(phone.host.made().front()->variantOptions,
            (Dictionary{{"AssetParts", 2}, {"Version", "1.0"}}));
}

TEST_F(OutstandingTransfers, RestoreWhoseRememberedPackageIsGoneAsksForBothParts) {
  seedRestore("com.r");
  rememberPath("com.r", "/var/mobile/Media/gone.pkg");
  requested();
  EXPECT_TRUE(loggedMessage(
      "Download path recovered for com.r but the file is missing: /var/mobile/Media/gone.pkg"));
  EXPECT_EQ(phone.host.made().front()->variantOptions,
            (Dictionary{{"AssetParts", 3}, {"Version", "1.0"}}));
}

TEST_F(OutstandingTransfers, RestoreWhoseRememberedPackageCannotBeLookedAtAsksForBothParts) {
  const std::string path = "/var/mobile/Media/r.pkg";
  seedRestore("com.r");
  phone.files.putFile(path, "package");
  rememberPath("com.r", path);
  // Of another domain, a code says nothing of the path.
  const Error reason = Error::withDescription("OtherErrorDomain", EINVAL, "busy");
  phone.faults.failWhere("FileManager.attributesOfItem", path, reason);
  requested();
  EXPECT_TRUE(
      logged("log error SyncBundle|com.corvane.twc.AppsClient|Download path recovered for com.r "
             "but can't look at " +
             path + ": " + description(reason)));
  EXPECT_FALSE(loggedMessage("Download path recovered for com.r but the file is missing: " + path));
  EXPECT_EQ(phone.host.made().front()->variantOptions,
            (Dictionary{{"AssetParts", 3}, {"Version", "1.0"}}));
}

TEST_F(OutstandingTransfers, ATodoListThatCannotBeReadJustNowIsSaidAndCountsAsEmpty) {
  putEntries({install("com.a")});
  phone.faults.failWhere("FileManager.contentsAtPath", TodoListPath, Error::posix(24));
  EXPECT_THAT(requested(), IsEmpty());
  EXPECT_TRUE(logged("log error SyncBundle|com.corvane.twc.AppsClient|can't read " + TodoListPath +
                     ": " + description(Error::posix(24))));
}

TEST_F(OutstandingTransfers, NameFallsBackToTheDesktopsAndThenToTheIdentifier) {
  Dictionary named = install("com.named");
  named.emplace("name", "From Desktop");
  putEntries({named, install("com.nameless")});
  const std::vector<SyncAssetPtr> assets = client().outstandingAssetTransfers();
  ASSERT_THAT(identifiersOf(assets), ElementsAre("com.named", "com.nameless"));
  EXPECT_EQ(assets[0]->prettyName, "From Desktop");
  EXPECT_EQ(assets[1]->prettyName, "com.nameless");
}

TEST_F(OutstandingTransfers, FailedIconRenderingFallsBackToTheContainersArtwork) {
  putEntries({install("com.a")});
  const std::vector<SyncAssetPtr> assets = client().outstandingAssetTransfers();
  ASSERT_EQ(assets.size(), 1u);
  EXPECT_EQ(assets[0]->icon, FileLocation::file(WorkAreaPath + "/com.a/HalvoArtwork"));
}

TEST_F(OutstandingTransfers, EntryWithoutAVersionIsAskedForWithoutOne) {
  stage("com.a", "Alpha");
  putEntries({Dictionary{{"operation", "install"}, {"identifier", "com.a"}}});
  const std::vector<SyncAssetPtr> assets = client().outstandingAssetTransfers();
  ASSERT_EQ(assets.size(), 1u);
  EXPECT_EQ(assets[0]->variantOptions, (Dictionary{{"AssetParts", 1}}));
  // Its placeholder must stand all the same: it shields an installed version.
  EXPECT_TRUE(phone.appRegistry.placeholder("com.a"));
}

TEST_F(OutstandingTransfers, MissingIconScratchDirectoryIsLoggedAndIconsFallBack) {
  stage("com.a", "Alpha");
  putEntries({install("com.a")});
  phone.faults.failWhere("FileManager.createDirectory", "/Icons", Error::posix(28));
  phone.files.erase(IconsPath);
  const std::vector<SyncAssetPtr> assets = client().outstandingAssetTransfers();
  ASSERT_EQ(assets.size(), 1u);
  EXPECT_TRUE(
      logged("log error SyncBundle|com.corvane.twc.AppsClient|Can't create icon scratch dir! "
             "Error Domain=POSIX Code=28"));
  EXPECT_EQ(assets[0]->icon, FileLocation::file(WorkAreaPath + "/com.a/HalvoArtwork"));
}

TEST_F(OutstandingTransfers, IconScratchDirectoryIsEmptiedFirst) {
  phone.files.putFile(IconsPath + "/com.old.png", "old");
  requested();
  EXPECT_FALSE(phone.files.exists(IconsPath + "/com.old.png"));
  EXPECT_TRUE(phone.files.exists(IconsPath));
}

TEST_F(OutstandingTransfers, PlaceholderThatCannotBeMadeDoesNotKeepThePackageBack) {
  stage("com.a", "Alpha");
  putEntries({install("com.a")});
  phone.appRegistry.failPlaceholder("com.a", Error{"StartwellError", 1, {}, nullptr});
  EXPECT_THAT(requested(), ElementsAre("com.a"));
}

TEST_F(OutstandingTransfers, PreparingForASyncKeepsNoRestoreBack) {
  EXPECT_TRUE(client().prepareForSyncWithHostAnchor("anchor", {}, nullptr));
  seedRestore("com.r");
  requested();
  EXPECT_EQ(phone.host.made().size(), 1u);
}

TEST_F(CoordinatedTransfers, RestoresAreNeverReturned) {
  seedRestore("com.r");
  putEntries({install("com.r")});
  EXPECT_THAT(requested(), IsEmpty());
  EXPECT_TRUE(loggedMessage(
      "com.r is currenlty marked to be restored and will be handled by kioskd - skipping"));
}

TEST_F(CoordinatedTransfers, DemotedPlaceholderIsReturnedOnlyIfTheTodoListNamesIt) {
  phone.appRegistry.seedPlaceholder("com.named", InstallType::Downgrade);
  phone.appRegistry.seedPlaceholder("com.other", InstallType::IntentionalDowngrade);
  putEntries({install("com.named")});
  EXPECT_THAT(requested(), ElementsAre("com.named"));
  EXPECT_TRUE(
      loggedMessage("com.named is currenlty demoted (manual:1, auto:0) - but will be "
                    "installed as it's requested by client"));
  EXPECT_TRUE(loggedMessage("com.other is currenlty demoted (manual:0, auto:1) - skipping"));
}

TEST_F(CoordinatedTransfers, SystemApplicationIsSkipped) {
  AppRecord record;
  record.applicationIdentifier = "com.system";
  record.applicationType = ApplicationTypeSystem;
  record.installType = InstallType::Downgrade;
  phone.appRegistry.seedPlaceholder(record);
  EXPECT_THAT(requested(), IsEmpty());
  EXPECT_TRUE(
      loggedMessage("com.system is auto demoted: 1, manual demoted: 0, system app:1 - skipping"));
}

TEST_F(CoordinatedTransfers, InstalledApplicationIsUpdatedThroughAnUpdatingCoordinator) {
  phone.appRegistry.seedInstalled("com.a");
  stage("com.a", "Alpha");
  stage("com.b", "Beta");
  putEntries({install("com.a"), install("com.b")});
  EXPECT_THAT(requested(), ElementsAre("com.a", "com.b"));
  EXPECT_TRUE(loggedMessage("App com.a is already installed and will be updated."));
  EXPECT_FALSE(loggedMessage("App com.b is already installed and will be updated."));
  EXPECT_TRUE(loggedMessage("Created updating coordinator"));
  EXPECT_TRUE(loggedMessage("Created initiating coordinator"));
  EXPECT_EQ(phone.trace.count("AppRegistry.installApplication"), 0u);
}

TEST_F(CoordinatedTransfers, FailedPreparationMarksTheEntryFailedAndLeavesItOut) {
  stage("com.a", "Alpha");
  stage("com.b", "Beta");
  putEntries({install("com.a"), install("com.b")});
  phone.installCoordination.seedCoordinator(CoordinatorKind::Initiating, "com.a", KQClientKiosk);
  EXPECT_THAT(requested(), ElementsAre("com.b"));
  EXPECT_TRUE(
      logged("log error SyncBundle|com.corvane.twc.AppsClient|Not requesting app asset for "
             "com.a"));
  EXPECT_TRUE(loggedMessage("Changing com.a from install to FAILED"));
  EXPECT_EQ(todoOperation("com.a"), "FAILED");
  EXPECT_EQ(todoOperation("com.b"), "install");
}

}  // namespace
}  // namespace appsync
