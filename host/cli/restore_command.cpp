#include <CLI/CLI.hpp>
#include <set>

#include "base/interruption.h"
#include "host/cli/cli.h"
#include "host/cli/plugin_session.h"
#include "host/phone/plugin_loader.h"
#include "host/restore/restore.h"

namespace appsync::host {
namespace {

struct RestoreOptions {
  std::string folder;
  std::string catalogue;
  std::string packages;
  std::set<std::string> only;
  bool overwriteData = false;
};

std::optional<Library> libraryAt(const std::string& folder) {
  if (folder.empty()) return std::nullopt;
  std::string problem;
  auto library = readLibrary(folder, problem);
  if (!library) throw CommandError(ExitCode::WrongUsage, problem);
  return library;
}

RestoreInput readInput(const RestoreOptions& options) {
  std::string problem;
  auto backup = readBackup(options.folder, problem);
  auto list = backup ? RestoreList::of(*backup, problem) : std::nullopt;
  if (list && !options.only.empty() && !list->keepOnly(options.only, problem)) list.reset();
  if (!list) throw CommandError(ExitCode::WrongUsage, problem);
  return {std::move(*backup), std::move(*list), libraryAt(options.packages),
          libraryAt(options.catalogue), options.overwriteData};
}

void reportUnreadable(const std::optional<Library>& library, Reporter& reporter) {
  if (!library) return;
  for (const UnreadablePackage& file : library->unreadable) reporter.report(file);
}

ExitCode runRestore(const RestoreOptions& options, CommandContext& context) {
  RestoreInput input = readInput(options);
  const auto device = context.openDevice(device::Access::Write);
  if (input.packages && device->options().coordination) {
    throw CommandError(
        ExitCode::WrongUsage,
        "this phone takes the packages of restored applications only from the store: "
        "use --store instead of --packages");
  }
  input.installingAllowed = isAllowed(*device, PolicySetting::AppInstallationAllowed);
  return runVisit(context, *device, "restore",
                  [&](PluginSession& loaded, Reporter& reporter, Interruption& interruption) {
                    reportUnreadable(input.packages, reporter);
                    reportUnreadable(input.catalogue, reporter);
                    return Restore(loaded.client(), loaded.host(), device->phone(), reporter,
                                   interruption)
                        .run(input);
                  });
}

}  // namespace

void addRestoreCommand(CLI::App& app, Command& chosen) {
  auto options = std::make_shared<RestoreOptions>();
  CLI::App* restore = app.add_subcommand("restore", "Bring the applications of a backup back");
  restore->add_option("folder", options->folder, "Folder of the backup")
      ->required()
      ->type_name("FOLDER");
  restore
      ->add_option("--store", options->catalogue,
                   "Folder of packages from which the store brings the applications")
      ->type_name("CATALOGUE");
  restore
      ->add_option("--packages", options->packages,
                   "Folder of packages that are sent to the phone from here")
      ->type_name("LIBRARY");
  restore->add_option("--only", options->only, "Restore only this application (repeatable)")
      ->type_name("ID")
      ->check(checkIdentifier)
      ->allow_extra_args(false);
  restore->add_flag("--overwrite-data", options->overwriteData,
                    "Give the backup's data back also to applications that have data of their own");
  restore->footer(
      "Without packages, applications come back as placeholders with their data waiting.\n"
      "Installed applications, and the data of demoted ones, are left as they are without\n"
      "--overwrite-data.\n"
      "A restore that was interrupted is finished by another one.\n"
      "Example: appsync --device new-phone restore backup --store catalogue");
  restore->callback([options, &chosen] {
    chosen = [options](CommandContext& context) { return runRestore(*options, context); };
  });
}

}  // namespace appsync::host
