// How packages travel: progress, order, cancelling, failures and interruption.
#include <cerrno>

#include "tests/host/session_fixture.h"

namespace appsync::host {
namespace {

using namespace testing;
using ::testing::Contains;
using ::testing::Each;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::Not;
using ::testing::SizeIs;
using ::testing::StartsWith;

constexpr std::size_t ThreeChunks = 3 * PackageTransfer::ChunkSize - 8192;

std::vector<std::string> identifiersOf(const std::vector<std::string>& progressLines) {
  std::vector<std::string> identifiers;
  for (const std::string& line : progressLines) {
    identifiers.push_back(line.substr(line.find('(') + 1, 5));
  }
  return identifiers;
}

TEST_F(SessionTest, SendsThePackageUnchanged) {
  offer("com.a", "1.0", ThreeChunks);
  std::optional<Bytes> arrived;
  client.installsAtOnce = false;
  client.onSent = [&](const SyncAssetPtr& asset) {
    arrived = phone.files.bytesAt(joinPath(exchange::StagingRoot, *asset->path));
    EXPECT_EQ(asset->completedAssetParts, kTWAssetPartApplication);
    EXPECT_EQ(asset->downloadProgress, 1.0);
  };
  sync();
  EXPECT_TRUE(arrived && asText(*arrived) == fileText(folder / "com.a.tar"));
}

TEST_F(SessionTest, TellsProgressChunkByChunk) {
  offer("com.a", "1.0", ThreeChunks);
  sync();
  EXPECT_THAT(trace("client.assetTransferUpdatedProgress"),
              ElementsAre("client.assetTransferUpdatedProgress(com.a, 0.33)",
                          "client.assetTransferUpdatedProgress(com.a, 0.67)",
                          "client.assetTransferUpdatedProgress(com.a, 1.00)"));
}

TEST_F(SessionTest, TheAssetHoldsItsProgressBeforeTheClientIsTold) {
  offer("com.a", "1.0", ThreeChunks);
  std::vector<double> told;
  client.onProgress = [&](const SyncAssetPtr& asset, double fraction) {
    EXPECT_EQ(asset->downloadProgress, fraction);
    told.push_back(fraction);
  };
  sync();
  EXPECT_THAT(told, SizeIs(3));
}

TEST_F(SessionTest, AnEmptyPackageIsSentWhole) {
  offer("com.a");
  client.onOutstanding = [&] { std::filesystem::resize_file(folder / "com.a.tar", 0); };
  sync();
  EXPECT_THAT(trace("client.assetTransfer"),
              ElementsAre("client.assetTransferUpdatedProgress(com.a, 1.00)",
                          "client.assetTransferSucceeded(com.a, com.a.tar, none)",
                          "client.assetTransferEndedWithSuccess(true)"));
}

TEST_F(SessionTest, TellsProgressAtMostAHundredTimesForALargePackage) {
  offer("com.a", "1.0", 60 << 20);
  sync();
  EXPECT_THAT(trace("client.assetTransferUpdatedProgress"), SizeIs(100));
  EXPECT_THAT(trace("client.assetTransferUpdatedProgress"),
              Contains("client.assetTransferUpdatedProgress(com.a, 1.00)").Times(1));
}

TEST_F(SessionTest, PausesAPackageForOneThatIsPrioritised) {
  for (const char* identifier : {"com.a", "com.b", "com.c"}) offer(identifier, "1.0", ThreeChunks);
  bool asked = false;
  client.onProgress = [&](const SyncAssetPtr& asset, double) {
    if (asked || asset->identifier != "com.a") return;
    asked = true;
    host.service().prioritizeAsset(host.makeDownload("com.c", "Application", std::nullopt),
                                   [](const std::optional<Error>& error) { EXPECT_FALSE(error); });
  };
  const SyncResult result = sync();
  EXPECT_THAT(
      identifiersOf(trace("client.assetTransferUpdatedProgress")),
      ElementsAre("com.a", "com.c", "com.c", "com.c", "com.a", "com.a", "com.b", "com.b", "com.b"));
  EXPECT_EQ(text(result.summary), "installed: com.a com.b com.c");
}

TEST_F(SessionTest, AnswersAWishForAPackageThatDoesNotWait) {
  std::optional<Error> answer;
  host.service().prioritizeAsset(host.makeDownload("com.a", "Application", std::nullopt),
                                 [&](const std::optional<Error>& error) { answer = error; });
  ASSERT_TRUE(answer);
  EXPECT_EQ(answer->code, ENOENT);
  host.service().cancelAssetAsFailed(host.makeDownload("com.a", "Application", std::nullopt));
}

TEST_F(SessionTest, WhatWasCancelledBeforeItBeganDoesNotConcernIt) {
  offer("com.a");
  bool told = false;
  isBusyWith = [&](std::string_view identifier) {
    if (told) return false;
    host.service().cancelAssetAsFailed(host.makeDownload(identifier, "Application", std::nullopt));
    return told = true;
  };
  EXPECT_EQ(text(sync().summary), "installed: com.a");
}

TEST_F(SessionTest, StopsAPackageThatIsCancelledOnThePhone) {
  offer("com.a", "1.0", ThreeChunks);
  offer("com.b");
  client.onProgress = [&](const SyncAssetPtr& asset, double) {
    if (asset->identifier == "com.a") host.service().cancelAssetAsFailed(asset);
  };
  const SyncResult result = sync();
  EXPECT_THAT(trace("client.assetTransferSucceeded"),
              ElementsAre("client.assetTransferSucceeded(com.a, failed, TWError 30)",
                          "client.assetTransferSucceeded(com.b, com.b.tar, none)"));
  EXPECT_FALSE(phone.files.exists(joinPath(exchange::StagingRoot, "com.a.tar")));
  EXPECT_EQ(text(result.summary), "installed: com.b; failed: com.a (cancelled on the phone)");
}

TEST_F(SessionTest, APackageThatIsCancelledBeforeItIsQueuedIsNotSent) {
  offer("com.a");
  offer("com.b");
  client.onOutstanding = [&] {
    host.service().cancelAssetAsFailed(host.makeDownload("com.a", "Application", std::nullopt));
  };
  EXPECT_EQ(text(sync().summary), "installed: com.b; failed: com.a (cancelled on the phone)");
  EXPECT_THAT(identifiersOf(trace("client.assetTransferUpdatedProgress")), ElementsAre("com.b"));
}

TEST_F(SessionTest, APackageThatIsCancelledWhenItHasBeenSentCanBeSentAgain) {
  const auto asset = host.makeDownload("com.a", "Application", std::nullopt);
  host.transfers().add({asset});
  host.transfers().finish(asset);
  host.service().cancelAssetAsFailed(asset);
  host.transfers().add({asset});
  EXPECT_FALSE(host.transfers().next().cancelled);
}

TEST_F(SessionTest, FailsAPackageThatVanishes) {
  offer("com.a", "1.0", ThreeChunks);
  offer("com.b", "1.0", ThreeChunks);
  client.onOutstanding = [&] { std::filesystem::remove(folder / "com.a.tar"); };
  const SyncResult result = sync();
  EXPECT_THAT(trace("client.assetTransferSucceeded"),
              ElementsAre("client.assetTransferSucceeded(com.a, failed, POSIX 2)",
                          "client.assetTransferSucceeded(com.b, com.b.tar, none)"));
  ASSERT_THAT(result.summary.failed, SizeIs(1));
  EXPECT_THAT(result.summary.failed[0].reason,
              ::testing::AllOf(StartsWith("could not be sent: "),
                               ::testing::HasSubstr("No such file or directory")));
}

TEST_F(SessionTest, FailsAPackageThatShrinksWhileItIsSent) {
  offer("com.a", "1.0", ThreeChunks);
  client.onProgress = [&](const SyncAssetPtr&, double) {
    std::filesystem::resize_file(folder / "com.a.tar", PackageTransfer::ChunkSize + 10);
  };
  const SyncResult result = sync();
  ASSERT_THAT(result.summary.failed, SizeIs(1));
  EXPECT_THAT(result.summary.failed[0].reason, ::testing::HasSubstr("changed while it was being"));
  EXPECT_FALSE(phone.files.exists(joinPath(exchange::StagingRoot, "com.a.tar")));
}

TEST_F(SessionTest, DoesNotHangOnAPipeInAPackagesPlace) {
  offer("com.a");
  client.onOutstanding = [&] {
    std::filesystem::remove(folder / "com.a.tar");
    ASSERT_EQ(::mkfifo((folder / "com.a.tar").c_str(), 0600), 0);
  };
  EXPECT_THAT(sync().summary.failed, SizeIs(1));
}

TEST_F(SessionTest, PassesTheErrorOfAFullPhoneOn) {
  for (const char* operation : {"phone.receive", "phone.append", "phone.finish"}) {
    SCOPED_TRACE(operation);
    offer("com.a");
    phone.trace.clear();
    phone.faults.failEvery(operation, Error::posix(ENOSPC));
    const SyncResult result = sync();
    phone.faults.clear();
    EXPECT_TRUE(result.completed);
    EXPECT_THAT(trace("client.assetTransferSucceeded"),
                ElementsAre("client.assetTransferSucceeded(com.a, failed, POSIX 28)"));
    EXPECT_EQ(text(result.summary), "failed: com.a (could not be sent: No space left on device)");
  }
}

TEST_F(SessionTest, EndsCleanlyWhenInterruptedWhileSending) {
  offer("com.a");
  offer("com.b", "1.0", ThreeChunks);
  offer("com.c");
  client.onProgress = [&](const SyncAssetPtr& asset, double) {
    if (asset->identifier == "com.b") interruption.request();
  };
  const SyncResult result = sync();
  EXPECT_FALSE(result.completed);
  const auto calls = trace("client.");
  EXPECT_THAT(std::vector(calls.end() - 6, calls.end()),
              ElementsAre("client.assetTransferSucceeded(com.a, com.a.tar, none)",
                          "client.assetTransferUpdatedProgress(com.b, 0.33)",
                          "client.assetTransferSucceeded(com.b, failed, POSIX 125)",
                          "client.assetTransferSucceeded(com.c, failed, POSIX 125)",
                          "client.assetTransferEndedWithSuccess(false)",
                          "client.syncEndedWithSuccess(false)"));
  EXPECT_THAT(trace("phone.expedite"), SizeIs(1));
  EXPECT_EQ(text(result.summary),
            "installed: com.a; failed: com.b (interrupted before it was sent) "
            "com.c (interrupted before it was sent)");
  EXPECT_FALSE(phone.files.exists(exchange::LastSyncState));
}

TEST_F(SessionTest, ClaimsNothingForTheStoreOnceItIsInterrupted) {
  phone.appRegistry.seedPlaceholder("com.asked", InstallType::StoreDownload);
  offer("com.a");
  client.onTakingOver = [&] { interruption.request(); };
  EXPECT_FALSE(sync().completed);
  EXPECT_EQ(phone.appRegistry.progress("com.asked")->installState(), InstallState::Waiting);
}

TEST_F(SessionTest, DoesNotTouchThePhoneWhenInterruptedBeforeStaging) {
  offer("com.a");
  client.onInventory = [&] { interruption.request(); };
  const SyncResult result = sync();
  EXPECT_THAT(trace("client.").back(), "client.syncEndedWithSuccess(false)");
  EXPECT_THAT(trace("client.reconcileSync"), IsEmpty());
  EXPECT_FALSE(phone.files.exists(exchange::StagingArea));
  EXPECT_EQ(text(result.summary), "failed: com.a (interrupted; the next sync does it)");
}

TEST_F(SessionTest, EndsInstallsThatWaitWhenInterruptedAtTheEnd) {
  offer("com.a");
  client.installsAtOnce = false;
  client.onTransfersEnd = [&] {
    client.watcher->assertionDenied("com.a");
    interruption.request();
  };
  const SyncResult result = sync();
  EXPECT_THAT(reporter.lines(), Contains("waiting com.a"));
  EXPECT_THAT(trace("phone.expedite"), SizeIs(1));
  EXPECT_EQ(trace("client.").back(), "client.syncEndedWithSuccess(false)");
  EXPECT_EQ(text(result.summary), "failed: com.a (interrupted; the next sync does it)");
  EXPECT_FALSE(phone.files.exists(joinPath(exchange::StagingRoot, "com.a.tar")));
}

TEST_F(SessionTest, DoesNotTakeAnOlderSyncsTodoListForItsOwn) {
  offer("com.a");
  phone.files.putPlist(joinPath(exchange::WorkArea, exchange::TodoListName),
                       PropertyList::Array{PropertyList::Dictionary{{"identifier", "com.a"},
                                                                    {"operation", "INSTALLED"}}});
  client.reconcileError = Error::posix(EIO);
  const SyncResult result = sync();
  EXPECT_FALSE(result.completed);
  EXPECT_EQ(text(result.summary),
            "failed: com.a (the phone could not take over what is to be done: "
            "Input/output error)");
  EXPECT_EQ(trace("client.").back(), "client.syncEndedWithSuccess(false)");
}

TEST_F(SessionTest, EndsWhenTheClientCannotBegin) {
  offer("com.a");
  client.prepareError = Error::posix(EBUSY);
  EXPECT_FALSE(sync().completed);
  EXPECT_EQ(trace("client.").back(), "client.syncEndedWithSuccess(false)");
  EXPECT_THAT(reporter.lines("broken"), SizeIs(1));
}

TEST_F(SessionTest, EndsWhenThePhoneDoesNotTakeTheStagingArea) {
  offer("com.a");
  phone.faults.failWhere("FileManager.createFile", "ApplicationsSync.plist", Error::posix(EIO));
  const SyncResult result = sync();
  EXPECT_FALSE(result.completed);
  EXPECT_THAT(trace("client.reconcileSync"), IsEmpty());
  EXPECT_THAT(result.summary.failed, SizeIs(1));
}

TEST_F(SessionTest, EndsWhenAStaleStagingAreaCannotBeRemoved) {
  offer("com.a");
  phone.files.putFile(joinPath(exchange::StagingArea, exchange::IconLayoutName), "old");
  phone.faults.failWhere("FileManager.removeItem", exchange::StagingArea, Error::posix(EIO));
  const SyncResult result = sync();
  EXPECT_FALSE(result.completed);
  EXPECT_THAT(trace("client.reconcileSync"), IsEmpty());
  EXPECT_THAT(result.summary.failed, SizeIs(1));
}

TEST_F(SessionTest, IsNotCompleteWhenTheApplicationsPresentCannotBeWritten) {
  offer("com.a");
  phone.faults.failWhere("FileManager.writeAtomically", exchange::LastSyncState,
                         Error::posix(ENOSPC));
  const SyncResult result = sync();
  EXPECT_FALSE(result.completed);
  EXPECT_EQ(text(result.summary), "installed: com.a");
  EXPECT_THAT(reporter.lines("broken"),
              ElementsAre(HasSubstr("the list of applications present could not be written")));
}

TEST_F(SessionTest, RefusesAPlugInForSomethingElse) {
  offer("com.a");
  client.dataclasses = {"Music"};
  const SyncResult result = sync();
  EXPECT_FALSE(result.completed);
  EXPECT_EQ(text(result.summary), "failed: com.a (the plug-in does not serve applications)");
}

}  // namespace
}  // namespace appsync::host
