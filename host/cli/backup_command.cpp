#include <CLI/CLI.hpp>

#include "host/backup/backup.h"
#include "host/base/interruption.h"
#include "host/cli/cli.h"
#include "host/cli/plugin_session.h"
#include "host/phone/plugin_loader.h"

namespace appsync::host {
namespace {

ExitCode exitCode(const BackupSummary& summary, const Interruption& interruption) {
  if (summary.made) return summary.failed.empty() ? ExitCode::Done : ExitCode::SomeFailed;
  return interruption.requested() ? ExitCode::Interrupted : ExitCode::SomeFailed;
}

ExitCode runBackup(const std::string& folder, CommandContext& context) {
  const auto device = context.openDevice(device::Access::Write);
  const auto reporter = context.makeReporter();
  Interruption interruption;
  const auto plugin = loadPlugin(context);
  PluginSession loaded(*plugin, SyncHostBundleIdentifier, *device, interruption,
                       context.verbose ? reporter.get() : nullptr);
  const SignalWatcher signals(interruption);
  std::string problem;
  auto writer = BackupWriter::open(folder, problem);
  if (!writer) throw CommandError(ExitCode::WrongUsage, problem);
  const BackupPhone phone = backupPhoneOf(*device, loaded.host());
  const BackupSummary summary =
      BackupRun(loaded.client(), phone, *writer, *reporter, interruption).run();
  writer.reset();  // takes away what is not whole
  reporter->report(summary);
  context.tellIfUnseen("backup");
  return exitCode(summary, interruption);
}

}  // namespace

void addBackupCommand(CLI::App& app, Command& chosen) {
  auto folder = std::make_shared<std::string>();
  CLI::App* backup = app.add_subcommand("backup", "Save the phone's applications and their data");
  backup->add_option("folder", *folder, "Folder for the backup, or of an older one to replace")
      ->required()
      ->type_name("FOLDER");
  backup->footer(
      "Packages are not saved: \"restore\" gets them from a store or a library. An older backup "
      "is\n"
      "replaced when the new one is whole.\n"
      "Example: appsync --device phone backup backup-of-phone");
  backup->callback([folder, &chosen] {
    chosen = [folder](CommandContext& context) { return runBackup(*folder, context); };
  });
}

}  // namespace appsync::host
