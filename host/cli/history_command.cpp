#include <fmt/format.h>

#include <CLI/CLI.hpp>
#include <memory>

#include "base/text.h"
#include "host/cli/cli.h"
#include "host/cli/table.h"
#include "host/library/version.h"

namespace appsync::host {
namespace {

using device::HistoryEntry;
using device::HistoryEvent;
using device::HistoryOrigin;
using device::TransactionRecord;

struct HistoryOptions {
  std::size_t limit = 0;  // 0: all
  bool records = false;
};

std::string_view nameOfInstall(const HistoryEntry& entry) {
  if (!entry.replaced) return "installed";
  const auto order = compareVersions(entry.version.value_or(""), *entry.replaced);
  if (std::is_eq(order)) return "reinstalled";
  return std::is_gt(order) ? "updated" : "downgraded";
}

std::string_view nameOf(const HistoryEntry& entry) {
  switch (entry.event) {
    case HistoryEvent::Installed:
      return nameOfInstall(entry);
    case HistoryEvent::Failed:
      return "failed";
    case HistoryEvent::Removed:
      return "removed";
    case HistoryEvent::Demoted:
      return "demoted";
    case HistoryEvent::Restored:
      return "restored";
    case HistoryEvent::DataOverwritten:
      return "data-overwritten";
  }
  return "unknown";
}

std::string_view nameOf(HistoryOrigin origin) {
  switch (origin) {
    case HistoryOrigin::Sync:
      return "sync";
    case HistoryOrigin::Store:
      return "store";
    case HistoryOrigin::Person:
      return "person";
  }
  return "unknown";
}

/// "updated 1.0 to 1.1"
std::string whatHappened(const HistoryEntry& entry) {
  std::string text(nameOf(entry));
  const bool changed =
      entry.replaced && !entry.replaced->empty() && entry.replaced != entry.version;
  if (changed) text += fmt::format(" {} to", *entry.replaced);
  if (entry.version) text += " " + *entry.version;
  return text;
}

Json jsonOf(const HistoryEntry& entry) {
  return {{"number", entry.number},
          {"time", isoTime(entry.time)},
          {"event", nameOf(entry)},
          {"identifier", entry.bundleId},
          {"version", entry.version ? Json(*entry.version) : Json()},
          {"replaced", entry.replaced ? Json(*entry.replaced) : Json()},
          {"by", nameOf(entry.origin)},
          {"reason", textOrNull(entry.reason)}};
}

Row rowOf(const HistoryEntry& entry) {
  Row row = {isoTime(entry.time), printable(whatHappened(entry)), printable(entry.bundleId),
             fmt::format("by {}", nameOf(entry.origin))};
  if (!entry.reason.empty()) row.push_back(printable(oneLine(entry.reason)));
  return row;
}

std::string scenarioText(const TransactionRecord& record) {
  if (!record.scenario.empty()) return record.scenario;
  return fmt::format("step {} party {} phase {}", record.step.value_or(0), record.party,
                     record.phase);
}

Json jsonOf(const TransactionRecord& record) {
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

Row rowOf(const TransactionRecord& record) {
  return {isoTime(record.time), record.success ? "ok" : "failed", printable(scenarioText(record)),
          printable(record.bundleId), printable(record.description)};
}

template <typename Entry>
void tellLast(std::vector<Entry> entries, std::size_t limit, CommandContext& context) {
  if (limit > 0 && entries.size() > limit) {
    entries.erase(entries.begin(), entries.end() - static_cast<std::ptrdiff_t>(limit));
  }
  std::vector<Row> rows;
  for (const Entry& entry : entries) {
    if (context.json) {
      writeJsonLine(context.out, jsonOf(entry));
    } else {
      rows.push_back(rowOf(entry));
    }
  }
  if (!context.json && rows.empty() && !context.quiet) context.out.line("No history yet.");
  writeTable(context.out, rows);
}

ExitCode runHistory(const HistoryOptions& options, CommandContext& context) {
  const auto device = context.openDevice(device::Access::ReadOnly);
  std::optional<Error> error;
  if (options.records) {
    auto records = device->transactions(0, &error);
    insistOnRead(error);
    tellLast(std::move(records), options.limit, context);
  } else {
    auto entries = device->history(&error);
    insistOnRead(error);
    tellLast(std::move(entries), options.limit, context);
  }
  return ExitCode::Done;
}

}  // namespace

void addHistoryCommand(CLI::App& app, Command& chosen) {
  CLI::App* history =
      app.add_subcommand("history", "List what was installed, updated, removed and by whom");
  auto options = std::make_shared<HistoryOptions>();
  history->add_option("--limit", options->limit, "Only the last lines")
      ->check(checkPositive)
      ->type_name("N");
  history->add_flag("--records", options->records,
                    "The records that the client and the phone made of each step instead");
  history->footer(
      "One line for each application and event. The phone keeps the last 10,000 of them, and\n"
      "20,000 records.\n"
      "Example: appsync --device phone history --limit 20");
  history->callback([options, &chosen] {
    chosen = [options](CommandContext& context) { return runHistory(*options, context); };
  });
}

}  // namespace appsync::host
