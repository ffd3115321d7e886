#include "host/phone.h"

#include "platform/property_list_codec.h"

namespace appsync::host {

Phone phoneOf(device::EmbeddedDevice& device) {
  return {device.files(),
          device.appRegistry(),
          [&device](std::string_view path, std::optional<Error>* error) {
            return device.receiveFile(path, error);
          },
          [&device](device::DeviceWatcher* watcher) { device.setWatcher(watcher); },
          [&device] { device.hurry(); },
          [&device](std::string_view bundleId) { return device.isBusyWith(bundleId); },
          device.options().coordination ? &device.installCoordination() : nullptr};
}

std::vector<TodoEntry> readTodoList(FileManager& files, std::string_view directory) {
  const auto bytes = files.contentsAtPath(joinPath(directory, exchange::TodoName));
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
