#include <fmt/format.h>

#include <CLI/CLI.hpp>
#include <chrono>
#include <deque>
#include <map>
#include <memory>
#include <thread>

#include "base/text.h"
#include "host/cli/cli.h"
#include "host/cli/table.h"

namespace appsync::host {
namespace {

constexpr std::chrono::milliseconds FollowPoll{500};

struct LogOptions {
  std::string level = "debug";
  std::size_t limit = 0;  // 0: all
  bool follow = false;
};

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
  std::optional<Error> error;
  const std::vector<AppRecord> applications = device->applications(&error);
  insistOnRead(error);
  for (const AppRecord& record : applications) {
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

const std::map<std::string, int>& severities() {
  static const std::map<std::string, int> levels = {
      {"debug", 0}, {"info", 1}, {"default", 2}, {"error", 3}, {"fault", 4}};
  return levels;
}

int severity(LogLevel level) { return severities().at(std::string(name(level))); }

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
