#include "device/state/background_queue.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <atomic>
#include <future>
#include <memory>
#include <thread>
#include <vector>

namespace appsync::device {
namespace {

using namespace std::chrono_literals;
using ::testing::ElementsAre;

constexpr auto Never = std::chrono::hours(1000);

TEST(ThreadBackgroundQueue, RunsTasksInTheOrderInWhichTheyFallDue) {
  std::promise<void> done;
  std::vector<int> order;
  ThreadBackgroundQueue queue;
  queue.after(30ms, [&] {
    order.push_back(3);
    done.set_value();
  });
  queue.after(20ms, [&] { order.push_back(2); });
  queue.after(0ms, [&] { order.push_back(1); });
  done.get_future().wait();
  EXPECT_THAT(order, ElementsAre(1, 2, 3));
}

TEST(ThreadBackgroundQueue, WaitsAtLeastTheDelay) {
  std::promise<std::chrono::steady_clock::time_point> ran;
  const auto begin = std::chrono::steady_clock::now();
  ThreadBackgroundQueue queue;
  queue.after(50ms, [&] { ran.set_value(std::chrono::steady_clock::now()); });
  EXPECT_GE(ran.get_future().get() - begin, 50ms);
}

TEST(ThreadBackgroundQueue, NegativeAndEndlessDelaysAreTaken) {
  std::promise<void> done;
  ThreadBackgroundQueue queue;
  queue.after(std::chrono::milliseconds::max(), [] { ADD_FAILURE() << "ran"; });
  queue.after(std::chrono::milliseconds::min(), [&] { done.set_value(); });
  done.get_future().wait();
}

TEST(ThreadBackgroundQueue, TasksMayScheduleAndCancelTasks) {
  std::promise<void> done;
  ThreadBackgroundQueue queue;
  const auto cancelled = queue.after(Never, [] { ADD_FAILURE() << "ran"; });
  queue.after(0ms, [&] {
    queue.cancel(cancelled);
    queue.after(1ms, [&] { queue.after(1ms, [&] { done.set_value(); }); });
  });
  done.get_future().wait();
}

TEST(ThreadBackgroundQueue, CancelledTaskNeverRunsAndIsDestroyed) {
  ThreadBackgroundQueue queue;
  auto held = std::make_shared<int>();
  const std::weak_ptr<int> alive = held;
  const auto token = queue.after(Never, [held = std::move(held)] { ADD_FAILURE() << "ran"; });
  queue.cancel(token);
  EXPECT_TRUE(alive.expired());
  queue.cancel(token);
  queue.cancel(token + 1000);
}

TEST(ThreadBackgroundQueue, CancelWaitsForARunningTaskAndForWhatItHolds) {
  ThreadBackgroundQueue queue;
  for (int round = 0; round < 200; ++round) {
    std::promise<void> started;
    auto ended = std::make_shared<std::atomic<bool>>(false);
    const std::weak_ptr<std::atomic<bool>> alive = ended;
    const auto token = queue.after(0ms, [&started, ended] {
      started.set_value();
      std::this_thread::yield();
      *ended = true;
    });
    started.get_future().wait();
    queue.cancel(token);
    EXPECT_TRUE(*ended);
    ended.reset();
    EXPECT_TRUE(alive.expired());
  }
}

TEST(ThreadBackgroundQueue, TaskHasRunOrNeverRunsWhenCancelReturns) {
  ThreadBackgroundQueue queue;
  for (int round = 0; round < 500; ++round) {
    std::atomic<bool> over = false;
    std::atomic<bool> late = false;
    const auto token = queue.after(0ms, [&] { late = over.load(); });
    std::thread other([&] { queue.cancel(token); });
    queue.cancel(token);
    over = true;
    other.join();
    EXPECT_FALSE(late);
  }
}

TEST(ThreadBackgroundQueue, TaskThatCancelsItselfIsLetRun) {
  std::promise<void> done;
  std::promise<BackgroundQueue::Token> own;
  ThreadBackgroundQueue queue;
  own.set_value(queue.after(1ms, [&] {
    queue.cancel(own.get_future().get());
    done.set_value();
  }));
  done.get_future().wait();
}

TEST(ThreadBackgroundQueue, ExpediteRunsPendingTasksInTheirOrderAndLaterOnesAtOnce) {
  std::promise<void> done;
  std::vector<int> order;
  ThreadBackgroundQueue queue;
  queue.after(Never + 2h, [&] {
    order.push_back(2);
    queue.after(Never, [&] {
      order.push_back(4);
      done.set_value();
    });
  });
  queue.after(Never + 3h, [&] { order.push_back(3); });
  queue.after(Never + 1h, [&] { order.push_back(1); });
  queue.expedite();
  done.get_future().wait();
  EXPECT_THAT(order, ElementsAre(1, 2, 3, 4));
  queue.expedite();
}

TEST(ThreadBackgroundQueue, DestructorLetsTheRunningTaskEndAndDropsTheRest) {
  std::atomic<bool> ended = false;
  auto held = std::make_shared<int>();
  const std::weak_ptr<int> alive = held;
  std::promise<void> started;
  {
    ThreadBackgroundQueue queue;
    queue.after(0ms, [&] {
      started.set_value();
      std::this_thread::yield();
      ended = true;
    });
    queue.after(Never, [held = std::move(held)] { ADD_FAILURE() << "ran"; });
    started.get_future().wait();
  }
  EXPECT_TRUE(ended);
  EXPECT_TRUE(alive.expired());
}

TEST(ThreadBackgroundQueue, DroppedTasksMayHoldWhatCallsTheQueue) {
  ThreadBackgroundQueue queue;
  const auto token = queue.after(Never, [] {});
  const std::shared_ptr<void> caller(nullptr, [&](void*) { queue.cancel(token); });
  const auto outer = queue.after(Never, [caller] {});
  queue.cancel(outer);
}

}  // namespace
}  // namespace appsync::device
