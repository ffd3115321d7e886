#include "base/interruption.h"

#include <gtest/gtest.h>
#include <signal.h>

namespace appsync {
namespace {

/// Whether a request stands after the signals, and after the watcher has come to its end.
bool requestedAfter(std::initializer_list<int> signals) {
  Interruption interruption;
  {
    const SignalWatcher watcher(interruption);
    for (const int number : signals) ::raise(number);
  }
  return interruption.requested();
}

class SignalWatcherTest : public ::testing::TestWithParam<int> {};

TEST_P(SignalWatcherTest, TheFirstSignalIsARequest) { EXPECT_TRUE(requestedAfter({GetParam()})); }

TEST_P(SignalWatcherTest, OutsideItsLifeTheSignalDoesWhatItDidBefore) {
  static volatile sig_atomic_t heard = 0;
  const auto before = ::signal(GetParam(), [](int) { heard = heard + 1; });
  heard = 0;
  EXPECT_TRUE(requestedAfter({GetParam()}));
  EXPECT_EQ(heard, 0);
  ::raise(GetParam());
  EXPECT_EQ(heard, 1);
  ::signal(GetParam(), before);
}

INSTANTIATE_TEST_SUITE_P(Signals, SignalWatcherTest, ::testing::Values(SIGINT, SIGTERM, SIGHUP));

TEST(SignalWatcher, ATerminalThatHangsUpTwiceEndsNothingAtOnce) {
  EXPECT_TRUE(requestedAfter({SIGHUP, SIGHUP}));
  EXPECT_TRUE(requestedAfter({SIGINT, SIGHUP}));
}

TEST(SignalWatcherDeathTest, ASecondInterruptEndsTheProcessAtOnce) {
  for (const int first : {SIGINT, SIGTERM, SIGHUP}) {
    for (const int second : {SIGINT, SIGTERM}) {
      EXPECT_EXIT(requestedAfter({first, second}), ::testing::ExitedWithCode(130), "");
    }
  }
}

TEST(SignalWatcher, AHangUpThatWasIgnoredStaysIgnored) {
  const auto before = ::signal(SIGHUP, SIG_IGN);
  EXPECT_FALSE(requestedAfter({SIGHUP}));
  ::signal(SIGHUP, before);
}

}  // namespace
}  // namespace appsync
