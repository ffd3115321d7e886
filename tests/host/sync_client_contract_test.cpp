#include "client/apps_client.h"
#include "platform/bundle.h"
#include "tests/host/restore_fixture.h"

namespace appsync::host {
namespace {

using namespace testing;
using ::testing::UnorderedElementsAre;

enum class Kind { Fake, PlugIns };

/// What a host sees of a client: of the one that these tests take for it, and of the plug-in's.
class SyncClientContract : public ::testing::TestWithParam<Kind> {
 protected:
  bool isFake() const { return GetParam() == Kind::Fake; }
  SyncClient& client() { return isFake() ? static_cast<SyncClient&>(fake) : real; }

  static PropertyList::Dictionary entry(const std::string& identifier,
                                        const std::string& operation) {
    return {{"identifier", identifier}, {"operation", operation}, {"name", "Name"}};
  }
  /// Has the client take over a todo list of these entries.
  void reconcile(const PropertyList::Array& todo) {
    phone.files.putPlist(joinPath(exchange::StagingArea, exchange::TodoListName), todo);
    EXPECT_TRUE(client().reconcileSync(
        {}, "NEW", [](double) {}, nullptr));
  }
  /// The assets that the client asks for.
  std::map<std::string, SyncAssetPtr> asked() {
    std::map<std::string, SyncAssetPtr> assets;
    for (const SyncAssetPtr& asset : client().outstandingAssetTransfers()) {
      assets[asset->identifier] = asset;
    }
    return assets;
  }
  /// The package of "com.a" has been sent; the transfers end.
  void sendPackage() {
    reconcile({entry("com.a", "install")});
    const SyncAssetPtr asset = asked().at("com.a");
    phone.files.putFile(Package, "package");
    client().assetTransferUpdatedProgress(asset, 1);
    asset->path = "com.a.zip";
    asset->completedAssetParts = kTWAssetPartApplication;
    client().assetTransferSucceeded(asset, true, std::nullopt);
    client().assetTransferEndedWithSuccess(true);
  }
  void refusePackage(const Error& reason) {
    fake.refusedPackages.emplace("com.a", reason);
    phone.appRegistry.failInstall("com.a", reason);
  }
  std::string operationOf(const std::string& identifier) {
    const auto todo = readTodoList(phone.files, exchange::WorkArea);
    for (const TodoState& state : todo.value()) {
      if (state.identifier == identifier) return state.operation;
    }
    return "none";
  }

  static inline const std::string Package = joinPath(exchange::StagingRoot, "com.a.zip");

  fakes::FakePlatform phone;
  FakePhone::Texts waiting;
  bool coordination = false;
  RestoringClient fake{phone, phone.host, waiting, coordination};
  AppsClient real{phone.platform()};
};

TEST_P(SyncClientContract, ServesApplicationsAndBeginsASync) {
  EXPECT_EQ(client().supportedDataclasses(), std::vector<std::string>{"Application"});
  EXPECT_EQ(client().disabledAssetTypes(), std::nullopt);
  EXPECT_TRUE(client().prepareForSyncWithHostAnchor(
      client().currentSyncAnchor(), [](double) {}, nullptr));
}

TEST_P(SyncClientContract, TellsWhatHasDisappeared) {
  fake.deleted = {"com.gone"};
  phone.files.putPlist(exchange::LastSyncState, PropertyList::Array{"com.gone"});
  const PropertyList::Dictionary gone{{std::string(KBBundleIdentifier), "com.gone"}};
  EXPECT_EQ(client().installedAssets(),
            (PropertyList::Dictionary{{"_Deleted", PropertyList::Array{gone}}}));
}

TEST_P(SyncClientContract, TakesTheStagingAreaOverAndRemovesWhatIsToGo) {
  phone.appRegistry.seedInstalled("com.b");
  reconcile({entry("com.a", "install"), entry("com.b", "remove")});
  EXPECT_FALSE(phone.files.exists(exchange::StagingArea));
  EXPECT_EQ(operationOf("com.a"), "install");
  EXPECT_EQ(operationOf("com.b"), "remove");
  EXPECT_FALSE(phone.appRegistry.installed("com.b"));
}

TEST_P(SyncClientContract, AsksForThePackagesOfWhatIsToBeInstalled) {
  reconcile({entry("com.a", "install"), entry("com.b", "remove"), entry("com.c", "install")});
  std::vector<std::string> asked;
  for (const SyncAssetPtr& asset : client().outstandingAssetTransfers()) {
    asked.push_back(asset->dataclass + " " + asset->identifier);
  }
  EXPECT_THAT(asked, UnorderedElementsAre("Application com.a", "Application com.c"));
}

TEST_P(SyncClientContract, InstallsAPackageThatArrivedAndTakesItAway) {
  sendPackage();
  EXPECT_EQ(operationOf("com.a"), "INSTALLED");
  EXPECT_TRUE(phone.appRegistry.installed("com.a"));
  EXPECT_FALSE(phone.files.exists(Package));
}

TEST_P(SyncClientContract, MarksAPackageThatWasRefusedAndTakesItAway) {
  refusePackage(Error::withDescription(InstallerServiceErrorDomain, 1, "damaged"));
  sendPackage();
  EXPECT_EQ(operationOf("com.a"), "FAILED");
  EXPECT_FALSE(phone.appRegistry.installed("com.a"));
  EXPECT_FALSE(phone.files.exists(Package));
}

TEST_P(SyncClientContract, LeavesAnEntryWhosePackageDidNotComeForTheNextSync) {
  reconcile({entry("com.a", "install")});
  client().assetTransferSucceeded(asked().at("com.a"), false, Error::posix(ECANCELED));
  client().assetTransferEndedWithSuccess(false);
  client().syncEndedWithSuccess(false);
  EXPECT_EQ(operationOf("com.a"), "install");
  EXPECT_FALSE(phone.appRegistry.installed("com.a"));
}

TEST_P(SyncClientContract, MakesPlaceholdersOfARestoreListAndTakesTheListAway) {
  const auto metadata = serializePropertyList(metadataOf("com.r"), PropertyListFormat::Xml);
  phone.files.putDirectory("/var/mobile/Library/Logs/Vellum");
  phone.files.putPlist(
      exchange::RestoreList,
      PropertyList::Dictionary{
          {"com.r", PropertyList::Dictionary{{"HalvoMetadata", metadata.value()}}}});
  EXPECT_TRUE(client().reconcileRestoreOfType(2, nullptr));
  EXPECT_FALSE(phone.files.exists(exchange::RestoreList));
  const auto placeholder = phone.appRegistry.placeholder("com.r");
  ASSERT_TRUE(placeholder);
  EXPECT_EQ(placeholder->installType, InstallType::Restore);
  EXPECT_EQ(placeholder->displayName, "Name of com.r");
  EXPECT_EQ(placeholder->bundleVersion, "1.0");
}

INSTANTIATE_TEST_SUITE_P(Clients, SyncClientContract, ::testing::Values(Kind::Fake, Kind::PlugIns),
                         [](const auto& kind) {
                           return kind.param == Kind::Fake ? "Fake" : "PlugIns";
                         });

}  // namespace
}  // namespace appsync::host
