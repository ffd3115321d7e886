#pragma once

#include <filesystem>
#include <functional>
#include <memory>
#include <stdexcept>
#include <string>

#include "device/embedded_device.h"
#include "host/library/events.h"
#include "host/report/json_line.h"
#include "host/report/output.h"

namespace CLI {
class App;
}

namespace appsync::host {

/// What the command's exit code tells.
enum class ExitCode {
  Done = 0,
  SomeFailed = 1,
  WrongUsage = 2,
  DeviceUnusable = 3,
  Interrupted = 130
};

/// Ends a command with one line for people. Only thrown and caught inside the command line.
class CommandError : public std::runtime_error {
 public:
  CommandError(ExitCode code, const std::string& message)
      : std::runtime_error(message), code_(code) {}
  ExitCode code() const { return code_; }

 private:
  ExitCode code_;
};

/// Options before the command, and where a command writes.
struct CommandContext {
  std::string device;
  std::string plugin;
  bool json = false;
  bool quiet = false;
  bool verbose = false;
  Output out{1};
  Output err{2};

  /// The device's folder; a CommandError when none was named.
  std::filesystem::path deviceFolder() const;
  /// An open device; a CommandError when it cannot be used.
  std::unique_ptr<device::EmbeddedDevice> openDevice(device::Access access) const;

  /// Tells of the work's progress.
  std::unique_ptr<Reporter> makeReporter(bool showPlan = false);

  /// One line of a result: the object with --json, else the text.
  void tell(const Json& object, const std::string& text);
  /// The same, unless only what failed is wanted.
  void say(const Json& object, const std::string& text) {
    if (json || !quiet) tell(object, text);
  }
  void tellError(const std::string& message);
  /// Says that the work went on when nobody read the output any more, if that is so.
  void tellIfUnseen(std::string_view work);
};

/// Ends the command when what it asked a phone for could not be read.
void insistOnRead(const std::optional<Error>& error);

/// The command "status": one object, or a few lines for people.
ExitCode runStatus(CommandContext& context);

/// What the chosen command does; it gives the exit code.
using Command = std::function<ExitCode(CommandContext&)>;

/// Check of an option's text: empty for a whole number from 1 to 999999999, else what is wrong with
/// it.
std::string checkPositive(const std::string& text);

/// Check of an identifier's text: empty when it may be one, else what is wrong with it.
std::string checkIdentifier(const std::string& text);

bool isAllowed(device::EmbeddedDevice& device, PolicySetting setting);
/// "allow" or "forbid".
std::string policyText(device::EmbeddedDevice& device, PolicySetting setting);

// Each adds a group of commands; parsing sets `chosen` to the one that was named.
void addSyncCommands(CLI::App& app, Command& chosen);
void addBackupCommand(CLI::App& app, Command& chosen);
void addRestoreCommand(CLI::App& app, Command& chosen);
void addPhoneCommands(CLI::App& app, Command& chosen);
void addLookCommands(CLI::App& app, Command& chosen);
void addHistoryCommand(CLI::App& app, Command& chosen);
void addPackageCommand(CLI::App& app, Command& chosen);
void addHomeScreenCommand(CLI::App& app, Command& chosen);
/// Last of all: it tells of the commands that are there.
void addHelpCommand(CLI::App& app, Command& chosen);

/// The whole program `appsync`.
int runCommandLine(int argc, char** argv);

}  // namespace appsync::host
