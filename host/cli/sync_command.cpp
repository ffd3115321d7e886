#include <fmt/format.h>

#include <CLI/CLI.hpp>
#include <chrono>

#include "base/interruption.h"
#include "base/text.h"
#include "host/cli/cli.h"
#include "host/cli/plugin_session.h"
#include "host/library/icon_layout.h"
#include "host/phone/installed_applications.h"
#include "host/phone/plugin_loader.h"
#include "host/sync/session.h"
#include "host/transfer/staging.h"

namespace appsync::host {
namespace {

struct SyncOptions {
  std::string library;
  PlanOptions plan;
  std::string iconLayout;
  bool dryRun = false;
};

SyncInput prepareInput(const SyncOptions& options) {
  std::string problem;
  SyncInput input;
  auto library = readLibrary(options.library, problem);
  if (!library) throw CommandError(ExitCode::WrongUsage, problem);
  input.library = std::move(*library);
  if (!options.iconLayout.empty()) {
    input.iconLayout = readIconLayout(options.iconLayout, problem);
    if (!input.iconLayout) throw CommandError(ExitCode::WrongUsage, problem);
  }
  const auto now = std::chrono::system_clock::now().time_since_epoch();
  input.newAnchor = isoTime(std::chrono::duration<double>(now).count());
  return input;
}

void plan(SyncInput& input, PlanOptions options, device::EmbeddedDevice& device) {
  options.installingAllowed = isAllowed(device, PolicySetting::AppInstallationAllowed);
  options.removingAllowed = isAllowed(device, PolicySetting::AppRemovalAllowed);
  std::string problem;
  const auto installed = installedApplications(device.phone(), problem);
  if (!installed) throw CommandError(ExitCode::SomeFailed, problem);
  auto made = makePlan(input.library, *installed, options, problem);
  if (!made) throw CommandError(ExitCode::WrongUsage, problem);
  input.plan = std::move(*made);
}

void reportPlan(const SyncInput& input, Reporter& reporter) {
  for (const UnreadablePackage& file : input.library.unreadable) reporter.report(file);
  for (const PlannedEntry& entry : input.plan.entries) reporter.report(entry);
}

ExitCode dryRun(const SyncInput& input, Reporter& reporter) {
  reportPlan(input, reporter);
  SyncPlan nothing;
  nothing.skipped = input.plan.skipped;
  nothing.failed = input.plan.failed;
  const SyncResult result{settle(nothing, input.library, {}), true};
  reporter.report(result.summary);
  return exitCodeOf(result);
}

ExitCode runSync(const SyncOptions& options, CommandContext& context) {
  SyncInput input = prepareInput(options);
  const auto device =
      context.openDevice(options.dryRun ? device::Access::ReadOnly : device::Access::Write);
  plan(input, options.plan, *device);
  if (options.dryRun) return dryRun(input, *context.makeReporter(true));
  return runVisit(context, *device, "sync",
                  [&](PluginSession& loaded, Reporter& reporter, Interruption& interruption) {
                    reportPlan(input, reporter);
                    return Session(loaded.client(), loaded.host(), device->phone(), reporter,
                                   interruption)
                        .run(input);
                  });
}

/// Clearing takes every placeholder away, and with it what is left of its application.
void refuseToLoseData(device::EmbeddedDevice& device) {
  const Phone phone = device.phone();
  std::optional<Error> error;
  const auto present = applicationsPresent(phone, &error);
  if (!present) {
    throw CommandError(ExitCode::SomeFailed, withReason(CannotTellApplications, error));
  }
  std::string losers;
  for (const auto& [identifier, record] : present->placeholders) {
    if (present->installed.contains(identifier)) continue;
    // What cannot be looked at may be there.
    if (!ownsData(phone, identifier, nullptr).value_or(true)) continue;
    losers += (losers.empty() ? "" : ", ") + printable(identifier);
  }
  if (losers.empty()) return;
  throw CommandError(ExitCode::SomeFailed,
                     fmt::format("nothing is cleared: {} would lose data that is nowhere else; "
                                 "have it installed first, or use --with-data",
                                 losers));
}

ExitCode runClear(bool withData, CommandContext& context) {
  const auto device = context.openDevice(device::Access::Write);
  if (!withData) refuseToLoseData(*device);
  const auto plugin = loadPlugin(context);
  const Interruption interruption;
  PluginSession loaded(*plugin, QueryToolBundleIdentifier, *device, interruption, nullptr);
  const Phone phone = device->phone();
  const std::set<std::string> sent = everSent(phone);
  loaded.client().clearSyncData();
  removeLeftOverPackages(phone, sent);
  context.say({{"event", "cleared"}}, "Cleared all sync data and took every placeholder away.");
  return ExitCode::Done;
}

}  // namespace

void addSyncCommands(CLI::App& app, Command& chosen) {
  auto options = std::make_shared<SyncOptions>();
  CLI::App* sync = app.add_subcommand("sync", "Bring the phone in step with a folder of packages");
  sync->add_option("library", options->library, "Folder of packages")
      ->required()
      ->type_name("LIBRARY");
  sync->add_option("--install", options->plan.install,
                   "Install only this application, also anew in the same version (repeatable)")
      ->type_name("ID")
      ->check(checkIdentifier)
      ->allow_extra_args(false);
  sync->add_option("--remove", options->plan.remove, "Remove this application (repeatable)")
      ->type_name("ID")
      ->check(checkIdentifier)
      ->allow_extra_args(false);
  sync->add_flag("--mirror", options->plan.mirror,
                 "Also remove installed applications that the library lacks");
  sync->add_option("--icon-layout", options->iconLayout,
                   "Order of the home screen: a property list, JSON array or one ID per line")
      ->type_name("FILE");
  sync->add_flag("--dry-run", options->dryRun, "Only show what would be done");
  sync->footer(
      "Without --install, every package that is new or newer is installed.\n"
      "Example: appsync sync library --remove org.example.lantern --dry-run");
  sync->callback([options, &chosen] {
    chosen = [options](CommandContext& context) { return runSync(*options, context); };
  });

  CLI::App* clear = app.add_subcommand("clear", "Clear all sync data of the phone");
  auto withData = std::make_shared<bool>(false);
  clear->add_flag("--with-data", *withData,
                  "Also when a demoted application loses data of its own by it");
  clear->footer(
      "Placeholders that wait for their packages go too, with what a restore had for them.\n"
      "Example: appsync --device phone clear");
  clear->callback([withData, &chosen] {
    chosen = [withData](CommandContext& context) { return runClear(*withData, context); };
  });
}

}  // namespace appsync::host
