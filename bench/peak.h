#pragma once

#include <cstddef>

namespace appsync::bench {

/// The most memory that the process has had in use beyond what it used when this was made: all of
/// it, libraries' included, in steps of a page. One at a time.
class PeakMeter {
 public:
  PeakMeter();
  double mostMib() const;

 private:
  std::size_t before_;
};

}  // namespace appsync::bench
