#include "platform/mutex.h"

#include <gtest/gtest.h>

#include <barrier>
#include <thread>

namespace appsync {
namespace {

TEST(Mutex, LetsOneThreadAtATimeThrough) {
  Mutex mutex;
  int count = 0;
  const auto countUp = [&] {
    for (int i = 0; i < 10'000; ++i) {
      const Lock lock(mutex);
      ++count;
    }
  };
  std::thread other(countUp);
  countUp();
  other.join();
  EXPECT_EQ(count, 20'000);
}

TEST(Mutex, IsFreeWhileItIsLetGoAndHeldAgainAfterwards) {
  Mutex mutex;
  bool free = false;
  std::thread late;
  {
    const Lock lock(mutex);
    {
      const Unlock unlocked(mutex);
      std::thread([&] {
        const Lock here(mutex);
        free = true;
      }).join();
    }
    EXPECT_TRUE(free);
    late = std::thread([&] {
      const Lock here(mutex);
      free = false;
    });
    EXPECT_TRUE(free);
  }
  late.join();
  EXPECT_FALSE(free);
}

TEST(SharedMutex, LetsReadersInTogether) {
  SharedMutex mutex;
  std::barrier together(2);
  const auto read = [&] {
    const SharedLock lock(mutex);
    together.arrive_and_wait();
  };
  std::thread other(read);
  read();
  other.join();
  const Lock lock(mutex);
}

TEST(Condition, LetsGoOfTheMutexWhileItWaits) {
  Mutex mutex;
  Condition changed;
  bool ready = false;
  const Lock lock(mutex);
  std::thread other([&] {
    const Lock there(mutex);
    ready = true;
    changed.notifyAll();
  });
  while (!ready) changed.wait(mutex);
  {
    const Unlock unlocked(mutex);
    other.join();
  }
  EXPECT_TRUE(ready);
}

TEST(Condition, WaitsNoLongerThanUntilTheTime) {
  Mutex mutex;
  Condition changed;
  const Lock lock(mutex);
  EXPECT_FALSE(changed.waitUntil(mutex, std::chrono::steady_clock::now() - std::chrono::hours(1)));
  // Still held: letting go of it would be an error otherwise.
  const Unlock unlocked(mutex);
}

}  // namespace
}  // namespace appsync
