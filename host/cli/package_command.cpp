#include <fmt/format.h>

#include <CLI/CLI.hpp>
#include <memory>

#include "base/text.h"
#include "host/cli/cli.h"
#include "packages/package_writer.h"

namespace appsync::host {
namespace {

struct PackageOptions {
  std::string folder;
  std::string output;
};

ExitCode runPackage(const PackageOptions& options, CommandContext& context) {
  std::string problem;
  const auto package = writePackage(options.folder, options.output, problem);
  if (!package) throw CommandError(ExitCode::SomeFailed, "cannot make the package: " + problem);
  context.say(
      {{"event", "packaged"},
       {"identifier", package->identifier},
       {"version", textOrNull(package->version)},
       {"file", options.output},
       {"bytes", package->bytes},
       {"entries", package->entries}},
      fmt::format("{}: {} {}, {} entries, {}", printable(options.output), package->identifier,
                  printable(package->version), package->entries, byteCount(package->bytes)));
  return ExitCode::Done;
}

}  // namespace

void addPackageCommand(CLI::App& app, Command& chosen) {
  CLI::App* package = app.add_subcommand("package", "Make a package of an application folder");
  auto options = std::make_shared<PackageOptions>();
  package->add_option("folder", options->folder, "The application, NAME.app")
      ->required()
      ->type_name("APPFOLDER");
  package->add_option("-o,--output", options->output, "The package; its ending names the format")
      ->required()
      ->type_name("FILE");
  package->footer(
      "Formats: .zip, .tar, .tar.gz, .tar.xz, .tar.zst, .tar.bz2. HalvoMetadata.plist and\n"
      "HalvoArtwork that stand beside the folder go into the package.\n"
      "Example: appsync package Tally.app -o library/Tally.zip");
  package->callback([options, &chosen] {
    chosen = [options](CommandContext& context) { return runPackage(*options, context); };
  });
}

}  // namespace appsync::host
