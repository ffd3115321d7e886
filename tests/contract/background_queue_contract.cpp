#include <atomic>
#include <future>
#include <mutex>
#include <thread>

#include "tests/contract/phone.h"

namespace appsync::contract {
namespace {

using namespace std::chrono_literals;

class BackgroundQueueContract : public ServiceContract {
 protected:
  BackgroundQueue& queue = platform.backgroundQueue;

  /// Lets time pass until the promise is kept; false when that takes a minute.
  bool comesTrue(std::promise<void>& promise, std::chrono::milliseconds time) {
    phone->passTime(time);
    return promise.get_future().wait_for(1min) == std::future_status::ready;
  }
};

SERVICE_CONTRACT_OF(BackgroundQueueContract);

TEST_P(BackgroundQueueContract, RunsATaskOnceAfterItsDelay) {
  std::atomic<int> runs = 0;
  std::promise<void> later;
  queue.after(5ms, [&] { ++runs; });
  queue.after(20ms, [&] { later.set_value(); });
  EXPECT_TRUE(comesTrue(later, 20ms));
  EXPECT_EQ(runs, 1);
}

TEST_P(BackgroundQueueContract, RunsNoTaskBeforeItsTime) {
  const double start = phone->now();
  double ran = 0;
  std::promise<void> done;
  queue.after(30ms, [&] {
    ran = phone->now();
    done.set_value();
  });
  EXPECT_TRUE(comesTrue(done, 30ms));
  EXPECT_GE(ran - start, 0.029);
}

TEST_P(BackgroundQueueContract, RunsTasksInTheOrderOfTheirTimes) {
  std::mutex mutex;
  std::vector<int> order;
  std::promise<void> done;
  const auto note = [&](int number) {
    const std::scoped_lock lock(mutex);
    order.push_back(number);
    if (order.size() == 3) done.set_value();
  };
  queue.after(150ms, [&] { note(3); });
  queue.after(1ms, [&] { note(1); });
  queue.after(75ms, [&] { note(2); });
  EXPECT_TRUE(comesTrue(done, 150ms));
  // Under the lock: only then has the last task let go of it, which is on this stack.
  const std::scoped_lock lock(mutex);
  EXPECT_EQ(order, (std::vector<int>{1, 2, 3}));
}

TEST_P(BackgroundQueueContract, ADelayOfNothingRunsTheTaskToo) {
  std::promise<void> done;
  queue.after(0ms, [&] { done.set_value(); });
  EXPECT_TRUE(comesTrue(done, 0ms));
}

TEST_P(BackgroundQueueContract, ATaskMayAddAnother) {
  std::promise<void> done;
  queue.after(1ms, [&] { queue.after(1ms, [&] { done.set_value(); }); });
  EXPECT_TRUE(comesTrue(done, 2ms));
}

TEST_P(BackgroundQueueContract, ACancelledTaskNeverRuns) {
  std::atomic<bool> ran = false;
  std::promise<void> done;
  const BackgroundQueue::Token token = queue.after(50ms, [&] { ran = true; });
  queue.after(100ms, [&] { done.set_value(); });
  queue.cancel(token);
  EXPECT_TRUE(comesTrue(done, 100ms));
  EXPECT_FALSE(ran);
}

TEST_P(BackgroundQueueContract, CancellingWaitsForARunningTask) {
  std::promise<void> entered;
  std::promise<void> go;
  std::atomic<bool> finished = false;
  const BackgroundQueue::Token token = queue.after(1ms, [&] {
    entered.set_value();
    go.get_future().wait();
    finished = true;
  });
  std::thread timekeeper([&] { phone->passTime(1ms); });
  entered.get_future().wait();
  std::promise<void> canceling;
  std::thread canceler([&] {
    canceling.set_value();
    queue.cancel(token);
    EXPECT_TRUE(finished);
  });
  canceling.get_future().wait();
  go.set_value();
  canceler.join();
  timekeeper.join();
}

TEST_P(BackgroundQueueContract, UnknownAndFinishedTokensArePassedOver) {
  std::promise<void> done;
  const BackgroundQueue::Token token = queue.after(0ms, [&] { done.set_value(); });
  EXPECT_TRUE(comesTrue(done, 0ms));
  queue.cancel(token);
  queue.cancel(token + 1000);
  queue.cancel(0);
}

}  // namespace
}  // namespace appsync::contract
