#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <variant>
#include <vector>

#include "host/library/library.h"
#include "host/library/sync_plan.h"
#include "platform/log.h"

namespace appsync::host {

// What happens during a sync, a backup or a restore. Identifiers, names and reasons may hold any
// bytes that a package held; a reporter makes them safe for where it writes.

/// A file of the library that cannot be offered.
using PackageProblem = UnreadablePackage;

/// Taken away: the placeholder that a broken-off sync left.
struct PlaceholderSwept {
  std::string identifier;
};

/// The phone reports that it disappeared since the last sync.
struct DeletedOnPhone {
  std::string identifier;
};

struct TransferProgress {
  std::string identifier;
  std::string name;
  std::uint64_t sent = 0;   ///< bytes
  std::uint64_t total = 0;  ///< bytes
};

struct TransferEnded {
  std::string identifier;
  std::string name;
  std::optional<std::string> failure;  ///< reason
};

/// How far an application's own data has come on its way into a backup or back.
struct DataProgress {
  std::string identifier;
  std::string name;
  std::uint64_t done = 0;   ///< bytes
  std::uint64_t total = 0;  ///< bytes
};

struct DataEnded {
  std::string identifier;
  std::optional<std::string> failure;  ///< reason
};

/// An application is being saved; `bytes` of its own data so far.
struct SavingProgress {
  std::string identifier;
  std::string name;
  std::uint64_t bytes = 0;
  std::size_t number = 0;  ///< of the application, from 1
  std::size_t count = 0;   ///< of all applications
};

struct ApplicationSaved {
  std::string identifier;
  std::string name;
  std::optional<std::string> failure;  ///< reason
};

/// A restored application has its place on the home screen, without its package.
struct PlaceholderStands {
  std::string identifier;
  std::string name;
  bool demoted = false;  ///< and is to stay so until the person asks for it
};

/// One line that people should know of.
struct Notice {
  std::string text;
};

/// The application is open on the phone, so its install waits.
struct InstallWaiting {
  std::string identifier;
};
inline constexpr int InstallRetrySeconds = 30;

struct InstallEnded {
  std::string identifier;
  std::optional<std::string> failure;  ///< reason
  std::string file{};                  ///< name of the package's file; empty when it is not known
};

/// One of the client's log lines.
struct ClientLogLine {
  LogChannel channel = LogChannel::TWLogCategorySyncBundle;
  LogLevel level = LogLevel::Default;
  std::string text;
};

/// The person asked to end early.
struct Interrupted {};

/// The sync as a whole did not come to its end.
struct SyncBroken {
  std::string reason;
};

/// The last event of a sync or a restore.
struct Summary {
  std::vector<std::string> installed;
  std::vector<std::string> updated;
  std::vector<std::string> deleted;
  std::vector<FailedEntry> failed;
  std::vector<SkippedEntry> skipped;
  std::vector<std::string> downgraded{};
  /// Installed applications that got a backup's data in the place of their own.
  std::vector<std::string> dataRestored{};
};

/// The last event of a backup.
struct BackupSummary {
  std::vector<std::string> saved;
  std::vector<FailedEntry> failed;
  bool made = false;  ///< else an older backup stays as it was
};

using Event =
    std::variant<PackageProblem, PlannedEntry, PlaceholderSwept, DeletedOnPhone, TransferProgress,
                 TransferEnded, DataProgress, DataEnded, SavingProgress, ApplicationSaved,
                 PlaceholderStands, Notice, InstallWaiting, InstallEnded, ClientLogLine,
                 Interrupted, SyncBroken, Summary, BackupSummary>;

/// Tells people or programs what happens. Called from any thread.
class Reporter {
 public:
  virtual ~Reporter() = default;
  virtual void report(const Event& event) = 0;
};

/// Picks the function for an event's type.
template <typename... Functions>
struct Overloaded : Functions... {
  using Functions::operator()...;
};
template <typename... Functions>
Overloaded(Functions...) -> Overloaded<Functions...>;

}  // namespace appsync::host
