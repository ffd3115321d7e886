#include <fmt/format.h>

#include <map>

#include "base/text.h"
#include "host/cli/plugin_session.h"
#include "host/phone/phone_state.h"

namespace appsync::host {
namespace {

std::map<std::string, std::size_t> todoCounts(FileManager& files) {
  std::map<std::string, std::size_t> counts;
  for (const TodoState& entry :
       readTodoList(files, exchange::WorkArea).value_or(std::vector<TodoState>{}))
    ++counts[entry.operation];
  return counts;
}

/// Applications with a package that waits for its data to be restored.
std::vector<std::string> restoring(FileManager& files) {
  std::vector<std::string> identifiers;
  const auto state = readDictionary(files, exchange::RestoreState, nullptr);
  if (!state) return identifiers;
  for (const auto& [identifier, versions] : *state) identifiers.push_back(identifier);
  return identifiers;
}

std::vector<std::string> placeholders(device::EmbeddedDevice& device) {
  std::vector<std::string> identifiers;
  std::optional<Error> error;
  const std::vector<AppRecord> applications = device.applications(&error);
  insistOnRead(error);
  for (const AppRecord& record : applications) {
    if (record.isPlaceholder) identifiers.push_back(record.applicationIdentifier);
  }
  return identifiers;
}

/// The number that the client gives under a key.
std::uint64_t metric(const PropertyList::Dictionary& metrics, std::string_view key) {
  const PropertyList* value = find(metrics, key);
  return value ? value->asUnsigned().value_or(0) : 0;
}

Json applicationMetrics(CommandContext& context, device::EmbeddedDevice& device) {
  const auto plugin = loadPlugin(context);
  const Interruption interruption;
  PluginSession loaded(*plugin, QueryToolBundleIdentifier, device, interruption, nullptr);
  const auto metrics = loaded.client().installedAssetMetrics();
  return {{"count", metric(metrics, "_Count")},
          {"physicalSize", metric(metrics, "_PhysicalSize")},
          {"purgeableSize", metric(metrics, "_PurgeableSize")}};
}

std::string listed(const Json& identifiers) {
  std::string text;
  for (const auto& identifier : identifiers) {
    text += (text.empty() ? "" : ", ") + printable(identifier.get<std::string>());
  }
  return text.empty() ? "none" : text;
}

std::string counted(const Json& counts) {
  std::string text;
  for (const auto& [operation, count] : counts.items()) {
    text += fmt::format("{}{} {}", text.empty() ? "" : ", ", count.get<std::size_t>(),
                        printable(operation));
  }
  return text.empty() ? "nothing" : text;
}

std::string textOf(const Json& status) {
  const Json& applications = status["applications"];
  return fmt::format(
      "phone           {}\n"
      "coordination    {}\n"
      "applications    {} using {}\n"
      "placeholders    {}\n"
      "last todo list  {}\n"
      "restoring       {}\n"
      "uninstalled     {}\n"
      "open            {}\n"
      "installing      {}\n"
      "removing        {}",
      printable(status["device"].get<std::string>()),
      status["coordination"].get<bool>() ? "on" : "off", applications["count"].get<std::uint64_t>(),
      byteCount(applications["physicalSize"].get<std::uint64_t>()), listed(status["placeholders"]),
      counted(status["todo"]), listed(status["restoring"]), listed(status["uninstalled"]),
      listed(status["foreground"]), status["policy"]["installing"].get<std::string>(),
      status["policy"]["removing"].get<std::string>());
}

}  // namespace

ExitCode runStatus(CommandContext& context) {
  const auto device = context.openDevice(device::Access::ReadOnly);
  Json todo = Json::object();
  for (const auto& [operation, count] : todoCounts(device->files())) todo[operation] = count;
  const Json status = {{"device", context.deviceFolder().string()},
                       {"coordination", device->options().coordination},
                       {"applications", applicationMetrics(context, *device)},
                       {"placeholders", placeholders(*device)},
                       {"todo", todo},
                       {"restoring", restoring(device->files())},
                       {"uninstalled", device->uninstalledApplications()},
                       {"foreground", device->foregroundApplications()},
                       {"policy",
                        {{"installing", policyText(*device, PolicySetting::AppInstallationAllowed)},
                         {"removing", policyText(*device, PolicySetting::AppRemovalAllowed)}}}};
  // The text is made of the object only when it is wanted: names there need not be UTF-8.
  context.tell(status, context.json ? std::string() : textOf(status));
  return ExitCode::Done;
}

}  // namespace appsync::host
