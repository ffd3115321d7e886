#include "tests/client/client_test.h"
#include "transfer/in_progress_query.h"

namespace appsync {
namespace {

class InProgressQuery : public ClientTest {
 protected:
  void seed(std::string_view identifier, InstallType type, InstallState state, InstallPhase phase) {
    phone.appRegistry.seedPlaceholder(identifier, type);
    phone.appRegistry.progress(identifier)->begin(state, phase);
    prioritized.push_back(*phone.appRegistry.placeholder(identifier));
  }

  InProgressAssetQuery::Answer ask(std::vector<AppRecord> paused = {}) {
    phone.appRegistry.scriptReport(prioritized, std::move(paused));
    const ClientLog log(phone.log, "com.corvane.twc.AppsClient");
    return InProgressAssetQuery::currentInProgressAssetIDs(phone.appRegistry, log);
  }

  std::vector<AppRecord> prioritized;
};

using testing::ElementsAre;
using testing::IsEmpty;
using testing::Optional;

TEST_F(InProgressQuery, EmptyListGivesTwoEmptyAnswersAndASuccess) {
  const auto answer = ask();
  EXPECT_THAT(answer.inProgress, Optional(IsEmpty()));
  EXPECT_THAT(answer.restoring, Optional(IsEmpty()));
  const Lines log = phone.trace.log();
  // The report comes on a thread of the registry's own, so only its lines are ordered among
  // themselves.
  EXPECT_THAT(
      log,
      testing::UnorderedElementsAre(
          "log default SyncBundle|Waiting for -applicationInstallsArePrioritized:arePaused: "
          "to complete...",
          "log default Oversize|prioritized proxies () paused proxies ()",
          "log default SyncBundle|No assets currently in progress.",
          "log default SyncBundle|signaling semaphore", "log default SyncBundle|Wait completed"));
  EXPECT_EQ(log.back(), "log default SyncBundle|Wait completed");
}

TEST_F(InProgressQuery, TheObserverIsGoneAfterwards) {
  ask();
  EXPECT_EQ(phone.appRegistry.observerCount(), 0u);
}

TEST_F(InProgressQuery, ActiveLoadingStoreDownloadIsInProgressButSyncInstallIsNot) {
  seed("com.store", InstallType::StoreDownload, InstallState::Active, InstallPhase::Loading);
  seed("com.sync", InstallType::Sync, InstallState::Active, InstallPhase::Loading);
  const auto answer = ask();
  EXPECT_THAT(answer.inProgress, Optional(ElementsAre("com.store")));
  EXPECT_THAT(answer.restoring, Optional(IsEmpty()));
}

TEST_F(InProgressQuery, EveryTypeButRestoreThatIsActiveAndInstallingIsInProgress) {
  seed("com.none", InstallType::None, InstallState::Active, InstallPhase::Installing);
  seed("com.store", InstallType::StoreDownload, InstallState::Active, InstallPhase::Installing);
  seed("com.sync", InstallType::Sync, InstallState::Active, InstallPhase::Installing);
  seed("com.restore", InstallType::Restore, InstallState::Active, InstallPhase::Installing);
  const auto answer = ask();
  EXPECT_THAT(answer.inProgress, Optional(ElementsAre("com.none", "com.store", "com.sync")));
  EXPECT_THAT(answer.restoring, Optional(ElementsAre("com.restore")));
}

TEST_F(InProgressQuery, ActiveRestoreInTheDataPhaseIsDropped) {
  seed("com.loading", InstallType::Restore, InstallState::Active, InstallPhase::Loading);
  seed("com.data", InstallType::Restore, InstallState::Active, InstallPhase::RestoringData);
  const auto answer = ask();
  EXPECT_THAT(answer.inProgress, Optional(IsEmpty()));
  EXPECT_THAT(answer.restoring, Optional(ElementsAre("com.loading")));
}

TEST_F(InProgressQuery, InstallsThatAreNotActiveAreDropped) {
  seed("com.waiting", InstallType::Sync, InstallState::Waiting, InstallPhase::Installing);
  seed("com.paused", InstallType::Restore, InstallState::Paused, InstallPhase::Loading);
  seed("com.failed", InstallType::StoreDownload, InstallState::Failed, InstallPhase::Loading);
  const auto answer = ask();
  EXPECT_THAT(answer.inProgress, Optional(IsEmpty()));
  EXPECT_THAT(answer.restoring, Optional(IsEmpty()));
}

TEST_F(InProgressQuery, PausedInstallsAreOnlyLogged) {
  seed("com.a", InstallType::Sync, InstallState::Active, InstallPhase::Installing);
  const std::vector<AppRecord> paused = std::exchange(prioritized, {});
  const auto answer = ask(paused);
  EXPECT_THAT(answer.inProgress, Optional(IsEmpty()));
  EXPECT_EQ(phone.trace.count("log default Oversize|com.corvane.twc.AppsClient|prioritized proxies "
                              "() paused proxies (com.a (placeholder))"),
            1u);
}

TEST_F(InProgressQuery, ReportedApplicationWithoutPlaceholderOrProgressIsLoggedAndPassedOver) {
  phone.appRegistry.seedInstalled("com.whole");
  prioritized.push_back(*phone.appRegistry.installed("com.whole"));
  phone.appRegistry.seedPlaceholder("com.bare", InstallType::Sync);
  phone.appRegistry.dropProgress("com.bare");
  prioritized.push_back(*phone.appRegistry.placeholder("com.bare"));
  const auto answer = ask();
  EXPECT_THAT(answer.inProgress, Optional(IsEmpty()));
  EXPECT_THAT(
      phone.trace.log(),
      testing::IsSupersetOf(
          {"log default SyncBundle|No placeholder for asset identifier com.whole",
           "log default SyncBundle|No install progress found for asset identifier com.bare"}));
}

TEST_F(InProgressQuery, LogsTypeStateAndPhaseByName) {
  seed("com.odd", static_cast<InstallType>(9), InstallState::Active, InstallPhase::Installing);
  ask();
  EXPECT_THAT(phone.trace.log(),
              testing::Contains("log default SyncBundle|Got install type=Unknown Install Type: 9 "
                                "state=SWInstallStateActive phase=SWInstallPhaseInstalling for "
                                "com.odd"));
}

/// Reports a second time from inside the first report's thread, before the query can be gone.
class TwiceReportingRegistry : public fakes::FaultyAppRegistry {
 public:
  TwiceReportingRegistry(fakes::FakePlatform& phone, std::vector<AppRecord> second)
      : FaultyAppRegistry(phone.appRegistry, phone.faults), second_(std::move(second)) {}

  void addObserver(AppRegistryObserver* observer) noexcept override {
    observer->applicationInstallsArePrioritized({}, {});
    observer->applicationInstallsArePrioritized(second_, {});
  }
  void removeObserver(AppRegistryObserver*) noexcept override {}

 private:
  std::vector<AppRecord> second_;
};

TEST_F(InProgressQuery, SecondReportChangesNothing) {
  seed("com.late", InstallType::Sync, InstallState::Active, InstallPhase::Installing);
  TwiceReportingRegistry registry(phone, prioritized);
  const ClientLog log(phone.log, "com.corvane.twc.AppsClient");
  const auto answer = InProgressAssetQuery::currentInProgressAssetIDs(registry, log);
  EXPECT_THAT(answer.inProgress, Optional(IsEmpty()));
  expectTrace(
      {"log default Oversize|prioritized proxies () paused proxies ()",
       "log default SyncBundle|No assets currently in progress.",
       "log default SyncBundle|signaling semaphore",
       "log default Oversize|prioritized proxies (com.late (placeholder)) paused proxies ()",
       "log default SyncBundle|Waiting for -applicationInstallsArePrioritized:arePaused: to "
       "complete...",
       "log default SyncBundle|Wait completed"},
      fakes::TraceLog);
}

}  // namespace
}  // namespace appsync
