#pragma once

#include <concepts>
#include <mutex>
#include <string>
#include <string_view>
#include <vector>

#include "platform/error.h"
#include "platform/file_manager.h"
#include "platform/property_list.h"

namespace appsync::fakes {

/// What a line of the trace tells. Kinds are bits, so that a test picks what it compares.
using TraceKinds = unsigned;
inline constexpr TraceKinds TraceLog = 1;          ///< log lines
inline constexpr TraceKinds TraceTransaction = 2;  ///< transaction records
inline constexpr TraceKinds TraceCall = 4;    ///< service calls that change or request something
inline constexpr TraceKinds TraceFile = 8;    ///< file calls that change something
inline constexpr TraceKinds TraceQuery = 16;  ///< calls, of files too, that only ask
/// Everything that leaves a mark outside the client: what a scenario compares.
inline constexpr TraceKinds TraceEffects = TraceLog | TraceTransaction | TraceCall | TraceFile;
inline constexpr TraceKinds TraceAll = TraceEffects | TraceQuery;

/// Everything that reached the fakes of one platform, in order. Called from any thread.
///
/// Line forms:
///   log default SyncBundle|com.corvane.twc.AppsClient|starting   (channels SyncBundle, Oversize,
///                                                                 Framework)
///   transaction scenario "Halvo Sync" step 0 ok com.a "Uninstall succeeded"
///   transaction scenario "Install placeholder" failed com.a "Failed to install placeholder"
///   transaction step 3 party 1 phase 1 ok com.a "Create coordinator"
///   AppRegistry.uninstallApplication(com.a, {})
///   InstallProgress.setInstallState(com.a, 1)
///   FileManager.moveItem(/from, /to)
///   fault FileManager.moveItem(/from)            (a planned fault took the place of the call)
/// Directories as package locations end in "/"; file contents are not shown.
class CallTrace {
 public:
  void add(TraceKinds kind, std::string line);

  std::vector<std::string> lines(TraceKinds kinds = TraceEffects) const;
  /// The same with the plug-in's prefix taken out of log lines: "log default SyncBundle|starting".
  std::vector<std::string> readable(TraceKinds kinds = TraceEffects) const;
  std::vector<std::string> log() const { return readable(TraceLog); }
  std::vector<std::string> transactions() const { return lines(TraceTransaction); }
  std::vector<std::string> calls() const { return lines(TraceCall); }

  /// How many lines of whatever kind begin with `beginning`.
  std::size_t count(std::string_view beginning) const;
  void clear();

 private:
  struct Line {
    TraceKinds kind;
    std::string text;
  };
  mutable std::mutex mutex_;
  std::vector<Line> lines_;
};

/// What the client puts in front of its log lines, as FakeSyncHost names the plug-in.
inline constexpr std::string_view PluginLogPrefix = "com.corvane.twc.AppsClient|";

std::string withoutPluginPrefix(std::string text);

// Texts of call arguments.
inline std::string argumentText(std::string_view text) { return std::string(text); }
inline std::string argumentText(const char* text) { return text; }
inline std::string argumentText(bool value) { return value ? "true" : "false"; }
inline std::string argumentText(const Error& error) { return description(error); }
inline std::string argumentText(const PropertyList::Dictionary& values) {
  return description(values);
}
inline std::string argumentText(const FileLocation& location) {
  return location.path + (location.isDirectory ? "/" : "");
}
template <typename Number>
requires((std::integral<Number> ||
          std::floating_point<Number>)&&!std::same_as<Number, bool>) std::string
    argumentText(Number value) {
  if constexpr (std::integral<Number>) return std::to_string(value);
  return description(PropertyList(static_cast<double>(value)));
}
template <typename Value>
std::string argumentText(const std::optional<Value>& value) {
  return value ? argumentText(*value) : "none";
}

/// "Service.operation(a, b)".
template <typename... Arguments>
std::string callText(std::string_view operation, const Arguments&... arguments) {
  std::string text(operation);
  text += '(';
  std::string_view separator;
  ((text.append(separator).append(argumentText(arguments)), separator = ", "), ...);
  return text += ')';
}

}  // namespace appsync::fakes
