#include "tests/client/transfer_results.h"

#include <limits>

namespace appsync {
namespace {

using testing::Contains;

TEST_F(TransferResults, ProgressIsForwardedInThousandthsTruncated) {
  phone.appRegistry.seedPlaceholder("com.a");
  const SyncAssetPtr made = asset();
  client();
  forgetTrace();
  client().assetTransferUpdatedProgress(made, 0.4567);
  EXPECT_EQ(phone.appRegistry.progress("com.a")->completedUnitCount(), 456);
  EXPECT_EQ(phone.appRegistry.progress("com.a")->totalUnitCount(), 1000);
  EXPECT_EQ(phone.appRegistry.progress("com.a")->installState(), InstallState::Active);
  expectTrace({"log default SyncBundle|finished transferring 0.456700 for com.a",
               "log error SyncBundle|Returning " +
                   phone.appRegistry.progress("com.a")->description() + " progress for com.a",
               "InstallProgress.setInstallState(com.a, 1)",
               "InstallProgress.setTotalUnitCount(com.a, 1000)",
               "InstallProgress.setCompletedUnitCount(com.a, 456)"});
}

TEST_F(TransferResults, ProgressThatNoCountCanHoldCountsAsNone) {
  constexpr double Infinity = std::numeric_limits<double>::infinity();
  const std::pair<double, std::int64_t> counts[] = {{std::numeric_limits<double>::quiet_NaN(), 0},
                                                    {-Infinity, 0},
                                                    {-0.5, -500},
                                                    {0.9999, 999},
                                                    {Infinity, 0},
                                                    {1e300, 0},
                                                    {1.5, 1500}};
  phone.appRegistry.seedPlaceholder("com.a");
  for (const auto& [fraction, units] : counts) {
    phone.appRegistry.progress("com.a")->setCompletedUnitCount(-1);
    client().assetTransferUpdatedProgress(asset(), fraction);
    EXPECT_EQ(phone.appRegistry.progress("com.a")->completedUnitCount(), units) << fraction;
  }
}

TEST_F(TransferResults, AnotherInstallsProgressIsNotTouchedWithoutAPlaceholder) {
  phone.appRegistry.seedInstalled("com.a");
  client();
  EXPECT_EQ(client()._progressForAssetIdentifier("com.a"), nullptr);
  expectTrace({"AppRegistry.recordForIdentifier(com.a, true)",
               "log error SyncBundle|Returning (null) progress for com.a"},
              fakes::TraceAll);
}

TEST_F(TransferResults, TotalUnitCountIsSetOnlyOnce) {
  phone.appRegistry.seedPlaceholder("com.a");
  client().assetTransferUpdatedProgress(asset(), 0.1);
  client().assetTransferUpdatedProgress(asset(), 1.0);
  EXPECT_EQ(phone.trace.count("InstallProgress.setTotalUnitCount"), 1u);
  EXPECT_EQ(phone.appRegistry.progress("com.a")->completedUnitCount(), 1000);
}

TEST_F(TransferResults, ProgressWithoutARecordIsOnlyLogged) {
  const SyncAssetPtr made = asset();
  client();
  forgetTrace();
  client().assetTransferUpdatedProgress(made, 0.5);
  expectTrace({"log default SyncBundle|finished transferring 0.500000 for com.a",
               "log error SyncBundle|Returning (null) progress for com.a"});
}

TEST_F(TransferResults, RelativePathIsCompletedUnderTheStagingRoot) {
  putTodo({{"com.a", "install"}});
  const SyncAssetPtr made = received("a.zip");
  succeed(made);
  settle();
  EXPECT_EQ(made->path, "/var/mobile/Media/PublicStaging/a.zip");
}

TEST_F(TransferResults, AbsolutePathIsKept) {
  const SyncAssetPtr made = received("/var/mobile/Media/elsewhere/a.zip");
  succeed(made);
  settle();
  EXPECT_EQ(made->path, "/var/mobile/Media/elsewhere/a.zip");
  EXPECT_THAT(
      phone.trace.log(),
      Contains("log default SyncBundle|Received file at /var/mobile/Media/elsewhere/a.zip"));
}

TEST_F(TransferResults, ReceivedPackageIsMarkedDownloadedAndItsInstallEnqueued) {
  putTodo({{"com.a", "install"}});
  phone.appRegistry.seedPlaceholder("com.a");
  phone.appRegistry.blockInstalls();
  const std::string progress = phone.appRegistry.progress("com.a")->description();
  succeed(received("a.zip"));
  Lines trace = phone.trace.readable();
  trace.resize(std::min<std::size_t>(trace.size(), 9));
  EXPECT_THAT(
      trace,
      testing::ElementsAre(
          "log default SyncBundle|transfer for asset com.a ended with success y error (null) "
          "existingApp:0",
          "log error SyncBundle|Returning " + progress + " progress for com.a",
          "log default SyncBundle|asset transfer succeeded for com.a",
          testing::StartsWith("AppRegistry.installPhaseFinished("),
          "log default SyncBundle|Received file at /var/mobile/Media/PublicStaging/a.zip",
          "log default SyncBundle|Changing com.a from install to DOWNLOADED",
          "FileManager.writeAtomically(" + TodoListPath + ")",
          "log default SyncBundle|Installing synced asset com.a",
          "log default SyncBundle|Enqueue install request for com.a"));
  EXPECT_EQ(todoOperation("com.a"), "DOWNLOADED");
  phone.appRegistry.releaseInstalls();
  settle();
  EXPECT_EQ(todoOperation("com.a"), "INSTALLED");
}

TEST_F(TransferResults, ClimbingPathIsIgnored) {
  putTodo({{"com.a", "install"}});
  succeed(received("/var/../etc/a.zip"));
  expectTrace(
      {"log default SyncBundle|transfer for asset com.a ended with success y error (null) "
       "existingApp:0",
       "log error SyncBundle|Returning (null) progress for com.a",
       "log default SyncBundle|asset transfer succeeded for com.a",
       "log default SyncBundle|Ignoring invalid path: /var/../etc/a.zip"});
  EXPECT_EQ(todoOperation("com.a"), "install");
}

TEST_F(TransferResults, MissingPathWithNothingRememberedIsIgnored) {
  succeed(asset());
  EXPECT_THAT(phone.trace.log(), Contains("log default SyncBundle|Ignoring invalid path: (null)"));
}

TEST_F(TransferResults, ClimbingPathIsIgnoredAlsoWhenThereIsNothingToInstall) {
  putTodo({{"com.a", "install"}});
  const SyncAssetPtr made = received("/var/../etc/a.zip");
  made->isDownload = false;
  succeed(made);
  EXPECT_EQ(phone.trace.readable().back(),
            "log default SyncBundle|Ignoring invalid path: /var/../etc/a.zip");
  EXPECT_EQ(todoOperation("com.a"), "install");
}

TEST_F(TransferResults, AssetThatIsNoDownloadIsMarkedSentAndInstallsNothing) {
  putTodo({{"com.a", "install"}});
  const SyncAssetPtr made = received("a.zip");
  made->isDownload = false;
  succeed(made);
  EXPECT_EQ(todoOperation("com.a"), "SENT");
  EXPECT_THAT(phone.trace.log(),
              testing::Not(Contains(testing::HasSubstr("Enqueue install request"))));
}

TEST_F(TransferResults, RestoreWithBackupDataIsRememberedAndNotInstalled) {
  phone.backup.addRestoreData("com.a");
  phone.appRegistry.seedPlaceholder("com.a", InstallType::Restore);
  const std::string progress = phone.appRegistry.progress("com.a")->description();
  succeed(restored("/var/mobile/Media/Downloads/a.zip"));
  EXPECT_EQ(phone.files.plistAt(RestoreStatePath),
            PropertyList(Dictionary{
                {"com.a",
                 Dictionary{{"1.0", Dictionary{{"path", "/var/mobile/Media/Downloads/a.zip"}}}}}}));
  EXPECT_EQ(phone.appRegistry.progress("com.a")->installPhase(), InstallPhase::RestoringData);
  settle();
  EXPECT_FALSE(phone.appRegistry.installed("com.a"));
  Lines trace = phone.trace.readable();
  trace.resize(9);
  EXPECT_THAT(trace, testing::ElementsAre(
                         "log default SyncBundle|transfer for asset com.a ended with success y "
                         "error (null) existingApp:0",
                         "log error SyncBundle|Returning " + progress + " progress for com.a",
                         "log default SyncBundle|asset transfer succeeded for com.a",
                         "AppRegistry.installPhaseFinished(com.a)",
                         "log default SyncBundle|Received file at "
                         "/var/mobile/Media/Downloads/a.zip",
                         "log default SyncBundle|Restore data exists for com.a",
                         "InstallProgress.setInstallPhase(com.a, 2)",
                         "FileManager.writeAtomically(" + RestoreStatePath + ")",
                         "log default SyncBundle|asset transfer ended withsuccess: y"));
}

TEST_F(TransferResults, RestoreOfNoVersionIsRememberedToo) {
  phone.backup.addRestoreData("com.a");
  const SyncAssetPtr package = restored("/var/mobile/Media/Downloads/a.zip");
  package->variantOptions.clear();
  succeed(package);
  const SyncAssetPtr data = restored(std::nullopt);
  data->variantOptions.clear();
  data->completedAssetParts = kTWAssetPartApplicationData;
  succeed(data);
  settle();
  EXPECT_EQ(data->path, "/var/mobile/Media/Downloads/a.zip");
  EXPECT_TRUE(phone.appRegistry.installed("com.a"));
}

TEST_F(TransferResults, LaterDataOnlyAssetFindsTheRememberedPackageAndInstallsIt) {
  phone.backup.addRestoreData("com.a");
  succeed(restored("/var/mobile/Media/Downloads/a.zip"));
  const SyncAssetPtr data = restored(std::nullopt);
  data->completedAssetParts = kTWAssetPartApplicationData;
  succeed(data);
  settle();
  EXPECT_EQ(data->path, "/var/mobile/Media/Downloads/a.zip");
  EXPECT_TRUE(phone.appRegistry.installed("com.a"));
}

TEST_F(TransferResults, LaterDataOnlyAssetOfAnotherVersionDoesNotFindTheRememberedPackage) {
  putTodo({{"com.a", "install"}});
  phone.backup.addRestoreData("com.a");
  succeed(restored("/var/mobile/Media/Downloads/a.zip"));
  const auto before = phone.files.files();
  const SyncAssetPtr data = restored(std::nullopt);
  data->variantOptions = {{"Version", "2.0"}};
  data->completedAssetParts = kTWAssetPartApplicationData;
  succeed(data);
  expectTrace(
      {"log default SyncBundle|transfer for asset com.a ended with success y error (null) "
       "existingApp:0",
       "log error SyncBundle|Returning (null) progress for com.a",
       "log default SyncBundle|asset transfer succeeded for com.a",
       "log default SyncBundle|Ignoring invalid path: (null)"});
  EXPECT_EQ(phone.files.files(), before);
}

TEST_F(TransferResults, RestoreIsNamedByItsShortDescription) {
  const SyncAssetPtr made = restored("/var/mobile/Media/Downloads/a.zip");
  made->shortDescription = "Alpha of Ann";
  phone.backup.addRestoreData("com.a");
  succeed(made);
  EXPECT_EQ(phone.trace.count("log default SyncBundle|com.corvane.twc.AppsClient|Restore data "
                              "exists for Alpha of Ann"),
            1u);
  const SyncAssetPtr other = restored("/var/mobile/Media/Downloads/a.zip");
  other->identifier = "com.b";
  other->shortDescription = "Beta of Ann";
  succeed(other);
  EXPECT_EQ(phone.trace.count("log default SyncBundle|com.corvane.twc.AppsClient|No restore data "
                              "exists for Beta of Ann"),
            1u);
  settle();
}

TEST_F(TransferResults, RestoreWithoutBackupDataIsInstalledAtOnce) {
  succeed(restored("/var/mobile/Media/Downloads/a.zip"));
  EXPECT_EQ(phone.trace.count("log default SyncBundle|com.corvane.twc.AppsClient|No restore data "
                              "exists for com.a"),
            1u);
  settle();
  EXPECT_TRUE(phone.appRegistry.installed("com.a"));
}

TEST_F(TransferResults, RecoverableFailureOnlyMarksTheProgressFailed) {
  putTodo({{"com.a", "install"}});
  phone.appRegistry.seedPlaceholder("com.a");
  const std::string progress = phone.appRegistry.progress("com.a")->description();
  fail(asset(), Passing);
  expectTrace(
      {"log default SyncBundle|transfer for asset com.a ended with success n error Error "
       "Domain=Passing Code=8 existingApp:0",
       "log error SyncBundle|Returning " + progress + " progress for com.a",
       "log default SyncBundle|failed to transfer asset com.a. err=Error Domain=Passing "
       "Code=8, recoverable=1",
       "InstallProgress.setInstallState(com.a, 4)"});
  EXPECT_EQ(todoOperation("com.a"), "install");
  EXPECT_TRUE(phone.appRegistry.placeholder("com.a"));
}

TEST_F(TransferResults, FinalFailureCancelsTheProgressAndRemovesThePlaceholder) {
  phone.host.setRecoverable("Final", false);
  phone.appRegistry.seedInstalled("com.a");
  phone.appRegistry.seedPlaceholder("com.a");
  const std::string progress = phone.appRegistry.progress("com.a")->description();
  fail(asset(), Final);
  Lines trace = phone.trace.readable();
  EXPECT_THAT(
      trace,
      testing::ElementsAre(
          "log default SyncBundle|transfer for asset com.a ended with success n error Error "
          "Domain=Final Code=7 existingApp:0",
          "log error SyncBundle|Returning " + progress + " progress for com.a",
          "log default SyncBundle|failed to transfer asset com.a. err=Error Domain=Final "
          "Code=7, recoverable=0",
          "InstallProgress.cancel(com.a)", "log default SyncBundle|Uninstalling placeholder com.a",
          "AppRegistry.uninstallApplication(com.a, {UninstallPlaceholdersOnly = 1})",
          "log default SyncBundle|Uninstalling app using SW com.a secceeded"));
  EXPECT_TRUE(phone.appRegistry.installed("com.a"));
  EXPECT_FALSE(phone.appRegistry.placeholder("com.a"));
}

TEST_F(TransferResults, FinalFailureCancelsAnUnfinishedProgressAndLeavesAnEndedOneAlone) {
  phone.host.setRecoverable("Final", false);
  const std::pair<InstallState, std::size_t> cancellations[] = {
      {InstallState::Waiting, 1},  {InstallState::Active, 1}, {InstallState::Paused, 1},
      {InstallState::Canceled, 0}, {InstallState::Failed, 0}, {InstallState::Finished, 0}};
  for (const auto& [state, expected] : cancellations) {
    phone.appRegistry.seedPlaceholder("com.a");
    const auto progress = phone.appRegistry.progress("com.a");
    progress->begin(state, InstallPhase::Loading);
    fail(asset(), Final);
    EXPECT_EQ(phone.trace.count("InstallProgress.cancel(com.a)"), expected)
        << static_cast<int>(state);
    EXPECT_EQ(progress->installState(), expected ? InstallState::Canceled : state);
    EXPECT_FALSE(phone.appRegistry.placeholder("com.a"));
  }
}

TEST_F(TransferResults, FailedRemovalOfThePlaceholderIsLogged) {
  phone.host.setRecoverable("Final", false);
  phone.appRegistry.seedPlaceholder("com.a");
  phone.appRegistry.failUninstall("com.a");
  fail(asset(), Final);
  EXPECT_THAT(phone.trace.log(),
              Contains("log default SyncBundle|Uninstalling app using SW com.a failed"));
}

TEST_F(TransferResults, FinalFailureOfAnUnknownApplicationOrARestoreDoesNothingMore) {
  phone.host.setRecoverable("Final", false);
  fail(asset(), Final);
  EXPECT_EQ(phone.trace.count("AppRegistry.uninstallApplication"), 0u);
  phone.appRegistry.seedPlaceholder("com.a", InstallType::Restore);
  fail(restored(std::nullopt), Final);
  EXPECT_EQ(phone.trace.count("AppRegistry.uninstallApplication"), 0u);
  EXPECT_EQ(phone.trace.count("BackupManager.cancelApplicationRestore"), 0u);
}

TEST_F(TransferResults, EndWithNothingOutstandingOnlyNotifiesTheHomeScreen) {
  client();
  forgetTrace();
  client().assetTransferEndedWithSuccess(true);
  expectTrace({"log default SyncBundle|asset transfer ended withsuccess: y",
               "SystemNotifier.registerCheck(com.corvane.dashel.twc.wsyncnotify)",
               "log default SyncBundle|Notifying DS we are done syncing",
               "HomeScreenService.serverPort()",
               "SystemNotifier.setState(com.corvane.dashel.twc.wsyncnotify, 0)",
               "SystemNotifier.post(com.corvane.dashel.twc.wsyncnotify)"});
}

TEST_F(TransferResults, EndForgetsHowManyInstallsWereAttempted) {
  succeed(received("a.zip"));
  settle();
  EXPECT_EQ(phone.appRegistry.installsStarted(), 1u);
  EXPECT_EQ(client()._getAndResetNumAppInstallsAttempted(), 0u);
}

TEST_F(TransferResults, EndWithSuccessWhileTransfersAreOutstandingFinishesThemAndLogsAnError) {
  phone.appRegistry.seedPlaceholder("com.a");
  client().assetTransferUpdatedProgress(asset(), 0.5);
  client().assetTransferUpdatedProgress(asset("com.gone"), 0.5);
  forgetTrace();
  const std::string progress = phone.appRegistry.progress("com.a")->description();
  client().assetTransferEndedWithSuccess(true);
  EXPECT_THAT(
      phone.trace.readable(),
      testing::ElementsAre(
          "log default SyncBundle|asset transfer ended withsuccess: y",
          "SystemNotifier.registerCheck(com.corvane.dashel.twc.wsyncnotify)",
          "log default SyncBundle|Notifying DS we are done syncing",
          "HomeScreenService.serverPort()",
          "SystemNotifier.setState(com.corvane.dashel.twc.wsyncnotify, 0)",
          "SystemNotifier.post(com.corvane.dashel.twc.wsyncnotify)",
          "log default SyncBundle|Setting state for outstanding XFT loading phase of asset com.a "
          "to "
          "SWInstallStateFinished",
          "log error SyncBundle|Returning " + progress + " progress for com.a",
          "InstallProgress.setInstallState(com.a, 5)",
          testing::StartsWith("AppRegistry.installPhaseFinished("),
          "log default SyncBundle|Setting state for outstanding XFT loading phase of asset "
          "com.gone "
          "to SWInstallStateFinished",
          "log error SyncBundle|Returning (null) progress for com.gone",
          "log error SyncBundle|Called with success == YES but with 2 outstanding XFT transfers!"));
}

TEST_F(TransferResults, EndWithFailureMarksOutstandingTransfersFailedAndLogsNoErrorOfItsOwn) {
  phone.appRegistry.seedPlaceholder("com.a");
  client().assetTransferUpdatedProgress(asset(), 0.5);
  forgetTrace();
  const std::string progress = phone.appRegistry.progress("com.a")->description();
  client().assetTransferEndedWithSuccess(false);
  EXPECT_EQ(phone.appRegistry.progress("com.a")->installState(), InstallState::Failed);
  expectTrace(
      {"log default SyncBundle|asset transfer ended withsuccess: n",
       "SystemNotifier.registerCheck(com.corvane.dashel.twc.wsyncnotify)",
       "log default SyncBundle|Notifying DS we are done syncing", "HomeScreenService.serverPort()",
       "SystemNotifier.setState(com.corvane.dashel.twc.wsyncnotify, 0)",
       "SystemNotifier.post(com.corvane.dashel.twc.wsyncnotify)",
       "log default SyncBundle|Setting state for outstanding XFT loading phase of asset com.a to "
       "SWInstallStateFailed",
       "log error SyncBundle|Returning " + progress + " progress for com.a",
       "InstallProgress.setInstallState(com.a, 4)", "AppRegistry.installPhaseFinished(com.a)"});
  // Settled once: nothing is left for a second end.
  forgetTrace();
  client().assetTransferEndedWithSuccess(false);
  EXPECT_EQ(phone.trace.count("InstallProgress.setInstallState"), 0u);
}

TEST_F(CoordinatedResults, ProgressGoesToTheCoordinatorsPackagePromise) {
  const SyncAssetPtr made = received("/var/mobile/Media/Downloads/a.zip");
  made->downloadProgress = 0.25;
  client().assetTransferUpdatedProgress(made, 0.25);
  ASSERT_TRUE(phone.installCoordination.pathPromise("com.a-Asset"));
  EXPECT_EQ(phone.installCoordination.pathPromise("com.a-Asset")->percentComplete(), 0.25);
  EXPECT_EQ(phone.trace.count("InstallProgress."), 0u);
}

TEST_F(CoordinatedResults, NoProgressRecordIsLookedUp) {
  phone.appRegistry.seedPlaceholder("com.a");
  client();
  forgetTrace();
  EXPECT_EQ(client()._progressForAssetIdentifier("com.a"), nullptr);
  expectTrace({"log default SyncBundle|Not returning progress for com.a as install coordination is "
               "enabled"},
              fakes::TraceAll);
}

TEST_F(CoordinatedResults, ReceivedPackageSatisfiesItsPromise) {
  putTodo({{"com.a", "install"}});
  succeed(received("a.zip"));
  ASSERT_TRUE(phone.installCoordination.pathPromise("com.a-Asset"));
  EXPECT_TRUE(phone.installCoordination.pathPromise("com.a-Asset")->isComplete());
  EXPECT_EQ(todoOperation("com.a"), "DOWNLOADED");
  EXPECT_THAT(phone.trace.log(),
              testing::Not(Contains(testing::HasSubstr("Enqueue install request"))));
}

TEST_F(CoordinatedResults, RestoreAssetsAreLeftToTheStore) {
  succeed(restored("/var/mobile/Media/Downloads/a.zip"));
  EXPECT_THAT(
      phone.trace.log(),
      Contains("log default SyncBundle|Not processing restore asset com.a as coordination is "
               "enabled"));
  const SyncAssetPtr data = restored("/var/mobile/Media/Downloads/a.zip");
  data->completedAssetParts = kTWAssetPartApplicationData;
  succeed(data);
  EXPECT_THAT(
      phone.trace.log(),
      Contains("log default SyncBundle|Not processing kTWAssetPartApplicationData for restore "
               "asset com.a as coordination is enabled"));
}

TEST_F(CoordinatedResults, FailureCancelsTheCoordinatorOfAnInstalledApplication) {
  phone.appRegistry.seedPlaceholder("com.a");
  fail(asset(), Passing);
  EXPECT_TRUE(coordinator->state().cancellation.has_value());
  EXPECT_EQ(phone.trace.count("AppRegistry.uninstallApplication"), 0u);
}

TEST_F(CoordinatedResults, FailureWithoutAReasonCancelsTheCoordinatorToo) {
  putTodo({{"com.a", "install"}});
  phone.appRegistry.seedPlaceholder("com.a");
  const SyncAssetPtr made = received("a.zip");
  client().assetTransferUpdatedProgress(made, 0.5);
  fail(made, std::nullopt);
  EXPECT_FALSE(phone.installCoordination.pathPromise("com.a-Asset")->isComplete());
  const auto cancellation = coordinator->state().cancellation;
  ASSERT_TRUE(cancellation);
  EXPECT_EQ(phone.trace.count("InstallCoordination.createUserPresentableError(1, 0, Error "
                              "Domain=TWError Code=30)"),
            1u);
}

TEST_F(CoordinatedResults, FailureAfterThePersonCancelledLeavesTheCoordinatorAlone) {
  phone.appRegistry.seedPlaceholder("com.a");
  client().coordinatorCanceledWithReason(*coordinator, Passing, KQClientKiosk);
  fail(asset(), Passing);
  EXPECT_EQ(phone.trace.count("InstallCoordinator.cancel"), 0u);
}

TEST_F(CoordinatedResults, FailedEndCancelsOutstandingCoordinators) {
  client().assetTransferUpdatedProgress(asset(), 0.5);
  client().assetTransferEndedWithSuccess(false);
  EXPECT_TRUE(coordinator->state().cancellation.has_value());
}

TEST_F(CoordinatedResults, EndWithNothingOutstandingKeepsWhatThePersonCancelled) {
  client().coordinatorCanceledWithReason(*coordinator, Passing, KQClientKiosk);
  client().assetTransferEndedWithSuccess(true);
  forgetTrace();
  client().coordinatorCanceledWithReason(*coordinator, Passing, KQClientKiosk);
  expectTrace(
      {"log error SyncBundle|Cannot cancel com.a as it's already cancelled 1 OR the call is "
       "not supported"});
}

}  // namespace
}  // namespace appsync
