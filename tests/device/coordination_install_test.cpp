#include <algorithm>

#include "platform/bundle.h"
#include "tests/device/coordination_test.h"

namespace appsync::device {
namespace {

using Lines = std::vector<std::string>;
constexpr std::string_view Id = "com.example.a";

class CoordinationInstallTest : public CoordinationTest {
 protected:
  ~CoordinationInstallTest() override {
    if (device) device->setWatcher(nullptr);
  }

  static void waitUntilTold(WaitingWatcher& watcher, std::size_t times) {
    while (watcher.entries().size() < times) std::this_thread::yield();
  }
  /// The placeholder is complete, promised and laid.
  void lay(InstallCoordinator& coordinator,
           const std::shared_ptr<InstallPlaceholder>& placeholder) {
    ASSERT_TRUE(placeholder->setConfigurationComplete(&error));
    ASSERT_TRUE(coordinator.setPlaceholderPromise(placeholder, &error));
    ASSERT_TRUE(recorder.waitFor("placeholder " + *coordinator.bundleIdentifier()));
  }
  /// An update of version 1.0, which is open, whose package has come.
  std::shared_ptr<InstallCoordinator> updateWhileOpen() {
    EXPECT_TRUE(installPackage(Id, "1.0") && launch(Id));
    device->setWatcher(&watcher);
    auto coordinator = prepare(Id, CoordinatorKind::Updating);
    deliver(*coordinator, Id);
    EXPECT_TRUE(watcher.waitFor("denied com.example.a"));
    return coordinator;
  }
  void expectFailure(const FileLocation& package) {
    deliver(*prepare(Id), package);
    ASSERT_TRUE(recorder.waitFor("failed com.example.a: "));
    EXPECT_EQ(registry(), Lines{});
  }

  WaitingWatcher watcher;
};

TEST_F(CoordinationInstallTest, APlaceholderStandsUntilItsPackageTakesItsPlace) {
  const auto coordinator = prepare(Id);
  ASSERT_TRUE(recorder.waitFor("placeholder"));
  EXPECT_EQ(registry(), Lines{"com.example.a 2.0 (placeholder)"});
  const auto placeholder = record(Id, true);
  ASSERT_TRUE(placeholder);
  EXPECT_EQ(placeholder->displayName, "Name of com.example.a");
  EXPECT_EQ(placeholder->installType, InstallType::Sync);
  EXPECT_EQ(textAt(*placeholder->bundlePath + "/Icon.png"), "picture of com.example.a");
  EXPECT_NE(textAt(*placeholder->bundleContainerPath + "/HalvoMetadata.plist"), "");

  const FileLocation package = stageApplication(Id);
  deliver(*coordinator, package);
  ASSERT_TRUE(recorder.waitFor("complete"));
  EXPECT_EQ(registry(), Lines{"com.example.a 2.0"});
  EXPECT_FALSE(coordinator->error());
  waitUntilIdle(Id);
  EXPECT_FALSE(device->files().fileExists(package.path)) << "the service takes the package away";
  EXPECT_EQ(live(Id), nullptr) << "what is over is not found";
  const std::string promise = std::to_string(coordinator->appAssetPromise(nullptr)->identifier());
  const Events events = recorder.events();
  ASSERT_EQ(events.size(), 4U);
  EXPECT_EQ(Events(events.begin() + 1, events.end()),
            (Events{"placeholder com.example.a", "begin " + promise, "complete com.example.a"}));
  EXPECT_TRUE(events[0].starts_with("begin ")) << "the icon's promise";
}

TEST_F(CoordinationInstallTest, WhateverComesLastSetsTheInstallGoing) {
  InstallOptions options;
  options.installType = InstallType::Sync;
  const std::vector<std::function<void(InstallCoordinator&)>> pieces = {
      [&](InstallCoordinator& coordinator) { coordinator.setInstallOptions(options, nullptr); },
      [&](InstallCoordinator& coordinator) {
        const std::string id = *coordinator.bundleIdentifier();
        coordinator.setAppAssetPromise(packagePromise(id), nullptr);
        deliver(coordinator, id);
      },
      [&](InstallCoordinator& coordinator) {
        const auto placeholder = placeholderOf(*coordinator.bundleIdentifier());
        placeholder->setConfigurationComplete(nullptr);
        coordinator.setPlaceholderPromise(placeholder, nullptr);
      },
  };
  std::vector<std::size_t> order = {0, 1, 2};
  Lines expected;
  do {
    std::string id = "com.example.order";
    for (const std::size_t piece : order) id += std::to_string(piece);
    const auto coordinator = observed(id);
    for (const std::size_t piece : order) pieces[piece](*coordinator);
    EXPECT_TRUE(recorder.waitFor("complete " + id));
    expected.push_back(id + " 2.0");
  } while (std::next_permutation(order.begin(), order.end()));
  EXPECT_EQ(registry(), expected);
}

TEST_F(CoordinationInstallTest, AnUpdateLeavesTheOldVersionUsableUntilThePackageIsIn) {
  ASSERT_TRUE(installPackage(Id, "1.0"));
  const auto coordinator = prepare(Id, CoordinatorKind::Updating);
  ASSERT_TRUE(recorder.waitFor("placeholder"));
  EXPECT_EQ(version(Id), "1.0");
  EXPECT_EQ(registry(), (Lines{"com.example.a 1.0", "com.example.a 2.0 (placeholder)"}));
  deliver(*coordinator, Id);
  ASSERT_TRUE(recorder.waitFor("complete"));
  EXPECT_EQ(registry(), Lines{"com.example.a 2.0"});
}

TEST_F(CoordinationInstallTest, ADemotedRestoreEndsWithItsPlaceholder) {
  const auto coordinator = observed(Id, CoordinatorKind::RestoringDemoted);
  lay(*coordinator, placeholderOf(Id, InstallType::IntentionalDowngrade));
  ASSERT_TRUE(recorder.waitFor("complete"));
  EXPECT_EQ(registry(), Lines{"com.example.a 2.0 (placeholder)"});
  EXPECT_EQ(record(Id, true)->installType, InstallType::IntentionalDowngrade);
  EXPECT_EQ(live(Id), nullptr);
  reopen();
  EXPECT_EQ(registry(), Lines{"com.example.a 2.0 (placeholder)"});
}

TEST_F(CoordinationInstallTest, ARestoredApplicationWaitsForTheStoreAndGetsItsDataBack) {
  putFile("/var/mobile/Media/HalvoRestore/Data/com.example.a/saved", "kept");
  const auto coordinator = observed(Id, CoordinatorKind::Restoring);
  InstallOptions options{StoreMetadata{{{"title", "A"}}}, InstallType::Restore, 1, toBytes("sinf")};
  ASSERT_TRUE(coordinator->setInstallOptions(options, nullptr));
  lay(*coordinator, placeholderOf(Id, InstallType::Restore));
  ASSERT_TRUE(coordinator->setAppAssetPromiseResponsibleClient(KQClientKiosk, nullptr));
  EXPECT_EQ(service().packagesOwedBy(KQClientKiosk), std::set<std::string>{"com.example.a"});
  EXPECT_EQ(service().packagesOwedBy(SyncHostClientID), std::set<std::string>{});

  const auto asStore =
      service().coordinatorFor(CoordinatorKind::Any, Id, KQClientKiosk, false, nullptr, nullptr);
  ASSERT_TRUE(asStore);
  EXPECT_EQ(asStore->appAssetPromiseResponsibleClient(), KQClientKiosk);
  const auto package = service().createPathTransferPromise("com.example.a-Asset", KQClientKiosk,
                                                           stageApplication(Id), 0);
  ASSERT_TRUE(asStore->setAppAssetPromise(package, nullptr));
  EXPECT_EQ(service().packagesOwedBy(KQClientKiosk), std::set<std::string>{"com.example.a"});
  package->setComplete(true);
  ASSERT_TRUE(recorder.waitFor("complete"));
  EXPECT_EQ(service().packagesOwedBy(KQClientKiosk), std::set<std::string>{});
  EXPECT_EQ(record(Id)->installType, InstallType::Restore);
  EXPECT_EQ(textAt("/var/mobile/Containers/Data/com.example.a/saved"), "kept");
}

TEST_F(CoordinationInstallTest, ADamagedPackageFailsAndLeavesTheOldVersion) {
  ASSERT_TRUE(installPackage(Id, "1.0"));
  const auto coordinator = prepare(Id, CoordinatorKind::Updating);
  ASSERT_TRUE(recorder.waitFor("placeholder"));
  putFile("/var/mobile/Media/PublicStaging/bad.pkg", "no archive");
  deliver(*coordinator, FileLocation::file("/var/mobile/Media/PublicStaging/bad.pkg"));
  ASSERT_TRUE(recorder.waitFor("failed com.example.a: "));
  EXPECT_TRUE(coordinator->error());
  EXPECT_EQ(live(Id), nullptr);
  device.reset();
  reopen(Access::ReadOnly);
  EXPECT_EQ(registry(), Lines{"com.example.a 1.0"});
  EXPECT_FALSE(device->files().fileExists("/var/mobile/Media/PublicStaging/bad.pkg"));
  EXPECT_EQ(containerCount(), 1U);
}

TEST_F(CoordinationInstallTest, APackageOfAnotherApplicationFails) {
  expectFailure(stageApplication("com.example.b"));
  EXPECT_TRUE(logMentions("The coordinated install of com.example.a failed"));
}

TEST_F(CoordinationInstallTest, APackageThatIsNotThereFails) {
  expectFailure(FileLocation::file("/var/mobile/Media/PublicStaging/missing.pkg"));
}

TEST_F(CoordinationInstallTest, ADirectoryInThePlaceOfAPackageFailsAndStays) {
  putFile("/var/mobile/Media/precious/file", "kept");
  expectFailure(FileLocation::directory("/var/mobile/Media/precious"));
  EXPECT_EQ(textAt("/var/mobile/Media/precious/file"), "kept");
}

TEST_F(CoordinationInstallTest, AFailedInstallCanBeBegunAnew) {
  expectFailure(stageApplication("com.example.b"));
  const auto again = prepare(Id);
  EXPECT_FALSE(again->error());
  deliver(*again, Id);
  ASSERT_TRUE(recorder.waitFor("complete"));
  EXPECT_EQ(registry(), Lines{"com.example.a 2.0"});
}

TEST_F(CoordinationInstallTest, APlaceholderWaitsForItsIconOrDoesWithoutACancelledOne) {
  for (const bool kept : {true, false}) {
    const std::string id = kept ? "com.example.kept" : "com.example.cancelled";
    const auto coordinator = observed(id);
    putFile("/tmp/icon-" + id, "picture");
    const auto icon = service().createPathTransferPromise(id + "-Icon", SyncHostClientID,
                                                          FileLocation::file("/tmp/icon-" + id), 7);
    const auto placeholder =
        service().createAppPlaceholder(id, id, InstallType::Sync, SyncHostClientID);
    ASSERT_TRUE(placeholder->setIconPromise(icon, nullptr));
    ASSERT_TRUE(placeholder->setConfigurationComplete(nullptr));
    ASSERT_TRUE(coordinator->setPlaceholderPromise(placeholder, nullptr));
    EXPECT_FALSE(record(id));
    kept ? icon->setComplete(true) : icon->cancel(reason, SyncHostClientID);
    ASSERT_TRUE(recorder.waitFor("placeholder " + id));
    EXPECT_EQ(device->files().fileExists(*record(id)->bundlePath + "/Icon.png"), kept);
  }
}

TEST_F(CoordinationInstallTest, AMissingIconFileIsNotedAndDoesNotStopThePlaceholder) {
  const auto coordinator = observed(Id);
  const auto placeholder = placeholderOf(Id);
  std::filesystem::remove(onDisk("/tmp/Icons/com.example.a.png"));
  lay(*coordinator, placeholder);
  EXPECT_TRUE(logMentions("The placeholder of com.example.a goes without its icon"));
}

TEST_F(CoordinationInstallTest, WhatTheInfoDictionarySaysStandsInThePlaceholder) {
  const auto coordinator = observed(Id);
  const auto placeholder =
      service().createAppPlaceholder("Shown", Id, InstallType::Sync, SyncHostClientID);
  auto attributes = PlaceholderAttributes::fromInfoDictionary(
      {{"UIPeriodixApp", true}, {std::string(KBBundleIdentifier), "com.example.other"}});
  attributes.setLaunchProhibited(true);
  ASSERT_TRUE(placeholder->setPlaceholderAttributes(attributes, nullptr));
  lay(*coordinator, placeholder);
  const auto info = Bundle::open(device->files(), FileLocation::directory(*record(Id)->bundlePath))
                        ->infoDictionary();
  EXPECT_EQ(*appsync::find(info, KBBundleIdentifier), PropertyList(Id));
  EXPECT_EQ(*appsync::find(info, KBBundleDisplayName), PropertyList("Shown"));
  EXPECT_TRUE(appsync::find(info, "SWApplicationLaunchProhibited")->booleanValue());
  EXPECT_TRUE(appsync::find(info, "UIPeriodixApp")->booleanValue());
}

TEST_F(CoordinationInstallTest, AnApplicationInTheForegroundIsUpdatedWhenItIsClosed) {
  const auto coordinator = updateWhileOpen();
  EXPECT_EQ(version(Id), "1.0");
  EXPECT_TRUE(service().isBusy(Id));
  quit(Id);
  ASSERT_TRUE(recorder.waitFor("complete"));
  EXPECT_EQ(version(Id), "2.0");
  EXPECT_EQ(watcher.entries(), (Lines{"denied com.example.a", "installed com.example.a"}))
      << "people are told once";
}

TEST_F(CoordinationInstallTest, PeopleAreToldOfEachInstallThatWaitsForItsApplication) {
  updateWhileOpen();
  ASSERT_TRUE(service().cancelInstall(Id));
  deliver(*prepare(Id, CoordinatorKind::Updating), Id);
  waitUntilTold(watcher, 2);
  EXPECT_EQ(watcher.entries(), (Lines{"denied com.example.a", "denied com.example.a"}));
}

TEST_F(CoordinationInstallTest, TheBlobOfAPlaceholderStaysWithTheApplication) {
  const auto coordinator = observed(Id);
  const auto placeholder = placeholderOf(Id);
  ASSERT_TRUE(placeholder->setSinfData(toBytes("sinf"), nullptr));
  ASSERT_TRUE(coordinator->setInstallOptions({}, nullptr));
  ASSERT_TRUE(coordinator->setAppAssetPromise(packagePromise(Id), nullptr));
  lay(*coordinator, placeholder);
  EXPECT_EQ(device->opaqueBlob(Id), toBytes("sinf"));
  deliver(*coordinator, Id);
  ASSERT_TRUE(recorder.waitFor("complete"));
  EXPECT_EQ(device->opaqueBlob(Id), toBytes("sinf"));
}

TEST_F(CoordinationInstallTest, WhenExpeditedAWaitingInstallFails) {
  updateWhileOpen();
  device->expedite();
  ASSERT_TRUE(recorder.waitFor("failed com.example.a: "));
  EXPECT_EQ(version(Id), "1.0");
  deliver(*prepare("com.example.b"), "com.example.b");
  EXPECT_TRUE(recorder.waitFor("complete com.example.b")) << "what need not wait is still done";
}

TEST_F(CoordinationInstallTest, ProgressOfThePackageShowsInTheRegistry) {
  const auto coordinator = prepare(Id);
  ASSERT_TRUE(recorder.waitFor("placeholder"));
  coordinator->appAssetPromise(nullptr)->setPercentComplete(0.4567);
  const auto progress = device->appRegistry().installProgressSync(*record(Id, true));
  ASSERT_TRUE(progress);
  EXPECT_EQ(progress->installState(), InstallState::Active);
  EXPECT_EQ(progress->completedUnitCount(), 456);
  EXPECT_EQ(progress->totalUnitCount(), 1000);
}

TEST_F(CoordinationInstallTest, OptionsReachTheApplicationThroughItsPlaceholder) {
  const auto coordinator = observed(Id);
  const auto placeholder =
      service().createAppPlaceholder("A", Id, InstallType::None, SyncHostClientID);
  lay(*coordinator, placeholder);
  const InstallOptions options{StoreMetadata{{{"DeviceBasedQLP", true}}},
                               InstallType::StoreDownload, 1, std::nullopt};
  ASSERT_TRUE(coordinator->setInstallOptions(options, nullptr));
  ASSERT_TRUE(coordinator->setAppAssetPromise(packagePromise(Id), nullptr));
  deliver(*coordinator, Id);
  ASSERT_TRUE(recorder.waitFor("complete"));
  EXPECT_EQ(record(Id)->installType, InstallType::StoreDownload);
  EXPECT_TRUE(record(Id)->isDeviceBasedAssignment);
}

}  // namespace
}  // namespace appsync::device
