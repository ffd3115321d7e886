// What the store brings to a fake phone, through coordinators and without them.
#include <cerrno>

#include "host/transfer/shipments.h"
#include "tests/host/restore_fixture.h"

namespace appsync::host {
namespace {

using namespace testing;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::Pair;
using ::testing::SizeIs;

constexpr std::size_t ThreeChunks = 3 * PackageTransfer::ChunkSize - 8192;

/// Passes every event on and then does what a person does meanwhile.
class Watching : public Reporter {
 public:
  explicit Watching(Reporter& reporter) : reporter_(reporter) {}
  void report(const Event& event) override {
    reporter_.report(event);
    if (const auto* sent = std::get_if<TransferProgress>(&event); sent && onProgress) {
      onProgress(sent->identifier);
    }
  }
  std::function<void(const std::string&)> onProgress;

 private:
  Reporter& reporter_;
};

class StoreTest : public RestoreTest {
 protected:
  std::map<std::string, std::string> deliver(const std::set<std::string>& except = {}) {
    std::string problem;
    const Library catalogue = readLibrary(folder.path(), problem).value();
    const Phone all = hostsView.phone();
    phone.trace.clear();
    PackageSender sender(host.transfers(), all, watching, interruption);
    const ApplicationsPresent present = applicationsPresent(all, nullptr).value();
    std::set<std::string> wanted = waitingForStore(all, present);
    for (const std::string& identifier : except) wanted.erase(identifier);
    sender.send(shipmentsFromStore(host, all, present, catalogue, origin, wanted), "interrupted");
    sender.settle();
    return sender.outcome().failures;
  }
  std::vector<std::string> installed() { return phone.appRegistry.installedIdentifiers(); }
  SyncAssetPtr named(const std::string& identifier) {
    return host.makeDownload(identifier, "Application", std::nullopt);
  }

  Watching watching{reporter};
  std::optional<InstallType> origin = InstallType::StoreDownload;
};

TEST_F(StoreTest, KeepsThePromiseOfACoordinatorsPackage) {
  coordination = true;
  seedRestoring("com.a");
  offer("com.a", "1.0", ThreeChunks);
  EXPECT_THAT(deliver(), IsEmpty());
  EXPECT_THAT(installed(), ElementsAre("com.a"));
  EXPECT_THAT(
      trace(),
      ElementsAre("InstallCoordination.coordinatorFor(com.a, any, 1, look up)",
                  "phone.receive(/var/mobile/Media/Downloads/com.a.tar)",
                  "InstallCoordination.createPathTransferPromise(com.a-Asset, 1, none, 0)",
                  "InstallCoordinator.setAppAssetPromise(com.a, com.a-Asset)",
                  "DataPromise.setPercentComplete(com.a-Asset, 0.3339856490541422)",
                  "DataPromise.setPercentComplete(com.a-Asset, 0.6679712981082844)",
                  "phone.received(/var/mobile/Media/Downloads/com.a.tar, durable)",
                  "DataPromise.setPercentComplete(com.a-Asset, 1)",
                  "DataPromise.setTransferPath(com.a-Asset, /var/mobile/Media/Downloads/com.a.tar)",
                  "DataPromise.setComplete(com.a-Asset, true)"));
}

TEST_F(StoreTest, KeepsTheCoordinatorsPromiseOfASyncsPackageAsTheSync) {
  coordination = true;
  origin.reset();
  seedRestoring("com.a");
  offer("com.a");
  EXPECT_THAT(deliver(), IsEmpty());
  EXPECT_THAT(installed(), ElementsAre("com.a"));
  EXPECT_EQ(
      phone.trace.count("InstallCoordination.createPathTransferPromise(com.a-Asset, 3, none, 0)"),
      1);
}

TEST_F(StoreTest, TakesUpAPromiseThatAKilledRestoreMade) {
  coordination = true;
  seedRestoring("com.a");
  offer("com.a");
  const auto coordinator = phone.installCoordination.coordinator("com.a");
  const auto promise = phone.installCoordination.createPathTransferPromise(
      "com.a-Asset", KQClientKiosk, std::nullopt, 0);
  coordinator->setAppAssetPromise(promise, nullptr);
  EXPECT_THAT(deliver(), IsEmpty());
  EXPECT_EQ(coordinator->state().appAssetPromise, promise);
  EXPECT_THAT(phone.installCoordination.pathPromises(), SizeIs(1));
  EXPECT_THAT(installed(), ElementsAre("com.a"));
}

TEST_F(StoreTest, TellsWhyACoordinatedInstallFailed) {
  coordination = true;
  seedRestoring("com.a");
  seedRestoring("com.b");
  offer("com.a");
  offer("com.b");
  refusedByPhone.emplace("com.a", Error::withDescription("Test", 1, "damaged"));
  EXPECT_THAT(deliver(), ElementsAre(Pair("com.a", "damaged")));
  EXPECT_THAT(installed(), ElementsAre("com.b"));
}

TEST_F(StoreTest, TellsWhenThePromiseIsNotTaken) {
  coordination = true;
  seedRestoring("com.a");
  offer("com.a");
  phone.faults.failEvery("InstallCoordinator.setAppAssetPromise", Error::posix(EIO));
  EXPECT_THAT(deliver(), ElementsAre(Pair("com.a",
                                          "the phone did not install it (appsync log "
                                          "tells more)")));
  EXPECT_FALSE(phone.files.exists("/var/mobile/Media/Downloads/com.a.tar"));
}

TEST_F(StoreTest, InstallsThroughTheRegistryWithoutCoordination) {
  seedRestoring("com.a");
  offer("com.a", "1.0", ThreeChunks);
  EXPECT_THAT(deliver(), IsEmpty());
  EXPECT_THAT(installed(), ElementsAre("com.a"));
  EXPECT_THAT(trace(),
              ElementsAre("phone.receive(/var/mobile/Media/Downloads/com.a.tar)",
                          "InstallProgress.setInstallState(com.a, 1)",
                          "InstallProgress.setTotalUnitCount(com.a, 1000)",
                          "InstallProgress.setCompletedUnitCount(com.a, 333)",
                          "InstallProgress.setCompletedUnitCount(com.a, 667)",
                          "phone.received(/var/mobile/Media/Downloads/com.a.tar)",
                          "InstallProgress.setCompletedUnitCount(com.a, 1000)",
                          "AppRegistry.installApplication(/var/mobile/Media/Downloads/com.a.tar, "
                          "{KBBundleIdentifier = com.a; SWInstallType = 1; "
                          "SWPackageTypeKey = SWPackageTypeCustomer})",
                          "FileManager.removeItem(/var/mobile/Media/Downloads/com.a.tar)"));
}

TEST_F(StoreTest, InstallsASyncsPackageAsASyncs) {
  origin.reset();
  seedRestoring("com.a");
  offer("com.a");
  deliver();
  EXPECT_EQ(
      phone.trace.count("AppRegistry.installApplication(/var/mobile/Media/Downloads/com.a.tar, "
                        "{KBBundleIdentifier = com.a; "
                        "SWPackageTypeKey = SWPackageTypeCustomer})"),
      1);
}

TEST_F(StoreTest, RefusedPackageLeavesThePlaceholderAndNoFile) {
  seedRestoring("com.a");
  offer("com.a");
  phone.appRegistry.failInstall("com.a", Error::withDescription("Test", 1, "damaged"));
  EXPECT_THAT(deliver(), ElementsAre(Pair("com.a", "damaged")));
  EXPECT_THAT(phone.appRegistry.placeholderIdentifiers(), ElementsAre("com.a"));
  EXPECT_FALSE(phone.files.exists("/var/mobile/Media/Downloads/com.a.tar"));
}

TEST_F(StoreTest, BringsWhatWasAskedForAndNoDemotedApplication) {
  for (const bool coordinated : {false, true}) {
    coordination = coordinated;
    const std::string number = coordinated ? "2" : "1";
    for (const std::string kind : {"com.asked", "com.by-system", "com.by-person", "com.sync"}) {
      offer(kind + number);
    }
    seedRestoring("com.asked" + number, InstallType::StoreDownload);
    seedRestoring("com.by-system" + number, InstallType::Downgrade);
    seedRestoring("com.by-person" + number, InstallType::IntentionalDowngrade);
    seedRestoring("com.sync" + number, InstallType::Sync);
    EXPECT_THAT(deliver(), IsEmpty());
  }
  EXPECT_THAT(installed(), ElementsAre("com.asked1", "com.asked2"));
}

TEST_F(StoreTest, LeavesARestoreThatThePhoneListsAsDemoted) {
  seedRestoring("com.a");
  seedRestoring("com.b", InstallType::StoreDownload);
  offer("com.a");
  offer("com.b");
  phone.files.putPlist(
      exchange::DemotedApplications,
      PropertyList::Dictionary{{"AutomaticDowngrades", PropertyList::Array{"com.a", "com.b"}}});
  deliver();
  EXPECT_THAT(installed(), ElementsAre("com.b"));
}

TEST_F(StoreTest, BringsOnlyWhatTheCatalogueHasAndIsNotLeftOut) {
  for (const char* identifier : {"com.a", "com.b", "com.c"}) seedRestoring(identifier);
  offer("com.b");
  offer("com.c");
  EXPECT_THAT(deliver({"com.c"}), IsEmpty());
  EXPECT_THAT(installed(), ElementsAre("com.b"));
}

TEST_F(StoreTest, BringsFirstWhatThePersonAsksForFirst) {
  coordination = true;
  for (const char* identifier : {"com.a", "com.b", "com.c"}) {
    seedRestoring(identifier);
    offer(identifier, "1.0", ThreeChunks);
  }
  watching.onProgress = [&](const std::string& identifier) {
    if (identifier == "com.a") host.service().prioritizeAsset(named("com.c"), {});
  };
  deliver();
  EXPECT_THAT(reporter.lines("sent"), ElementsAre("sent com.c", "sent com.a", "sent com.b"));
}

TEST_F(StoreTest, StopsAPackageThatIsCancelledOnThePhone) {
  coordination = true;
  seedRestoring("com.a");
  seedRestoring("com.b");
  offer("com.a", "1.0", ThreeChunks);
  offer("com.b");
  watching.onProgress = [&](const std::string& identifier) {
    if (identifier == "com.a") host.service().cancelAssetAsFailed(named("com.a"));
  };
  EXPECT_THAT(deliver(), ElementsAre(Pair("com.a", "cancelled on the phone")));
  EXPECT_THAT(installed(), ElementsAre("com.b"));
  EXPECT_THAT(trace("phone.received"),
              ElementsAre("phone.received(/var/mobile/Media/Downloads/com.b.tar, durable)"));
}

TEST_F(StoreTest, InterruptionStopsWhatIsSentAndLetsWhatArrivedSettle) {
  coordination = true;
  for (const char* identifier : {"com.a", "com.b", "com.c"}) {
    seedRestoring(identifier);
    offer(identifier, "1.0", ThreeChunks);
  }
  watching.onProgress = [&](const std::string& identifier) {
    if (identifier == "com.b") interruption.request();
  };
  EXPECT_THAT(deliver(), ElementsAre(Pair("com.b", "interrupted"), Pair("com.c", "interrupted")));
  EXPECT_THAT(installed(), ElementsAre("com.a"));
  EXPECT_THAT(phone.appRegistry.placeholderIdentifiers(), ElementsAre("com.b", "com.c"));
  EXPECT_EQ(phone.installCoordination.pathPromise("com.b-Asset")->percentComplete(), 0);
}

TEST_F(StoreTest, TellsWhyAPackageCouldNotBeSent) {
  seedRestoring("com.a");
  offer("com.a");
  phone.faults.failEvery("phone.finish", Error::posix(ENOSPC));
  EXPECT_THAT(deliver(), ElementsAre(Pair("com.a", HasSubstr("could not be sent: "))));
  EXPECT_EQ(phone.appRegistry.progress("com.a")->installState(), InstallState::Paused);
}

TEST_F(StoreTest, ClaimsOnlyWhatWasAskedForOfIt) {
  seedRestoring("com.asked", InstallType::StoreDownload);
  seedRestoring("com.b");
  seedRestoring("com.without-progress", InstallType::StoreDownload);
  phone.appRegistry.dropProgress("com.without-progress");
  EXPECT_TRUE(claimDownloads(hostsView.phone(), {}, nullptr));
  EXPECT_EQ(phone.appRegistry.progress("com.asked")->installState(), InstallState::Active);
  EXPECT_EQ(phone.appRegistry.progress("com.b")->installState(), InstallState::Waiting);
}

}  // namespace
}  // namespace appsync::host
