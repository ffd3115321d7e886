#include <atomic>
#include <future>

#include "tests/contract/latch_observer.h"
#include "tests/contract/phone.h"

namespace appsync::contract {
namespace {

class AppRegistryObserverContract : public ServiceContract {
 protected:
  AppRegistry& registry = platform.appRegistry;

  std::shared_ptr<InstallProgress> progress(std::string_view identifier) {
    const auto record = registry.recordForIdentifier(identifier, true);
    return record ? registry.installProgress(*record, InstallPhase::Loading) : nullptr;
  }
};

SERVICE_CONTRACT_OF(AppRegistryObserverContract);

using Report = LatchObserver::Report;

TEST_P(AppRegistryObserverContract, ANewObserverGetsOneReportOnAnotherThread) {
  ASSERT_TRUE(installPlaceholder("com.a"));
  ASSERT_TRUE(installPlaceholder("com.b"));
  LatchObserver observer;
  registry.addObserver(&observer);
  EXPECT_TRUE(observer.waitFor(Report{{"com.a", "com.b"}, {}}));
  EXPECT_NE(observer.thread(), std::this_thread::get_id());
  registry.removeObserver(&observer);
  EXPECT_EQ(observer.reportCount(), 1U);
}

TEST_P(AppRegistryObserverContract, AnEmptyRegistryReportsToo) {
  LatchObserver observer;
  registry.addObserver(&observer);
  EXPECT_TRUE(observer.waitFor(Report{}));
  registry.removeObserver(&observer);
}

TEST_P(AppRegistryObserverContract, EveryChangeOfTheInstallsIsReported) {
  LatchObserver observer;
  registry.addObserver(&observer);
  ASSERT_TRUE(observer.waitFor(Report{}));
  ASSERT_TRUE(installPlaceholder("com.a"));
  EXPECT_TRUE(observer.waitFor(Report{{"com.a"}, {}}));
  ASSERT_TRUE(installPlaceholder("com.b"));
  EXPECT_TRUE(observer.waitFor(Report{{"com.a", "com.b"}, {}}));
  progress("com.a")->setInstallState(InstallState::Paused);
  EXPECT_TRUE(observer.waitFor(Report{{"com.b"}, {"com.a"}}));
  progress("com.a")->setInstallState(InstallState::Active);
  EXPECT_TRUE(observer.waitFor(Report{{"com.a", "com.b"}, {}}));
  ASSERT_TRUE(installPackage("com.b"));
  EXPECT_TRUE(observer.waitFor(Report{{"com.a"}, {}}));
  ASSERT_TRUE(registry.uninstallApplication("com.a", {}));
  EXPECT_TRUE(observer.waitFor(Report{}));
  registry.removeObserver(&observer);
}

TEST_P(AppRegistryObserverContract, ACancelledInstallIsToldAndLeavesTheReport) {
  ASSERT_TRUE(installPlaceholder("com.a", "1.0", InstallType::Restore));
  LatchObserver observer;
  registry.addObserver(&observer);
  ASSERT_TRUE(observer.waitFor(Report{{"com.a"}, {}}));
  const auto installing = progress("com.a");
  installing->cancel();
  EXPECT_EQ(installing->installState(), InstallState::Canceled);
  EXPECT_TRUE(observer.waitForCanceled({"com.a"}));
  EXPECT_TRUE(observer.waitFor(Report{}));
  registry.removeObserver(&observer);
}

TEST_P(AppRegistryObserverContract, ARemovedObserverIsToldNothingMore) {
  LatchObserver removed;
  LatchObserver staying;
  registry.addObserver(&removed);
  registry.addObserver(&staying);
  ASSERT_TRUE(removed.waitFor(Report{}));
  ASSERT_TRUE(staying.waitFor(Report{}));
  registry.removeObserver(&removed);
  ASSERT_TRUE(installPlaceholder("com.a"));
  ASSERT_TRUE(staying.waitFor(Report{{"com.a"}, {}}));
  registry.removeObserver(&staying);
  EXPECT_EQ(removed.reportCount(), 1U);
}

/// Stays inside its first event until it is let go.
class SlowObserver : public AppRegistryObserver {
 public:
  void applicationInstallsArePrioritized(const std::vector<AppRecord>&,
                                         const std::vector<AppRecord>&) noexcept override {
    if (seen.exchange(true)) return;
    entered.set_value();
    go.get_future().wait();
    finished = true;
  }
  std::atomic<bool> seen = false;
  std::promise<void> entered;
  std::promise<void> go;
  std::atomic<bool> finished = false;
};

TEST_P(AppRegistryObserverContract, RemovingWaitsForARunningEvent) {
  SlowObserver observer;
  registry.addObserver(&observer);
  observer.entered.get_future().wait();
  std::promise<void> removing;
  std::thread remover([&] {
    removing.set_value();
    registry.removeObserver(&observer);
    EXPECT_TRUE(observer.finished);
  });
  removing.get_future().wait();
  observer.go.set_value();
  remover.join();
}

TEST_P(AppRegistryObserverContract, AnObserverMayAskTheRegistry) {
  class Asking : public AppRegistryObserver {
   public:
    explicit Asking(AppRegistry& registry) : registry_(registry) {}
    void applicationInstallsArePrioritized(const std::vector<AppRecord>& prioritized,
                                           const std::vector<AppRecord>&) noexcept override {
      if (prioritized.empty() || answered_.exchange(true)) return;
      const auto progress = registry_.installProgressSync(prioritized.front());
      answer.set_value(progress && registry_.isApplicationInstalled("com.a"));
    }
    std::promise<bool> answer;

   private:
    AppRegistry& registry_;
    std::atomic<bool> answered_ = false;
  };
  ASSERT_TRUE(installPlaceholder("com.a"));
  Asking observer(registry);
  registry.addObserver(&observer);
  EXPECT_TRUE(observer.answer.get_future().get());
  registry.removeObserver(&observer);
}

}  // namespace
}  // namespace appsync::contract
