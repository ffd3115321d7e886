#pragma once

#include <chrono>

namespace appsync::device {

/// Seconds since 1970-01-01T00:00:00Z.
inline double secondsSince1970() {
  return std::chrono::duration<double>(std::chrono::system_clock::now().time_since_epoch()).count();
}

/// 2001-01-01T00:00:00Z, from which property lists count, in seconds since 1970.
inline constexpr double PropertyListEpoch = 978'307'200;

}  // namespace appsync::device
