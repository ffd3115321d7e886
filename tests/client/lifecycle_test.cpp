// What a client does when it is made and when it goes, and the small answers that it gives.
#include <array>
#include <atomic>
#include <thread>
#include <tuple>

#include "tests/client/client_test.h"

namespace appsync {
namespace {

using testing::ElementsAre;

constexpr std::string_view Startup = "com.corvane.twc.TWStartupCompleteNotification";

class Lifecycle : public ClientTest {};

TEST_F(Lifecycle, ConstructionInTheSyncHostRegistersEverythingInOrder) {
  const AppsClient made(phone.platform());
  expectTrace({"AppRegistry.addObserver()",
               "TransactionLog.initializeWithLog(com.corvane.appinstallation, twc.appsync)",
               "InstallCoordination.coordinationIsEnabled()", "SyncHost.mainBundleIdentifier()",
               "SystemNotifier.addObserver(com.corvane.twc.TWStartupCompleteNotification)"},
              fakes::TraceAll);
}

TEST_F(Lifecycle, ConstructionInAnotherProcessDoesNotWaitForTheStartUpNotification) {
  phone.host.setMainBundleIdentifier("com.corvane.tool");
  const AppsClient made(phone.platform());
  expectTrace({"AppRegistry.addObserver()",
               "TransactionLog.initializeWithLog(com.corvane.appinstallation, twc.appsync)"});
}

TEST_F(Lifecycle, TeardownInTheSyncHostUndoesTheRegistrationsInOrder) {
  client();
  destroyClient();
  expectTrace({"AppRegistry.removeObserver()",
               "SystemNotifier.removeObserver(com.corvane.twc.TWStartupCompleteNotification)"});
  EXPECT_EQ(phone.appRegistry.observerCount(), 0u);
  EXPECT_EQ(phone.notifier.observerCount(Startup), 0u);
}

TEST_F(Lifecycle, TeardownInAnotherProcessRemovesNoStartUpRegistration) {
  phone.host.setMainBundleIdentifier("com.corvane.tool");
  client();
  destroyClient();
  expectTrace({"AppRegistry.removeObserver()"});
  EXPECT_EQ(phone.appRegistry.observerCount(), 0u);
}

TEST_F(Lifecycle, TeardownWithCoordinationOnAlsoLeavesTheCoordinators) {
  phone.installCoordination.setEnabled(true);
  client();
  destroyClient();
  expectTrace({"AppRegistry.removeObserver()",
               "SystemNotifier.removeObserver(com.corvane.twc.TWStartupCompleteNotification)",
               "InstallCoordination.removeObserver()"});
}

class AlmostTheSyncHost : public ClientTest, public testing::WithParamInterface<const char*> {};

TEST_P(AlmostTheSyncHost, IsAnotherProcess) {
  phone.host.setMainBundleIdentifier(GetParam());
  client();
  EXPECT_EQ(phone.notifier.observerCount(Startup), 0u);
  phone.notifier.post(Startup);
  EXPECT_EQ(phone.installCoordination.listenerCount(), 0u);
}

TEST_P(AlmostTheSyncHost, IsAnotherProcessAtTheEndOfTheClientToo) {
  phone.host.setMainBundleIdentifier(GetParam());
  client();
  destroyClient();
  expectTrace({"AppRegistry.removeObserver()"});
}

INSTANTIATE_TEST_SUITE_P(Identifiers, AlmostTheSyncHost,
                         testing::Values("", "com.corvane", "com.corvane.twc2", "com.corvane.TWC",
                                         " com.corvane.twc", "com.corvane.twc "));

TEST_F(Lifecycle, TheStartUpNotificationSetsUpTheCoordinatorEventListener) {
  client();
  EXPECT_EQ(phone.installCoordination.listenerCount(), 0u);
  phone.notifier.post(Startup);
  expectTrace(
      {"SystemNotifier.post(com.corvane.twc.TWStartupCompleteNotification)",
       "InstallCoordination.createEventListener(com.corvane.twc.ipx.icappobserverdelegate, (3))"});
  EXPECT_EQ(phone.installCoordination.listenerCount(), 1u);
}

TEST_F(Lifecycle, PostingTheStartUpNotificationAgainMakesNoSecondListener) {
  client();
  phone.notifier.post(Startup);
  phone.notifier.post(Startup);
  EXPECT_EQ(phone.installCoordination.listenerCount(), 1u);
}

TEST_F(Lifecycle, TeardownEndsTheCoordinatorEventListener) {
  client();
  phone.notifier.post(Startup);
  destroyClient();
  EXPECT_EQ(phone.installCoordination.listenerCount(), 0u);
}

/// Sees how many listeners there still are when the client leaves the coordinators.
class WatchfulCoordination : public fakes::FakeInstallCoordination {
 public:
  using FakeInstallCoordination::FakeInstallCoordination;
  void removeObserver(CoordinatorObserver* observer) noexcept override {
    listenersLeft = listenerCount();
    FakeInstallCoordination::removeObserver(observer);
  }

  std::optional<std::size_t> listenersLeft;
};

TEST_F(Lifecycle, TeardownEndsTheListenerBeforeItLeavesTheCoordinators) {
  WatchfulCoordination coordination(phone.trace, phone.faults, phone.appRegistry);
  coordination.setEnabled(true);
  {
    const AppsClient made(with(phone.platform(), coordination));
    phone.notifier.post(Startup);
    EXPECT_EQ(coordination.listenerCount(), 1u);
  }
  EXPECT_EQ(coordination.listenersLeft, 0u);
}

/// Keeps the callback that it is given.
class RememberingNotifier : public SystemNotifier {
 public:
  Registration registerCheck(std::string_view) noexcept override { return {}; }
  void setState(int, std::uint64_t) noexcept override {}
  void post(std::string_view) noexcept override {}
  void addObserver(void*, std::string_view, Callback given) noexcept override { callback = given; }
  void removeObserver(void*, std::string_view) noexcept override {}

  Callback callback = nullptr;
};

TEST_F(Lifecycle, TheStartUpHandlerToleratesAMissingObserver) {
  RememberingNotifier notifier;
  const AppsClient made(with(phone.platform(), notifier));
  ASSERT_NE(notifier.callback, nullptr);
  notifier.callback(nullptr);
  EXPECT_EQ(phone.installCoordination.listenerCount(), 0u);
}

TEST_F(Lifecycle, WhetherInstallsAreCoordinatedIsAskedOnlyOnce) {
  client();
  phone.installCoordination.setEnabled(true);
  phone.appRegistry.seedPlaceholder("com.a");
  EXPECT_NE(client()._progressForAssetIdentifier("com.a"), nullptr);
  EXPECT_EQ(phone.trace.count("InstallCoordination.coordinationIsEnabled"), 0u);
}

TEST_F(Lifecycle, ServesTheDataclassOfApplications) {
  EXPECT_THAT(client().supportedDataclasses(), ElementsAre("Application"));
  expectTrace({}, fakes::TraceAll);
}

TEST_F(Lifecycle, TheAnchorIsTheSameWhateverTheHostRemembers) {
  EXPECT_EQ(client().currentSyncAnchor(), "NO_APP_SYNC_ANCHOR");
  std::optional<Error> error;
  EXPECT_TRUE(client().prepareForSyncWithHostAnchor("2026-01-31", nullptr, &error));
  EXPECT_EQ(error, std::nullopt);
  EXPECT_EQ(client().currentSyncAnchor(), "NO_APP_SYNC_ANCHOR");
  expectTrace({}, fakes::TraceAll);
}

TEST_F(Lifecycle, PreparingForASyncNeverReportsProgress) {
  bool called = false;
  EXPECT_TRUE(client().prepareForSyncWithHostAnchor(
      "", [&called](double) { called = true; }, nullptr));
  EXPECT_FALSE(called);
}

class DisabledAssetTypes
    : public ClientTest,
      public testing::WithParamInterface<std::tuple<PolicyValue, PolicyValue>> {};

TEST_P(DisabledAssetTypes, NamesApplicationsOnlyWhenInstallingAndRemovingAreBothForbidden) {
  const auto [installing, removing] = GetParam();
  phone.policy.set(PolicySetting::AppInstallationAllowed, installing);
  phone.policy.set(PolicySetting::AppRemovalAllowed, removing);
  const bool mayInstall = installing != PolicyValue::ExplicitlyNo;
  const bool mayRemove = removing != PolicyValue::ExplicitlyNo;
  EXPECT_EQ(client()._appInstallationAllowed(), mayInstall);
  EXPECT_EQ(client()._appRemovalAllowed(), mayRemove);
  const std::set<std::string> all{"Application"};
  EXPECT_EQ(client().disabledAssetTypes(),
            mayInstall || mayRemove ? std::nullopt : std::optional(all));
}

constexpr std::array EveryPolicyValue{PolicyValue::NotSet, PolicyValue::Yes,
                                      PolicyValue::ExplicitlyNo};
INSTANTIATE_TEST_SUITE_P(EveryCombination, DisabledAssetTypes,
                         testing::Combine(testing::ValuesIn(EveryPolicyValue),
                                          testing::ValuesIn(EveryPolicyValue)));

TEST_F(Lifecycle, RestrictionsThatWereNeverSetDisableNothing) {
  EXPECT_EQ(client().disabledAssetTypes(), std::nullopt);
  expectTrace({"DevicePolicy.effectiveBoolValue(AppInstallationAllowed)"}, fakes::TraceAll);
}

TEST_F(Lifecycle, RemovalIsAskedAboutOnlyWhenInstallingIsForbidden) {
  phone.policy.forbidInstalling();
  EXPECT_EQ(client().disabledAssetTypes(), std::nullopt);
  expectTrace({"DevicePolicy.effectiveBoolValue(AppInstallationAllowed)",
               "DevicePolicy.effectiveBoolValue(AppRemovalAllowed)"},
              fakes::TraceAll);
}

class InstallAttempts : public ClientTest {
 protected:
  SyncAssetPtr packageOf(const std::string& identifier) {
    auto asset = std::make_shared<SyncAsset>();
    asset->identifier = identifier;
    asset->path = StagingRootPath + "/" + identifier + ".zip";
    phone.files.putFile(*asset->path, "package");
    return asset;
  }
};

TEST_F(InstallAttempts, AreCountedUntilTheyAreRead) {
  client()._performAssetInstall(packageOf("com.a"));
  client()._performAssetInstall(packageOf("com.b"));
  EXPECT_EQ(client()._getAndResetNumAppInstallsAttempted(), 2u);
}

TEST_F(InstallAttempts, AreZeroWhenReadTwiceWithNoInstallBetween) {
  EXPECT_EQ(client()._getAndResetNumAppInstallsAttempted(), 0u);
  client()._performAssetInstall(packageOf("com.a"));
  EXPECT_EQ(client()._getAndResetNumAppInstallsAttempted(), 1u);
  EXPECT_EQ(client()._getAndResetNumAppInstallsAttempted(), 0u);
}

TEST_F(InstallAttempts, LoseNoCountBetweenAReadAndItsReset) {
  constexpr std::uint32_t Installs = 50;
  for (int round = 0; round < 40; ++round) {
    client();
    forgetTrace();
    std::atomic<bool> installing = true;
    std::thread installer([this, &installing] {
      const SyncAssetPtr asset = packageOf("com.a");
      for (std::uint32_t i = 0; i < Installs; ++i) client()._performAssetInstall(asset);
      installing = false;
    });
    // Read without a pause, so that many an install ends between the halves of a read, if it has
    // any.
    std::uint32_t counted = 0;
    while (installing) counted += client()._getAndResetNumAppInstallsAttempted();
    installer.join();
    counted += client()._getAndResetNumAppInstallsAttempted();
    EXPECT_EQ(counted, Installs);
  }
}

}  // namespace
}  // namespace appsync
