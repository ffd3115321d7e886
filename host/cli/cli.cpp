#include "host/cli/cli.h"

#include <fmt/format.h>
#include <locale.h>
#include <signal.h>

#include <CLI/CLI.hpp>
#include <algorithm>
#include <cerrno>
#include <sstream>
#include <string_view>

#include "base/text.h"
#include "host/report/columns.h"
#include "host/report/report.h"

namespace appsync::host {
namespace {

constexpr const char* Examples = R"(Examples:
  appsync --device phone init
  appsync package Tally.app -o library/Tally.zip
  appsync --device phone sync library
  appsync --device phone sync library --install org.example.tally --remove org.example.lantern
  appsync --device phone --json apps

Exit codes: 0 all done, 1 some application failed, 2 wrong usage, 3 phone missing, busy or damaged,
or no backup can be written there, 130 interrupted. APPSYNC_DEVICE and APPSYNC_PLUGIN stand for --device and --plugin.
)";

void addGlobalOptions(CLI::App& app, CommandContext& context) {
  app.add_option("-d,--device", context.device, "Folder of the phone")
      ->envname("APPSYNC_DEVICE")
      ->type_name("DIR");
  app.add_option("--plugin", context.plugin, "Plug-in bundle, if not the one beside the program")
      ->envname("APPSYNC_PLUGIN")
      ->type_name("DIR");
  app.add_flag("--json", context.json, "One JSON object per line on standard output");
  app.add_flag("-q,--quiet", context.quiet, "Only what failed");
  app.add_flag("-v,--verbose", context.verbose, "The plan and the plug-in's log lines too");
  app.set_version_flag("--version", "appsync " APPSYNC_VERSION);
}

std::string unknownCommand(std::string_view name) {
  return fmt::format("unknown command \"{}\"; see appsync --help", printable(name));
}

std::string usageMessage(const CLI::App& app, const CLI::ParseError& error) {
  std::string command = "appsync";
  if (const auto unknown = app.remaining(); app.get_subcommands().empty() && !unknown.empty()) {
    return unknownCommand(unknown.front());
  }
  for (const CLI::App* chosen : app.get_subcommands()) command += " " + chosen->get_name();
  return fmt::format("{}; see {} --help", printable(oneLine(error.what())), command);
}

bool asksForJson(int argc, char** argv) {
  return std::any_of(argv, argv + argc, [](std::string_view text) { return text == "--json"; });
}

ExitCode run(const Command& command, CommandContext& context) {
  try {
    return command(context);
  } catch (const CommandError& error) {
    context.tellError(error.what());
    return error.code();
  } catch (const std::exception& error) {
    context.tellError(printable(oneLine(error.what())));
    return ExitCode::SomeFailed;
  }
}

/// A reader that closed the pipe has seen enough; every other failure loses what was asked for.
ExitCode withOutputChecked(ExitCode code, CommandContext& context) {
  const int error = context.out.error();
  if (error == 0 || error == EPIPE) return code;
  context.err.line("appsync: cannot write to standard output: " + systemText(error));
  return code == ExitCode::Done ? ExitCode::SomeFailed : code;
}

}  // namespace

std::filesystem::path CommandContext::deviceFolder() const {
  if (device.empty()) {
    throw CommandError(ExitCode::WrongUsage,
                       "no phone named: give its folder with --device or APPSYNC_DEVICE");
  }
  return device;
}

std::unique_ptr<device::EmbeddedDevice> CommandContext::openDevice(device::Access access) const {
  device::DeviceError error;
  auto opened = device::EmbeddedDevice::open(deviceFolder(), access, error);
  if (!opened) throw CommandError(ExitCode::DeviceUnusable, printable(error.message));
  return opened;
}

std::unique_ptr<Reporter> CommandContext::makeReporter(bool showPlan) {
  return host::makeReporter(out, err, {json, quiet, verbose, showPlan});
}

void CommandContext::tell(const Json& object, const std::string& text) {
  if (json) {
    writeJsonLine(out, object);
  } else {
    out.line(text);
  }
}

void CommandContext::tellError(const std::string& message) {
  if (json) {
    writeJsonLine(out, {{"event", "error"}, {"message", message}});
  } else {
    err.line("appsync: " + message);
  }
}

void CommandContext::tellIfUnseen(std::string_view work) {
  if (out.error() != EPIPE) return;
  err.line(
      fmt::format("appsync: nobody reads the output any more; the {} ran to its end unseen", work));
}

void insistOnRead(const std::optional<Error>& error) {
  if (error) {
    throw CommandError(ExitCode::DeviceUnusable, printable(oneLine(error->localizedDescription())));
  }
}

std::string checkPositive(const std::string& text) {
  const bool isNumber =
      text.size() <= 9 && text.find_first_not_of("0123456789") == std::string::npos;
  const bool isPositive = text.find_first_not_of('0') != std::string::npos;
  return isNumber && isPositive ? "" : "must be a whole number from 1 to 999999999";
}

std::string checkIdentifier(const std::string& text) {
  return text.empty() ? "an identifier is not empty" : "";
}

void addHelpCommand(CLI::App& app, Command& chosen) {
  CLI::App* help = app.add_subcommand("help", "Tell how a command is used");
  auto name = std::make_shared<std::string>();
  help->add_option("command", *name, "The command; without it, all are listed")
      ->type_name("COMMAND");
  help->footer("Example: appsync help sync");
  help->callback([name, &app, &chosen] {
    chosen = [name, &app](CommandContext& context) {
      const auto commands =
          app.get_subcommands([&](const CLI::App* one) { return one->get_name() == *name; });
      if (!name->empty() && commands.empty()) {
        throw CommandError(ExitCode::WrongUsage, unknownCommand(*name));
      }
      // Asked itself, the program would help with the command that was chosen: this one.
      context.out.write(name->empty() ? app.get_formatter()->make_help(&app, app.get_name(),
                                                                       CLI::AppFormatMode::Normal)
                                      : commands.front()->help(app.get_name()));
      return ExitCode::Done;
    };
  });
}

int runCommandLine(int argc, char** argv) {
  if (!openStandardDescriptors()) return static_cast<int>(ExitCode::WrongUsage);
  // Character widths need a UTF-8 locale, whatever the person's is.
  if (!::setlocale(LC_CTYPE, "") || displayWidth("\u00e9") != 1) ::setlocale(LC_CTYPE, "C.UTF-8");
  ::signal(SIGPIPE, SIG_IGN);
  ::signal(SIGXFSZ, SIG_IGN);  // writing beyond a limit fails like writing to a full disk

  CommandContext context;
  CLI::App app("Keeps a phone's applications in step with a library of packages.", "appsync");
  app.footer(Examples);
  app.require_subcommand(1);
  app.fallthrough();
  Command chosen;
  addGlobalOptions(app, context);
  addSyncCommands(app, chosen);
  addBackupCommand(app, chosen);
  addRestoreCommand(app, chosen);
  addLookCommands(app, chosen);
  addHistoryCommand(app, chosen);
  addHomeScreenCommand(app, chosen);
  addPhoneCommands(app, chosen);
  addPackageCommand(app, chosen);
  addHelpCommand(app, chosen);
  try {
    app.parse(argc, argv);
  } catch (const CLI::Success& asked) {
    std::ostringstream help;
    app.exit(asked, help, help);
    context.out.write(help.str());
    return static_cast<int>(withOutputChecked(ExitCode::Done, context));
  } catch (const CLI::ParseError& error) {
    context.json = asksForJson(argc, argv);
    context.tellError(usageMessage(app, error));
    return static_cast<int>(ExitCode::WrongUsage);
  }
  return static_cast<int>(withOutputChecked(run(chosen, context), context));
}

}  // namespace appsync::host
