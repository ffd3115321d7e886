#include <atomic>
#include <condition_variable>
#include <future>
#include <mutex>
#include <thread>

#include "tests/contract/phone.h"

namespace appsync::contract {
namespace {

SERVICE_CONTRACT(SystemNotifierContract);

/// Counts its calls and lets a test wait for them.
class Counter {
 public:
  static void call(void* observer) noexcept {
    auto* const counter = static_cast<Counter*>(observer);
    const std::scoped_lock lock(counter->mutex_);
    ++counter->calls_;
    counter->changed_.notify_all();
  }
  bool waitFor(int calls) {
    std::unique_lock lock(mutex_);
    return changed_.wait_for(lock, std::chrono::minutes(1), [&] { return calls_ >= calls; });
  }
  int calls() {
    const std::scoped_lock lock(mutex_);
    return calls_;
  }

 private:
  std::mutex mutex_;
  std::condition_variable changed_;
  int calls_ = 0;
};

TEST_P(SystemNotifierContract, GivesATokenToWhichAStateCanBeAttached) {
  const auto first = platform.systemNotifier.registerCheck("com.corvane.one");
  const auto second = platform.systemNotifier.registerCheck("com.corvane.two");
  EXPECT_EQ(first.status, 0U);
  EXPECT_EQ(second.status, 0U);
  EXPECT_NE(first.token, second.token);
  platform.systemNotifier.setState(first.token, 1);
  platform.systemNotifier.setState(second.token, ~std::uint64_t{0});
  platform.systemNotifier.setState(12345, 1);
  platform.systemNotifier.post("com.corvane.one");
}

TEST_P(SystemNotifierContract, CallsEverySubscriberOfTheNameOnEveryPosting) {
  Counter one;
  Counter two;
  Counter other;
  platform.systemNotifier.addObserver(&one, "com.corvane.one", Counter::call);
  platform.systemNotifier.addObserver(&two, "com.corvane.one", Counter::call);
  platform.systemNotifier.addObserver(&other, "com.corvane.other", Counter::call);
  for (int round = 1; round <= 3; ++round) {
    platform.systemNotifier.post("com.corvane.one");
    EXPECT_TRUE(one.waitFor(round));
    EXPECT_TRUE(two.waitFor(round));
  }
  platform.systemNotifier.post("com.corvane.other");
  EXPECT_TRUE(other.waitFor(1));
  platform.systemNotifier.removeObserver(&one, "com.corvane.one");
  platform.systemNotifier.removeObserver(&two, "com.corvane.one");
  platform.systemNotifier.removeObserver(&other, "com.corvane.other");
  EXPECT_EQ(one.calls(), 3);
  EXPECT_EQ(two.calls(), 3);
  EXPECT_EQ(other.calls(), 1);
}

TEST_P(SystemNotifierContract, PostingsInQuickSuccessionAreEachCalledBack) {
  Counter counter;
  platform.systemNotifier.addObserver(&counter, "com.corvane.one", Counter::call);
  for (int round = 0; round < 50; ++round) platform.systemNotifier.post("com.corvane.one");
  EXPECT_TRUE(counter.waitFor(50));
  platform.systemNotifier.removeObserver(&counter, "com.corvane.one");
  EXPECT_EQ(counter.calls(), 50);
}

TEST_P(SystemNotifierContract, ARemovedObserverIsNotCalledForThatNameAgain) {
  Counter removed;
  Counter staying;
  SystemNotifier& notifier = platform.systemNotifier;
  notifier.addObserver(&removed, "com.corvane.one", Counter::call);
  notifier.addObserver(&removed, "com.corvane.two", Counter::call);
  notifier.addObserver(&staying, "com.corvane.one", Counter::call);
  notifier.removeObserver(&removed, "com.corvane.one");
  notifier.removeObserver(&removed, "com.corvane.unknown");
  notifier.post("com.corvane.one");
  EXPECT_TRUE(staying.waitFor(1));
  notifier.post("com.corvane.two");
  EXPECT_TRUE(removed.waitFor(1));
  notifier.removeObserver(&removed, "com.corvane.two");
  notifier.removeObserver(&staying, "com.corvane.one");
  EXPECT_EQ(removed.calls(), 1);
}

struct SlowCallback {
  static void call(void* observer) noexcept {
    auto* const slow = static_cast<SlowCallback*>(observer);
    slow->entered.set_value();
    slow->go.get_future().wait();
    slow->finished = true;
  }
  std::promise<void> entered;
  std::promise<void> go;
  std::atomic<bool> finished = false;
};

TEST_P(SystemNotifierContract, RemovingWaitsForARunningCallback) {
  SlowCallback slow;
  platform.systemNotifier.addObserver(&slow, "com.corvane.one", SlowCallback::call);
  std::thread poster([&] { platform.systemNotifier.post("com.corvane.one"); });
  slow.entered.get_future().wait();
  std::promise<void> removing;
  std::thread remover([&] {
    removing.set_value();
    platform.systemNotifier.removeObserver(&slow, "com.corvane.one");
    EXPECT_TRUE(slow.finished);
  });
  removing.get_future().wait();
  slow.go.set_value();
  remover.join();
  poster.join();
}

}  // namespace
}  // namespace appsync::contract
