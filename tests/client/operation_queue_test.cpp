#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <barrier>
#include <cerrno>
#include <latch>
#include <mutex>
#include <set>
#include <system_error>
#include <thread>

#include "client/queues.h"

namespace appsync {
namespace {

using testing::ElementsAre;

TEST(OperationQueue, RunsOperationsInTheOrderInWhichTheyWereAdded) {
  OperationQueue queue(1);
  std::vector<int> order;
  for (int i = 0; i < 5; ++i) queue.add([&order, i] { order.push_back(i); });
  queue.waitUntilAllOperationsAreFinished();
  EXPECT_THAT(order, ElementsAre(0, 1, 2, 3, 4));
}

TEST(OperationQueue, RunsAsManyAtOnceAsItsMaximumAndNoMore) {
  constexpr int Maximum = 3;
  OperationQueue queue(Maximum);
  // Nobody passes the barrier before three operations run at the same time.
  std::barrier together(Maximum);
  std::atomic<int> running = 0;
  std::atomic<int> most = 0;
  for (int i = 0; i < 4 * Maximum; ++i) {
    queue.add([&] {
      const int now = ++running;
      for (int seen = most; seen < now && !most.compare_exchange_weak(seen, now);) {
      }
      together.arrive_and_wait();
      --running;
    });
  }
  queue.waitUntilAllOperationsAreFinished();
  EXPECT_EQ(most, Maximum);
}

TEST(OperationQueue, DoesNotMakeTheCallerWait) {
  OperationQueue queue(1);
  std::latch added(2);
  bool ran = false;
  queue.add([&] {
    added.arrive_and_wait();
    ran = true;
  });
  added.arrive_and_wait();
  queue.waitUntilAllOperationsAreFinished();
  EXPECT_TRUE(ran);
}

TEST(OperationQueue, WaitsForAnOperationThatAnOperationAdded) {
  OperationQueue queue(1);
  bool second = false;
  queue.add([&] { queue.add([&] { second = true; }); });
  queue.waitUntilAllOperationsAreFinished();
  EXPECT_TRUE(second);
}

TEST(OperationQueue, HasNothingToWaitForWhenNothingWasAdded) {
  OperationQueue queue(10);
  queue.waitUntilAllOperationsAreFinished();
}

TEST(OperationQueue, DestructionRunsWhatWasAddedToItsEnd) {
  std::atomic<int> ran = 0;
  {
    OperationQueue queue(2);
    for (int i = 0; i < 50; ++i) queue.add([&ran] { ++ran; });
  }
  EXPECT_EQ(ran, 50);
}

TEST(OperationQueue, DestructionRunsWhatRunningOperationsAdd) {
  std::atomic<int> ran = 0;
  {
    OperationQueue queue(2);
    for (int i = 0; i < 10; ++i) {
      queue.add([&queue, &ran] { queue.add([&ran] { ++ran; }); });
    }
  }
  EXPECT_EQ(ran, 10);
}

TEST(OperationQueue, UsesAnIdleThreadAgain) {
  OperationQueue queue(10);
  std::mutex mutex;
  std::set<std::thread::id> threads;
  for (int i = 0; i < 5; ++i) {
    queue.add([&] {
      const std::lock_guard lock(mutex);
      threads.insert(std::this_thread::get_id());
    });
    queue.waitUntilAllOperationsAreFinished();
  }
  EXPECT_EQ(threads.size(), 1u);
  EXPECT_FALSE(threads.contains(std::this_thread::get_id()));
}

[[noreturn]] std::thread noThread(const std::function<void()>&) {
  throw std::system_error(EAGAIN, std::generic_category());
}

TEST(OperationQueue, RunsAtOnceWhatNoThreadCanBeMadeFor) {
  OperationQueue queue(3, noThread);
  std::vector<std::thread::id> ranOn;
  for (std::size_t i = 1; i <= 2; ++i) {
    queue.add([&ranOn] { ranOn.push_back(std::this_thread::get_id()); });
    EXPECT_EQ(ranOn.size(), i);
  }
  EXPECT_THAT(ranOn, testing::Each(std::this_thread::get_id()));
  queue.waitUntilAllOperationsAreFinished();
}

TEST(OperationQueue, LeavesToTheThreadThatIsThereWhatNoOtherCanBeMadeFor) {
  int made = 0;
  OperationQueue queue(3, [&made](std::function<void()> work) {
    if (++made > 1) noThread(work);
    return std::thread(std::move(work));
  });
  std::latch added(1);
  std::vector<std::thread::id> ranOn;
  for (int i = 0; i < 3; ++i) {
    queue.add([&] {
      added.wait();
      ranOn.push_back(std::this_thread::get_id());
    });
  }
  EXPECT_THAT(ranOn, testing::IsEmpty());
  added.count_down();
  queue.waitUntilAllOperationsAreFinished();
  EXPECT_GT(made, 1);
  EXPECT_EQ(ranOn.size(), 3u);
  EXPECT_THAT(ranOn, testing::Each(testing::Eq(ranOn.front())));
  EXPECT_NE(ranOn.front(), std::this_thread::get_id());
}

TEST(OperationQueue, AnOperationIsGoneWhenItCountsAsFinished) {
  OperationQueue queue(1);
  const auto captured = std::make_shared<int>(7);
  queue.add([captured] {});
  queue.waitUntilAllOperationsAreFinished();
  EXPECT_EQ(captured.use_count(), 1);
}

TEST(OperationQueue, TakesOperationsFromManyThreads) {
  OperationQueue queue(4);
  std::atomic<int> ran = 0;
  std::vector<std::thread> adding;
  for (int i = 0; i < 4; ++i) {
    adding.emplace_back([&] {
      for (int k = 0; k < 100; ++k) queue.add([&ran] { ++ran; });
    });
  }
  for (std::thread& thread : adding) thread.join();
  queue.waitUntilAllOperationsAreFinished();
  EXPECT_EQ(ran, 400);
}

}  // namespace
}  // namespace appsync
