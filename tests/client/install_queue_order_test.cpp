// What the install queue lets happen at once, what it waits for, and what it clears behind it.
#include <atomic>
#include <latch>
#include <thread>

#include "tests/client/install_queue.h"
#include "tests/client/turns.h"

namespace appsync {
namespace {

using namespace std::chrono_literals;

TEST_F(InstallQueue, TenInstallsOverlapAndTheEleventhWaits) {
  prepare();
  phone.appRegistry.blockInstalls();
  for (int index = 0; index < 11; ++index) {
    const std::string identifier = "com.app" + std::to_string(index);
    const std::string path = StagingRootPath + "/" + identifier + ".zip";
    phone.files.putFile(path, "package");
    client()._enqueueAssetInstall(asset(identifier, path));
  }
  ASSERT_TRUE(phone.appRegistry.waitForInstalls(10));
  EXPECT_FALSE(seenInTurns([this] { return phone.appRegistry.installsStarted() > 10; }));
  phone.appRegistry.releaseInstalls();
  client().assetTransferEndedWithSuccess(true);
  EXPECT_EQ(phone.appRegistry.installsStarted(), 11u);
  EXPECT_EQ(phone.appRegistry.mostInstallsAtOnce(), 10u);
  EXPECT_EQ(phone.appRegistry.installedIdentifiers().size(), 11u);
}

/// Tells when the end of the transfers has begun, and whether it is over at a moment when an
/// install still waits for its retry.
class EndNoticingLog : public fakes::FakeLog {
 public:
  using FakeLog::FakeLog;
  void write(LogChannel channel, LogLevel level, std::string_view text) noexcept override {
    FakeLog::write(channel, level, text);
    if (text.ends_with("asset transfer ended withsuccess: y")) endBegan.count_down();
    if (text.find("Will retry installation") == std::string_view::npos &&
        text.find("Re-enqueue installation") == std::string_view::npos) {
      return;
    }
    endBegan.wait();
    if (seenInTurns([this] { return ended.load(); })) endedEarly = true;
  }

  std::latch endBegan{1};
  std::atomic<bool> ended = false;
  std::atomic<bool> endedEarly = false;
};

TEST_F(InstallQueue, EndOfTheTransfersWaitsForARetryFromTheRefusalToItsInstall) {
  phone.homeScreen.queueOutcomes("com.a", {AssertionOutcome::Denied});
  EndNoticingLog noticing(phone.trace);
  AppsClient ending(with(phone.platform(), noticing));
  ending._enqueueAssetInstall(asset());
  std::thread host([&] {
    ending.assetTransferEndedWithSuccess(true);
    noticing.ended = true;
  });
  ASSERT_TRUE(phone.backgroundQueue.waitForPending(1));
  phone.backgroundQueue.advance(30s);
  host.join();
  EXPECT_FALSE(noticing.endedEarly);
  EXPECT_TRUE(phone.appRegistry.installed("com.a"));
  const Lines log = phone.trace.log();
  const auto done =
      std::ranges::find(log, "log default SyncBundle|Notifying DS we are done syncing");
  const auto installed = std::ranges::find(log, "log default SyncBundle|com.a install succeeded");
  EXPECT_LT(installed, done);
}

/// A phone that remembers com.a's package of an earlier restore.
class InstallQueueAndRestoreState : public InstallQueue {
 protected:
  void SetUp() override {
    InstallQueue::SetUp();
    const Dictionary versions{{"1.0", Dictionary{{"path", PackagePath}}}};
    phone.files.putPlist(RestoreStatePath, Dictionary{{"com.a", versions}});
  }
};

TEST_F(InstallQueueAndRestoreState, ASuccessClearsItBeforeTheInstallIsOver) {
  client().assetInstallSucceeded(asset());
  EXPECT_FALSE(phone.files.exists(RestoreStatePath));
}

TEST_F(InstallQueueAndRestoreState, AFailureOfEitherSortClearsItBeforeTheInstallIsOver) {
  client().assetInstallFailed(asset(), Passing);
  EXPECT_FALSE(phone.files.exists(RestoreStatePath));
  SetUp();
  client().assetInstallFailed(asset(), Refused);
  EXPECT_FALSE(phone.files.exists(RestoreStatePath));
}

TEST_F(InstallQueueAndRestoreState, AnInstallThatIsToBeTriedAgainClearsItWhenItsTurnIsOver) {
  phone.homeScreen.queueOutcomes("com.a", {AssertionOutcome::Denied});
  client()._enqueueAssetInstall(asset());
  ASSERT_TRUE(phone.backgroundQueue.waitForPending(1));
  // Lets the turn end and drops the retry.
  destroyClient();
  EXPECT_FALSE(phone.appRegistry.installed("com.a"));
  EXPECT_FALSE(phone.files.exists(RestoreStatePath));
}

}  // namespace
}  // namespace appsync
