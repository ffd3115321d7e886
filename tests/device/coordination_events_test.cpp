#include <signal.h>
#include <unistd.h>

#include <future>

#include "tests/device/coordination_test.h"

namespace appsync::device {
namespace {

constexpr std::string_view Id = "com.example.a";

class CoordinationEventsTest : public CoordinationTest {
 protected:
  std::unique_ptr<CoordinatorEventListener> listen(CoordinatorObserver& delegate,
                                                   CoordinationClientId client = SyncHostClientID) {
    return service().createEventListener("com.corvane.test", {client}, delegate);
  }
};

TEST_F(CoordinationEventsTest, GoToTheObserverElseToAListenerAndComeOnAThreadOfTheService) {
  EventRecorder listening;
  const auto listener = listen(listening);
  const auto coordinator = coordinatorFor(Id);
  ASSERT_TRUE(service().tap(Id));
  ASSERT_TRUE(listening.waitFor("prioritize"));
  coordinator->setObserver(&recorder);
  ASSERT_TRUE(service().cancelInstall(Id));
  ASSERT_TRUE(recorder.waitFor("canceled"));
  EXPECT_EQ(listening.events(), Events{"prioritize com.example.a"});
  EXPECT_EQ(recorder.events(), Events{"canceled com.example.a by 15"});
  EXPECT_NE(recorder.thread(), std::this_thread::get_id());
  EXPECT_EQ(recorder.thread(), listening.thread());
}

TEST_F(CoordinationEventsTest, AListenerHearsOnlyOfItsClientsCoordinators) {
  EventRecorder listening;
  const auto listener = listen(listening);
  EventRecorder storeListening;
  coordinatorFor("com.example.store", CoordinatorKind::Initiating, KQClientKiosk);
  coordinatorFor(Id);
  ASSERT_TRUE(service().tap("com.example.store"));
  ASSERT_TRUE(service().tap(Id));
  ASSERT_TRUE(listening.waitFor("prioritize com.example.a"));
  EXPECT_EQ(listening.events().size(), 1U);
  const auto stores = listen(storeListening, KQClientKiosk);
  EXPECT_TRUE(storeListening.waitFor("prioritize com.example.store")) << "it was kept";
}

TEST_F(CoordinationEventsTest, AreKeptAcrossARestartUntilSomebodyIsThereAndThenComeOnce) {
  deliver(*prepare(Id), Id);
  ASSERT_TRUE(recorder.waitFor("complete"));
  const auto failing = prepare("com.example.b");
  failing->setObserver(nullptr);
  deliver(*failing, stageApplication("com.example.c"));
  waitUntilIdle("com.example.b");
  reopen();
  reopen();
  EventRecorder listening;
  auto listener = listen(listening);
  ASSERT_TRUE(listening.waitFor("failed com.example.b: "));
  waitUntilIdle("com.example.b");
  EXPECT_EQ(listening.count("complete com.example.a"), 0U) << "that was told before";
  EXPECT_EQ(recorder.count("complete com.example.a"), 1U);
  listener.reset();
  reopen();
  EventRecorder again;
  listener = listen(again);
  waitUntilIdle("com.example.b");
  EXPECT_EQ(again.events(), Events{});
}

TEST_F(CoordinationEventsTest, OfOneCoordinatorComeInTheirOrder) {
  const auto coordinator = coordinatorFor(Id);
  const auto promise = packagePromise(Id);
  ASSERT_TRUE(coordinator->setAppAssetPromise(promise, nullptr));
  promise->setPercentComplete(0.1);
  promise->setPercentComplete(0.2);
  ASSERT_TRUE(service().tap(Id));
  ASSERT_TRUE(service().tap(Id));
  coordinator->setObserver(&recorder);
  ASSERT_TRUE(recorder.waitFor("begin"));
  waitUntilIdle(Id);
  EXPECT_EQ(recorder.events(), (Events{"begin " + std::to_string(promise->identifier()),
                                       "prioritize com.example.a", "prioritize com.example.a"}));
}

TEST_F(CoordinationEventsTest, ATapOfWhatIsOverIsToldToNobody) {
  const auto coordinator = coordinatorFor(Id);
  ASSERT_TRUE(service().tap(Id));
  ASSERT_TRUE(service().cancelInstall(Id));
  coordinator->setObserver(&recorder);
  ASSERT_TRUE(recorder.waitFor("canceled"));
  EXPECT_EQ(recorder.events(), Events{"canceled com.example.a by 15"});
  EXPECT_FALSE(service().tap(Id));
  EXPECT_FALSE(service().tap("com.example.unknown"));
  EXPECT_FALSE(service().cancelInstall(Id));
}

TEST_F(CoordinationEventsTest, TwoCancelsMakeOneEvent) {
  const auto coordinator = prepare(Id);
  ASSERT_TRUE(recorder.waitFor("placeholder"));
  ASSERT_TRUE(service().cancelInstall(Id));
  EXPECT_TRUE(coordinator->cancel(reason, KQClientKiosk)) << "it is cancelled";
  coordinator->cancel(reason, SyncHostClientID);
  waitUntilIdle(Id);
  EXPECT_EQ(recorder.count("canceled"), 1U);
  EXPECT_EQ(coordinator->error()->code, ECANCELED) << "the first reason stays";
}

TEST_F(CoordinationEventsTest, ACreatorsOwnCancelIsNotToldToIt) {
  const auto coordinator = prepare(Id);
  ASSERT_TRUE(recorder.waitFor("placeholder"));
  ASSERT_TRUE(coordinator->cancel(reason, SyncHostClientID));
  EXPECT_EQ(coordinator->error(), reason);
  EXPECT_TRUE(registry().empty()) << "its placeholder has gone when cancel returns";
  waitUntilIdle(Id);
  EXPECT_EQ(recorder.count("canceled"), 0U);
}

TEST_F(CoordinationEventsTest, NoneComesWhenTheObserverHasBeenRemoved) {
  const auto first = coordinatorFor(Id);
  first->setObserver(&recorder);
  coordinatorFor("com.example.b")->setObserver(&recorder);
  std::promise<void> inside;
  std::promise<void> goOn;
  recorder.during = [&](const std::string& event) {
    if (event != "prioritize com.example.a") return;
    inside.set_value();
    goOn.get_future().wait();
  };
  ASSERT_TRUE(service().tap(Id));
  ASSERT_TRUE(service().tap("com.example.b"));
  inside.get_future().wait();
  auto removal = std::async(std::launch::async, [&] {
    service().removeObserver(&recorder);
    return recorder.events();
  });
  waitUntilIdle("com.example.b");  // nobody is there for it any more
  EXPECT_EQ(removal.wait_for(std::chrono::seconds(0)), std::future_status::timeout)
      << "it waits for the event that runs";
  goOn.set_value();
  EXPECT_EQ(removal.get(), Events{"prioritize com.example.a"});
  EventRecorder listening;
  const auto listener = listen(listening);
  ASSERT_TRUE(listening.waitFor("prioritize com.example.b"));
  EXPECT_EQ(recorder.events(), Events{"prioritize com.example.a"});
}

TEST_F(CoordinationEventsTest, AnObserverCanBeRemovedOrReplacedFromItsOwnEvent) {
  const auto coordinator = coordinatorFor(Id);
  EventRecorder next;
  coordinator->setObserver(&recorder);
  recorder.during = [&](const std::string&) {
    service().removeObserver(&recorder);
    coordinator->setObserver(&next);
  };
  ASSERT_TRUE(service().tap(Id));
  ASSERT_TRUE(recorder.waitFor("prioritize"));
  ASSERT_TRUE(service().cancelInstall(Id));
  ASSERT_TRUE(next.waitFor("canceled"));
  EXPECT_EQ(recorder.events().size(), 1U);
  service().removeObserver(&next);
}

TEST_F(CoordinationEventsTest, AListenerCanGoFromItsOwnEventAndNothingComesAfterItHasGone) {
  EventRecorder listening;
  auto listener = listen(listening);
  listening.during = [&](const std::string&) { listener.reset(); };
  coordinatorFor(Id);
  ASSERT_TRUE(service().tap(Id));
  ASSERT_TRUE(listening.waitFor("prioritize"));
  ASSERT_TRUE(service().tap(Id));
  ASSERT_TRUE(service().cancelInstall(Id));
  EventRecorder next;
  const auto other = listen(next);
  ASSERT_TRUE(next.waitFor("canceled"));
  EXPECT_EQ(listening.events().size(), 1U);
}

TEST_F(CoordinationEventsTest, AnEventMayCallTheServiceBack) {
  recorder.during = [&](const std::string& event) {
    if (event.starts_with("placeholder")) {
      service().cancelInstall(Id);
      coordinatorFor("com.example.b")->setObserver(&recorder);
      service().tap("com.example.b");
    }
  };
  prepare(Id);
  EXPECT_TRUE(recorder.waitFor("prioritize com.example.b"));
  EXPECT_TRUE(recorder.waitFor("canceled com.example.a by 15"));
  EXPECT_TRUE(registry().empty());
}

TEST_F(CoordinationEventsTest, ADeviceThatIsClosedKeepsWhatItHasNotTold) {
  const auto coordinator = coordinatorFor(Id);
  std::promise<void> inside;
  std::promise<void> goOn;
  bool waited = false;
  recorder.during = [&](const std::string& event) {
    // The second may come too, before the closing has begun.
    if (event != "prioritize com.example.a" || std::exchange(waited, true)) return;
    inside.set_value();
    goOn.get_future().wait();
  };
  coordinator->setObserver(&recorder);
  ASSERT_TRUE(service().tap(Id));
  inside.get_future().wait();
  ASSERT_TRUE(service().tap(Id));
  auto closing = std::async(std::launch::async, [&] { device.reset(); });
  goOn.set_value();
  closing.get();
  recorder.during = nullptr;
  reopen();
  EventRecorder listening;
  const auto listener = listen(listening);
  waitUntilIdle(Id);
  Events all = recorder.events();
  for (const std::string& event : listening.events()) all.push_back(event);
  EXPECT_EQ(all, (Events{"prioritize com.example.a", "prioritize com.example.a"}));
}

TEST_F(CoordinationEventsTest, AProcessThatDiesWhileItReceivesOneGetsItAnew) {
  device.reset();
  const int status = inOtherProcess([&] {
    reopen();
    coordinatorFor(Id)->setObserver(&recorder);
    recorder.during = [](const std::string&) { kill(getpid(), SIGKILL); };
    service().tap(Id);
    return recorder.waitFor("prioritize") ? 1 : 2;
  });
  EXPECT_EQ(status, 128 + SIGKILL);
  reopen();
  EventRecorder listening;
  const auto listener = listen(listening);
  EXPECT_TRUE(listening.waitFor("prioritize com.example.a"));
}

TEST_F(CoordinationEventsTest, ACancellationIsToldOnlyInTheLifeOfTheProcessInWhichItCame) {
  deliver(*prepare("com.example.b", CoordinatorKind::Initiating, nullptr),
          stageApplication("com.example.c"));
  waitUntilIdle("com.example.b");
  coordinatorFor(Id);
  ASSERT_TRUE(service().cancelInstall(Id));
  reopen();
  EventRecorder listening;
  const auto listener = listen(listening);
  waitUntilIdle(Id);
  waitUntilIdle("com.example.b");
  EXPECT_EQ(listening.count("failed com.example.b"), 1U) << "what else was kept has come";
  EXPECT_EQ(listening.count("canceled"), 0U);
}

TEST_F(CoordinationEventsTest, OfOneCoordinatorKeepTheirOrderWhenItsObserverComesMidway) {
  const auto promise = packagePromise(Id);
  ASSERT_TRUE(coordinatorFor(Id)->setAppAssetPromise(promise, nullptr));
  promise->setPercentComplete(0.1);
  coordinatorFor("com.example.b");
  ASSERT_TRUE(service().tap("com.example.b"));
  ASSERT_TRUE(service().tap(Id));
  EventRecorder midway;
  recorder.during = [&](const std::string&) { live(Id)->setObserver(&midway); };
  live("com.example.b")->setObserver(&recorder);
  ASSERT_TRUE(midway.waitFor("prioritize"));
  waitUntilIdle(Id);
  EXPECT_EQ(midway.events(),
            (Events{"begin " + std::to_string(promise->identifier()), "prioritize com.example.a"}));
  service().removeObserver(&midway);
}

TEST_F(CoordinationEventsTest,
       ThatNobodyEverHearsAreForgottenBeyondTheLastThousandAndTheLogSaysSo) {
  coordinatorFor(Id);
  device.reset();
  edit(
      "WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n WHERE i < 1002) "
      "INSERT INTO coordinator_events SELECT NULL, 1, 3, 0, NULL, 0 FROM n");
  reopen();
  EXPECT_TRUE(
      logMentions("2 events of install coordinators that nobody came to hear are forgotten: "
                  "only the last 1000 are kept"));
  EventRecorder listening;
  const auto listener = listen(listening);
  waitUntilIdle(Id);
  EXPECT_EQ(listening.count("prioritize"), 1000U);
  std::filesystem::remove_all(folder / "log");
  reopen();
  EXPECT_FALSE(logMentions("forgotten"));
}

}  // namespace
}  // namespace appsync::device
