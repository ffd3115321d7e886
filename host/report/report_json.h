#pragma once

#include "host/library/events.h"
#include "host/report/output.h"

namespace appsync::host {

/// One JSON object per event and line.
class JsonReporter : public Reporter {
 public:
  /// `quiet` leaves only errors and the summary.
  JsonReporter(Output& output, bool quiet) : output_(output), quiet_(quiet) {}
  void report(const Event& event) override;

 private:
  Output& output_;
  const bool quiet_;
};

}  // namespace appsync::host
