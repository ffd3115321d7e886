#include "bench/peak.h"

#include <malloc.h>

#include <fstream>
#include <string>

namespace appsync::bench {
namespace {

/// A line of the process's status, in KiB.
std::size_t status(const std::string& wanted) {
  std::ifstream lines("/proc/self/status");
  for (std::string name; lines >> name; lines.ignore(256, '\n')) {
    std::size_t value = 0;
    if (name == wanted && lines >> value) return value;
  }
  return 0;
}

}  // namespace

PeakMeter::PeakMeter() {
  ::malloc_trim(0);
  std::ofstream("/proc/self/clear_refs") << 5;  // forgets the peak so far
  before_ = status("VmRSS:");
}

double PeakMeter::mostMib() const { return static_cast<double>(status("VmHWM:") - before_) / 1024; }

}  // namespace appsync::bench
