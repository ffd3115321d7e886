#include "host/backup/backup.h"

#include <fmt/format.h>

#include <algorithm>
#include <chrono>
#include <thread>

#include "host/phone/phone_state.h"

namespace appsync::host {
namespace {

constexpr std::chrono::milliseconds IdlePoll{10};
constexpr std::uint64_t BytesBetweenReports = std::uint64_t{1} << 20;
constexpr int FlattenedIconState = 1;

std::string nameOf(const AppRecord& record) {
  return record.displayName.empty() ? record.applicationIdentifier : record.displayName;
}

}  // namespace

BackupRun::BackupRun(SyncClient& client, const Phone& phone, BackupWriter& writer,
                     Reporter& reporter, Interruption& interruption)
    : client_(client),
      phone_(phone),
      writer_(writer),
      reporter_(reporter),
      interruption_(interruption) {
  interruption_.setListener([this] { reporter_.report(Interrupted{}); });
}

BackupRun::~BackupRun() { interruption_.setListener({}); }

BackupSummary BackupRun::run(const BackupOptions& options) {
  summary_.made = saveAll(options);
  if (summary_.made) {
    for (const AppRecord& record : saved_) summary_.saved.push_back(record.applicationIdentifier);
  }
  return std::move(summary_);
}

bool BackupRun::saveAll(const BackupOptions& options) {
  client_.prepareForBackup();
  std::optional<Error> error;
  waitUntilIdle(applicationsToSave(phone_, &error));
  const std::vector<AppRecord> applications = applicationsToSave(phone_, &error);
  if (error) return broken(withReason("the applications cannot be told", error));
  count_ = applications.size();
  for (const AppRecord& record : applications) {
    if (!save(record)) return false;
  }
  if (!options.allowMissing && !mayReplaceOlder()) return false;
  if (!saveLists() || interruption_.requested()) return false;
  return writer_.finish() || broken(writer_.problem());
}

/// What an install under way replaces could not be read.
void BackupRun::waitUntilIdle(const std::vector<AppRecord>& applications) {
  std::set<std::string> identifiers;
  for (const AppRecord& record : applications) identifiers.insert(record.applicationIdentifier);
  while (!interruption_.requested() && !phone_.activity.busyAmong(identifiers).empty()) {
    std::this_thread::sleep_for(IdlePoll);
  }
}

bool BackupRun::save(const AppRecord& record) {
  if (interruption_.requested()) return false;
  const std::string& identifier = record.applicationIdentifier;
  ++number_;
  reportProgress(record, 0);
  std::string problem;
  auto entry = restoreEntry(phone_, record, problem);
  const auto failure = entry ? saveData(record) : std::optional(problem);
  if (!writer_.problem().empty()) return broken(writer_.problem());
  if (interruption_.requested()) return false;
  reporter_.report(ApplicationSaved{identifier, nameOf(record), failure});
  if (failure) {
    summary_.failed.push_back({identifier, *failure});
  } else {
    entries_.emplace(identifier, std::move(*entry));
    saved_.push_back(record);
  }
  return true;
}

std::optional<std::string> BackupRun::saveData(const AppRecord& record) {
  std::uint64_t bytes = 0;
  std::uint64_t reported = 0;
  const auto take = [&](ByteView piece) {
    if (interruption_.requested() || !writer_.append(piece)) return false;
    bytes += piece.size();
    if (bytes - reported < BytesBetweenReports) return true;
    reported = bytes;
    reportProgress(record, bytes);
    return true;
  };
  std::optional<Error> error;
  if (!writer_.beginData(record.applicationIdentifier)) return writer_.problem();
  const bool whole = phone_.data.saveData(record.applicationIdentifier, take, &error);
  if (whole && bytes > 0) {
    if (!writer_.endData()) return writer_.problem();
  } else {
    writer_.dropData();
  }
  if (whole) return std::nullopt;
  return withReason("its data cannot be saved", error);
}

void BackupRun::noteUnlisted() {
  for (const std::string& identifier : writer_.olderApplications()) {
    const auto isIt = [&](const auto& entry) { return entry == identifier; };
    if (std::ranges::any_of(saved_, isIt, &AppRecord::applicationIdentifier) ||
        std::ranges::any_of(summary_.failed, isIt, &FailedEntry::identifier)) {
      continue;
    }
    if (hasAnyData(phone_, identifier, nullptr) == false) continue;
    summary_.failed.push_back({identifier, "the phone does not list it, but has data of it"});
  }
}

bool BackupRun::mayReplaceOlder() {
  noteUnlisted();
  std::string lost;
  for (const FailedEntry& entry : summary_.failed) {
    if (!writer_.olderHolds(entry.identifier)) continue;
    lost += (lost.empty() ? "" : ", ") + entry.identifier;
  }
  return lost.empty() || broken(fmt::format("the older backup stays, since {} cannot be saved now; "
                                            "--allow-missing replaces it all the same",
                                            lost));
}

bool BackupRun::saveLists() {
  const auto layout =
      phone_.homeScreen.getFlattenedIconState(phone_.homeScreen.serverPort(), FlattenedIconState);
  if (!layout) return broken("the home screen does not tell its layout");
  std::optional<Error> error;
  auto demotions = demotionsAmong(phone_.files, saved_, &error);
  if (!demotions)
    return broken(withReason("the list of demoted applications cannot be read", error));
  // Binary, since it is mostly icons.
  return addList(BackupApplicationsFile, std::move(entries_), PropertyListFormat::Binary) &&
         addList(BackupDemotionsFile, std::move(*demotions), PropertyListFormat::Xml) &&
         (writer_.addFile(BackupIconLayoutFile, *layout) || broken(writer_.problem()));
}

bool BackupRun::addList(std::string_view name, const PropertyList& list,
                        PropertyListFormat format) {
  std::optional<Error> error;
  const auto bytes = serializePropertyList(list, format, &error);
  if (!bytes) return broken(withReason(fmt::format("{} cannot be made", name), error));
  return writer_.addFile(name, *bytes) || broken(writer_.problem());
}

void BackupRun::reportProgress(const AppRecord& record, std::uint64_t bytes) {
  reporter_.report(
      SavingProgress{record.applicationIdentifier, nameOf(record), bytes, number_, count_});
}

bool BackupRun::broken(const std::string& reason) {
  reporter_.report(SyncBroken{reason});
  return false;
}

}  // namespace appsync::host
