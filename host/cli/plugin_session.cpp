#include "host/cli/plugin_session.h"

namespace appsync::host {
void ReportingLog::write(LogChannel channel, LogLevel level, std::string_view text) noexcept {
  log_.write(channel, level, text);
  if (reporter_) reporter_->report(ClientLogLine{channel, level, std::string(text)});
}

std::unique_ptr<Plugin> loadPlugin(const CommandContext& context) {
  std::string problem;
  const auto bundle = findPlugin(context.plugin, problem);
  auto plugin = bundle ? Plugin::load(*bundle, problem) : nullptr;
  if (!plugin) throw CommandError(ExitCode::WrongUsage, problem);
  return plugin;
}

PluginSession::PluginSession(Plugin& plugin, std::string_view mainBundleIdentifier,
                             device::EmbeddedDevice& device, const Interruption& interruption,
                             Reporter* logReporter)
    : host_(mainBundleIdentifier, plugin.identifier(), interruption),
      log_(device.log(), logReporter),
      client_(plugin.createClient(with(device.platform(host_), log_))) {
  if (!client_) throw CommandError(ExitCode::SomeFailed, "the plug-in could not make its client");
  if (mainBundleIdentifier == SyncHostBundleIdentifier) {
    announceStartUp(device.systemNotifier());
  }
}

ExitCode runVisit(CommandContext& context, device::EmbeddedDevice& device, std::string_view work,
                  const std::function<SyncResult(PluginSession& loaded, Reporter& reporter,
                                                 Interruption& interruption)>& run) {
  const auto reporter = context.makeReporter();
  Interruption interruption;
  const auto plugin = loadPlugin(context);
  PluginSession loaded(*plugin, SyncHostBundleIdentifier, device, interruption,
                       context.verbose ? reporter.get() : nullptr);
  const SignalWatcher signals(interruption);
  const SyncResult result = run(loaded, *reporter, interruption);
  reporter->report(result.summary);
  context.tellIfUnseen(work);
  return interruption.requested() ? ExitCode::Interrupted : exitCodeOf(result);
}

ExitCode exitCodeOf(const SyncResult& result) {
  return result.completed && result.summary.failed.empty() ? ExitCode::Done : ExitCode::SomeFailed;
}

}  // namespace appsync::host
