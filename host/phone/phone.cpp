#include "host/phone/phone.h"

#include <chrono>
#include <thread>

#include "platform/property_list_codec.h"

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
          [&device](device::DeviceWatcher* watcher) { device.setWatcher(watcher); },
          [&device] { device.hurry(); },
          [&device](std::string_view bundleId) { return device.isBusyWith(bundleId); },
          [&device](std::string_view bundleId, const device::DataSink& sink,
                    std::optional<Error>* error) { return device.saveData(bundleId, sink, error); },
          [&device](CoordinationClientId client) { return device.packagesOwedBy(client); },
          device.options().coordination ? &device.installCoordination() : nullptr};
}

RestorePhone restorePhoneOf(device::EmbeddedDevice& device) {
  return {phoneOf(device), device.homeScreen(),
          [&device](std::string_view bundleId, const device::DataSource& source,
                    std::optional<Error>* error) {
            return device.restoreData(bundleId, source, error);
          }};
}

void waitUntilIdle(const Phone& phone, const std::set<std::string>& identifiers) {
  for (const std::string& identifier : identifiers) {
    while (phone.isBusyWith(identifier)) std::this_thread::sleep_for(IdlePoll);
  }
}

ApplicationsPresent applicationsPresent(AppRegistry& registry) {
  ApplicationsPresent present;
  registry.enumerateBundles(BundleKind::All, [&](const AppRecord& record, bool&) {
    if (!record.isApplication) return;
    if (record.isPlaceholder) {
      present.placeholders.insert_or_assign(record.applicationIdentifier, record);
    } else {
      present.installed.insert(record.applicationIdentifier);
    }
  });
  return present;
}

void claimDownloads(AppRegistry& apps, const std::set<std::string>& except) {
  for (const auto& item : applicationsPresent(apps).placeholders) {
    const AppRecord& record = item.second;
    if (record.installType != InstallType::StoreDownload || except.contains(item.first)) continue;
    if (const auto progress = apps.installProgressSync(record)) {
      progress->setInstallState(InstallState::Active);
    }
  }
}

std::vector<TodoEntry> readTodoList(FileManager& files, std::string_view directory) {
  const auto bytes = files.contentsAtPath(joinPath(directory, exchange::TodoListName));
  const auto list = bytes ? parsePropertyList(*bytes) : std::nullopt;
  if (!list || !list->asArray()) return {};
  std::vector<TodoEntry> entries;
  for (const PropertyList& item : *list->asArray()) {
    const PropertyList::Dictionary* entry = item.asDictionary();
    const std::string* identifier = entry ? findString(*entry, "identifier") : nullptr;
    const std::string* operation = entry ? findString(*entry, "operation") : nullptr;
    if (identifier && operation) entries.push_back({*identifier, *operation});
  }
  return entries;
}

}  // namespace appsync::host
