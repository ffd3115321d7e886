#pragma once

#include <string_view>

namespace appsync {

/// The sync host's log channels.
enum class LogChannel {
  TWLogCategorySyncBundle,           ///< what a sync bundle has to say
  TWLogCategorySyncBundle_Oversize,  ///< lines that print whole lists
  TWLogCategoryFramework,            ///< the sync host's own framework
};

enum class LogLevel { Default, Info, Debug, Error, Fault };

std::string_view name(LogChannel channel);  ///< the enumerator's name
std::string_view name(LogLevel level);      ///< "default", "info", "debug", "error", "fault"

/// Where log lines go.
class Log {
 public:
  virtual ~Log() = default;

  /// Takes one finished line without a line end. `text` is borrowed for the call; it may hold any
  /// bytes, since identifiers from outside stand in it. Called from any thread; never fails
  /// visibly.
  virtual void write(LogChannel channel, LogLevel level, std::string_view text) noexcept = 0;
};

/// Names a stream of records to a service that keeps its own log (see TransactionLog).
struct LogHandle {
  std::string_view subsystem;
  std::string_view category;
};

}  // namespace appsync
