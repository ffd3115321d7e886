#include "device/services/system_notifier.h"

#include <gtest/gtest.h>

#include <atomic>
#include <future>
#include <string>

namespace appsync::device {
namespace {

constexpr std::string_view Name = "com.example.event";

/// Counts callbacks; `reach` waits for a number of them.
struct Counter {
  static void called(void* observer) noexcept {
    auto& counter = *static_cast<Counter*>(observer);
    ++counter.count;
    counter.count.notify_all();
  }
  void reach(int wanted) {
    for (int now = count; now < wanted; now = count) count.wait(now);
  }
  std::atomic<int> count = 0;
};

TEST(LocalNotifier, CallsEveryObserverOfTheNameForEveryPosting) {
  LocalNotifier notifier;
  Counter first;
  Counter second;
  Counter other;
  notifier.addObserver(&first, Name, &Counter::called);
  notifier.addObserver(&second, Name, &Counter::called);
  notifier.addObserver(&other, "com.example.other", &Counter::called);
  for (int i = 0; i < 3; ++i) notifier.post(Name);
  first.reach(3);
  second.reach(3);
  EXPECT_EQ(other.count, 0);
}

TEST(LocalNotifier, ObserverHearsOnlyOfLaterPostings) {
  LocalNotifier notifier;
  Counter early;
  Counter late;
  notifier.addObserver(&early, Name, &Counter::called);
  notifier.post(Name);
  notifier.addObserver(&late, Name, &Counter::called);
  notifier.post("com.example.last");
  notifier.addObserver(&early, "com.example.last", &Counter::called);
  notifier.post("com.example.last");
  early.reach(2);
  EXPECT_EQ(late.count, 0);
}

TEST(LocalNotifier, StateBelongsToTheName) {
  LocalNotifier notifier;
  const SystemNotifier::Registration one = notifier.registerCheck(Name);
  const SystemNotifier::Registration two = notifier.registerCheck(Name);
  const SystemNotifier::Registration other = notifier.registerCheck("com.example.other");
  ASSERT_EQ(one.status, 0u);
  EXPECT_EQ(notifier.state(Name), 0u);
  notifier.setState(one.token, UINT64_MAX);
  EXPECT_EQ(notifier.state(Name), UINT64_MAX);
  notifier.setState(two.token, 7);
  notifier.setState(other.token, 9);
  notifier.setState(12345, 1);
  notifier.setState(-1, 1);
  EXPECT_EQ(notifier.state(Name), 7u);
  EXPECT_EQ(notifier.state("com.example.other"), 9u);
}

TEST(LocalNotifier, EmptyNameCannotBeRegistered) {
  EXPECT_NE(LocalNotifier().registerCheck("").status, 0u);
}

TEST(LocalNotifier, StateSetBeforeAPostIsSeenInTheCallback) {
  struct Reader {
    LocalNotifier notifier;
    std::promise<std::uint64_t> seen;
  } reader;
  const int token = reader.notifier.registerCheck(Name).token;
  reader.notifier.addObserver(&reader, Name, [](void* observer) noexcept {
    auto& self = *static_cast<Reader*>(observer);
    self.seen.set_value(self.notifier.state(Name));
  });
  reader.notifier.setState(token, 42);
  reader.notifier.post(Name);
  EXPECT_EQ(reader.seen.get_future().get(), 42u);
}

TEST(LocalNotifier, RemovedObserverIsNeitherRunningNorCalledAgain) {
  struct Observer {
    std::atomic<bool> removed = false;
    std::atomic<bool> calledLate = false;
  };
  LocalNotifier notifier;
  for (int round = 0; round < 300; ++round) {
    Observer observer;
    notifier.addObserver(&observer, Name, [](void* self) noexcept {
      auto& called = *static_cast<Observer*>(self);
      std::this_thread::yield();
      if (called.removed) called.calledLate = true;
    });
    notifier.post(Name);
    notifier.post(Name);
    notifier.removeObserver(&observer, Name);
    observer.removed = true;
    EXPECT_FALSE(observer.calledLate);
  }
}

TEST(LocalNotifier, ObserverMayRemoveItselfInItsCallback) {
  struct Observer {
    LocalNotifier notifier;
    Counter counter;
  } observer;
  observer.notifier.addObserver(&observer, Name, [](void* self) noexcept {
    auto& called = *static_cast<Observer*>(self);
    called.notifier.removeObserver(self, Name);
    Counter::called(&called.counter);
  });
  Counter last;
  observer.notifier.addObserver(&last, Name, &Counter::called);
  observer.notifier.post(Name);
  observer.notifier.post(Name);
  last.reach(2);
  EXPECT_EQ(observer.counter.count, 1);
}

TEST(LocalNotifier, CallbackMayPostAndAddObservers) {
  struct Observer {
    LocalNotifier notifier;
    Counter counter;
  } observer;
  observer.notifier.addObserver(&observer, Name, [](void* self) noexcept {
    auto& called = *static_cast<Observer*>(self);
    called.notifier.addObserver(&called.counter, "com.example.next", &Counter::called);
    called.notifier.post("com.example.next");
  });
  observer.notifier.post(Name);
  observer.counter.reach(1);
}

TEST(LocalNotifier, DestructorDropsWhatIsNotDelivered) {
  Counter counter;
  {
    LocalNotifier notifier;
    notifier.addObserver(&counter, Name, &Counter::called);
    for (int i = 0; i < 1000; ++i) notifier.post(Name);
  }
  EXPECT_LE(counter.count, 1000);
}

}  // namespace
}  // namespace appsync::device
