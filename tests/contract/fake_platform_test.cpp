// What tests rely on beyond the contracts: the trace, planned faults and installs that overlap.
#include "tests/fakes/fake_platform.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <thread>

namespace appsync::fakes {
namespace {

using Lines = std::vector<std::string>;

const PropertyList::Dictionary package = {
    {std::string(SWPackageTypeKey), SWPackageTypeCustomer},
    {std::string(KBBundleIdentifier), "com.a"},
};

class FakePlatformTest : public testing::Test {
 protected:
  FakePlatform fakes;
  Platform platform = fakes.platform();
};

TEST_F(FakePlatformTest, TheTraceTellsEverythingInOneOrder) {
  fakes.appRegistry.seedPlaceholder("com.a");
  platform.log.write(LogChannel::TWLogCategorySyncBundle, LogLevel::Default,
                     "com.corvane.twc.AppsClient|starting");
  platform.log.write(LogChannel::TWLogCategoryFramework, LogLevel::Error, "no prefix");
  platform.appRegistry.uninstallApplication("com.a", {});
  platform.transactionLog.logScenario("Halvo Sync", 0U, true, "com.a", "Uninstall succeeded");
  platform.transactionLog.logScenario("Install placeholder", std::nullopt, false, "com.a",
                                      "Failed");
  platform.transactionLog.logStep(3, 1, 1, true, "com.a", "Create coordinator");
  platform.files.moveItem("/from", "/to");
  platform.files.fileExists("/to");
  EXPECT_EQ(fakes.trace.readable(TraceAll),
            (Lines{"log default SyncBundle|starting", "log error Framework|no prefix",
                   "AppRegistry.uninstallApplication(com.a, {})",
                   "transaction scenario \"Halvo Sync\" step 0 ok com.a \"Uninstall succeeded\"",
                   "transaction scenario \"Install placeholder\" failed com.a \"Failed\"",
                   "transaction step 3 party 1 phase 1 ok com.a \"Create coordinator\"",
                   "FileManager.moveItem(/from, /to)", "FileManager.fileExists(/to)"}));
  EXPECT_EQ(fakes.trace.calls(), Lines{"AppRegistry.uninstallApplication(com.a, {})"});
  EXPECT_EQ(fakes.trace.lines(TraceLog).front(),
            "log default SyncBundle|com.corvane.twc.AppsClient|starting");
  EXPECT_EQ(fakes.trace.readable(TraceEffects).size(), 7U);
  fakes.trace.clear();
  EXPECT_EQ(fakes.trace.lines(TraceAll), Lines{});
}

TEST_F(FakePlatformTest, OnlyThePlannedCallFailsAndChangesNothing) {
  const Error full = Error::posix(ENOSPC);
  fakes.faults.failCall("FileManager.writeAtomically", 2, full);
  std::optional<Error> error;
  EXPECT_TRUE(platform.files.writeAtomically("/tmp/1", asBytes("1"), &error));
  EXPECT_FALSE(platform.files.writeAtomically("/tmp/2", asBytes("2"), &error));
  EXPECT_EQ(error, full);
  EXPECT_TRUE(platform.files.writeAtomically("/tmp/3", asBytes("3")));
  EXPECT_EQ(fakes.files.files(),
            (std::map<std::string, Bytes>{{"/tmp/1", toBytes("1")}, {"/tmp/3", toBytes("3")}}));
  EXPECT_EQ(fakes.trace.lines(), (Lines{"FileManager.writeAtomically(/tmp/1)",
                                        "fault FileManager.writeAtomically(/tmp/2)",
                                        "FileManager.writeAtomically(/tmp/3)"}));
}

TEST_F(FakePlatformTest, AFaultMayStrikeEveryCallOrThoseOfOneArgument) {
  fakes.faults.failWhere("FileManager.createDirectory", "com.a", Error::posix(EACCES));
  EXPECT_TRUE(platform.files.createDirectory("/tmp/com.b.app", true, {}));
  EXPECT_FALSE(platform.files.createDirectory("/tmp/com.a.app", true, {}));
  fakes.faults.failEvery("InstallCoordination.createAppPlaceholder", Error::posix(EIO));
  const auto make = [&] {
    return platform.installCoordination.createAppPlaceholder("A", "com.a", InstallType::Sync,
                                                             SyncHostClientID);
  };
  EXPECT_FALSE(make());
  EXPECT_FALSE(make());
  fakes.faults.clear();
  EXPECT_TRUE(make());
  EXPECT_TRUE(platform.files.createDirectory("/tmp/com.a.app", true, {}));
}

TEST_F(FakePlatformTest, ACoordinatorsSetterCanFailWithAnError) {
  const Error refused = Error::withDescription(TWErrorDomain, 7, "refused");
  fakes.faults.failWhere("InstallCoordinator.setInstallOptions", "com.a", refused);
  const auto coordinator = platform.installCoordination.coordinatorFor(
      CoordinatorKind::Initiating, "com.a", SyncHostClientID, true, nullptr, nullptr);
  std::optional<Error> error;
  EXPECT_FALSE(coordinator->setInstallOptions({}, &error));
  EXPECT_EQ(error, refused);
  EXPECT_FALSE(coordinator->hasInstallOptions());
}

TEST_F(FakePlatformTest, AnInstallFailsAsTold) {
  const Error damaged = Error::withDescription(InstallerServiceErrorDomain, 2, "damaged");
  fakes.files.putFile("/tmp/package", "bytes");
  fakes.appRegistry.failInstall("com.a", damaged);
  std::optional<Error> error;
  EXPECT_FALSE(
      platform.appRegistry.installApplication(FileLocation::file("/tmp/package"), package, &error));
  EXPECT_EQ(error, damaged);
  fakes.appRegistry.seedInstalled("com.a");
  fakes.appRegistry.failUninstall("com.a");
  EXPECT_FALSE(platform.appRegistry.uninstallApplication("com.a", {}));
  EXPECT_TRUE(fakes.appRegistry.installed("com.a"));
}

TEST_F(FakePlatformTest, BlockedInstallsWaitInsideTheRegistryUntilReleased) {
  fakes.files.putFile("/tmp/package", "bytes");
  fakes.appRegistry.blockInstalls();
  std::vector<std::thread> threads;
  for (const char* identifier : {"com.a", "com.b", "com.c"}) {
    threads.emplace_back([this, identifier] {
      PropertyList::Dictionary options = package;
      options.insert_or_assign(std::string(KBBundleIdentifier), identifier);
      EXPECT_TRUE(platform.appRegistry.installApplication(FileLocation::file("/tmp/package"),
                                                          options, nullptr));
    });
  }
  EXPECT_TRUE(fakes.appRegistry.waitForInstalls(3));
  EXPECT_EQ(fakes.appRegistry.installedIdentifiers(), Lines{});
  fakes.appRegistry.releaseInstalls();
  for (std::thread& thread : threads) thread.join();
  EXPECT_EQ(fakes.appRegistry.installedIdentifiers(), (Lines{"com.a", "com.b", "com.c"}));
  EXPECT_EQ(fakes.appRegistry.mostInstallsAtOnce(), 3U);
}

TEST_F(FakePlatformTest, ObserversGetScriptedReports) {
  class Observer : public AppRegistryObserver {
   public:
    void applicationInstallsArePrioritized(const std::vector<AppRecord>& prioritized,
                                           const std::vector<AppRecord>& paused) noexcept override {
      told.push_back(prioritized.size() * 10 + paused.size());
    }
    void applicationInstallsDidCancel(const std::vector<AppRecord>& records) noexcept override {
      told.push_back(records.size());
    }
    std::vector<std::size_t> told;
  };
  Observer observer;
  fakes.appRegistry.scriptReport(std::vector<AppRecord>(3), std::vector<AppRecord>(1));
  platform.appRegistry.addObserver(&observer);
  fakes.appRegistry.waitForEvents();
  fakes.appRegistry.reportInstalls({}, std::vector<AppRecord>(2));
  fakes.appRegistry.reportCancellation(std::vector<AppRecord>(5));
  platform.appRegistry.removeObserver(&observer);
  EXPECT_EQ(observer.told, (std::vector<std::size_t>{31, 2, 5}));
}

TEST_F(FakePlatformTest, TheVirtualClockRunsWhatIsDueAndNoMore) {
  using namespace std::chrono_literals;
  const auto start = fakes.clock.now();
  std::vector<std::chrono::milliseconds> runs;
  const auto note = [&] { runs.push_back(fakes.clock.now() - start); };
  platform.backgroundQueue.after(30s, note);
  platform.backgroundQueue.after(10s, [&] {
    note();
    platform.backgroundQueue.after(5s, note);
  });
  fakes.backgroundQueue.advance(30s - 1ms);
  EXPECT_EQ(runs, (std::vector<std::chrono::milliseconds>{10s, 15s}));
  EXPECT_EQ(fakes.backgroundQueue.pendingDelays(), std::vector<std::chrono::milliseconds>{1ms});
  fakes.backgroundQueue.advance(1ms);
  EXPECT_EQ(runs.back(), 30s);
  EXPECT_EQ(fakes.backgroundQueue.pendingCount(), 0U);
}

}  // namespace
}  // namespace appsync::fakes
