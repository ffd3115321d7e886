#include <condition_variable>
#include <mutex>
#include <thread>

#include "tests/device/device_test.h"

namespace appsync::device {
namespace {

constexpr std::string_view Id = "com.example.a";

class InstallProgressTest : public DeviceTest {
 protected:
  std::shared_ptr<InstallProgress> progress(std::string_view identifier = Id) {
    const auto placeholder = record(identifier, true);
    return placeholder ? device->appRegistry().installProgressSync(*placeholder) : nullptr;
  }
};

/// Keeps what the registry tells and lets a test wait for it.
class Listener final : public AppRegistryObserver {
 public:
  void applicationInstallsDidCancel(const std::vector<AppRecord>& records) noexcept override {
    const std::lock_guard lock(mutex_);
    for (const AppRecord& record : records) cancelled_.push_back(description(record));
    changed_.notify_all();
  }
  void applicationInstallsArePrioritized(const std::vector<AppRecord>&,
                                         const std::vector<AppRecord>&) noexcept override {
    const std::lock_guard lock(mutex_);
    ++reports_;
    changed_.notify_all();
  }
  void waitForReports(int count) {
    std::unique_lock lock(mutex_);
    changed_.wait(lock, [&] { return reports_ >= count; });
  }
  std::vector<std::string> waitForCancellation() {
    std::unique_lock lock(mutex_);
    changed_.wait(lock, [&] { return !cancelled_.empty(); });
    return cancelled_;
  }
  std::vector<std::string> cancelled() {
    const std::lock_guard lock(mutex_);
    return cancelled_;
  }

 private:
  std::mutex mutex_;
  std::condition_variable changed_;
  std::vector<std::string> cancelled_;
  int reports_ = 0;
};

TEST_F(InstallProgressTest, AnInstallWaitsAndLoadsAtFirst) {
  ASSERT_TRUE(installPlaceholder(Id));
  EXPECT_EQ(progress()->installState(), InstallState::Waiting);
  EXPECT_EQ(progress()->installPhase(), InstallPhase::Loading);
  EXPECT_EQ(progress()->totalUnitCount(), 0);
  EXPECT_EQ(progress()->completedUnitCount(), 0);
  const auto placeholder = record(Id, true);
  EXPECT_TRUE(device->appRegistry().installProgress(*placeholder, InstallPhase::Loading));
  EXPECT_FALSE(device->appRegistry().installProgress(*placeholder, InstallPhase::Installing));
}

TEST_F(InstallProgressTest, TwoObjectsOfOneInstallShareItsValues) {
  ASSERT_TRUE(installPlaceholder(Id));
  const auto one = progress();
  const auto other = progress();
  one->setCompletedUnitCount(7);
  other->setInstallPhase(InstallPhase::RestoringData);
  EXPECT_EQ(other->completedUnitCount(), 7);
  EXPECT_EQ(one->installPhase(), InstallPhase::RestoringData);
}

TEST_F(InstallProgressTest, WhenTheInstallIsOverTheLastValuesStayAndNothingChangesThem) {
  ASSERT_TRUE(installPlaceholder(Id));
  const auto kept = progress();
  kept->setTotalUnitCount(1000);
  kept->setCompletedUnitCount(999);
  ASSERT_TRUE(installPackage(Id));
  EXPECT_EQ(kept->installState(), InstallState::Finished);
  kept->setCompletedUnitCount(1);
  kept->setInstallState(InstallState::Paused);
  kept->setInstallPhase(InstallPhase::RestoringData);
  kept->cancel();
  EXPECT_EQ(kept->installState(), InstallState::Finished);
  EXPECT_EQ(kept->installPhase(), InstallPhase::Installing);
  EXPECT_EQ(kept->completedUnitCount(), 999);
  EXPECT_EQ(kept->totalUnitCount(), 1000);
}

TEST_F(InstallProgressTest, TheEndOfLoadingIsTheBeginningOfInstallingUnlessItFailed) {
  auto& registry = device->appRegistry();
  struct Case {
    InstallState state;
    InstallPhase phase;
  };
  for (const auto& [state, phase] : {Case{InstallState::Active, InstallPhase::Installing},
                                     Case{InstallState::Finished, InstallPhase::Installing},
                                     Case{InstallState::Failed, InstallPhase::Loading},
                                     Case{InstallState::Canceled, InstallPhase::Loading}}) {
    ASSERT_TRUE(installPlaceholder(Id));
    const auto installing = progress();
    installing->setInstallState(state);
    registry.installPhaseFinished(*installing);
    EXPECT_EQ(installing->installPhase(), phase) << static_cast<int>(state);
  }
  const auto restoring = progress();
  restoring->setInstallPhase(InstallPhase::RestoringData);
  registry.installPhaseFinished(*restoring);
  EXPECT_EQ(restoring->installPhase(), InstallPhase::RestoringData);
}

TEST_F(InstallProgressTest, APersonsRemovalOfAPlaceholderBeingInstalledIsACancellation) {
  Listener listener;
  ASSERT_TRUE(installPlaceholder(Id));
  ASSERT_TRUE(installPlaceholder("com.example.failed"));
  progress("com.example.failed")->setInstallState(InstallState::Failed);
  device->appRegistry().addObserver(&listener);
  EXPECT_TRUE(device->uninstall("com.example.failed", &error));
  EXPECT_TRUE(device->uninstall(Id, &error));
  EXPECT_EQ(listener.waitForCancellation(),
            std::vector<std::string>{"com.example.a (placeholder)"});
  device->appRegistry().removeObserver(&listener);
}

TEST_F(InstallProgressTest, AClientsOwnRemovalIsNoCancellation) {
  Listener listener;
  ASSERT_TRUE(installPlaceholder(Id));
  device->appRegistry().addObserver(&listener);
  listener.waitForReports(1);
  ASSERT_TRUE(device->appRegistry().uninstallApplication(Id, {}));
  listener.waitForReports(2);
  device->appRegistry().removeObserver(&listener);
  EXPECT_TRUE(listener.cancelled().empty());
}

TEST_F(InstallProgressTest, ObserversComeAndGoWhileInstallsChange) {
  ASSERT_TRUE(installPlaceholder(Id));
  const auto installing = progress();
  std::vector<std::thread> threads;
  for (int i = 0; i < 4; ++i) {
    threads.emplace_back([&] {
      for (int round = 0; round < 20; ++round) {
        Listener listener;
        device->appRegistry().addObserver(&listener);
        if (round % 2 == 0) listener.waitForReports(1);
        std::thread alsoRemoves([&] { device->appRegistry().removeObserver(&listener); });
        device->appRegistry().removeObserver(&listener);
        alsoRemoves.join();
      }
    });
  }
  for (int i = 0; i < 100; ++i) {
    installing->setInstallState(i % 2 == 0 ? InstallState::Active : InstallState::Paused);
  }
  for (std::thread& thread : threads) thread.join();
}

}  // namespace
}  // namespace appsync::device
