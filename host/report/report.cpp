#include "host/report/report.h"

#include <cstdlib>
#include <string_view>

#include "host/report/report_json.h"
#include "host/report/report_text.h"
#include "platform/mutex.h"

namespace appsync::host {
namespace {

std::string_view environment(const char* name) {
  const char* value = std::getenv(name);
  return value ? value : "";
}

bool isAbleTerminal(const Output& output) {
  return output.isTerminal() && environment("TERM") != "dumb";
}

/// Lets one thread at a time through.
class TextReporterForThreads final : public Reporter {
 public:
  TextReporterForThreads(Output& output, Output& errorOutput, const ReportOptions& options)
      : reporter_(output, errorOutput, options, isAbleTerminal(output), wantsColour(output)) {}

  void report(const Event& event) override {
    const Lock lock(mutex_);
    reporter_.report(event);
  }

 private:
  Mutex mutex_;
  TextReporter reporter_ APPSYNC_GUARDED_BY(mutex_);
};

}  // namespace

bool wantsColour(const Output& output) {
  return isAbleTerminal(output) && environment("NO_COLOR").empty();
}

std::unique_ptr<Reporter> makeReporter(Output& output, Output& errorOutput,
                                       const ReportOptions& options) {
  if (options.json) return std::make_unique<JsonReporter>(output, options.quiet);
  return std::make_unique<TextReporterForThreads>(output, errorOutput, options);
}

}  // namespace appsync::host
