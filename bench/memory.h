#pragma once

#include <cstddef>

namespace appsync::bench {

/// The most memory taken with new and held at a time, on all threads, beyond what was held when
/// this was made. One at a time.
class MemoryMeter {
 public:
  MemoryMeter();
  std::size_t most() const;

 private:
  std::size_t before_;
};

}  // namespace appsync::bench
