#include <algorithm>
#include <atomic>

#include "tests/device/coordination_test.h"

namespace appsync::device {
namespace {

class CoordinationThreadsTest : public CoordinationTest {};

/// What the thread of a client goes through with one application.
enum class Course { Install, Cancel, PersonCancels, Damaged };

TEST_F(CoordinationThreadsTest, InstallsOfManyThreadsDoNotDisturbOneAnother) {
  constexpr int Applications = 12;
  // No identifier is the beginning of another.
  const auto idOf = [](int number) { return "com.example.app" + std::to_string(100 + number); };
  const auto courseOf = [](int number) { return static_cast<Course>(number % 4); };
  std::vector<FileLocation> packages;
  for (int number = 0; number < Applications; ++number) {
    packages.push_back(
        stageApplication(courseOf(number) == Course::Damaged ? "com.example.other" : idOf(number)));
  }
  std::vector<std::thread> threads;
  for (int number = 0; number < Applications; ++number) {
    threads.emplace_back([&, number] {
      const std::string id = idOf(number);
      const auto coordinator = prepare(id);
      const auto promise = coordinator->appAssetPromise(nullptr);
      for (int step = 1; step < 10; ++step) promise->setPercentComplete(step / 10.0);
      service().tap(id);
      if (courseOf(number) == Course::Cancel) coordinator->cancel(reason, SyncHostClientID);
      if (courseOf(number) == Course::PersonCancels) service().cancelInstall(id);
      deliver(*coordinator, packages[static_cast<std::size_t>(number)]);
    });
  }
  for (std::thread& thread : threads) thread.join();
  std::vector<std::string> expected;
  for (int number = 0; number < Applications; ++number) {
    const std::string id = idOf(number);
    waitUntilIdle(id);
    EXPECT_EQ(recorder.count("complete " + id), courseOf(number) == Course::Install ? 1U : 0U);
    EXPECT_EQ(recorder.count("canceled " + id),
              courseOf(number) == Course::PersonCancels ? 1U : 0U);
    EXPECT_EQ(recorder.count("failed " + id), courseOf(number) == Course::Damaged ? 1U : 0U);
    if (courseOf(number) == Course::Install) expected.push_back(id + " 2.0");
  }
  std::ranges::sort(expected);
  EXPECT_EQ(registry(), expected);
}

TEST_F(CoordinationThreadsTest, ACancelBesideAnInstallIsEitherInTimeOrTooLate) {
  for (int round = 0; round < 8; ++round) {
    const std::string id = "com.example.race" + std::to_string(round);
    const auto coordinator = prepare(id);
    ASSERT_TRUE(recorder.waitFor("placeholder " + id));
    const FileLocation package = stageApplication(id);
    std::atomic<bool> cancelled = false;
    std::thread person([&] { cancelled = service().cancelInstall(id); });
    deliver(*coordinator, package);
    person.join();
    waitUntilIdle(id);
    EXPECT_EQ(recorder.count("canceled " + id), cancelled ? 1U : 0U);
    EXPECT_EQ(recorder.count("complete " + id), cancelled ? 0U : 1U);
    EXPECT_EQ(record(id).has_value(), !cancelled);
  }
}

TEST_F(CoordinationThreadsTest, ObserversComeAndGoWhileEventsArrive) {
  coordinatorFor("com.example.a");
  std::atomic<bool> done = false;
  std::thread taps([&] {
    for (int tap = 0; tap < 100; ++tap) service().tap("com.example.a");
    done = true;
  });
  std::size_t heard = 0;
  while (!done) {
    EventRecorder observing;
    live("com.example.a")->setObserver(&observing);
    service().removeObserver(&observing);
    EventRecorder listening;
    {
      const auto listener =
          service().createEventListener("com.corvane.test", {SyncHostClientID}, listening);
    }
    heard += observing.events().size() + listening.events().size();
  }
  taps.join();
  EventRecorder last;
  live("com.example.a")->setObserver(&last);
  waitUntilIdle("com.example.a");
  service().removeObserver(&last);
  EXPECT_EQ(heard + last.events().size(), 100U) << "each event comes to one of them, once";
}

TEST_F(CoordinationThreadsTest, ObjectsAreUsedWhileTheDeviceIsClosed) {
  const auto coordinator = prepare("com.example.a");
  const auto promise = coordinator->appAssetPromise(nullptr);
  std::atomic<bool> started = false;
  std::atomic<bool> done = false;
  std::thread client([&] {
    while (!done) {
      promise->setPercentComplete(0.5);
      coordinator->error();
      coordinator->setObserver(nullptr);
      started = true;
    }
  });
  while (!started) std::this_thread::yield();
  device.reset();
  done = true;
  client.join();
  EXPECT_EQ(promise->percentComplete(), 0);
}

}  // namespace
}  // namespace appsync::device
