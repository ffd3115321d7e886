#include <fmt/format.h>

#include <CLI/CLI.hpp>
#include <chrono>
#include <deque>
#include <map>
#include <memory>
#include <thread>

#include "host/base/text.h"
#include "host/cli/cli.h"
#include "host/cli/status.h"

namespace appsync::host {
namespace {

constexpr std::chrono::milliseconds FollowPoll{500};

struct LogOptions {
  std::string level = "debug";
  std::size_t limit = 0;  // 0: all
  bool follow = false;
};

using Row = std::vector<std::string>;

/// Columns as wide as their widest cell; the last one is left as it is.
void writeTable(Output& output, const std::vector<Row>& rows) {
  std::vector<std::size_t> widths;
  for (const Row& row : rows) {
    widths.resize(std::max(widths.size(), row.size()));
    for (std::size_t i = 0; i < row.size(); ++i) {
      widths[i] = std::max(widths[i], displayWidth(row[i]));
    }
  }
  for (const Row& row : rows) {
    std::string line;
    for (std::size_t i = 0; i + 1 < row.size(); ++i) line += fitted(row[i], widths[i]) + "  ";
    if (!row.empty()) line += row.back();
    output.line(line);
  }
}

Json jsonOf(const AppRecord& record) {
  return {{"identifier", record.applicationIdentifier},
          {"version", record.bundleVersion ? Json(*record.bundleVersion) : Json()},
          {"name", record.displayName},
          {"type", record.applicationType},
          {"placeholder", record.isPlaceholder},
          {"path", record.bundlePath ? Json(*record.bundlePath) : Json()}};
}

ExitCode runApps(CommandContext& context) {
  const auto device = context.openDevice(device::Access::ReadOnly);
  std::vector<Row> rows;
  for (const AppRecord& record : device->applications()) {
    if (context.json) {
      writeJsonLine(context.out, jsonOf(record));
    } else {
      rows.push_back({printable(record.applicationIdentifier),
                      printable(record.bundleVersion.value_or("-")), printable(record.displayName),
                      record.isPlaceholder ? "placeholder" : printable(record.applicationType)});
    }
  }
  if (!context.json && rows.empty() && !context.quiet) context.out.line("No applications.");
  writeTable(context.out, rows);
  return ExitCode::Done;
}

std::string scenarioText(const device::TransactionRecord& record) {
  if (!record.scenario.empty()) return record.scenario;
  return fmt::format("step {} party {} phase {}", record.step.value_or(0), record.party,
                     record.phase);
}

Json jsonOf(const device::TransactionRecord& record) {
  return {{"number", record.number},
          {"time", isoTime(record.time)},
          {"scenario", textOrNull(record.scenario)},
          {"step", record.step ? Json(*record.step) : Json()},
          {"party", record.party},
          {"phase", record.phase},
          {"success", record.success},
          {"identifier", record.bundleId},
          {"description", record.description}};
}

ExitCode runHistory(std::size_t limit, CommandContext& context) {
  const auto device = context.openDevice(device::Access::ReadOnly);
  auto records = device->transactions();
  if (limit > 0 && records.size() > limit) {
    records.erase(records.begin(), records.end() - static_cast<std::ptrdiff_t>(limit));
  }
  std::vector<Row> rows;
  for (const device::TransactionRecord& record : records) {
    if (context.json) {
      writeJsonLine(context.out, jsonOf(record));
    } else {
      rows.push_back({isoTime(record.time), record.success ? "ok" : "failed",
                      printable(scenarioText(record)), printable(record.bundleId),
                      printable(record.description)});
    }
  }
  if (!context.json && rows.empty() && !context.quiet) context.out.line("No history yet.");
  writeTable(context.out, rows);
  return ExitCode::Done;
}

int severity(LogLevel level) {
  switch (level) {
    case LogLevel::Debug:
      return 0;
    case LogLevel::Info:
      return 1;
    case LogLevel::Default:
      return 2;
    case LogLevel::Error:
      return 3;
    case LogLevel::Fault:
      return 4;
  }
  return 2;
}

const std::map<std::string, int>& severities() {
  static const std::map<std::string, int> levels = {
      {"debug", 0}, {"info", 1}, {"default", 2}, {"error", 3}, {"fault", 4}};
  return levels;
}

void writeLogLine(const device::LogLine& line, CommandContext& context) {
  context.tell(
      {{"time", isoTime(line.time)},
       {"channel", name(line.channel)},
       {"level", name(line.level)},
       {"text", line.text}},
      fmt::format("{}  {:<7}  {}", isoTime(line.time), name(line.level), printable(line.text)));
}

/// Remembers how far the log was read. Old lines may have been dropped since then, so it is the
/// time of the last line that counts, and how many lines of that time there were.
class LogPosition {
 public:
  /// Whether the line was not seen before; to be asked of all lines in order, after `rewind`.
  bool isNew(const device::LogLine& line) {
    if (line.time < time_) return false;
    if (line.time > time_) {
      time_ = line.time;
      seenAtTime_ = passed_ = 1;
      return true;
    }
    if (++passed_ <= seenAtTime_) return false;
    seenAtTime_ = passed_;
    return true;
  }
  void rewind() { passed_ = 0; }

 private:
  double time_ = -1;
  std::size_t seenAtTime_ = 0;
  std::size_t passed_ = 0;
};

ExitCode runLog(const LogOptions& options, CommandContext& context) {
  const auto device = context.openDevice(device::Access::ReadOnly);
  const int least = severities().at(options.level);
  LogPosition position;
  std::deque<device::LogLine> lines;
  const auto readNew = [&](std::size_t limit) {
    position.rewind();
    device->readLog([&](const device::LogLine& line) {
      if (!position.isNew(line) || severity(line.level) < least) return;
      lines.push_back(line);
      if (limit > 0 && lines.size() > limit) lines.pop_front();
    });
    for (const device::LogLine& line : lines) writeLogLine(line, context);
    lines.clear();
  };
  readNew(options.limit);
  while (options.follow && context.out.error() == 0) {
    std::this_thread::sleep_for(FollowPoll);
    readNew(0);
  }
  return ExitCode::Done;
}

}  // namespace

void addLookCommands(CLI::App& app, Command& chosen) {
  CLI::App* apps = app.add_subcommand("apps", "List the applications on the phone");
  apps->footer("Example: appsync --device phone apps");
  apps->callback([&chosen] { chosen = &runApps; });

  CLI::App* status = app.add_subcommand("status", "Show the state of the phone's sync");
  status->footer("Example: appsync --device phone --json status");
  status->callback([&chosen] { chosen = &runStatus; });

  CLI::App* history = app.add_subcommand("history", "List what was installed and removed");
  auto historyLimit = std::make_shared<std::size_t>(0);
  history->add_option("--limit", *historyLimit, "Only the last records")->type_name("N");
  history->callback([historyLimit, &chosen] {
    chosen = [historyLimit](CommandContext& context) { return runHistory(*historyLimit, context); };
  });

  CLI::App* log = app.add_subcommand("log", "Show the phone's log");
  log->footer("Example: appsync --device phone log --level error --follow");
  auto logOptions = std::make_shared<LogOptions>();
  log->add_option("--level", logOptions->level, "Least severe level to show")
      ->check(CLI::IsMember(severities()))
      ->type_name("debug|info|default|error|fault")
      ->capture_default_str();
  log->add_option("--limit", logOptions->limit, "Only the last lines")
      ->check(checkPositive)
      ->type_name("N");
  log->add_flag("-f,--follow", logOptions->follow, "Go on as lines come, until interrupted");
  log->callback([logOptions, &chosen] {
    chosen = [logOptions](CommandContext& context) { return runLog(*logOptions, context); };
  });
}

}  // namespace appsync::host
