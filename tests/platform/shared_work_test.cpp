#include "platform/shared_work.h"

#include <gmock/gmock.h>

#include <future>
#include <thread>

namespace appsync {
namespace {

using ::testing::ElementsAre;
using ::testing::UnorderedElementsAre;

TEST(SharedWork, ServesOneRequestAfterTheOtherWhereNobodyElseAsks) {
  std::vector<std::vector<int>> runs;
  SharedWork<int> work([&](std::span<int* const> requests) {
    runs.emplace_back();
    for (int* const request : requests) runs.back().push_back((*request)++);
  });
  int one = 1;
  int five = 5;
  work.serve(one);
  work.serve(five);
  EXPECT_THAT(runs, ElementsAre(ElementsAre(1), ElementsAre(5)));
  EXPECT_EQ(one, 2);
  EXPECT_EQ(five, 6);
}

TEST(SharedWork, ServesTogetherWhatIsAskedForDuringARun) {
  std::promise<void> entered;
  std::promise<void> go;
  std::vector<std::vector<int>> runs;
  SharedWork<int> work([&](std::span<int* const> requests) {
    runs.emplace_back();
    for (const int* const request : requests) runs.back().push_back(*request);
    if (runs.size() > 1) return;
    entered.set_value();
    go.get_future().wait();
  });
  const auto ask = [&](int number) {
    return std::thread([&work, number] {
      int request = number;
      work.serve(request);
    });
  };
  std::thread first = ask(0);
  entered.get_future().wait();
  std::vector<std::thread> others;
  for (int number = 1; number <= 5; ++number) others.push_back(ask(number));
  while (work.waiting() < others.size()) std::this_thread::yield();
  go.set_value();
  first.join();
  for (std::thread& thread : others) thread.join();
  EXPECT_THAT(runs, ElementsAre(ElementsAre(0), UnorderedElementsAre(1, 2, 3, 4, 5)));
}

TEST(SharedWork, NobodyReturnsBeforeTheRunThatServesHim) {
  constexpr int Threads = 8;
  constexpr int Each = 200;
  SharedWork<bool> work([](std::span<bool* const> requests) {
    for (bool* const served : requests) *served = true;
  });
  std::atomic<int> served = 0;
  std::vector<std::thread> threads;
  for (int thread = 0; thread < Threads; ++thread) {
    threads.emplace_back([&] {
      for (int i = 0; i < Each; ++i) {
        bool mine = false;
        work.serve(mine);
        if (mine) ++served;
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  EXPECT_EQ(served, Threads * Each);
  EXPECT_EQ(work.waiting(), 0U);
}

}  // namespace
}  // namespace appsync
