#include <future>
#include <latch>

#include "tests/device/coordination_test.h"

namespace appsync::device {
namespace {

using Lines = std::vector<std::string>;
constexpr std::string_view Id = "com.example.a";

class CoordinationObjectsTest : public CoordinationTest {
 protected:
  std::optional<Error> uninstall(std::string_view identifier) {
    std::promise<std::optional<Error>> told;
    service().uninstallApp(identifier, false,
                           [&](const std::optional<Error>& outcome) { told.set_value(outcome); });
    return told.get_future().get();
  }
  std::string text() { return error ? error->localizedDescription() : "no error"; }
};

TEST_F(CoordinationObjectsTest, OneCoordinatorIsLivePerApplicationWhoeverMadeItAndOfWhateverKind) {
  EXPECT_TRUE(service().coordinationIsEnabled());
  bool created = true;
  EXPECT_FALSE(service().coordinatorFor(CoordinatorKind::Updating, Id, SyncHostClientID, false,
                                        &created, &error));
  EXPECT_FALSE(created);
  EXPECT_FALSE(error);
  EXPECT_FALSE(
      service().coordinatorFor(CoordinatorKind::Any, Id, SyncHostClientID, true, nullptr, &error));
  const auto stores = service().coordinatorFor(CoordinatorKind::Restoring, Id, KQClientKiosk, true,
                                               &created, &error);
  ASSERT_TRUE(stores) << text();
  EXPECT_TRUE(created);
  for (const CoordinatorKind kind :
       {CoordinatorKind::Any, CoordinatorKind::Initiating, CoordinatorKind::Restoring}) {
    EXPECT_EQ(service().coordinatorFor(kind, Id, SyncHostClientID, true, &created, &error), stores);
    EXPECT_FALSE(created);
  }
  EXPECT_EQ(stores->creatorIdentifier(), KQClientKiosk);
}

TEST_F(CoordinationObjectsTest, WhatNoApplicationCanBeCalledIsRefused) {
  for (const std::string_view bad : {"", "../com.a", "a/b", "..", "a b"}) {
    error.reset();
    EXPECT_FALSE(service().coordinatorFor(CoordinatorKind::Initiating, bad, SyncHostClientID, true,
                                          nullptr, &error));
    EXPECT_TRUE(error) << bad;
    EXPECT_FALSE(service().createAppPlaceholder("A", bad, InstallType::Sync, SyncHostClientID));
    EXPECT_TRUE(uninstall(bad)) << bad;
    EXPECT_FALSE(service().tap(bad));
  }
}

TEST_F(CoordinationObjectsTest, PromisesThatCannotBeKeptAreRefused) {
  const auto coordinator = coordinatorFor(Id);
  EXPECT_FALSE(coordinator->setAppAssetPromise(nullptr, &error));
  EXPECT_EQ(text(), "the package promise is missing");
  EXPECT_FALSE(coordinator->setUserDataPromise(nullptr, &error));
  EXPECT_FALSE(coordinator->setInitialQPKAssetPromises({nullptr}, &error));
  EXPECT_FALSE(coordinator->setPlaceholderPromise(nullptr, &error));

  const auto cancelled = packagePromise(Id);
  cancelled->cancel(reason, SyncHostClientID);
  EXPECT_FALSE(coordinator->setAppAssetPromise(cancelled, &error));
  EXPECT_EQ(text(), "the promise has been cancelled or is settled");

  const auto shared = packagePromise(Id);
  ASSERT_TRUE(coordinatorFor("com.example.b")->setAppAssetPromise(shared, nullptr));
  EXPECT_FALSE(coordinator->setAppAssetPromise(shared, &error));
  EXPECT_EQ(text(), "the promise is made to com.example.b already");

  EXPECT_FALSE(coordinator->setPlaceholderPromise(completePlaceholder("com.example.b"), &error));
  EXPECT_EQ(text(), "the placeholder is one of com.example.b, not of com.example.a");
  const auto given = placeholderOf(Id);
  given->cancel(reason, SyncHostClientID);
  EXPECT_FALSE(coordinator->setPlaceholderPromise(given, &error));
  EXPECT_FALSE(coordinator->hasAppAssetPromise());
  EXPECT_FALSE(coordinator->hasPlaceholderPromise());
}

TEST_F(CoordinationObjectsTest, ObjectsOfAnotherServiceAreRefused) {
  const auto old = packagePromise(Id);
  reopen();
  EXPECT_FALSE(coordinatorFor(Id)->setAppAssetPromise(old, &error));
  EXPECT_EQ(text(), "the package promise is none of this service's");
}

TEST_F(CoordinationObjectsTest, ASecondPlaceholderCannotTakeTheFirstOnesPlace) {
  const auto coordinator = prepare(Id);
  ASSERT_TRUE(recorder.waitFor("placeholder"));
  EXPECT_FALSE(coordinator->setPlaceholderPromise(completePlaceholder(Id), &error));
  EXPECT_EQ(text(), "com.example.a has its placeholder already");
}

TEST_F(CoordinationObjectsTest, ValuesThatNoPropertyListHoldsAreRefused) {
  const auto coordinator = coordinatorFor(Id);
  InstallOptions options{StoreMetadata{{{"bad", PropertyList::null()}}}, InstallType::Sync, 1, {}};
  EXPECT_FALSE(coordinator->setInstallOptions(options, &error));
  EXPECT_FALSE(coordinator->hasInstallOptions());
  const auto placeholder = placeholderOf(Id);
  EXPECT_FALSE(placeholder->setMetadata({{{"bad", PropertyList::null()}}}, &error));
  EXPECT_FALSE(placeholder->setPlaceholderAttributes(
      PlaceholderAttributes::fromInfoDictionary({{"bad", PropertyList::null()}}), &error));
}

TEST_F(CoordinationObjectsTest, AFractionOutsideItsRangeIsBroughtIntoIt) {
  const auto promise = packagePromise(Id);
  promise->setPercentComplete(7);
  EXPECT_EQ(promise->percentComplete(), 1.0);
  promise->setPercentComplete(-1);
  EXPECT_EQ(promise->percentComplete(), 0);
  promise->setPercentComplete(std::numeric_limits<double>::quiet_NaN());
  EXPECT_EQ(promise->percentComplete(), 0);
}

TEST_F(CoordinationObjectsTest, ACancelledPackagePromiseOrPlaceholderTakesItsCoordinatorAlong) {
  const auto first = prepare(Id);
  first->appAssetPromise(nullptr)->cancel(reason, KQClientKiosk);
  EXPECT_TRUE(recorder.waitFor("canceled com.example.a by 1"));
  EXPECT_EQ(first->error(), reason);
  const auto second = coordinatorFor("com.example.b");
  second->setObserver(&recorder);
  const auto placeholder = completePlaceholder("com.example.b");
  ASSERT_TRUE(second->setPlaceholderPromise(placeholder, nullptr));
  EXPECT_TRUE(placeholder->cancel(reason, KQClientKiosk));
  EXPECT_TRUE(recorder.waitFor("canceled com.example.b by 1"));
  waitUntilIdle(Id);
  EXPECT_EQ(registry(), Lines{});
}

TEST_F(CoordinationObjectsTest, WhatIsOverTakesNoMoreChanges) {
  const auto coordinator = prepare(Id);
  const auto promise = coordinator->appAssetPromise(nullptr);
  ASSERT_TRUE(coordinator->cancel(reason, SyncHostClientID));
  promise->setPercentComplete(0.5);
  promise->setComplete(true);
  promise->setTransferPath(stageApplication(Id));
  EXPECT_EQ(promise->percentComplete(), 0);
  EXPECT_FALSE(promise->isComplete());
  EXPECT_FALSE(promise->transferPath());
  EXPECT_FALSE(coordinator->setAppAssetPromiseResponsibleClient(KQClientKiosk, &error));
  EXPECT_EQ(text(), "the install is over");
  EXPECT_EQ(coordinator->appAssetPromiseResponsibleClient(), 0U);
  EXPECT_EQ(coordinator->bundleIdentifier(), Id);
  EXPECT_TRUE(coordinator->hasInstallOptions()) << "the last values stay readable";
  waitUntilIdle(Id);
  EXPECT_EQ(registry(), Lines{});
}

TEST_F(CoordinationObjectsTest, ACancelledInstallLosesThePackageThatHasCome) {
  ASSERT_TRUE(installPackage(Id, "1.0"));
  ASSERT_TRUE(launch(Id));
  WaitingWatcher watcher;
  device->setWatcher(&watcher);
  const auto coordinator = prepare(Id, CoordinatorKind::Updating);
  const FileLocation package = stageApplication(Id);
  deliver(*coordinator, package);
  ASSERT_TRUE(watcher.waitFor("denied com.example.a"));
  ASSERT_TRUE(service().cancelInstall(Id));
  EXPECT_EQ(registry(), Lines{"com.example.a 1.0"});
  EXPECT_FALSE(device->files().fileExists(package.path));
  device->setWatcher(nullptr);
}

TEST_F(CoordinationObjectsTest, ObjectsOutliveTheService) {
  const auto coordinator = prepare(Id);
  const auto promise = coordinator->appAssetPromise(nullptr);
  const auto data = service().createOutOfBandTransferPromise("data", SyncHostClientID, 0);
  const auto placeholder = placeholderOf(Id);
  auto listener = service().createEventListener("com.corvane.test", {SyncHostClientID}, recorder);
  device.reset();
  promise->setComplete(true);
  data->cancel(reason, SyncHostClientID);
  coordinator->setObserver(nullptr);
  EXPECT_FALSE(coordinator->setInstallOptions({}, &error));
  EXPECT_EQ(text(), "the coordination service has ended");
  error.reset();
  EXPECT_FALSE(placeholder->setConfigurationComplete(&error));
  EXPECT_EQ(text(), "the coordination service has ended");
  EXPECT_FALSE(placeholder->cancel(reason, SyncHostClientID));
  EXPECT_FALSE(coordinator->cancel(reason, SyncHostClientID));
  listener.reset();
  EXPECT_EQ(promise->name(), "com.example.a-Asset");
  EXPECT_FALSE(promise->isComplete());
  EXPECT_EQ(data->percentComplete(), 0);
  EXPECT_EQ(coordinator->bundleIdentifier(), Id);
  EXPECT_EQ(coordinator->creatorIdentifier(), SyncHostClientID);
  EXPECT_FALSE(coordinator->appAssetPromise(nullptr));
  EXPECT_FALSE(coordinator->error());
  EXPECT_EQ(placeholder->bundleIdentifier(), Id);
}

TEST_F(CoordinationObjectsTest, UninstallingTakesAnApplicationOrOnlyThePlaceholderLaidOverIt) {
  ASSERT_TRUE(installPackage(Id, "1.0"));
  const auto coordinator = prepare(Id, CoordinatorKind::Updating);
  ASSERT_TRUE(recorder.waitFor("placeholder"));
  EXPECT_FALSE(uninstall(Id));
  EXPECT_EQ(registry(), Lines{"com.example.a 1.0"});
  EXPECT_EQ(live(Id), nullptr) << "the install is over with its placeholder";
  EXPECT_TRUE(recorder.waitFor("canceled com.example.a by 16"));
  EXPECT_FALSE(uninstall(Id));
  EXPECT_EQ(registry(), Lines{});
  const auto failure = uninstall(Id);
  ASSERT_TRUE(failure);
  EXPECT_EQ(failure->code, ENOENT);
}

TEST_F(CoordinationObjectsTest, UninstallingEndsAnInstallOfWhichNothingIsThereYet) {
  const auto coordinator = coordinatorFor(Id);
  EXPECT_FALSE(uninstall(Id));
  EXPECT_TRUE(coordinator->error());
}

TEST_F(CoordinationObjectsTest, AnUninstallIsToldAboutEvenWhenTheDeviceIsClosed) {
  ASSERT_TRUE(installPackage(Id, "1.0"));
  int told = 0;
  service().uninstallApp(Id, false,
                         [&](const std::optional<Error>& outcome) { told += outcome ? 100 : 1; });
  device.reset();
  EXPECT_EQ(told, 1);
  reopen();
  EXPECT_EQ(registry(), Lines{});
}

TEST_F(CoordinationObjectsTest, TheDeviceIsBusyUntilACompletionHasReturned) {
  ASSERT_TRUE(installPackage(Id, "1.0"));
  std::latch called(1);
  std::latch released(1);
  service().uninstallApp(Id, false, [&](const std::optional<Error>&) {
    called.count_down();
    released.wait();
  });
  called.wait();
  EXPECT_EQ(device->busyAmong({std::string(Id)}), std::set<std::string>{std::string(Id)});
  released.count_down();
  waitUntilIdle(Id);
}

TEST_F(CoordinationObjectsTest, APersonWhoUninstallsEndsTheInstall) {
  prepare(Id);
  ASSERT_TRUE(recorder.waitFor("placeholder"));
  ASSERT_TRUE(device->uninstall(Id, &error)) << text();
  EXPECT_TRUE(recorder.waitFor("canceled com.example.a by 15"));
  EXPECT_EQ(live(Id), nullptr);
}

TEST_F(CoordinationObjectsTest, ARestoreThatThePersonCancelsIsGoneWithWhatItHadForTheApplication) {
  putFile("/var/mobile/Media/HalvoRestore/Data/com.example.a/saved", "old");
  const auto coordinator = coordinatorFor(Id, CoordinatorKind::Restoring);
  coordinator->setObserver(&recorder);
  ASSERT_TRUE(
      coordinator->setPlaceholderPromise(completePlaceholder(Id, InstallType::Restore), nullptr));
  ASSERT_TRUE(recorder.waitFor("placeholder"));
  DeviceError problem;
  EXPECT_TRUE(EmbeddedDevice::cancel(folder, Id, problem, &error)) << text();
  EXPECT_EQ(registry(), Lines{});
  EXPECT_FALSE(device->files().fileExists("/var/mobile/Media/HalvoRestore/Data/com.example.a"));
}

TEST_F(CoordinationObjectsTest, ARegistryThatCannotBeReadCostsNoWaitingDataAndThePersonIsToldSo) {
  const std::string data = "/var/mobile/Media/HalvoRestore/Data/com.example.a/saved";
  putFile(data, "old");
  const auto coordinator = coordinatorFor(Id, CoordinatorKind::Restoring);
  coordinator->setObserver(&recorder);
  ASSERT_TRUE(
      coordinator->setPlaceholderPromise(completePlaceholder(Id, InstallType::Restore), nullptr));
  ASSERT_TRUE(recorder.waitFor("placeholder"));
  waitUntilIdle(Id);  // the event that was delivered is still being taken out
  SQLite::Database database((folder / "device.db").string(), SQLite::OPEN_READWRITE);
  database.exec("ALTER TABLE applications RENAME TO hidden");
  DeviceError problem;
  EXPECT_FALSE(EmbeddedDevice::cancel(folder, Id, problem, &error));
  EXPECT_EQ(text().find("is not being installed"), std::string::npos) << text();
  EXPECT_EQ(textAt(data), "old");
  error.reset();
  EXPECT_FALSE(EmbeddedDevice::cancel(folder, "com.example.b", problem, &error));
  EXPECT_EQ(text().find("is not being installed"), std::string::npos) << text();
  error.reset();
  EXPECT_FALSE(EmbeddedDevice::tap(folder, "com.example.b", problem, &error));
  EXPECT_EQ(text().find("is not being installed"), std::string::npos) << text();
}

TEST_F(CoordinationObjectsTest, ATapOfADemotedApplicationThatASyncBringsAsksForItToo) {
  ASSERT_TRUE(installPackage(Id, "1.0"));
  putFile("/var/mobile/Containers/Data/com.example.a/saved", "kept");
  ASSERT_TRUE(device->demote(Id, &error)) << text();
  prepare(Id);
  ASSERT_TRUE(recorder.waitFor("placeholder"));
  DeviceError problem;
  EXPECT_TRUE(EmbeddedDevice::tap(folder, Id, problem, &error)) << text();
  EXPECT_TRUE(recorder.waitFor("prioritize"));
  EXPECT_EQ(record(Id, true)->installType, InstallType::StoreDownload);
  EXPECT_TRUE(EmbeddedDevice::cancel(folder, Id, problem, &error)) << text();
  EXPECT_EQ(record(Id, true)->installType, InstallType::IntentionalDowngrade);
  EXPECT_EQ(textAt("/var/mobile/Containers/Data/com.example.a/saved"), "kept");
}

TEST_F(CoordinationObjectsTest, AnErrorForThePersonCarriesItsCauseAndSurvivesTheStore) {
  const Error shown = service().createUserPresentableError(1, 2, reason);
  EXPECT_EQ(shown.domain, TWErrorDomain);
  EXPECT_EQ(shown.code, 1);
  ASSERT_TRUE(shown.underlying);
  EXPECT_EQ(*shown.underlying, reason);
  EXPECT_FALSE(service().createUserPresentableError(1, 0, std::nullopt).underlying);
  const auto coordinator = coordinatorFor(Id);
  ASSERT_TRUE(coordinator->cancel(shown, SyncHostClientID));
  EXPECT_EQ(coordinator->error(), shown);
  Error odd = Error::withDescription(TWErrorDomain, 5, "odd");
  odd.userInfo.emplace("null", PropertyList::null());
  const auto other = coordinatorFor("com.example.b");
  ASSERT_TRUE(other->cancel(odd, SyncHostClientID));
  EXPECT_EQ(other->error(), Error::withDescription(TWErrorDomain, 5, "odd"));
}

}  // namespace
}  // namespace appsync::device
