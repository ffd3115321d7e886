#include "host/phone/phone_state.h"

#include <chrono>
#include <thread>

#include "base/text.h"
#include "platform/property_list_codec.h"
#include "platform/todo_entry.h"

namespace appsync::host {
namespace {

constexpr std::chrono::milliseconds IdlePoll{10};

}  // namespace

std::optional<bool> ownsData(const Phone& phone, const std::string& identifier,
                             std::optional<Error>* error) {
  const auto waits = isThere(phone.files, joinPath(exchange::WaitingData, identifier), error);
  if (!waits || *waits) return waits ? std::optional(false) : std::nullopt;
  return hasAnyData(phone, identifier, error);
}

std::optional<bool> hasAnyData(const Phone& phone, const std::string& identifier,
                               std::optional<Error>* error) {
  bool any = false;
  const auto look = [&](ByteView bytes) {
    any = !bytes.empty();
    return !any;
  };
  const bool read = phone.data.saveData(identifier, look, error);
  return any || read ? std::optional(any) : std::nullopt;
}

void waitUntilIdle(const Phone& phone, const std::set<std::string>& identifiers) {
  while (!phone.activity.busyAmong(identifiers).empty()) std::this_thread::sleep_for(IdlePoll);
}

std::optional<std::vector<AppRecord>> applicationsOf(const Phone& phone,
                                                     std::optional<Error>* error) {
  std::optional<Error> reason;
  std::vector<AppRecord> records = phone.data.applications(&reason);
  if (reason) {
    setError(error, *reason);
    return std::nullopt;
  }
  return records;
}

std::optional<ApplicationsPresent> applicationsPresent(const Phone& phone,
                                                       std::optional<Error>* error) {
  const auto records = applicationsOf(phone, error);
  if (!records) return std::nullopt;
  ApplicationsPresent present;
  for (const AppRecord& record : *records) {
    if (!record.isApplication) continue;
    if (record.isPlaceholder) {
      present.placeholders.insert_or_assign(record.applicationIdentifier, record);
    } else {
      present.installed.insert(record.applicationIdentifier);
    }
  }
  return present;
}

std::string withReason(std::string_view what, const std::optional<Error>& error) {
  std::string text(what);
  if (error) text += ": " + oneLine(error->localizedDescription());
  return text;
}

bool claimDownloads(const Phone& phone, const std::set<std::string>& except,
                    std::optional<Error>* error) {
  const auto present = applicationsPresent(phone, error);
  if (!present) return false;
  for (const auto& item : present->placeholders) {
    const AppRecord& record = item.second;
    if (record.installType != InstallType::StoreDownload || except.contains(item.first)) continue;
    if (const auto progress = phone.apps.installProgressSync(record)) {
      progress->setInstallState(InstallState::Active);
    }
  }
  return true;
}

std::optional<std::vector<TodoState>> readTodoList(FileManager& files, std::string_view directory,
                                                   std::optional<Error>* error) {
  std::optional<Bytes> bytes;
  const std::string path = joinPath(directory, exchange::TodoListName);
  if (!readIfThere(files, path, bytes, error)) return std::nullopt;
  const auto list = bytes ? parsePropertyList(*bytes) : std::nullopt;
  if (!list || !list->asArray()) return std::vector<TodoState>{};
  std::vector<TodoState> entries;
  for (const PropertyList& item : *list->asArray()) {
    const TodoEntry entry(item);
    if (entry.identifier() && entry.operation()) {
      entries.push_back({*entry.identifier(), *entry.operation()});
    }
  }
  return entries;
}

}  // namespace appsync::host
