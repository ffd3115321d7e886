#pragma once

#include <optional>
#include <string>
#include <vector>

#include "base/interruption.h"
#include "host/backup/backup_folder.h"
#include "host/backup/backup_lists.h"
#include "host/library/events.h"
#include "platform/property_list_codec.h"
#include "platform/sync_client.h"

namespace appsync::host {

struct BackupOptions {
  /// Replace an older backup even by one that lacks an application of it.
  bool allowMissing = false;
};

/// One backup of a phone: its applications one after another, then what belongs to all of them. An
/// application that cannot be saved whole is left out and harms no other; but an older backup that
/// holds it stays. Borrows everything; used once, by one thread.
class BackupRun {
 public:
  BackupRun(SyncClient& client, const Phone& phone, BackupWriter& writer, Reporter& reporter,
            Interruption& interruption);
  ~BackupRun();
  BackupRun(const BackupRun&) = delete;
  BackupRun& operator=(const BackupRun&) = delete;

  /// The last event, which it does not report itself. When the backup as a whole fails or is
  /// interrupted, the writer is left unfinished.
  BackupSummary run(const BackupOptions& options = {});

 private:
  [[nodiscard]] bool saveAll(const BackupOptions& options);
  void waitUntilIdle(const std::vector<AppRecord>& applications);
  [[nodiscard]] bool save(const AppRecord& record);
  /// Why the application's data is not in the backup.
  std::optional<std::string> saveData(const AppRecord& record);
  /// False when the older backup would be replaced by one that lacks what it holds.
  bool mayReplaceOlder();
  /// Notes those applications of the older backup that the phone does not list, but has data of.
  void noteUnlisted();
  [[nodiscard]] bool saveLists();
  [[nodiscard]] bool addList(std::string_view name, const PropertyList& list,
                             PropertyListFormat format);
  void reportProgress(const AppRecord& record, std::uint64_t bytes);
  /// Always false.
  bool broken(const std::string& reason);

  SyncClient& client_;
  const Phone& phone_;
  BackupWriter& writer_;
  Reporter& reporter_;
  Interruption& interruption_;
  std::size_t number_ = 0;  ///< of the application being saved, from 1
  std::size_t count_ = 0;
  std::vector<AppRecord> saved_;
  PropertyList::Dictionary entries_;
  BackupSummary summary_;
};

}  // namespace appsync::host
