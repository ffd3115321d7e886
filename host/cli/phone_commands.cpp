#include <fmt/format.h>

#include <CLI/CLI.hpp>
#include <memory>

#include "base/text.h"
#include "host/cli/cli.h"
#include "host/phone/phone_state.h"

namespace appsync::host {
namespace {

struct PolicyOptions {
  std::string installing;
  std::string removing;
};

[[noreturn]] void fail(std::string_view what, const std::string& identifier,
                       const std::optional<Error>& error) {
  throw CommandError(ExitCode::SomeFailed,
                     printable(withReason(fmt::format("cannot {} {}", what, identifier), error)));
}

ExitCode runInit(bool coordination, CommandContext& context) {
  device::DeviceOptions options;
  options.coordination = coordination;
  device::DeviceError error;
  const std::string folder = context.deviceFolder().string();
  if (!device::EmbeddedDevice::initialize(folder, options, error)) {
    throw CommandError(ExitCode::DeviceUnusable, printable(error.message));
  }
  context.say({{"event", "initialized"}, {"device", folder}, {"coordination", coordination}},
              fmt::format("Made a new phone in {}.", printable(folder)));
  return ExitCode::Done;
}

/// What a person does to an application. False with a reason when it is not done.
using Deed = bool (*)(const CommandContext&, const std::string& identifier, std::optional<Error>*);

/// Done by this process, which writes the device meanwhile.
template <bool (device::EmbeddedDevice::*Act)(std::string_view, std::optional<Error>*) noexcept>
bool onOpenDevice(const CommandContext& context, const std::string& identifier,
                  std::optional<Error>* error) {
  const auto device = context.openDevice(device::Access::Write);
  return (device.get()->*Act)(identifier, error);
}

/// Done also while another process writes the device.
template <bool (*Act)(const std::filesystem::path&, std::string_view, device::DeviceError&,
                      std::optional<Error>*) noexcept>
bool meanwhile(const CommandContext& context, const std::string& identifier,
               std::optional<Error>* error) {
  device::DeviceError deviceError;
  if (Act(context.deviceFolder(), identifier, deviceError, error)) return true;
  if (!*error) throw CommandError(ExitCode::DeviceUnusable, printable(deviceError.message));
  return false;
}

/// A command that a person gives for one application.
struct Gesture {
  const char* name;
  const char* description;
  const char* more;  ///< before the example: empty, or whole lines
  const char* event;
  const char* done;  ///< for people; "{}" stands for the application
  Deed deed;
};

using device::EmbeddedDevice;

constexpr Gesture Gestures[] = {
    {"uninstall", "Uninstall an application, as a person would", "Its data goes with it.\n",
     "uninstalled", "Uninstalled {}.", onOpenDevice<&EmbeddedDevice::uninstall>},
    {"demote", "Keep only the placeholder and the data of an application",
     "\"tap\" asks for it again.\n", "demoted", "Demoted {}: its placeholder and data stay.",
     onOpenDevice<&EmbeddedDevice::demote>},
    {"launch", "Open an application on the phone",
     "While it is open, its update waits. Works while a sync runs.\n", "launched",
     "{} is open now.", meanwhile<&EmbeddedDevice::launch>},
    {"quit", "Close an application on the phone", "Works while a sync runs.\n", "quit",
     "{} is closed.", meanwhile<&EmbeddedDevice::quit>},
    {"tap", "Tap a placeholder: have its application come next", "Works while a sync runs.\n",
     "tapped", "{} is asked for now.", meanwhile<&EmbeddedDevice::tap>},
    {"cancel", "Cancel the install of an application on the phone",
     "Works while a sync runs. A demoted application that was tapped is demoted again; one\n"
     "that waits to be restored goes, with what the restore had for it.\n",
     "cancelled", "The install of {} is cancelled.", meanwhile<&EmbeddedDevice::cancel>},
};

ExitCode run(const Gesture& gesture, const std::string& identifier, CommandContext& context) {
  std::optional<Error> error;
  if (!gesture.deed(context, identifier, &error)) fail(gesture.name, identifier, error);
  context.say({{"event", gesture.event}, {"identifier", identifier}},
              fmt::format(fmt::runtime(gesture.done), printable(identifier)));
  return ExitCode::Done;
}

void setPolicy(device::EmbeddedDevice& device, PolicySetting setting, const std::string& wish) {
  if (wish.empty()) return;
  const PolicyValue value = wish == "allow" ? PolicyValue::Yes : PolicyValue::ExplicitlyNo;
  std::optional<Error> error;
  if (!device.setPolicy(setting, value, &error)) fail("set", "the policy", error);
}

ExitCode runPolicy(const PolicyOptions& options, CommandContext& context) {
  const bool changes = !options.installing.empty() || !options.removing.empty();
  const auto device =
      context.openDevice(changes ? device::Access::Write : device::Access::ReadOnly);
  setPolicy(*device, PolicySetting::AppInstallationAllowed, options.installing);
  setPolicy(*device, PolicySetting::AppRemovalAllowed, options.removing);
  const std::string installing = policyText(*device, PolicySetting::AppInstallationAllowed);
  const std::string removing = policyText(*device, PolicySetting::AppRemovalAllowed);
  if (changes && context.quiet && !context.json) return ExitCode::Done;
  context.tell({{"event", "policy"}, {"installing", installing}, {"removing", removing}},
               fmt::format("installing: {}\nremoving:   {}", installing, removing));
  return ExitCode::Done;
}

void add(const Gesture& gesture, CLI::App& app, Command& chosen) {
  CLI::App* command = app.add_subcommand(gesture.name, gesture.description);
  command->footer(fmt::format("{}Example: appsync --device phone {} org.example.tally",
                              gesture.more, gesture.name));
  auto identifier = std::make_shared<std::string>();
  command->add_option("identifier", *identifier, "Bundle identifier of the application")
      ->required()
      ->type_name("ID")
      ->check(checkIdentifier);
  command->callback([identifier, &gesture, &chosen] {
    chosen = [identifier, &gesture](CommandContext& context) {
      return run(gesture, *identifier, context);
    };
  });
}

}  // namespace

bool isAllowed(device::EmbeddedDevice& device, PolicySetting setting) {
  return device.policy(setting) != PolicyValue::ExplicitlyNo;
}

std::string policyText(device::EmbeddedDevice& device, PolicySetting setting) {
  return isAllowed(device, setting) ? "allow" : "forbid";
}

void addPhoneCommands(CLI::App& app, Command& chosen) {
  CLI::App* init = app.add_subcommand("init", "Make a new phone in a folder");
  init->footer("The folder must be missing or empty.\nExample: appsync --device phone init");
  auto coordination = std::make_shared<std::string>("off");
  init->add_option("--coordination", *coordination, "Drive installs through install coordinators")
      ->check(CLI::IsMember({"on", "off"}))
      ->type_name("on|off")
      ->capture_default_str();
  init->callback([coordination, &chosen] {
    chosen = [coordination](CommandContext& context) {
      return runInit(*coordination == "on", context);
    };
  });

  for (const Gesture& gesture : Gestures) add(gesture, app, chosen);

  CLI::App* policy = app.add_subcommand("policy", "Show or set the phone's restrictions");
  policy->footer(
      "What is forbidden is forbidden to syncs, restores and persons alike; a restore still "
      "brings\n"
      "placeholders.\n"
      "Example: appsync --device phone policy --removing forbid");
  auto wishes = std::make_shared<PolicyOptions>();
  policy->add_option("--installing", wishes->installing, "Whether applications may be installed")
      ->check(CLI::IsMember({"allow", "forbid"}))
      ->type_name("allow|forbid");
  policy->add_option("--removing", wishes->removing, "Whether applications may be removed")
      ->check(CLI::IsMember({"allow", "forbid"}))
      ->type_name("allow|forbid");
  policy->callback([wishes, &chosen] {
    chosen = [wishes](CommandContext& context) { return runPolicy(*wishes, context); };
  });
}

}  // namespace appsync::host
