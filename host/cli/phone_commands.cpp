#include <fmt/format.h>

#include <CLI/CLI.hpp>
#include <memory>

#include "base/text.h"
#include "host/cli/cli.h"

namespace appsync::host {
namespace {

struct PolicyOptions {
  std::string installing;
  std::string removing;
};

void say(CommandContext& context, const Json& object, const std::string& text) {
  if (context.json || !context.quiet) context.tell(object, text);
}

[[noreturn]] void fail(std::string_view what, const std::string& identifier,
                       const std::optional<Error>& error) {
  throw CommandError(
      ExitCode::SomeFailed,
      fmt::format("cannot {} {}: {}", what, printable(identifier),
                  printable(error ? oneLine(error->localizedDescription()) : "no reason")));
}

ExitCode runInit(bool coordination, CommandContext& context) {
  device::DeviceOptions options;
  options.coordination = coordination;
  device::DeviceError error;
  const std::string folder = context.deviceFolder().string();
  if (!device::EmbeddedDevice::initialize(folder, options, error)) {
    throw CommandError(ExitCode::DeviceUnusable, printable(error.message));
  }
  say(context, {{"event", "initialized"}, {"device", folder}, {"coordination", coordination}},
      fmt::format("Made a new phone in {}.", printable(folder)));
  return ExitCode::Done;
}

ExitCode runUninstall(const std::string& identifier, CommandContext& context) {
  const auto device = context.openDevice(device::Access::Write);
  std::optional<Error> error;
  if (!device->uninstall(identifier, &error)) fail("uninstall", identifier, error);
  say(context, {{"event", "uninstalled"}, {"identifier", identifier}},
      fmt::format("Uninstalled {}.", printable(identifier)));
  return ExitCode::Done;
}

ExitCode runDemote(const std::string& identifier, CommandContext& context) {
  const auto device = context.openDevice(device::Access::Write);
  std::optional<Error> error;
  if (!device->demote(identifier, &error)) fail("demote", identifier, error);
  say(context, {{"event", "demoted"}, {"identifier", identifier}},
      fmt::format("Demoted {}: its placeholder and data stay.", printable(identifier)));
  return ExitCode::Done;
}

/// What a person can do while another process writes the device: EmbeddedDevice::launch and others.
using Gesture = bool (*)(const std::filesystem::path&, std::string_view, device::DeviceError&,
                         std::optional<Error>*);

void make(Gesture gesture, std::string_view what, const std::string& identifier,
          const CommandContext& context) {
  device::DeviceError deviceError;
  std::optional<Error> error;
  if (gesture(context.deviceFolder(), identifier, deviceError, &error)) return;
  if (error) fail(what, identifier, error);
  throw CommandError(ExitCode::DeviceUnusable, printable(deviceError.message));
}

ExitCode runLaunch(const std::string& identifier, CommandContext& context) {
  make(&device::EmbeddedDevice::launch, "launch", identifier, context);
  say(context, {{"event", "launched"}, {"identifier", identifier}},
      fmt::format("{} is open now.", printable(identifier)));
  return ExitCode::Done;
}

ExitCode runQuit(const std::string& identifier, CommandContext& context) {
  make(&device::EmbeddedDevice::quit, "quit", identifier, context);
  say(context, {{"event", "quit"}, {"identifier", identifier}},
      fmt::format("{} is closed.", printable(identifier)));
  return ExitCode::Done;
}

ExitCode runTap(const std::string& identifier, CommandContext& context) {
  make(&device::EmbeddedDevice::tap, "tap", identifier, context);
  say(context, {{"event", "tapped"}, {"identifier", identifier}},
      fmt::format("{} is asked for now.", printable(identifier)));
  return ExitCode::Done;
}

ExitCode runCancel(const std::string& identifier, CommandContext& context) {
  make(&device::EmbeddedDevice::cancel, "cancel", identifier, context);
  say(context, {{"event", "cancelled"}, {"identifier", identifier}},
      fmt::format("The install of {} is cancelled.", printable(identifier)));
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

using IdentifierCommand = ExitCode (*)(const std::string&, CommandContext&);

/// `more` goes before the example; empty, or whole lines.
void addIdentifierCommand(CLI::App& app, Command& chosen, const char* name, const char* description,
                          const char* more, IdentifierCommand run) {
  CLI::App* command = app.add_subcommand(name, description);
  command->footer(
      fmt::format("{}Example: appsync --device phone {} org.example.tally", more, name));
  auto identifier = std::make_shared<std::string>();
  command->add_option("identifier", *identifier, "Bundle identifier of the application")
      ->required()
      ->type_name("ID")
      ->check(checkIdentifier);
  command->callback([identifier, run, &chosen] {
    chosen = [identifier, run](CommandContext& context) { return run(*identifier, context); };
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

  addIdentifierCommand(app, chosen, "uninstall", "Uninstall an application, as a person would",
                       "Its data goes with it.\n", &runUninstall);
  addIdentifierCommand(app, chosen, "demote",
                       "Keep only the placeholder and the data of an application",
                       "\"tap\" asks for it again.\n", &runDemote);
  addIdentifierCommand(app, chosen, "launch", "Open an application on the phone",
                       "While it is open, its update waits. Works while a sync runs.\n",
                       &runLaunch);
  addIdentifierCommand(app, chosen, "quit", "Close an application on the phone",
                       "Works while a sync runs.\n", &runQuit);
  addIdentifierCommand(app, chosen, "tap", "Tap a placeholder: have its application come next",
                       "Works while a sync runs.\n", &runTap);
  addIdentifierCommand(
      app, chosen, "cancel", "Cancel the install of an application on the phone",
      "Works while a sync runs. A demoted application that was tapped is demoted again; one\n"
      "that waits to be restored goes, with what the restore had for it.\n",
      &runCancel);

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
