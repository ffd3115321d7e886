#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <string_view>

#include "platform/error.h"
#include "platform/log.h"
#include "platform/property_list.h"

// What goes in and out of an embedded device beside the platform's own types.

namespace appsync::device {

/// Why a device folder cannot be used.
enum class DeviceProblem {
  Missing,   ///< there is no device at the path
  Exists,    ///< a new device was asked for where something stands already
  Busy,      ///< another process is writing the device
  Foreign,   ///< the folder holds something else, or a device of a newer version
  Damaged,   ///< a device, but its data cannot be read
  Unusable,  ///< the system refuses (permissions, disk full, ...)
};

struct DeviceError {
  DeviceProblem problem = DeviceProblem::Missing;
  /// One line for people that names the folder, the reason and what to do.
  std::string message;
};

enum class Access {
  Write,    ///< takes the device's lock for as long as the object lives
  ReadOnly  ///< may look at any time, also while another process writes
};

struct DeviceOptions {
  bool coordination = false;  ///< whether installs are driven through install coordinators
};

/// One record of the transaction log.
struct TransactionRecord {
  std::int64_t number = 0;  ///< ascending, from 1
  double time = 0;          ///< seconds since 1970-01-01T00:00:00Z
  /// The scenario's name; empty for a step of a coordinated install.
  std::string scenario;
  std::optional<std::uint32_t> step;
  std::uint32_t party = 0;  ///< 0 for a scenario
  std::uint32_t phase = 0;  ///< 0 for a scenario
  bool success = false;
  std::string bundleId;
  std::string description;
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
  std::string bundleId;
  std::optional<std::string> version;
  /// Installed over an older version: that version, empty when it had none.
  std::optional<std::string> replaced;
  std::string reason;  ///< Failed: why
};

struct LogLine {
  double time = 0;  ///< seconds since 1970-01-01T00:00:00Z
  LogChannel channel = LogChannel::TWLogCategorySyncBundle;
  LogLevel level = LogLevel::Default;
  std::string text;
};

/// A file that is being sent to the phone piece by piece. Destroying it before `finish` removes
/// what has arrived. Used by one thread.
class FileReceiver {
 public:
  virtual ~FileReceiver() = default;
  virtual bool append(ByteView bytes, std::optional<Error>* error) noexcept = 0;
  /// The file is whole. False when it could not be completed.
  virtual bool finish(std::optional<Error>* error) noexcept = 0;
};

/// Told of things that a person watching the device would see, on the threads that bring them
/// about and before the call that does so returns. Must not replace the watcher.
class DeviceWatcher {
 public:
  virtual ~DeviceWatcher() = default;
  /// A termination assertion was denied because the application is in the foreground.
  virtual void assertionDenied(std::string_view bundleId) noexcept { (void)bundleId; }
  /// A package was installed (error none) or refused.
  virtual void installFinished(std::string_view bundleId,
                               const std::optional<Error>& error) noexcept {
    (void)bundleId, (void)error;
  }
};

/// Takes the next bytes; false to end with the sink's own reason.
using DataSink = std::function<bool(ByteView bytes)>;

/// Fills in the next bytes and gives their number; 0 at the end, -1 when there is no going on.
using DataSource = std::function<std::int64_t(std::uint8_t* bytes, std::size_t size)>;

}  // namespace appsync::device
