#include "host/phone/phone.h"

#include <chrono>
#include <thread>

#include "base/text.h"
#include "platform/property_list_codec.h"
#include "platform/todo_entry.h"

namespace appsync::host {
namespace {

constexpr std::chrono::milliseconds IdlePoll{10};

}  // namespace

Phone phoneOf(device::EmbeddedDevice& device) {
  return {device.files(),
          device.appRegistry(),
          [&device](std::string_view path, std::optional<Error>* error) {
            return device.receiveFile(path, error);
          },
          [&device](std::string_view directory, std::optional<Error>* error) {
            return device.namesIn(directory, error);
          },
          [&device](device::DeviceWatcher* watcher) { device.setWatcher(watcher); },
          [&device] { device.hurry(); },
          [&device](std::string_view bundleId) { return device.isBusyWith(bundleId); },
          [&device](std::string_view bundleId, const DataSink& sink, std::optional<Error>* error) {
            return device.saveData(bundleId, sink, error);
          },
          [&device](CoordinationClientId client) { return device.packagesOwedBy(client); },
          device.options().coordination ? &device.installCoordination() : nullptr};
}

RestorePhone restorePhoneOf(device::EmbeddedDevice& device) {
  return {
      phoneOf(device), device.homeScreen(),
      [&device](std::string_view bundleId, const DataSource& source, std::optional<Error>* error) {
        return device.restoreData(bundleId, source, error);
      },
      [&device](std::string_view bundleId, const DataSource& source, std::optional<Error>* error) {
        return device.overwriteData(bundleId, source, error);
      }};
}

std::optional<PropertyList::Dictionary> readDictionary(FileManager& files, std::string_view path,
                                                       std::optional<Error>* error) {
  std::optional<Bytes> bytes;
  if (!readIfThere(files, path, bytes, error)) return std::nullopt;
  auto parsed = bytes ? parsePropertyList(*bytes) : std::nullopt;
  PropertyList::Dictionary* dictionary = parsed ? parsed->asDictionary() : nullptr;
  return dictionary ? std::move(*dictionary) : PropertyList::Dictionary{};
}

std::optional<bool> ownsData(const Phone& phone, const std::string& identifier,
                             std::optional<Error>* error) {
  const auto waits = isThere(phone.files, joinPath(exchange::WaitingData, identifier), error);
  if (!waits || *waits) return waits ? std::optional(false) : std::nullopt;
  bool any = false;
  const auto look = [&](ByteView bytes) {
    any = !bytes.empty();
    return !any;
  };
  const bool read = phone.saveData(identifier, look, error);
  return any || read ? std::optional(any) : std::nullopt;
}

void waitUntilIdle(const Phone& phone, const std::set<std::string>& identifiers) {
  for (const std::string& identifier : identifiers) {
    while (phone.isBusyWith(identifier)) std::this_thread::sleep_for(IdlePoll);
  }
}

std::optional<ApplicationsPresent> applicationsPresent(AppRegistry& registry,
                                                       std::optional<Error>* error) {
  ApplicationsPresent present;
  const auto sort = [&](const AppRecord& record, bool&) {
    if (!record.isApplication) return;
    if (record.isPlaceholder) {
      present.placeholders.insert_or_assign(record.applicationIdentifier, record);
    } else {
      present.installed.insert(record.applicationIdentifier);
    }
  };
  if (!registry.enumerateBundles(BundleKind::All, sort, error)) return std::nullopt;
  return present;
}

std::string withReason(std::string_view what, const std::optional<Error>& error) {
  std::string text(what);
  if (error) text += ": " + oneLine(error->localizedDescription());
  return text;
}

bool claimDownloads(AppRegistry& apps, const std::set<std::string>& except,
                    std::optional<Error>* error) {
  const auto present = applicationsPresent(apps, error);
  if (!present) return false;
  for (const auto& item : present->placeholders) {
    const AppRecord& record = item.second;
    if (record.installType != InstallType::StoreDownload || except.contains(item.first)) continue;
    if (const auto progress = apps.installProgressSync(record)) {
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
