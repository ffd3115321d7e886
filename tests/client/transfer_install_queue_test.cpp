#include <algorithm>
#include <latch>
#include <thread>

#include "tests/client/install_queue.h"
#include "transfer/install_plan.h"

namespace appsync {
namespace {

using namespace std::chrono_literals;
using testing::Contains;
using testing::ElementsAre;

TEST(InstallPlan, DecidesByTheOutcomeAlone) {
  using Next = InstallPlan::Next;
  EXPECT_EQ(installPlanFor(AssertionOutcome::Success, "com.a").next, Next::Install);
  EXPECT_EQ(installPlanFor(AssertionOutcome::NotFound, "com.a").next, Next::Install);
  EXPECT_EQ(installPlanFor(AssertionOutcome::Denied, "com.a").next, Next::Retry);
  for (const int code : {3, 4, -1, 99}) {
    const InstallPlan plan = installPlanFor(static_cast<AssertionOutcome>(code), "com.a");
    EXPECT_EQ(plan.next, Next::Fail);
    EXPECT_EQ(plan.line, "Unknown error " + std::to_string(code) + " getting assertion for com.a");
    EXPECT_FALSE(plan.recordSuccess);
  }
}

TEST_F(InstallQueue, InstallsUnderAnAssertionAndRemovesThePackage) {
  phone.appRegistry.seedPlaceholder("com.a");
  install(asset());
  expectInstall({"log default SyncBundle|Assertion succeeded for com.a",
                 "transaction scenario \"Asset install\" step 0 ok com.a \"assertion succeeded\"",
                 InstallCall, "log default SyncBundle|com.a install succeeded",
                 "log default SyncBundle|Changing com.a from DOWNLOADED to INSTALLED",
                 "FileManager.writeAtomically(" + TodoListPath + ")",
                 "TerminationAssertion.release(com.a)"});
  EXPECT_EQ(todoOperation("com.a"), "INSTALLED");
  EXPECT_FALSE(phone.files.exists(PackagePath));
  EXPECT_THAT(phone.homeScreen.heldAssertions(), testing::IsEmpty());
}

TEST_F(InstallQueue, AssertionNotFoundInstallsAnyway) {
  phone.homeScreen.queueOutcomes("com.a", {AssertionOutcome::NotFound});
  install(asset());
  expectInstall({"log default SyncBundle|Assertion not found for com.a, installing anyway...",
                 "transaction scenario \"Asset install\" step 0 ok com.a \"assertion not found\"",
                 InstallCall, "log default SyncBundle|com.a install succeeded",
                 "log default SyncBundle|Changing com.a from DOWNLOADED to INSTALLED",
                 "FileManager.writeAtomically(" + TodoListPath + ")"});
}

TEST_F(InstallQueue, AssertionDeniedRetriesAfterExactly30SecondsAndKeepsTheFile) {
  phone.homeScreen.queueOutcomes("com.a", {AssertionOutcome::Denied});
  phone.homeScreen.setRefusalsCarryAssertion(true);
  prepare();
  client()._enqueueAssetInstall(asset());
  ASSERT_TRUE(phone.backgroundQueue.waitForPending(1));
  EXPECT_THAT(phone.backgroundQueue.pendingDelays(), ElementsAre(30'000ms));
  phone.backgroundQueue.advance(29'999ms);
  EXPECT_FALSE(phone.appRegistry.installed("com.a"));
  EXPECT_TRUE(phone.files.exists(PackagePath));
  phone.backgroundQueue.advance(1ms);
  client().assetTransferEndedWithSuccess(false);
  EXPECT_TRUE(phone.appRegistry.installed("com.a"));
  EXPECT_FALSE(phone.files.exists(PackagePath));

  // The first operation's last line may come before or after the second begins.
  Lines trace = installTrace();
  const auto finished =
      std::ranges::find(trace, "log default SyncBundle|Finished install for com.a");
  ASSERT_NE(finished, trace.end());
  trace.erase(finished);
  std::erase(trace, "BackgroundQueue.after(30000)");
  EXPECT_THAT(
      trace,
      testing::ElementsAreArray(joined(
          joined(begun(),
                 {"log error SyncBundle|Assertion denied for com.a",
                  "transaction scenario \"Asset install\" step 0 ok com.a \"assertion denied\"",
                  "TerminationAssertion.release(com.a)",
                  "log error SyncBundle|Will retry installation of com.a in 30 seconds",
                  "transaction scenario \"Asset install\" step 0 ok com.a \"retrying asset "
                  "install\"",
                  "log error SyncBundle|Re-enqueue installation request for com.a"}),
          joined(
              begun(),
              {"log default SyncBundle|Assertion succeeded for com.a",
               "transaction scenario \"Asset install\" step 0 ok com.a \"assertion succeeded\"",
               InstallCall, "log default SyncBundle|com.a install succeeded",
               "log default SyncBundle|Changing com.a from DOWNLOADED to INSTALLED",
               "FileManager.writeAtomically(" + TodoListPath + ")",
               "TerminationAssertion.release(com.a)", "FileManager.removeItem(" + PackagePath + ")",
               "log default SyncBundle|Finished install for com.a"}))));
}

TEST_F(InstallQueue, KeepsRetryingForAsLongAsTheHomeScreenRefuses) {
  phone.homeScreen.launch("com.a");
  prepare();
  client()._enqueueAssetInstall(asset());
  for (int round = 0; round < 5; ++round) {
    ASSERT_TRUE(phone.backgroundQueue.waitForPending(1)) << round;
    phone.backgroundQueue.advance(30s);
  }
  ASSERT_TRUE(phone.backgroundQueue.waitForPending(1));
  EXPECT_EQ(phone.trace.count("HomeScreenService.createTerminationAssertion"), 6u);
  EXPECT_EQ(client()._getAndResetNumAppInstallsAttempted(), 0u);
  phone.homeScreen.quit("com.a");
  phone.backgroundQueue.advance(30s);
  client().assetTransferEndedWithSuccess(false);
  EXPECT_TRUE(phone.appRegistry.installed("com.a"));
}

TEST_F(InstallQueue, UnknownAssertionErrorFailsWithPosix22AndRemovesTheFile) {
  phone.host.setRecoverable(POSIXErrorDomain, false);
  phone.appRegistry.seedPlaceholder("com.a");
  phone.homeScreen.queueOutcomes("com.a", {static_cast<AssertionOutcome>(3)});
  phone.homeScreen.setRefusalsCarryAssertion(true);
  install(asset());
  expectInstall(
      {"log error SyncBundle|Unknown error 3 getting assertion for com.a",
       "transaction scenario \"Asset install\" step 0 failed com.a \"unknown error grabbing "
       "assertion\"",
       "log default SyncBundle|com.a install failed unrecoverably: Error Domain=POSIX Code=22",
       "log default SyncBundle|Changing com.a from DOWNLOADED to FAILED",
       "FileManager.writeAtomically(" + TodoListPath + ")",
       "AppRegistry.uninstallApplication(com.a, {})",
       "transaction scenario \"Aerix restore\" step 0 ok com.a \"placeholder removed\"",
       "TerminationAssertion.release(com.a)"});
  EXPECT_EQ(client()._getAndResetNumAppInstallsAttempted(), 0u);
}

TEST_F(InstallQueue, UnknownAssertionErrorThatTheHostWouldTryAgainKeepsTheTodoEntry) {
  phone.appRegistry.seedPlaceholder("com.a");
  phone.homeScreen.queueOutcomes("com.a", {static_cast<AssertionOutcome>(3)});
  install(asset());
  expectInstall(
      {"log error SyncBundle|Unknown error 3 getting assertion for com.a",
       "transaction scenario \"Asset install\" step 0 failed com.a \"unknown error grabbing "
       "assertion\"",
       "log default SyncBundle|com.a install failed but was recoverable: Error Domain=POSIX "
       "Code=22",
       "transaction scenario \"Aerix restore\" step 0 failed com.a \"install failed "
       "recoverably\""});
  EXPECT_EQ(todoOperation("com.a"), "DOWNLOADED");
  EXPECT_TRUE(phone.appRegistry.placeholder("com.a"));
  EXPECT_FALSE(phone.files.exists(PackagePath));
}

/// Refuses every package without a reason.
class SilentRegistry : public fakes::FaultyAppRegistry {
 public:
  using FaultyAppRegistry::FaultyAppRegistry;
  bool installApplication(const FileLocation&, const PropertyList::Dictionary&,
                          std::optional<Error>*) noexcept override {
    return false;
  }
};

TEST_F(InstallQueue, PackageRefusedWithoutAReasonIsFailedForGood) {
  phone.appRegistry.seedPlaceholder("com.a");
  SilentRegistry registry(phone.appRegistry, phone.faults);
  AppsClient installing(with(phone.platform(), registry));
  // The host would try again whatever it is asked about.
  phone.host.setRecoverable("", true);
  installing._enqueueAssetInstall(asset());
  installing.assetTransferEndedWithSuccess(false);
  EXPECT_EQ(todoOperation("com.a"), "FAILED");
  EXPECT_FALSE(phone.appRegistry.placeholder("com.a"));
  EXPECT_THAT(phone.trace.log(),
              Contains("log default SyncBundle|com.a install failed unrecoverably: (null)"));
  EXPECT_FALSE(phone.files.exists(PackagePath));
}

TEST_F(InstallQueue, AnUpdateWithoutAPlaceholderThatFailsForGoodKeepsTheWorkingVersion) {
  phone.appRegistry.seedInstalled("com.a", "1.0");
  phone.appRegistry.failInstall("com.a", Refused);
  install(asset());
  EXPECT_TRUE(phone.appRegistry.installed("com.a"));
  expectInstall(
      {"log default SyncBundle|Assertion succeeded for com.a",
       "transaction scenario \"Asset install\" step 0 ok com.a \"assertion succeeded\"",
       InstallCall,
       "log default SyncBundle|com.a install failed unrecoverably: " + description(Refused),
       "log default SyncBundle|Changing com.a from DOWNLOADED to FAILED",
       "FileManager.writeAtomically(" + TodoListPath + ")",
       "log error SyncBundle|Uninstall of com.a failed.",
       "transaction scenario \"Aerix restore\" step 0 failed com.a \"failed to remove "
       "placeholder\"",
       "TerminationAssertion.release(com.a)"});
}

TEST_F(InstallQueue, RefusedPackageIsFailedForGoodAndItsPlaceholderRemoved) {
  phone.appRegistry.seedInstalled("com.a", "1.0");
  phone.appRegistry.seedPlaceholder("com.a");
  phone.appRegistry.failInstall("com.a", Refused);
  install(asset());
  EXPECT_EQ(todoOperation("com.a"), "FAILED");
  EXPECT_THAT(
      phone.trace.transactions(),
      ElementsAre(
          "transaction scenario \"Asset install\" step 0 ok com.a \"assertion succeeded\"",
          "transaction scenario \"Aerix restore\" step 0 ok com.a \"placeholder removed\""));
  // A damaged update never costs the working application.
  EXPECT_TRUE(phone.appRegistry.installed("com.a"));
  EXPECT_FALSE(phone.appRegistry.placeholder("com.a"));
}

TEST_F(InstallQueue, PlaceholderThatCannotBeRemovedIsLoggedAndRecorded) {
  phone.appRegistry.failInstall("com.a", Refused);
  phone.appRegistry.failUninstall("com.a");
  install(asset());
  EXPECT_THAT(phone.trace.log(), Contains("log error SyncBundle|Uninstall of com.a failed."));
  EXPECT_THAT(
      phone.trace.transactions(),
      Contains("transaction scenario \"Aerix restore\" step 0 failed com.a \"failed to remove "
               "placeholder\""));
}

TEST_F(InstallQueue, RecoverableFailureLeavesTheTodoEntryForALaterSync) {
  phone.appRegistry.seedPlaceholder("com.a");
  phone.appRegistry.failInstall("com.a", Passing);
  install(asset());
  EXPECT_EQ(todoOperation("com.a"), "DOWNLOADED");
  EXPECT_TRUE(phone.appRegistry.placeholder("com.a"));
  EXPECT_THAT(phone.trace.log(), Contains("log default SyncBundle|com.a install failed but was "
                                          "recoverable: Error Domain=Passing Code=8"));
  EXPECT_THAT(
      phone.trace.transactions(),
      Contains("transaction scenario \"Aerix restore\" step 0 failed com.a \"install failed "
               "recoverably\""));
}

TEST_F(InstallQueue, FailedRestoreCountsAsRecoverableWhateverItsError) {
  phone.appRegistry.seedPlaceholder("com.a", InstallType::Restore);
  phone.appRegistry.failInstall("com.a", Refused);
  const SyncAssetPtr made = asset();
  made->isRestore = true;
  install(made);
  expectInstall(
      {"log default SyncBundle|Assertion succeeded for com.a",
       "transaction scenario \"Asset install\" step 0 ok com.a \"assertion succeeded\"",
       InstallCall,
       "log default SyncBundle|com.a install failed but was recoverable: " + description(Refused),
       "transaction scenario \"Aerix restore\" step 0 failed com.a \"install failed "
       "recoverably\"",
       "TerminationAssertion.release(com.a)"});
  EXPECT_EQ(todoOperation("com.a"), "DOWNLOADED");
  EXPECT_TRUE(phone.appRegistry.placeholder("com.a"));
}

TEST_F(InstallQueue, CountsTheAttemptsThatReachedTheInstaller) {
  prepare();
  phone.appRegistry.failInstall("com.b", Refused);
  phone.homeScreen.queueOutcomes("com.c", {static_cast<AssertionOutcome>(3)});
  for (const char* identifier : {"com.a", "com.b", "com.c"}) {
    client()._performAssetInstall(asset(identifier));
  }
  EXPECT_EQ(client()._getAndResetNumAppInstallsAttempted(), 2u);
  EXPECT_EQ(client()._getAndResetNumAppInstallsAttempted(), 0u);
}

TEST_F(InstallQueue, DestroyedClientFinishesRunningInstallsAndDropsWaitingRetries) {
  phone.homeScreen.launch("com.waiting");
  prepare();
  client()._enqueueAssetInstall(asset("com.waiting"));
  ASSERT_TRUE(phone.backgroundQueue.waitForPending(1));
  phone.appRegistry.blockInstalls();
  client()._enqueueAssetInstall(asset());
  ASSERT_TRUE(phone.appRegistry.waitForInstalls(1));
  std::thread release([&] { phone.appRegistry.releaseInstalls(); });
  destroyClient();
  release.join();
  EXPECT_TRUE(phone.appRegistry.installed("com.a"));
  EXPECT_EQ(phone.backgroundQueue.pendingCount(), 0u);
  phone.backgroundQueue.advance(60s);
  EXPECT_FALSE(phone.appRegistry.installed("com.waiting"));
}

TEST_F(InstallQueue, ErrorsAreSortedByTheHostAndByTwoDomains) {
  prepare();
  EXPECT_TRUE(client()._isRecoverableError(Passing));
  // The host would try these again.
  EXPECT_FALSE(client()._isRecoverableError(Error{"StartwellError", 1, {}, nullptr}));
  EXPECT_FALSE(client()._isRecoverableError(Refused));
  phone.host.setRecoverable("Passing", false);
  EXPECT_FALSE(client()._isRecoverableError(Passing));
  EXPECT_FALSE(client()._isRecoverableError(std::nullopt));
}

TEST_F(InstallQueue, WithCoordinationNoErrorIsRecoverable) {
  phone.installCoordination.setEnabled(true);
  prepare();
  EXPECT_FALSE(client()._isRecoverableError(Passing));
  expectTrace(
      {"log default SyncBundle|Treating error Error Domain=Passing Code=8 as non recoverable "
       "as install coordination is enabled"});
}

TEST_F(InstallQueue, WithCoordinationAFailedInstallIsUninstalledThroughTheService) {
  phone.installCoordination.setEnabled(true);
  prepare();
  client().assetInstallFailed(asset(), Passing);
  phone.installCoordination.waitForEvents();
  EXPECT_EQ(phone.trace.count("InstallCoordination.uninstallApp(com.a"), 1u);
  EXPECT_EQ(phone.trace.count("AppRegistry.uninstallApplication"), 0u);
  EXPECT_EQ(todoOperation("com.a"), "FAILED");
}

}  // namespace
}  // namespace appsync
