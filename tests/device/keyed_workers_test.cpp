#include "device/state/keyed_workers.h"

#include <gtest/gtest.h>

namespace appsync::device {
namespace {

using Clock = KeyedWorkers::Clock;
using Pending = std::deque<KeyedWorkers::Pending>;
constexpr std::chrono::seconds Second{1};

TEST(KeyedWorkersTest, AWorkerWithoutWorkLooksAgainWhenTheNextJobFallsDue) {
  const Clock::time_point now = Clock::now();
  EXPECT_EQ(KeyedWorkers::nextLook({}, now), std::nullopt);
  const Pending pending{{"b", {}, now + 2 * Second}, {"a", {}, now + Second}};
  EXPECT_EQ(KeyedWorkers::nextLook(pending, now), now + Second);
}

TEST(KeyedWorkersTest, AWorkerDoesNotLookAgainAndAgainForAJobThatIsDueAndWaitsForItsKey) {
  const Clock::time_point now = Clock::now();
  EXPECT_EQ(KeyedWorkers::nextLook({{"a", {}, now}, {"b", {}, now - Second}}, now), std::nullopt);
  EXPECT_EQ(KeyedWorkers::nextLook({{"a", {}, now - Second}, {"b", {}, now + Second}}, now),
            now + Second);
}

}  // namespace
}  // namespace appsync::device
