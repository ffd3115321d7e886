// What a sync finds on a fake phone.
#include "host/phone/installed_applications.h"

#include <cerrno>

#include "platform/bundle.h"
#include "tests/host/restore_fixture.h"

namespace appsync::host {
namespace {

using namespace testing;
using ::testing::ElementsAre;

class InstalledApplicationsTest : public RestoreTest {
 protected:
  std::vector<std::string> found() {
    std::vector<std::string> lines;
    const auto all = installedApplications(hostsView.phone(), problem);
    if (!all) return {problem};
    for (const auto& application : *all) {
      lines.push_back(
          application.identifier + " " + application.version +
          (application.isSystem ? " system" : "") +
          (application.isPlaceholder ? " placeholder" : "") +
          (application.isDemoted ? " demoted" : "") + (application.waits ? " waits" : "") +
          (application.isDamaged ? " damaged" : "") + (application.isUntold ? " untold" : ""));
    }
    return lines;
  }

  std::string problem;
};

TEST_F(InstalledApplicationsTest, AreOnePerIdentifierWithoutLeftOverPlaceholders) {
  phone.appRegistry.seedInstalled("com.a", "1.0");
  phone.appRegistry.seedPlaceholder("com.a", InstallType::Restore, "2.0");
  phone.appRegistry.seedPlaceholder("com.left", InstallType::Sync);
  phone.appRegistry.seedPlaceholder("com.restoring", InstallType::Restore);
  AppRecord extension;
  extension.applicationIdentifier = "com.extension";
  extension.isApplication = false;
  phone.appRegistry.seedOther(extension);
  AppRecord system;
  system.applicationIdentifier = "com.system";
  system.applicationType = ApplicationTypeSystem;
  phone.appRegistry.seedInstalled(system);
  EXPECT_THAT(found(), ElementsAre("com.a 1.0 waits", "com.restoring 1.0 placeholder waits",
                                   "com.system  system"));
}

TEST_F(InstalledApplicationsTest, EveryPlaceholderWaitsForTheHostWithoutCoordination) {
  seedRestoring("com.a", InstallType::StoreDownload);
  seedRestoring("com.b", InstallType::IntentionalDowngrade);
  seedRestoring("com.c");
  EXPECT_THAT(found(),
              ElementsAre("com.a 1.0 placeholder waits", "com.b 1.0 placeholder demoted waits",
                          "com.c 1.0 placeholder waits"));
}

TEST_F(InstalledApplicationsTest, TheClientAsksForWhatIsNotTheStoresWithCoordination) {
  coordination = true;
  seedRestoring("com.a", InstallType::StoreDownload);
  seedRestoring("com.b", InstallType::IntentionalDowngrade);
  seedRestoring("com.c");
  seedRestoring("com.d");
  auto tapped = *phone.appRegistry.recordForIdentifier("com.d", true);
  tapped.installType = InstallType::StoreDownload;
  phone.appRegistry.seedPlaceholder(tapped);
  EXPECT_THAT(found(), ElementsAre("com.a 1.0 placeholder", "com.b 1.0 placeholder demoted",
                                   "com.c 1.0 placeholder waits", "com.d 1.0 placeholder waits"));
}

TEST_F(InstalledApplicationsTest, AreDamagedWhenTheirExecutablesAreKnownToBeGone) {
  for (const std::string identifier : {"com.gone", "com.there", "com.unseen"}) {
    phone.appRegistry.seedInstalled(identifier);
    const auto bundle = *phone.appRegistry.recordForIdentifier(identifier, false)->bundlePath;
    phone.files.putPlist(bundle + "/Info.plist",
                         PropertyList::Dictionary{{std::string(KBBundleExecutable), "run"}});
    if (identifier == "com.there") phone.files.putFile(bundle + "/run", "");
    if (identifier == "com.unseen") {
      phone.faults.failWhere("FileManager.attributesOfItem", bundle + "/run", Error::posix(EMFILE));
    }
  }
  EXPECT_THAT(found(), ElementsAre("com.gone 1.0 damaged", "com.there 1.0", "com.unseen 1.0"));
}

TEST_F(InstalledApplicationsTest, AreUntoldWhenTheTodoListKnowsOnlyOfTheirPackages) {
  phone.appRegistry.seedInstalled("com.a");
  phone.appRegistry.seedInstalled("com.b");
  seedRestoring("com.c");
  putTodo({{"com.a", "DOWNLOADED"}, {"com.b", "INSTALLED"}, {"com.c", "DOWNLOADED"}});
  EXPECT_THAT(found(), ElementsAre("com.a 1.0 untold", "com.b 1.0", "com.c 1.0 placeholder waits"));
}

TEST_F(InstalledApplicationsTest, AreNotToldWhenItCannotBeSeenWhatIsDemoted) {
  seedRestoring("com.a");
  phone.files.putPlist(exchange::DemotedApplications, PropertyList::Dictionary{});
  phone.faults.failWhere("FileManager.contentsAtPath", exchange::DemotedApplications,
                         Error::posix(EMFILE));
  EXPECT_THAT(found(), ElementsAre("the phone's list of demoted applications could not be looked "
                                   "at: Too many open files"));
}

TEST_F(InstalledApplicationsTest, AreNotToldWhenTheRegistryCannotBeRead) {
  phone.appRegistry.seedInstalled("com.a", "1.0");
  phone.faults.failEvery("phone.applications", Error::posix(EMFILE));
  EXPECT_THAT(found(), ElementsAre("the phone's applications cannot be told: Too many open files"));
}

}  // namespace
}  // namespace appsync::host
