#include "host/report/report_text.h"

#include <fmt/format.h>

#include <algorithm>

#include "base/text.h"

namespace appsync::host {
namespace {

/// Adds "3 installed" and the like.
void addCount(std::string& counts, std::size_t count, std::string_view what) {
  if (count > 0) counts += fmt::format("{}{} {}", counts.empty() ? "" : ", ", count, what);
}

std::string_view pastTense(Action action) {
  if (action == Action::Install) return "installed";
  return action == Action::Downgrade ? "downgraded" : "updated";
}

}  // namespace

TextReporter::TextReporter(Output& output, Output& errorOutput, const ReportOptions& options,
                           bool terminal, bool colour)
    : errorOutput_(errorOutput),
      options_(options),
      colour_(colour),
      status_(output, terminal && !options.quiet) {}

void TextReporter::report(const Event& event) {
  std::visit([this](const auto& value) { tell(value); }, event);
}

void TextReporter::print(std::string_view style, std::string_view word, const std::string& rest) {
  if (options_.quiet) return;
  const bool coloured = colour_ && !style.empty();
  status_.print(
      fmt::format("{}{:<10}{} {}", coloured ? style : "", word, coloured ? "\x1b[0m" : "", rest));
}

void TextReporter::printError(std::string_view word, const std::string& rest) {
  if (options_.quiet) {
    errorOutput_.line(fmt::format("appsync: {} {}", word, rest));
  } else {
    print(Style::Bad, word, rest);
  }
}

std::string TextReporter::subject(const std::string& identifier) const {
  const auto planned = planned_.find(identifier);
  if (planned == planned_.end() || planned->second.name.empty()) return printable(identifier);
  const PlannedEntry& entry = planned->second;
  const std::string version = entry.version.empty() ? "" : " " + printable(entry.version);
  return fmt::format("{}{} ({})", printable(entry.name), version, printable(identifier));
}

void TextReporter::showInstalling() {
  if (installing_.empty()) return status_.clear();
  status_.showText(installing_.size() == 1
                       ? fmt::format("Installing {} ...", subject(*installing_.begin()))
                       : fmt::format("Installing {} applications ...", installing_.size()));
}

void TextReporter::tell(const PackageProblem& event) {
  if (options_.verbose) {
    print(Style::Warning, "unreadable",
          fmt::format("{}: {}", printable(event.file), printable(event.reason)));
  }
}

void TextReporter::tell(const PlannedEntry& event) {
  planned_[event.identifier] = event;
  if (!options_.showPlan && !options_.verbose) return;
  const bool changes = event.action == Action::Update || event.action == Action::Downgrade;
  const std::string from = changes ? " from " + printable(event.installedVersion) : "";
  print(Style::Plain, name(event.action), subject(event.identifier) + from);
}

void TextReporter::tell(const PlaceholderSwept& event) {
  if (options_.verbose) {
    print(Style::Dim, "cleaned", printable(event.identifier) + ": what a broken-off sync had left");
  }
}

void TextReporter::tell(const DeletedOnPhone& event) {
  print(Style::Warning, "gone", printable(event.identifier) + " was deleted on the phone");
}

void TextReporter::showBytes(const std::string& what, std::uint64_t bytes, std::uint64_t total) {
  if (total == 0) return;
  status_.showBar(what, static_cast<double>(bytes) / static_cast<double>(total),
                  fmt::format("{} of {}", byteCount(bytes), byteCount(total)));
}

void TextReporter::tell(const TransferProgress& event) {
  showBytes("Sending " + event.name, event.sent, event.total);
}

void TextReporter::tell(const TransferEnded& event) {
  if (event.failure) return showInstalling();
  installing_.insert(event.identifier);
  showInstalling();
  if (options_.verbose) print(Style::Dim, "sent", subject(event.identifier));
}

void TextReporter::tell(const DataProgress& event) {
  showBytes("Data of " + event.name, event.done, event.total);
}

void TextReporter::tell(const DataEnded& event) {
  status_.clear();
  if (options_.verbose && !event.failure) print(Style::Dim, "data", subject(event.identifier));
}

void TextReporter::tell(const SavingProgress& event) {
  const std::string bytes = event.bytes > 0 ? ", " + byteCount(event.bytes) : "";
  status_.showBar("Saving " + event.name,
                  static_cast<double>(event.number - 1) / static_cast<double>(event.count),
                  fmt::format("{} of {}{}", event.number, event.count, bytes));
}

void TextReporter::tell(const ApplicationSaved& event) {
  if (!options_.verbose || event.failure) return;
  print(Style::Good, "saved",
        fmt::format("{} ({})", printable(event.name), printable(event.identifier)));
}

void TextReporter::tell(const PlaceholderStands& event) {
  if (event.name != event.identifier) {
    planned_.try_emplace(event.identifier,
                         PlannedEntry{Action::Install, event.identifier, "", "", event.name});
  }
  print(Style::Plain, "restored",
        fmt::format("{} as a {}placeholder", subject(event.identifier),
                    event.demoted ? "demoted " : ""));
}

void TextReporter::tell(const Notice& event) {
  print(Style::Warning, "note", printable(event.text));
}

void TextReporter::tell(const InstallWaiting& event) {
  const std::string identifier = printable(event.identifier);
  print(Style::Warning, "waiting",
        fmt::format("{} is open on the phone; it is installed when it quits (appsync quit {}), "
                    "next try in {} s",
                    subject(event.identifier), identifier, InstallRetrySeconds));
}

void TextReporter::tell(const InstallEnded& event) {
  installing_.erase(event.identifier);
  if (!event.failure) {
    const auto planned = planned_.find(event.identifier);
    const Action action = planned == planned_.end() ? Action::Install : planned->second.action;
    print(Style::Good, pastTense(action), subject(event.identifier));
  }
  showInstalling();
}

void TextReporter::tell(const ClientLogLine& event) {
  print(Style::Dim, "log", fmt::format("{}: {}", name(event.level), printable(event.text)));
}

void TextReporter::tell(const Interrupted&) {
  print(Style::Warning, "ending", "cleanly; interrupt once more to end at once");
}

void TextReporter::tell(const SyncBroken& event) { printError("failed", printable(event.reason)); }

void TextReporter::tell(const Summary& event) {
  status_.clear();
  for (const std::string& identifier : event.deleted) {
    print(Style::Good, "deleted", subject(identifier));
  }
  for (const SkippedEntry& entry : event.skipped) {
    if (entry.upToDate && !options_.verbose) continue;
    print(Style::Warning, "skipped",
          fmt::format("{}: {}", subject(entry.identifier), printable(entry.reason)));
  }
  for (const FailedEntry& entry : event.failed) {
    const bool named = entry.file.empty() || entry.file == entry.identifier;
    printError("failed", fmt::format("{}: {}{}", subject(entry.identifier), printable(entry.reason),
                                     named ? "" : fmt::format(" [{}]", printable(entry.file))));
  }
  tellCounts(event);
}

void TextReporter::tell(const BackupSummary& event) {
  status_.clear();
  for (const FailedEntry& entry : event.failed) {
    printError("failed",
               fmt::format("{}: {}", printable(entry.identifier), printable(entry.reason)));
  }
  if (!event.made) return print(Style::Warning, "stopped", "no backup was made");
  std::string counts;
  addCount(counts, event.saved.size(), "saved");
  addCount(counts, event.failed.size(), "failed");
  print(Style::Plain, "done", counts.empty() ? "no applications to save" : counts);
}

void TextReporter::tellCounts(const Summary& event) {
  const auto upToDate = static_cast<std::size_t>(
      std::count_if(event.skipped.begin(), event.skipped.end(),
                    [](const SkippedEntry& entry) { return entry.upToDate; }));
  std::string counts;
  addCount(counts, event.installed.size(), "installed");
  addCount(counts, event.updated.size(), "updated");
  addCount(counts, event.downgraded.size(), "downgraded");
  addCount(counts, event.deleted.size(), "deleted");
  addCount(counts, event.dataRestored.size(), "with the backup's data");
  addCount(counts, event.failed.size(), "failed");
  const bool idle = counts.empty();
  addCount(counts, event.skipped.size() - upToDate, "skipped");
  addCount(counts, upToDate, "up to date");
  const bool nothing = idle && planned_.empty();
  if (options_.showPlan && !nothing) return;
  if (nothing || counts.empty()) counts = "nothing to do" + (counts.empty() ? "" : ": " + counts);
  print(Style::Plain, "done", counts);
}

}  // namespace appsync::host
