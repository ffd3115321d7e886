// The client's memory of which transfers are updates and which ones a person cancelled.
#include "tests/client/outstanding_transfers.h"

namespace appsync {
namespace {

const Error Passing{"Passing", 8, {}, nullptr};

/// com.a is installed, and the desktop has a new version of it.
class TransferOfAnUpdate : public CoordinatedTransfers {
 protected:
  void SetUp() override {
    CoordinatedTransfers::SetUp();
    phone.appRegistry.seedInstalled("com.a");
    stage("com.a", "Alpha");
    putEntries({install("com.a")});
  }
  /// Its package is on its way.
  SyncAssetPtr begin() {
    SyncAssetPtr asset = requestOne();
    if (!asset) return nullptr;
    asset->downloadProgress = 0.25;
    client().assetTransferUpdatedProgress(asset, 0.25);
    forgetTrace();
    return asset;
  }
  /// What the client says of one that ends now.
  std::string endOf(const SyncAssetPtr& asset) {
    forgetTrace();
    client().assetTransferSucceeded(asset, false, Passing);
    return phone.trace.log().front();
  }
  static std::string ended(int existingApp) {
    return "log default SyncBundle|transfer for asset com.a ended with success n error Error "
           "Domain=Passing Code=8 existingApp:" +
           std::to_string(existingApp);
  }
};

TEST_F(TransferOfAnUpdate, GoesThroughTheUpdatingCoordinatorToItsEnd) {
  const SyncAssetPtr asset = requestOne();
  ASSERT_TRUE(asset);
  const std::string coordinator = phone.installCoordination.coordinator("com.a")->description();
  const Lines lookUp{
      "transaction step 3 party 1 phase 1 ok com.a \"Create coordinator\"",
      "InstallCoordination.coordinatorFor(com.a, updating, 3, look up)",
      "log default SyncBundle|Created updating coordinator " + coordinator +
          " (createIfNotExisting:0, existingApp:1) for com.a with error (null)",
      "transaction step 3 party 1 phase 2 ok com.a \"Finished creating coordinator\""};
  const auto joined = [&](Lines first, const Lines& last) {
    first.insert(first.end(), lookUp.begin(), lookUp.end());
    first.insert(first.end(), last.begin(), last.end());
    return first;
  };

  asset->downloadProgress = 0.25;
  client().assetTransferUpdatedProgress(asset, 0.25);
  expectTrace(joined({"log default SyncBundle|finished transferring 0.250000 for com.a"},
                     {"log default SyncBundle|Updating download progress: 0.250000 install "
                      "progress:0.000000 for com.a",
                      "DataPromise.setPercentComplete(com.a-Asset, 0.25)"}));

  asset->path = "a.zip";
  client().assetTransferSucceeded(asset, true, std::nullopt);
  expectTrace(joined(
      {"log default SyncBundle|transfer for asset com.a ended with success y error (null) "
       "existingApp:1",
       "log default SyncBundle|Not returning progress for com.a as install coordination is enabled",
       "log default SyncBundle|asset transfer succeeded for com.a",
       "log default SyncBundle|Received file at " + StagingRootPath + "/a.zip",
       "log default SyncBundle|Changing com.a from install to DOWNLOADED",
       "FileManager.writeAtomically(" + TodoListPath + ")",
       "log default SyncBundle|Installing synced asset com.a"},
      {"DataPromise.setTransferPath(com.a-Asset, " + StagingRootPath + "/a.zip)",
       "log default SyncBundle|Satisfying asset promise for com.a",
       "DataPromise.setPercentComplete(com.a-Asset, 1)",
       "DataPromise.setComplete(com.a-Asset, true)"}));
  EXPECT_EQ(phone.installCoordination.coordinatorCount(), 1u);
}

TEST_F(TransferOfAnUpdate, IsNotWhatAFirstInstallIs) {
  phone.appRegistry.removeAll("com.a");
  const SyncAssetPtr asset = requestOne();
  ASSERT_TRUE(asset);
  EXPECT_EQ(endOf(asset), ended(0));
}

TEST_F(TransferOfAnUpdate, IsForgottenWithItsEnd) {
  const SyncAssetPtr asset = begin();
  ASSERT_TRUE(asset);
  EXPECT_EQ(endOf(asset), ended(1));
  EXPECT_EQ(endOf(asset), ended(0));
}

TEST_F(TransferOfAnUpdate, IsForgottenWhenTheTransfersEndWithoutIt) {
  const SyncAssetPtr asset = begin();
  ASSERT_TRUE(asset);
  client().assetTransferEndedWithSuccess(true);
  EXPECT_EQ(endOf(asset), ended(0));
}

TEST_F(TransferOfAnUpdate, IsRememberedWhenTheTransfersEndWithNothingOnItsWay) {
  const SyncAssetPtr asset = requestOne();
  ASSERT_TRUE(asset);
  client().assetTransferEndedWithSuccess(true);
  EXPECT_EQ(endOf(asset), ended(1));
}

TEST_F(TransferOfAnUpdate, ThatAPersonCancelledMayBeCancelledAgainAfterItsEnd) {
  const SyncAssetPtr asset = begin();
  ASSERT_TRUE(asset);
  const auto coordinator = phone.installCoordination.coordinator("com.a");
  client().coordinatorCanceledWithReason(*coordinator, Passing, KQClientKiosk);
  endOf(asset);
  forgetTrace();
  client().coordinatorCanceledWithReason(*coordinator, Passing, KQClientKiosk);
  expectTrace({"log default SyncBundle|Cancelling asset sync for com.a",
               "SyncHostService.cancelAssetAsFailed(com.a)"});
}

TEST_F(TransferOfAnUpdate, ThatAPersonCancelledMayBeCancelledAgainWhenTheTransfersEndWithoutIt) {
  ASSERT_TRUE(begin());
  const auto coordinator = phone.installCoordination.coordinator("com.a");
  client().coordinatorCanceledWithReason(*coordinator, Passing, KQClientKiosk);
  client().assetTransferEndedWithSuccess(true);
  forgetTrace();
  client().coordinatorCanceledWithReason(*coordinator, Passing, KQClientKiosk);
  expectTrace({"log default SyncBundle|Cancelling asset sync for com.a",
               "SyncHostService.cancelAssetAsFailed(com.a)"});
}

TEST_F(TransferOfAnUpdate, IsLeftToItsCoordinatorWhenTheTransfersEndWithSuccessBeforeIt) {
  ASSERT_TRUE(begin());
  client().assetTransferEndedWithSuccess(true);
  expectTrace({"log default SyncBundle|asset transfer ended withsuccess: y",
               "SystemNotifier.registerCheck(com.corvane.dashel.twc.wsyncnotify)",
               "log default SyncBundle|Notifying DS we are done syncing",
               "HomeScreenService.serverPort()",
               "SystemNotifier.setState(com.corvane.dashel.twc.wsyncnotify, 0)",
               "SystemNotifier.post(com.corvane.dashel.twc.wsyncnotify)",
               "InstallCoordination.coordinatorFor(com.a, any, 3, look up)",
               "log error SyncBundle|Called with success == YES but with 1 outstanding XFT "
               "transfers!"});
  EXPECT_TRUE(phone.installCoordination.coordinator("com.a")->state().isLive());
  // Settled once: nothing is left for a second end.
  client().assetTransferEndedWithSuccess(true);
  EXPECT_EQ(phone.trace.count("InstallCoordination."), 0u);
}

}  // namespace
}  // namespace appsync
