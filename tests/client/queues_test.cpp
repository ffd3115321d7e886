// Task group, access queue, semaphore and delayed tasks.
#include "client/queues.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <atomic>
#include <latch>
#include <thread>

#include "tests/fakes/fake_background_queue.h"

namespace appsync {
namespace {

using namespace std::chrono_literals;
using testing::ElementsAre;

TEST(TaskGroup, HasNothingToWaitForAtFirst) {
  TaskGroup group;
  group.wait();
}

TEST(TaskGroup, WaitReturnsOnlyWhenEveryEnterWasLeft) {
  TaskGroup group;
  std::atomic<int> left = 0;
  for (int i = 0; i < 10; ++i) group.enter();
  std::vector<std::thread> workers;
  for (int i = 0; i < 10; ++i) {
    workers.emplace_back([&] {
      ++left;
      group.leave();
    });
  }
  group.wait();
  EXPECT_EQ(left, 10);
  for (std::thread& worker : workers) worker.join();
}

TEST(TaskGroup, IsNotEmptyWhileTheNextEntryComesBeforeTheLastLeaves) {
  TaskGroup group;
  bool second = false;
  group.enter();
  std::thread worker([&] {
    group.enter();
    group.leave();
    second = true;
    group.leave();
  });
  group.wait();
  EXPECT_TRUE(second);
  worker.join();
}

TEST(TaskGroup, WakesEveryWaiter) {
  TaskGroup group;
  group.enter();
  std::vector<std::thread> waiters;
  for (int i = 0; i < 3; ++i) waiters.emplace_back([&group] { group.wait(); });
  group.leave();
  for (std::thread& waiter : waiters) waiter.join();
}

TEST(TaskGroup, MayBeDestroyedAsSoonAsItIsEmpty) {
  for (int round = 0; round < 200; ++round) {
    auto group = std::make_unique<TaskGroup>();
    group->enter();
    std::thread worker([&leaving = *group] { leaving.leave(); });
    group->wait();
    group.reset();
    worker.join();
  }
}

TEST(AccessQueue, RunsATaskOnTheCallersThreadAndGivesItsResult) {
  AccessQueue queue("label");
  EXPECT_EQ(queue.label(), "label");
  const std::thread::id ranOn = queue.sync([] { return std::this_thread::get_id(); });
  EXPECT_EQ(ranOn, std::this_thread::get_id());
}

TEST(AccessQueue, RunsOneTaskAtATime) {
  AccessQueue queue("label");
  int plain = 0;
  std::vector<std::thread> threads;
  for (int i = 0; i < 4; ++i) {
    threads.emplace_back([&] {
      for (int k = 0; k < 1000; ++k) queue.sync([&plain] { ++plain; });
    });
  }
  for (std::thread& thread : threads) thread.join();
  EXPECT_EQ(plain, 4000);
}

TEST(Semaphore, LetsThroughAsManyAsWereSignalled) {
  Semaphore semaphore;
  semaphore.signal();
  semaphore.signal();
  EXPECT_TRUE(semaphore.wait());
  EXPECT_TRUE(semaphore.wait(0ms));
  EXPECT_FALSE(semaphore.wait(0ms));
}

TEST(Semaphore, WakesAWaiterOnAnotherThread) {
  Semaphore semaphore;
  bool before = false;
  std::thread signalling([&] {
    before = true;
    semaphore.signal();
  });
  EXPECT_TRUE(semaphore.wait());
  EXPECT_TRUE(before);
  signalling.join();
}

TEST(Semaphore, WithALimitReturnsTrueForASignalInTime) {
  Semaphore semaphore;
  std::thread signalling([&semaphore] { semaphore.signal(); });
  EXPECT_TRUE(semaphore.wait(1min));
  signalling.join();
}

class DelayedTasksTest : public testing::Test {
 protected:
  fakes::CallTrace trace;
  fakes::FakeClock clock;
  fakes::FakeBackgroundQueue queue{trace, clock};
};

TEST_F(DelayedTasksTest, ATaskRunsOnceItsDelayHasPassedAndNotBefore) {
  DelayedTasks tasks(queue);
  int ran = 0;
  EXPECT_TRUE(tasks.after(30s, [&ran] { ++ran; }));
  queue.advance(29'999ms);
  EXPECT_EQ(ran, 0);
  queue.advance(1ms);
  EXPECT_EQ(ran, 1);
  queue.advance(5min);
  EXPECT_EQ(ran, 1);
}

TEST_F(DelayedTasksTest, RunInTheOrderInWhichTheyAreDue) {
  DelayedTasks tasks(queue);
  std::vector<int> order;
  tasks.after(3s, [&order] { order.push_back(3); });
  tasks.after(1s, [&order] { order.push_back(1); });
  tasks.after(2s, [&order] { order.push_back(2); });
  queue.advance(3s);
  EXPECT_THAT(order, ElementsAre(1, 2, 3));
}

TEST_F(DelayedTasksTest, ATaskMayAddTheNext) {
  DelayedTasks tasks(queue);
  int ran = 0;
  tasks.after(30s, [&] {
    ++ran;
    tasks.after(30s, [&ran] { ++ran; });
  });
  queue.advance(60s);
  EXPECT_EQ(ran, 2);
}

TEST_F(DelayedTasksTest, CloseDropsWhatIsPendingAndTellsOfEach) {
  DelayedTasks tasks(queue);
  int ran = 0;
  int dropped = 0;
  tasks.after(1s, [&ran] { ++ran; });
  tasks.after(30s, [&ran] { ++ran; });
  tasks.after(60s, [&ran] { ++ran; });
  queue.advance(1s);
  tasks.close([&dropped] { ++dropped; });
  EXPECT_EQ(dropped, 2);
  EXPECT_EQ(queue.pendingCount(), 0u);
  queue.advance(5min);
  EXPECT_EQ(ran, 1);
}

TEST_F(DelayedTasksTest, AreRefusedOnceClosed) {
  DelayedTasks tasks(queue);
  tasks.close();
  EXPECT_FALSE(tasks.after(0s, [] { FAIL() << "ran after close"; }));
  queue.advance(1min);
  int dropped = 0;
  tasks.close([&dropped] { ++dropped; });
  EXPECT_EQ(dropped, 0);
}

TEST_F(DelayedTasksTest, DestructionDropsWhatIsPending) {
  const auto captured = std::make_shared<int>(7);
  {
    DelayedTasks tasks(queue);
    tasks.after(30s, [captured] { FAIL() << "ran after destruction"; });
  }
  EXPECT_EQ(captured.use_count(), 1);
  queue.advance(1min);
}

TEST_F(DelayedTasksTest, CloseWaitsForATaskThatRunsAndDoesNotCallItDropped) {
  DelayedTasks tasks(queue);
  std::latch started(1);
  std::latch mayEnd(1);
  bool ended = false;
  tasks.after(1s, [&] {
    started.count_down();
    mayEnd.wait();
    ended = true;
  });
  std::thread running([this] { queue.advance(1s); });
  started.wait();
  std::thread releasing([&mayEnd] { mayEnd.count_down(); });
  tasks.close([] { FAIL() << "a task that ran was called dropped"; });
  EXPECT_TRUE(ended);
  running.join();
  releasing.join();
}

TEST_F(DelayedTasksTest, WhatATaskHeldMayAddTheNextWhenItGoes) {
  DelayedTasks tasks(queue);
  int ran = 0;
  const auto addsNext = [&](int*) { tasks.after(1s, [&ran] { ++ran; }); };
  tasks.after(1s, [held = std::shared_ptr<int>(nullptr, addsNext)] {});
  queue.advance(1s);
  EXPECT_EQ(ran, 0);
  queue.advance(1s);
  EXPECT_EQ(ran, 1);
}

TEST_F(DelayedTasksTest, CloseWaitsUntilWhatARunningTaskHeldIsGone) {
  std::latch going(1);
  std::latch mayGo(1);
  std::atomic<bool> gone = false;
  const auto goes = [&](int*) {
    going.count_down();
    mayGo.wait();
    gone = true;
  };
  DelayedTasks tasks(queue);
  tasks.after(1s, [held = std::shared_ptr<int>(nullptr, goes)] {});
  std::thread running([this] { queue.advance(1s); });
  going.wait();
  std::thread releasing([&mayGo] { mayGo.count_down(); });
  tasks.close([] { FAIL() << "a task that ran was called dropped"; });
  EXPECT_TRUE(gone);
  running.join();
  releasing.join();
}

TEST_F(DelayedTasksTest, MayBeDestroyedWhileATaskEnds) {
  for (int round = 0; round < 200; ++round) {
    auto tasks = std::make_unique<DelayedTasks>(queue);
    std::latch ran(1);
    tasks->after(1s, [&ran] { ran.count_down(); });
    std::thread running([this] { queue.advance(1s); });
    ran.wait();
    tasks.reset();
    running.join();
  }
}

TEST_F(DelayedTasksTest, ATaskThatRunsDuringCloseCannotAddAnother) {
  for (int round = 0; round < 50; ++round) {
    DelayedTasks tasks(queue);
    std::atomic<int> settled = 0;
    tasks.after(1s, [&] {
      if (!tasks.after(1s, [&settled] { ++settled; })) ++settled;
    });
    std::thread running([this] { queue.advance(2s); });
    tasks.close([&settled] { ++settled; });
    running.join();
    EXPECT_EQ(settled, 1);
    EXPECT_EQ(queue.pendingCount(), 0u);
  }
}

TEST_F(DelayedTasksTest, EachEitherRunsOrIsDroppedWhateverComesFirst) {
  constexpr int Many = 50;
  for (int round = 0; round < 20; ++round) {
    DelayedTasks tasks(queue);
    std::atomic<int> settled = 0;
    std::vector<std::atomic<int>> runs(Many);
    for (int i = 0; i < Many; ++i) {
      tasks.after(std::chrono::milliseconds(i), [&, i] {
        ++runs[static_cast<std::size_t>(i)];
        ++settled;
      });
    }
    std::thread running([this] { queue.advance(1s); });
    tasks.close([&settled] { ++settled; });
    running.join();
    EXPECT_EQ(settled, Many);
    for (const std::atomic<int>& count : runs) EXPECT_LE(count, 1);
  }
}

}  // namespace
}  // namespace appsync
