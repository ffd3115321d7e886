#include "host/report/report_json.h"

#include <fmt/format.h>

#include "host/report/json_line.h"

namespace appsync::host {
namespace {

Json jsonOf(const PackageProblem& event) {
  return {{"event", "package-problem"}, {"file", event.file}, {"reason", event.reason}};
}

Json jsonOf(const PlannedEntry& event) {
  return {{"event", "plan"},
          {"action", name(event.action)},
          {"identifier", event.identifier},
          {"version", textOrNull(event.version)},
          {"installedVersion", textOrNull(event.installedVersion)},
          {"name", event.name}};
}

Json jsonOf(const PlaceholderSwept& event) {
  return {{"event", "placeholder-removed"}, {"identifier", event.identifier}};
}

Json jsonOf(const DeletedOnPhone& event) {
  return {{"event", "deleted-on-phone"}, {"identifier", event.identifier}};
}

Json jsonOf(const TransferProgress& event) {
  return {{"event", "transfer"},
          {"identifier", event.identifier},
          {"name", event.name},
          {"sent", event.sent},
          {"total", event.total}};
}

Json withFailure(Json object, const std::optional<std::string>& failure) {
  object["success"] = !failure;
  if (failure) object["reason"] = *failure;
  return object;
}

Json jsonOf(const TransferEnded& event) {
  return withFailure({{"event", "transfer-ended"}, {"identifier", event.identifier}},
                     event.failure);
}

Json jsonOf(const DataProgress& event) {
  return {{"event", "data"},
          {"identifier", event.identifier},
          {"name", event.name},
          {"done", event.done},
          {"total", event.total}};
}

Json jsonOf(const DataEnded& event) {
  return withFailure({{"event", "data-ended"}, {"identifier", event.identifier}}, event.failure);
}

Json jsonOf(const SavingProgress& event) {
  return {{"event", "saving"},    {"identifier", event.identifier}, {"name", event.name},
          {"bytes", event.bytes}, {"number", event.number},         {"count", event.count}};
}

Json jsonOf(const ApplicationSaved& event) {
  return withFailure({{"event", "saved"}, {"identifier", event.identifier}, {"name", event.name}},
                     event.failure);
}

Json jsonOf(const PlaceholderStands& event) {
  return {{"event", "placeholder"},
          {"identifier", event.identifier},
          {"name", event.name},
          {"demoted", event.demoted}};
}

Json jsonOf(const Notice& event) { return {{"event", "notice"}, {"message", event.text}}; }

Json jsonOf(const InstallWaiting& event) {
  return {{"event", "waiting"},
          {"identifier", event.identifier},
          {"retrySeconds", InstallRetrySeconds},
          {"message", fmt::format("{0} is open on the phone; it is installed when it quits "
                                  "(appsync quit {0})",
                                  event.identifier)}};
}

Json jsonOf(const InstallEnded& event) {
  Json object =
      withFailure({{"event", "install-ended"}, {"identifier", event.identifier}}, event.failure);
  if (event.failure && !event.file.empty()) object["file"] = event.file;
  return object;
}

Json jsonOf(const ClientLogLine& event) {
  return {{"event", "log"},
          {"channel", name(event.channel)},
          {"level", name(event.level)},
          {"text", event.text}};
}

Json jsonOf(const Interrupted&) { return {{"event", "interrupted"}}; }

Json jsonOf(const SyncBroken& event) { return {{"event", "error"}, {"message", event.reason}}; }

Json reasons(const std::vector<SkippedEntry>& entries) {
  Json list = Json::array();
  for (const SkippedEntry& entry : entries) {
    list.push_back(
        {{"identifier", entry.identifier}, {"reason", entry.reason}, {"upToDate", entry.upToDate}});
  }
  return list;
}

Json reasons(const std::vector<FailedEntry>& entries) {
  Json list = Json::array();
  for (const FailedEntry& entry : entries) {
    list.push_back({{"identifier", entry.identifier}, {"reason", entry.reason}});
    if (!entry.file.empty()) list.back()["file"] = entry.file;
  }
  return list;
}

Json jsonOf(const Summary& event) {
  return {{"event", "summary"},
          {"installed", event.installed},
          {"updated", event.updated},
          {"downgraded", event.downgraded},
          {"deleted", event.deleted},
          {"failed", reasons(event.failed)},
          {"skipped", reasons(event.skipped)},
          {"dataRestored", event.dataRestored}};
}

Json jsonOf(const BackupSummary& event) {
  return {{"event", "summary"}, {"saved", event.saved}, {"failed", reasons(event.failed)}};
}

}  // namespace

void JsonReporter::report(const Event& event) {
  const bool essential = std::holds_alternative<Summary>(event) ||
                         std::holds_alternative<BackupSummary>(event) ||
                         std::holds_alternative<SyncBroken>(event);
  if (quiet_ && !essential) return;
  writeJsonLine(output_, std::visit([](const auto& value) { return jsonOf(value); }, event));
}

}  // namespace appsync::host
