// A client that goes while transfers, installs or retries are under way.
#include <thread>

#include "tests/client/client_test.h"

namespace appsync {
namespace {

using namespace std::chrono_literals;

class Teardown : public ClientTest {
 protected:
  SyncAssetPtr packageOf(const std::string& identifier) {
    auto asset = std::make_shared<SyncAsset>();
    asset->identifier = identifier;
    asset->path = StagingRootPath + "/" + identifier + ".zip";
    phone.files.putFile(*asset->path, "package");
    return asset;
  }
};

TEST_F(Teardown, WithOutstandingTransfersOnlySaysSo) {
  client().assetTransferUpdatedProgress(packageOf("com.a"), 0.5);
  client().assetTransferUpdatedProgress(packageOf("com.b"), 0.25);
  client().assetTransferUpdatedProgress(packageOf("com.b"), 0.75);
  forgetTrace();
  destroyClient();
  expectTrace(
      {"log error SyncBundle|<AppsClient> getting dealloc'd with 2 outstanding XFT "
       "transfers!",
       "AppRegistry.removeObserver()",
       "SystemNotifier.removeObserver(com.corvane.twc.TWStartupCompleteNotification)"});
}

TEST_F(Teardown, AfterEveryTransferEndedSaysNothing) {
  const SyncAssetPtr asset = packageOf("com.a");
  client().assetTransferUpdatedProgress(asset, 0.5);
  client().assetTransferSucceeded(asset, true, std::nullopt);
  client().assetTransferEndedWithSuccess(true);
  forgetTrace();
  destroyClient();
  expectTrace({}, fakes::TraceLog);
}

TEST_F(Teardown, LetsARunningInstallFinishBeforeAnythingIsTakenDown) {
  putTodo({{"com.a", "DOWNLOADED"}});
  phone.appRegistry.blockInstalls();
  client()._enqueueAssetInstall(packageOf("com.a"));
  ASSERT_TRUE(phone.appRegistry.waitForInstalls(1));
  forgetTrace();

  std::thread destroying([this] { destroyClient(); });
  phone.appRegistry.releaseInstalls();
  destroying.join();

  EXPECT_EQ(todoOperation("com.a"), "INSTALLED");
  expectTrace({"log default SyncBundle|com.a install succeeded",
               "log default SyncBundle|Changing com.a from DOWNLOADED to INSTALLED",
               "FileManager.writeAtomically(" + TodoListPath + ")",
               "TerminationAssertion.release(com.a)",
               "FileManager.removeItem(/var/mobile/Media/PublicStaging/com.a.zip)",
               "log default SyncBundle|Finished install for com.a", "AppRegistry.removeObserver()",
               "SystemNotifier.removeObserver(com.corvane.twc.TWStartupCompleteNotification)"});
}

TEST_F(Teardown, LetsInstallsThatWaitForAPlaceRunToo) {
  constexpr int Many = 14;
  phone.appRegistry.blockInstalls();
  for (int i = 0; i < Many; ++i) {
    client()._enqueueAssetInstall(packageOf("com." + std::to_string(i)));
  }
  ASSERT_TRUE(phone.appRegistry.waitForInstalls(10));

  std::thread destroying([this] { destroyClient(); });
  phone.appRegistry.releaseInstalls();
  destroying.join();

  EXPECT_EQ(phone.appRegistry.installedIdentifiers().size(), std::size_t{Many});
  EXPECT_EQ(phone.appRegistry.mostInstallsAtOnce(), 10u);
}

TEST_F(Teardown, DropsARetryThatWaits) {
  phone.homeScreen.queueOutcomes("com.a", {AssertionOutcome::Denied});
  client()._enqueueAssetInstall(packageOf("com.a"));
  ASSERT_TRUE(phone.backgroundQueue.waitForPending(1));

  destroyClient();
  EXPECT_EQ(phone.backgroundQueue.pendingCount(), 0u);
  expectTrace(
      {"HomeScreenService.createTerminationAssertion(com.a, 0)", "BackgroundQueue.after(30000)",
       "BackgroundQueue.cancel()", "AppRegistry.removeObserver()",
       "SystemNotifier.removeObserver(com.corvane.twc.TWStartupCompleteNotification)"},
      fakes::TraceCall);
  phone.backgroundQueue.advance(60s);
  expectTrace({}, fakes::TraceAll);
  EXPECT_TRUE(phone.files.exists(StagingRootPath + "/com.a.zip"));
}

TEST_F(Teardown, ARefusalDuringItIsNotTriedAgain) {
  // The install of com.b has its place only when com.a's is over, which the teardown waits for.
  phone.appRegistry.blockInstalls();
  for (int i = 0; i < 10; ++i) {
    client()._enqueueAssetInstall(packageOf("com." + std::to_string(i)));
  }
  ASSERT_TRUE(phone.appRegistry.waitForInstalls(10));
  phone.homeScreen.queueOutcomes("com.late", {AssertionOutcome::Denied});
  client()._enqueueAssetInstall(packageOf("com.late"));

  std::thread destroying([this] { destroyClient(); });
  phone.appRegistry.releaseInstalls();
  destroying.join();

  EXPECT_EQ(phone.trace.count("log error SyncBundle|com.corvane.twc.AppsClient|Assertion denied"),
            1u);
  EXPECT_EQ(phone.backgroundQueue.pendingCount(), 0u);
  EXPECT_EQ(phone.appRegistry.installed("com.late"), std::nullopt);
}

TEST_F(Teardown, WhileARetryIsBeingEnqueuedRunsItsInstallOrDropsIt) {
  for (int round = 0; round < 20; ++round) {
    phone.homeScreen.queueOutcomes("com.a", {AssertionOutcome::Denied});
    client()._enqueueAssetInstall(packageOf("com.a"));
    ASSERT_TRUE(phone.backgroundQueue.waitForPending(1));

    std::thread clock([this] { phone.backgroundQueue.advance(30s); });
    destroyClient();
    clock.join();
    EXPECT_EQ(phone.backgroundQueue.pendingCount(), 0u);
    const bool retried =
        phone.trace.count("log error SyncBundle|com.corvane.twc.AppsClient|Re-enqueue") > 0;
    EXPECT_EQ(phone.appRegistry.installed("com.a").has_value(), retried);
    phone.appRegistry.removeAll("com.a");
    forgetTrace();
  }
}

TEST_F(Teardown, WhileCancellationsArriveIsSafe) {
  AppRecord restored;
  restored.applicationIdentifier = "com.a";
  restored.installType = InstallType::Restore;
  for (int round = 0; round < 20; ++round) {
    client();
    std::thread events([&] { phone.appRegistry.reportCancellation({restored}); });
    destroyClient();
    events.join();
    EXPECT_EQ(phone.appRegistry.observerCount(), 0u);
  }
}

}  // namespace
}  // namespace appsync
