// Events of coordinators that arrive on other threads while the host begins a sync, ends transfers,
// starts up or lets the client go.

#include <atomic>
#include <latch>
#include <thread>

#include "client/paths.h"
#include "tests/client/client_test.h"
#include "tests/coordination/coordination_fixture.h"

namespace appsync::fakes {
namespace {

using testing::Contains;
using testing::IsEmpty;

constexpr int Rounds = 40;

std::string idOf(int number) { return "com." + std::to_string(number); }

/// Runs all tasks at once, each on a thread of its own.
void atOnce(const std::vector<std::function<void()>>& tasks) {
  std::latch start(static_cast<std::ptrdiff_t>(tasks.size()));
  std::vector<std::thread> threads;
  for (const auto& task : tasks) {
    threads.emplace_back([&] {
      start.arrive_and_wait();
      task();
    });
  }
  for (std::thread& thread : threads) thread.join();
}

class EventRaceTest : public CoordinationTest {
 protected:
  EventRaceTest() { phone.notifier.post(TWStartupCompleteNotification); }

  FakeInstallCoordination& service() { return phone.installCoordination; }

  /// As the host makes a coordinated install: its entry in the todo list asks for it.
  void prepare(const std::vector<std::string>& identifiers) {
    PropertyList::Array todo;
    PropertyList::Dictionary restoreState;
    for (const std::string& id : identifiers) {
      todo.push_back(PropertyList::Dictionary{{"identifier", id}, {"operation", "install"}});
      restoreState.emplace(id, PropertyList::Dictionary{});
      phone.appRegistry.seedPlaceholder(id);
      const auto coordinator = service().coordinatorFor(CoordinatorKind::Initiating, id,
                                                        SyncHostClientID, true, nullptr, nullptr);
      client->_createAppAssetPromiseForBundleIdentifier(id, std::nullopt, coordinator.get());
    }
    phone.files.putPlist(paths::TodoList, todo);
    phone.files.putPlist(exchange::RestoreState, restoreState);
    forget();
  }

  /// The host's calls about one package, from its first progress to its end.
  void transfer(const std::string& id, bool succeeds) {
    auto asset = std::make_shared<SyncAsset>();
    asset->identifier = id;
    asset->isDownload = true;
    for (const double fraction : {0.25, 0.5, 1.0}) {
      asset->downloadProgress = fraction;
      client->assetTransferUpdatedProgress(asset, fraction);
    }
    if (succeeds) asset->path = id + ".zip";
    client->assetTransferSucceeded(asset, succeeds,
                                   succeeds ? std::nullopt : std::optional(Refused));
  }

  std::size_t timesSaid(std::string_view beginning) const {
    return phone.trace.count("log default SyncBundle|com.corvane.twc.AppsClient|" +
                             std::string(beginning));
  }
  std::size_t refusedCancels() const {
    return phone.trace.count("log error SyncBundle|com.corvane.twc.AppsClient|Cannot cancel ");
  }
};

TEST_F(EventRaceTest, EventsOfOtherApplicationsLoseNoEntryWhileTransfersEnd) {
  // The host transfers the first three; of the others the service tells.
  const std::vector<std::string> ids = {idOf(0), idOf(1), idOf(2), idOf(3), idOf(4), idOf(5)};
  for (int round = 0; round < Rounds; ++round) {
    prepare(ids);
    const auto host = [&] {
      for (int number = 0; number < 3; ++number) transfer(idOf(number), true);
      client->assetTransferEndedWithSuccess(true);
      client->syncEndedWithSuccess(true);
    };
    const auto events = [&] {
      for (const std::string& id : ids) {
        service().fireDidInstallPlaceholder(*service().coordinator(id));
        service().fireShouldPrioritize(*service().coordinator(id));
      }
      service().fireDidComplete(*service().coordinator(idOf(3)));
      service().fireDidComplete(*service().coordinator(idOf(4)), Refused);
      service().fireCanceled(*service().coordinator(idOf(5)), Refused, KQClientKiosk);
    };
    atOnce({host, events});

    for (int number = 0; number < 3; ++number) {
      EXPECT_EQ(client->_operationStateForIdentifier(idOf(number)), "DOWNLOADED");
      EXPECT_TRUE(service().pathPromise(idOf(number) + "-Asset")->isComplete());
    }
    EXPECT_EQ(client->_operationStateForIdentifier(idOf(3)), "INSTALLED");
    EXPECT_EQ(client->_operationStateForIdentifier(idOf(4)), "FAILED");
    EXPECT_EQ(client->_operationStateForIdentifier(idOf(5)), "install");
    const auto restoreState = phone.files.plistAt(exchange::RestoreState);
    ASSERT_TRUE(restoreState && restoreState->asDictionary());
    EXPECT_EQ(restoreState->asDictionary()->size(), 4u) << "those of both that completed are gone";
    EXPECT_EQ(timesSaid("coordinatorDidInstallPlaceholder for "), ids.size());
    EXPECT_EQ(timesSaid("Prioritize com."), 2 * ids.size()) << "each is asked for and answered";
    EXPECT_EQ(timesSaid("Cancelling asset sync for com.5"), 1u);
    for (const std::string& id : ids) service().coordinator(id)->cancel(Refused, SyncHostClientID);
    // Empties what the person cancelled, for the next round.
    transfer(idOf(5), false);
    client->assetTransferEndedWithSuccess(false);
  }
}

TEST_F(EventRaceTest, EventsOfTheSameApplicationBesideTheEndOfItsTransfer) {
  for (int round = 0; round < Rounds; ++round) {
    prepare({"com.a"});
    const auto coordinator = service().coordinator("com.a");
    const bool succeeds = round % 2 == 0;
    const auto host = [&] {
      transfer("com.a", succeeds);
      client->assetTransferEndedWithSuccess(succeeds);
      client->syncEndedWithSuccess(succeeds);
    };
    const auto events = [&] {
      service().fireDidInstallPlaceholder(*coordinator);
      service().fireShouldPrioritize(*coordinator);
      service().fireCanceled(*coordinator, Refused, KQClientKiosk);
      service().fireCanceled(*coordinator, Refused, KQClientKiosk);
      service().fireDidComplete(*coordinator, succeeds ? std::nullopt : std::optional(Refused));
    };
    atOnce({host, events});

    const auto operation = client->_operationStateForIdentifier("com.a");
    EXPECT_THAT((Trace{succeeds ? "INSTALLED" : "FAILED", succeeds ? "DOWNLOADED" : "FAILED"}),
                Contains(operation));
    const std::size_t reported = timesSaid("Cancelling asset sync for com.a");
    EXPECT_EQ(reported + refusedCancels(), 2u) << "each cancel is reported or known already";
    EXPECT_GE(reported, 1u);
    EXPECT_LE(phone.trace.count("InstallCoordinator.cancel(com.a"), 1u);
    coordinator->cancel(Refused, SyncHostClientID);
    transfer("com.a", false);
  }
}

TEST_F(EventRaceTest, OfCancelsAtOnceOneReachesTheHost) {
  // A service may have several threads; the fake has one, so these call the client themselves.
  for (int round = 0; round < Rounds; ++round) {
    prepare({"com.a"});
    const auto coordinator = service().coordinator("com.a");
    const auto cancel = [&] {
      client->coordinatorCanceledWithReason(*coordinator, Refused, KQClientKiosk);
    };
    atOnce({cancel, cancel, cancel});
    EXPECT_EQ(timesSaid("Cancelling asset sync for com.a"), 1u);
    EXPECT_EQ(refusedCancels(), 2u);
    EXPECT_EQ(phone.trace.count("SyncHostService.cancelAssetAsFailed(com.a)"), 1u);
    transfer("com.a", false);
    coordinator->cancel(Refused, SyncHostClientID);
  }
}

TEST_F(EventRaceTest, CompletionsAtOnceLoseNoEntry) {
  const std::vector<std::string> ids = {idOf(0), idOf(1), idOf(2), idOf(3)};
  for (int round = 0; round < Rounds; ++round) {
    prepare(ids);
    std::vector<std::function<void()>> completions;
    for (const std::string& id : ids) {
      completions.push_back([this, coordinator = service().coordinator(id)] {
        client->coordinatorDidCompleteSuccessfully(*coordinator);
      });
    }
    atOnce(completions);
    for (const std::string& id : ids) {
      EXPECT_EQ(client->_operationStateForIdentifier(id), "INSTALLED");
      service().coordinator(id)->cancel(Refused, SyncHostClientID);
    }
    EXPECT_FALSE(phone.files.exists(exchange::RestoreState)) << "its last entry has gone";
  }
}

/// Gives other threads time between a reading of the todo list and what the reader makes of it,
/// until the staging area has been taken over.
class HesitantFiles : public FaultyFileManager {
 public:
  using FaultyFileManager::FaultyFileManager;

  std::optional<Bytes> contentsAtPath(std::string_view path,
                                      std::optional<Error>* error) noexcept override {
    std::optional<Bytes> bytes = FaultyFileManager::contentsAtPath(path, error);
    if (path != paths::TodoList) return bytes;
    for (int turn = 0; turn < 100 && !moved_; ++turn) std::this_thread::yield();
    return bytes;
  }
  bool moveItem(std::string_view from, std::string_view to,
                std::optional<Error>* error) noexcept override {
    const bool moved = FaultyFileManager::moveItem(from, to, error);
    moved_ = true;
    return moved;
  }
  void beginRound() { moved_ = false; }

 private:
  std::atomic<bool> moved_ = false;
};

class ReconcileRaceTest : public EventRaceTest {
 protected:
  ReconcileRaceTest() {
    client = nullptr;
    client = std::make_unique<AppsClient>(with(phone.platform(), files));
    phone.notifier.post(TWStartupCompleteNotification);
  }
  ~ReconcileRaceTest() override { client = nullptr; }

  /// A todo list of one sync: every entry bears its mark.
  static PropertyList::Array todoOf(int sync) {
    PropertyList::Array todo;
    for (int number = 0; number < 3; ++number) {
      todo.push_back(PropertyList::Dictionary{
          {"identifier", idOf(number)}, {"operation", "install"}, {"sync", sync}});
    }
    return todo;
  }

  HesitantFiles files{phone.files, phone.faults};
};

TEST_F(ReconcileRaceTest, ChangesWhileANewSyncBeginsNeverBringTheOldTodoListBack) {
  const std::string staged = std::string(exchange::StagingArea) + "/ApplicationsSync.plist";
  for (int round = 0; round < Rounds; ++round) {
    prepare({idOf(0), idOf(1)});
    phone.files.putPlist(paths::TodoList, todoOf(round));
    phone.files.putPlist(staged, todoOf(round + 1));
    files.beginRound();
    std::atomic<bool> begun = false;
    const auto host = [&] {
      EXPECT_TRUE(client->reconcileSync({}, "anchor", {}, nullptr));
      begun = true;
    };
    const auto changes = [&] {
      while (!begun) client->changeAssetID(idOf(0), "DOWNLOADED");
    };
    const auto completions = [&] {
      while (!begun) service().fireDidComplete(*service().coordinator(idOf(1)));
    };
    atOnce({host, changes, changes, completions});

    const auto todo = phone.files.plistAt(paths::TodoList);
    ASSERT_TRUE(todo && todo->asArray() && todo->asArray()->size() == 3);
    // The staged list, in which the changes that came after it may show.
    PropertyList::Array expected = todoOf(round + 1);
    const char* const outcomes[] = {"DOWNLOADED", "INSTALLED"};
    for (std::size_t number : {0u, 1u}) {
      if (*todo->asArray()->at(number).find("operation") == PropertyList("install")) continue;
      (*expected[number].asDictionary())["operation"] = outcomes[number];
    }
    ASSERT_EQ(*todo, PropertyList(expected));
  }
}

TEST(StartUpRaceTest, StartUpNotificationsAtOnceMakeOneListener) {
  for (int round = 0; round < Rounds; ++round) {
    FakePlatform phone;
    phone.installCoordination.setEnabled(true);
    const AppsClient client(phone.platform());
    const auto start = [&] { phone.notifier.post(TWStartupCompleteNotification); };
    atOnce({start, start, start});
    EXPECT_EQ(phone.trace.count("InstallCoordination.createEventListener"), 1u);
    EXPECT_EQ(phone.installCoordination.listenerCount(), 1u);
  }
}

TEST(StartUpRaceTest, AClientThatGoesAtStartUpLeavesNoListener) {
  for (int round = 0; round < Rounds; ++round) {
    FakePlatform phone;
    phone.installCoordination.setEnabled(true);
    auto client = std::make_unique<AppsClient>(phone.platform());
    atOnce(
        {[&] { phone.notifier.post(TWStartupCompleteNotification); }, [&] { client = nullptr; }});
    EXPECT_EQ(phone.installCoordination.listenerCount(), 0u);
  }
}

TEST_F(EventRaceTest, NothingReachesAClientThatIsGone) {
  for (int round = 0; round < Rounds; ++round) {
    if (!client) client = std::make_unique<AppsClient>(phone.platform());
    phone.notifier.post(TWStartupCompleteNotification);
    prepare({"com.listened", "com.observed"});
    const auto listened = service().coordinator("com.listened");
    const auto observed = service().coordinator("com.observed");
    observed->setObserver(client.get());
    std::atomic<bool> gone = false;
    const auto events = [&] {
      while (!gone) {
        for (const auto& coordinator : {listened, observed}) {
          service().fireShouldPrioritize(*coordinator);
          service().fireCanceled(*coordinator, Refused, KQClientKiosk);
          service().fireDidInstallPlaceholder(*coordinator);
          service().fireDidComplete(*coordinator);
        }
      }
    };
    atOnce({events, [&] {
              client = nullptr;
              forget();
              gone = true;
            }});
    EXPECT_THAT(phone.trace.readable(TraceLog | TraceFile), IsEmpty());
  }
}

}  // namespace
}  // namespace appsync::fakes
