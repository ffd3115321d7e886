#pragma once

#include <functional>
#include <memory>

#include "base/interruption.h"
#include "device/embedded_device.h"
#include "host/cli/cli.h"
#include "host/library/events.h"
#include "host/phone/plugin_loader.h"
#include "host/phone/sync_host.h"
#include "host/transfer/visit.h"

namespace appsync::host {

/// Hands log lines on to the phone's log and to a reporter.
class ReportingLog : public Log {
 public:
  ReportingLog(Log& log, Reporter* reporter) : log_(log), reporter_(reporter) {}
  void write(LogChannel channel, LogLevel level, std::string_view text) noexcept override;

 private:
  Log& log_;
  Reporter* const reporter_;
};

/// The plug-in that the options name; a CommandError when it cannot be used.
std::unique_ptr<Plugin> loadPlugin(const CommandContext& context);

/// A client at work on a device. Borrows everything given.
class PluginSession {
 public:
  /// `logReporter`, when given, sees the client's log lines. A CommandError when the plug-in makes
  /// no client.
  PluginSession(Plugin& plugin, std::string_view mainBundleIdentifier,
                device::EmbeddedDevice& device, const Interruption& interruption,
                Reporter* logReporter);

  SyncClient& client() { return *client_; }
  HostProcess& host() { return host_; }

 private:
  HostProcess host_;
  ReportingLog log_;
  std::shared_ptr<SyncClient> client_;
};

/// Runs a sync or a restore, tells its result, and gives the exit code. A first signal interrupts
/// it; `work` is what it is called in front of people.
ExitCode runVisit(CommandContext& context, device::EmbeddedDevice& device, std::string_view work,
                  const std::function<SyncResult(PluginSession& loaded, Reporter& reporter,
                                                 Interruption& interruption)>& run);

/// That of a visit that was not interrupted.
ExitCode exitCodeOf(const SyncResult& result);

}  // namespace appsync::host
