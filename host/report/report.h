#pragma once

#include <memory>

#include "host/library/events.h"
#include "host/report/output.h"

namespace appsync::host {

struct ReportOptions {
  bool json = false;
  bool quiet = false;     ///< only what failed
  bool verbose = false;   ///< the plan and the client's log lines too
  bool showPlan = false;  ///< the plan even when not verbose
};

/// JSON lines, or lines for people with a progress bar where the output is a terminal.
std::unique_ptr<Reporter> makeReporter(Output& output, Output& errorOutput,
                                       const ReportOptions& options);

/// Whether to use colour: a terminal, not a dumb one, and NO_COLOR is unset or empty.
bool wantsColour(const Output& output);

}  // namespace appsync::host
