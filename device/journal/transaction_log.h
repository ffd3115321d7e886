#pragma once

#include <string>
#include <vector>

#include "device/journal/records.h"
#include "device/state/database.h"
#include "platform/mutex.h"
#include "platform/transaction_log.h"

namespace appsync::device {

/// Older records go.
inline constexpr std::int64_t TransactionRecordsKept = 20'000;

/// Install milestones, kept in the device's database.
class StoredTransactionLog final : public TransactionLog {
 public:
  explicit StoredTransactionLog(Database& database) : database_(database) {}

  void initializeWithLog(const LogHandle& handle) noexcept override;
  void logScenario(std::string_view scenario, std::optional<std::uint32_t> step, bool success,
                   std::string_view bundleId, std::string_view description) noexcept override;
  void logStep(std::uint32_t step, std::uint32_t party, std::uint32_t phase, bool success,
               std::string_view bundleId, std::string_view description) noexcept override;

  /// The records after `number`, oldest first. None, with an error, when they cannot be read.
  [[nodiscard]] std::vector<TransactionRecord> recordsAfter(std::int64_t number,
                                                            std::optional<Error>* error) noexcept;

 private:
  void keep(const TransactionRecord& record) noexcept;

  Database& database_;
  Mutex mutex_;
  // Who writes the records that come.
  std::string subsystem_ APPSYNC_GUARDED_BY(mutex_);
  std::string category_ APPSYNC_GUARDED_BY(mutex_);
};

}  // namespace appsync::device
