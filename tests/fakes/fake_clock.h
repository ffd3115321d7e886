#pragma once

#include <atomic>
#include <chrono>

namespace appsync::fakes {

/// The time of a fake platform: it stands still until a test moves it.
class FakeClock {
 public:
  std::chrono::milliseconds now() const { return std::chrono::milliseconds(now_.load()); }
  /// Seconds since 1970-01-01T00:00:00Z.
  double seconds() const { return static_cast<double>(now_.load()) / 1000.0; }
  void advance(std::chrono::milliseconds time) { now_ += time.count(); }

 private:
  std::atomic<std::int64_t> now_ = 1'769'860'800'000;  // 2026-01-31T12:00:00Z
};

}  // namespace appsync::fakes
