// What becomes a candidate, and what is asked for it.
#include "tests/client/outstanding_transfers.h"

namespace appsync {
namespace {

using testing::Contains;
using testing::ElementsAre;
using testing::IsEmpty;

class TransferCandidates : public OutstandingTransfers {
 protected:
  static std::string containerOf(const std::string& identifier) {
    return "/var/mobile/Containers/Placeholders/" + identifier;
  }
  /// The candidate entry of a placeholder whose record is complete.
  static Dictionary entry(const std::string& identifier, const std::string& flag) {
    const std::string container = containerOf(identifier);
    Dictionary whole{{"KBBundleIdentifier", identifier},
                     {"KBBundleVersion", "1.0"},
                     {"Container", container},
                     {"Path", container + "/" + identifier + ".app"}};
    return withFlags(std::move(whole), flag);
  }
  static Dictionary withFlags(Dictionary entry, const std::string& flag) {
    for (const char* name :
         {"IsRestore", "intentional_demoted_app", "auto_demoted_app", "system_app"}) {
      entry.emplace(name, flag == name);
    }
    return entry;
  }
  std::string candidatesLine(const Dictionary& entries) {
    return "log default Oversize|outstandingAssetTransfers preExistingPlaceHolders " +
           description(entries) + ", idsWeWant " + description(entries);
  }
};

TEST_F(TransferCandidates, APlaceholdersEntryTellsPlaceVersionAndHowItCameToBe) {
  seedRestore("com.restored");
  phone.appRegistry.seedPlaceholder("com.auto", InstallType::Downgrade);
  phone.appRegistry.seedPlaceholder("com.intended", InstallType::IntentionalDowngrade);
  phone.appRegistry.seedPlaceholder("com.synced", InstallType::Sync);
  AppRecord system;
  system.applicationIdentifier = "com.system";
  system.applicationType = ApplicationTypeSystem;
  system.bundleVersion = "1.0";
  phone.appRegistry.seedPlaceholder(system);
  // Named by the todo list, but not yet when the line is written.
  putEntries({install("com.a")});
  requested();
  EXPECT_THAT(
      phone.trace.log(),
      Contains(candidatesLine({{"com.restored", entry("com.restored", "IsRestore")},
                               {"com.auto", entry("com.auto", "auto_demoted_app")},
                               {"com.intended", entry("com.intended", "intentional_demoted_app")},
                               {"com.synced", entry("com.synced", "")},
                               {"com.system", entry("com.system", "system_app")}})));
}

TEST_F(TransferCandidates, APlaceholdersEntryHoldsOnlyWhatTheRegistryKnows) {
  seedRestore("com.bare");
  phone.appRegistry.edit("com.bare", [](AppRecord& record) {
    record.bundleIdentifier.reset();
    record.bundleVersion.reset();
    record.bundlePath.reset();
    record.bundleContainerPath.reset();
  });
  EXPECT_THAT(requested(), IsEmpty());
  EXPECT_THAT(phone.trace.log(),
              Contains(candidatesLine({{"com.bare", withFlags({}, "IsRestore")}})));
  EXPECT_THAT(phone.host.made(), IsEmpty());
}

TEST_F(TransferCandidates, APlaceholderIsKeptUnderItsApplicationIdentifier) {
  AppRecord record;
  record.applicationIdentifier = "com.a";
  record.bundleIdentifier = "com.bundle";
  record.bundleVersion = "1.0";
  phone.appRegistry.seedPlaceholder(record);
  putEntries({install("com.a")});
  requested();
  EXPECT_TRUE(loggedMessage("com.a already has a placeholder - skipping"));
}

TEST_F(TransferCandidates, AnIdentifierListedTwiceIsAskedForOnceInItsFirstVersion) {
  stage("com.a", "Alpha");
  Dictionary again = install("com.a");
  again.insert_or_assign("version", "3.0");
  putEntries({install("com.a"), again});
  const std::vector<SyncAssetPtr> assets = client().outstandingAssetTransfers();
  ASSERT_THAT(identifiersOf(assets), ElementsAre("com.a"));
  EXPECT_EQ(assets[0]->variantOptions, (Dictionary{{"AssetParts", 1}, {"Version", "2.0"}}));
  // For the second entry the first one stands where a placeholder would.
  EXPECT_EQ(phone.trace.count("log default SyncBundle|com.corvane.twc.AppsClient|com.a already has "
                              "a placeholder - skipping"),
            1u);
}

TEST_F(TransferCandidates, ASyncedApplicationsRememberedPackageIsNamedButAskedForAgain) {
  stage("com.a", "Alpha");
  putEntries({install("com.a")});
  phone.files.putFile("/var/mobile/Media/a.pkg", "package");
  rememberPath("com.a", "/var/mobile/Media/a.pkg", "2.0");
  const std::vector<SyncAssetPtr> assets = client().outstandingAssetTransfers();
  EXPECT_TRUE(loggedMessage("Recovered download path for com.a at /var/mobile/Media/a.pkg"));
  ASSERT_EQ(assets.size(), 1u);
  EXPECT_EQ(assets[0]->variantOptions, (Dictionary{{"AssetParts", 1}, {"Version", "2.0"}}));
}

TEST_F(TransferCandidates, APackageRememberedForAnotherVersionIsNotRecovered) {
  seedRestore("com.r");
  phone.files.putFile("/var/mobile/Media/r.pkg", "package");
  rememberPath("com.r", "/var/mobile/Media/r.pkg", "2.0");
  requested();
  EXPECT_FALSE(loggedMessage("Recovered download path"));
  ASSERT_EQ(phone.host.made().size(), 1u);
  EXPECT_EQ(phone.host.made().front()->variantOptions,
            (Dictionary{{"AssetParts", 3}, {"Version", "1.0"}}));
}

TEST_F(TransferCandidates, SystemApplicationsPlaceholderIsSkippedAlsoUncoordinated) {
  AppRecord record;
  record.applicationIdentifier = "com.system";
  record.applicationType = ApplicationTypeSystem;
  phone.appRegistry.seedPlaceholder(record);
  putEntries({install("com.system")});
  EXPECT_THAT(requested(), IsEmpty());
  EXPECT_TRUE(loggedMessage("com.system is system app placeholder - skipping"));
  EXPECT_THAT(phone.host.made(), IsEmpty());
}

/// A demoted application that the desktop wants, the one asset that begins as a placeholder.
class DemotedCandidate : public CoordinatedTransfers {
 protected:
  void SetUp() override {
    CoordinatedTransfers::SetUp();
    phone.appRegistry.seedPlaceholder("com.a", InstallType::Downgrade);
    putEntries({install("com.a")});
    // What the desktop staged under the name is not what the entry speaks of.
    stage("com.a", "Of the desktop");
  }
  static inline const std::string Container = "/var/mobile/Containers/Placeholders/com.a";
  static inline const std::string BundlePath = Container + "/com.a.app";
};

TEST_F(DemotedCandidate, TakesNameIconAndFilesFromItsOwnBundleAndContainer) {
  phone.files.putPlist(BundlePath + "/Info.plist", Dictionary{{"KBBundleDisplayName", "Alpha"},
                                                              {"KBBundleIconFile", "Icon.png"}});
  phone.files.putFile(BundlePath + "/Icon.png", "picture");
  const std::vector<SyncAssetPtr> assets = client().outstandingAssetTransfers();
  ASSERT_THAT(identifiersOf(assets), ElementsAre("com.a"));
  const SyncAsset& asset = *assets.front();
  EXPECT_EQ(asset.prettyName, "Alpha");
  EXPECT_EQ(asset.icon, FileLocation::file(IconsPath + "/com.a.png"));
  EXPECT_EQ(asset.storePlist, Container + "/HalvoMetadata.plist");
  EXPECT_EQ(asset.infoPlist, BundlePath + "/Info.plist");
  EXPECT_EQ(asset.variantOptions, (Dictionary{{"AssetParts", 1}, {"Version", "1.0"}}));
  EXPECT_TRUE(loggedMessage("Asset com.a (pretty=Alpha, version=1.0) prepped with icon " +
                            IconsPath + "/com.a.png, at " + BundlePath + ", meta at " + Container +
                            "/HalvoMetadata.plist, info at " + BundlePath +
                            "/Info.plist, storePid=0, isRestore=n"));
}

TEST_F(DemotedCandidate, WithoutAnIconTakesTheArtworkOfItsContainer) {
  const std::vector<SyncAssetPtr> assets = client().outstandingAssetTransfers();
  ASSERT_THAT(identifiersOf(assets), ElementsAre("com.a"));
  EXPECT_EQ(assets.front()->icon, FileLocation::file(Container + "/HalvoArtwork"));
  EXPECT_EQ(assets.front()->prettyName, "com.a");
}

TEST_F(DemotedCandidate, IsNoUpdateSinceOnlyItsPlaceholderIsThere) {
  EXPECT_THAT(requested(), ElementsAre("com.a"));
  EXPECT_FALSE(loggedMessage("App com.a is already installed and will be updated."));
  EXPECT_EQ(phone.trace.count("InstallCoordination.coordinatorFor(com.a, initiating, 3, create)"),
            1u);
  const auto coordinator = phone.installCoordination.coordinator("com.a");
  ASSERT_TRUE(coordinator);
  EXPECT_EQ(coordinator->state().kind, CoordinatorKind::Initiating);
}

TEST_F(CoordinatedTransfers, ARecordThatIsNotInstalledIsNoUpdate) {
  AppRecord record;
  record.applicationIdentifier = "com.a";
  record.isInstalled = false;
  phone.appRegistry.seedInstalled(record);
  stage("com.a", "Alpha");
  putEntries({install("com.a")});
  EXPECT_THAT(requested(), ElementsAre("com.a"));
  EXPECT_FALSE(loggedMessage("App com.a is already installed and will be updated."));
  const auto coordinator = phone.installCoordination.coordinator("com.a");
  ASSERT_TRUE(coordinator);
  EXPECT_EQ(coordinator->state().kind, CoordinatorKind::Initiating);
}

}  // namespace
}  // namespace appsync
