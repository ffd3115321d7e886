#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "platform/log.h"

namespace appsync::device {

/// One record of the transaction log.
struct TransactionRecord {
  std::int64_t number = 0;  ///< ascending, from 1
  double time = 0;          ///< seconds since 1970-01-01T00:00:00Z
  /// The scenario's name; empty for a step of a coordinated install.
  std::string scenario{};
  std::optional<std::uint32_t> step{};
  std::uint32_t party = 0;  ///< 0 for a scenario
  std::uint32_t phase = 0;  ///< 0 for a scenario
  bool success = false;
  std::string bundleId{};
  std::string description{};
};

/// What happened to an application. Stored: values do not change.
enum class HistoryEvent {
  Installed,  ///< in the place of an older version, if there was one
  Failed,     ///< its package was not installed
  Removed,
  Demoted,          ///< its placeholder and data stay
  Restored,         ///< as a placeholder, from a backup
  DataOverwritten,  ///< with a backup's
};

/// By whom. Stored: values do not change.
enum class HistoryOrigin { Sync, Store, Person };

struct HistoryEntry {
  std::int64_t number = 0;  ///< ascending
  double time = 0;          ///< seconds since 1970-01-01T00:00:00Z
  HistoryEvent event = HistoryEvent::Installed;
  HistoryOrigin origin = HistoryOrigin::Sync;
  std::string bundleId{};
  std::optional<std::string> version{};
  /// Installed over an older version: that version, empty when it had none.
  std::optional<std::string> replaced{};
  std::string reason{};  ///< Failed: why
};

struct LogLine {
  double time = 0;  ///< seconds since 1970-01-01T00:00:00Z
  LogChannel channel = LogChannel::TWLogCategorySyncBundle;
  LogLevel level = LogLevel::Default;
  std::string text;
};

}  // namespace appsync::device
