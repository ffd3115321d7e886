#include "host/phone/installed_applications.h"

#include "host/phone/demotions.h"

namespace appsync::host {
namespace {

/// Whether the client does not ask the host for the package: without coordination never while the
/// placeholder stands already; with it for none that is the store's.
bool isLeftOut(const Phone& phone, const std::set<std::string>& owedByStore,
               const AppRecord& placeholder) {
  return !phone.coordination || placeholder.installType == InstallType::Restore ||
         owedByStore.contains(placeholder.applicationIdentifier);
}

/// Those whose packages have come, with no word of their installs.
std::set<std::string> withoutWord(FileManager& files) {
  std::set<std::string> identifiers;
  const auto todo = readTodoList(files, exchange::WorkArea);
  for (const TodoState& entry : todo.value_or(std::vector<TodoState>{})) {
    if (entry.operation == exchange::TodoDownloaded) identifiers.insert(entry.identifier);
  }
  return identifiers;
}

/// Only what is known to be gone counts.
bool isDamaged(FileManager& files, const AppRecord& record) {
  return !record.isPlaceholder && record.applicationType == ApplicationTypeUser &&
         record.bundlePath && isExecutableThere(files, *record.bundlePath, nullptr) == false;
}

}  // namespace

bool isLeftOver(const Phone& phone, const AppRecord& placeholder) {
  if (placeholder.installType != InstallType::Sync) return false;
  const auto record = phone.apps.recordForIdentifier(placeholder.applicationIdentifier, false);
  const bool laidOver = record && !record->isPlaceholder;
  return laidOver || ownsData(phone, placeholder.applicationIdentifier, nullptr) == false;
}

std::optional<std::vector<InstalledApplication>> installedApplications(const Phone& phone,
                                                                       std::string& problem) {
  const Demotions demotions(phone.files);
  if (demotions.problem()) {
    problem = *demotions.problem();
    return std::nullopt;
  }
  const std::set<std::string> owedByStore = phone.activity.packagesOwedBy(KQClientKiosk);
  const std::set<std::string> untold = withoutWord(phone.files);
  std::map<std::string, InstalledApplication> found;
  std::optional<Error> error;
  const auto records = applicationsOf(phone, &error);
  if (!records) {
    problem = withReason(CannotTellApplications, error);
    return std::nullopt;
  }
  for (const AppRecord& record : *records) {
    if (!record.isApplication || (record.isPlaceholder && isLeftOver(phone, record))) continue;
    const auto [place, isNew] = found.try_emplace(record.applicationIdentifier);
    InstalledApplication& application = place->second;
    if (isNew || !record.isPlaceholder) {
      application = {record.applicationIdentifier,
                     record.bundleVersion.value_or(""),
                     record.displayName,
                     record.applicationType == ApplicationTypeSystem,
                     record.isPlaceholder,
                     record.isPlaceholder && demotions.holdBack(record),
                     application.waits,
                     isDamaged(phone.files, record),
                     !record.isPlaceholder && untold.contains(record.applicationIdentifier)};
    }
    if (record.isPlaceholder) application.waits = isLeftOut(phone, owedByStore, record);
  }
  std::vector<InstalledApplication> result;
  result.reserve(found.size());
  for (auto& [identifier, application] : found) result.push_back(std::move(application));
  return result;
}

}  // namespace appsync::host
