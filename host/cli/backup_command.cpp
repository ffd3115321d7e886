#include <CLI/CLI.hpp>

#include "base/interruption.h"
#include "host/backup/backup.h"
#include "host/cli/cli.h"
#include "host/cli/plugin_session.h"
#include "host/phone/plugin_loader.h"

namespace appsync::host {
namespace {

ExitCode exitCode(const BackupSummary& summary, const Interruption& interruption) {
  if (summary.made) return summary.failed.empty() ? ExitCode::Done : ExitCode::SomeFailed;
  return interruption.requested() ? ExitCode::Interrupted : ExitCode::SomeFailed;
}

struct BackupArguments {
  std::string folder;
  BackupOptions options;
};

ExitCode runBackup(const BackupArguments& arguments, CommandContext& context) {
  const auto device = context.openDevice(device::Access::Write);
  const auto reporter = context.makeReporter();
  Interruption interruption;
  const auto plugin = loadPlugin(context);
  PluginSession loaded(*plugin, SyncHostBundleIdentifier, *device, interruption,
                       context.verbose ? reporter.get() : nullptr);
  const SignalWatcher signals(interruption);
  BackupProblem problem;
  auto writer = BackupWriter::open(arguments.folder, problem);
  if (!writer) {
    throw CommandError(problem.isWrongFolder ? ExitCode::WrongUsage : ExitCode::DeviceUnusable,
                       problem.text);
  }
  const Phone phone = device->phone();
  const BackupSummary summary =
      BackupRun(loaded.client(), phone, *writer, *reporter, interruption).run(arguments.options);
  writer.reset();  // takes away what is not whole
  reporter->report(summary);
  context.tellIfUnseen("backup");
  return exitCode(summary, interruption);
}

}  // namespace

void addBackupCommand(CLI::App& app, Command& chosen) {
  auto arguments = std::make_shared<BackupArguments>();
  CLI::App* backup = app.add_subcommand("backup", "Save the phone's applications and their data");
  backup
      ->add_option("folder", arguments->folder,
                   "Folder for the backup, or of an older one to replace")
      ->required()
      ->type_name("FOLDER");
  backup->add_flag("--allow-missing", arguments->options.allowMissing,
                   "Replace an older backup also when an application of it cannot be saved now");
  backup->footer(
      "Packages are not saved: \"restore\" gets them from a store or a library. An older backup\n"
      "is replaced when the new one is whole; it stays when an application that it holds is on\n"
      "the phone but cannot be saved.\n"
      "Example: appsync --device phone backup backup-of-phone");
  backup->callback([arguments, &chosen] {
    chosen = [arguments](CommandContext& context) { return runBackup(*arguments, context); };
  });
}

}  // namespace appsync::host
