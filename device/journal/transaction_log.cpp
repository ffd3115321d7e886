#include "device/journal/transaction_log.h"

#include "device/base/clock.h"

namespace appsync::device {

void StoredTransactionLog::initializeWithLog(const LogHandle& handle) noexcept {
  const std::lock_guard lock(mutex_);
  subsystem_ = handle.subsystem;
  category_ = handle.category;
}

void StoredTransactionLog::logScenario(std::string_view scenario, std::optional<std::uint32_t> step,
                                       bool success, std::string_view bundleId,
                                       std::string_view description) noexcept {
  TransactionRecord record;
  record.scenario = scenario;
  record.step = step;
  record.success = success;
  record.bundleId = bundleId;
  record.description = description;
  keep(record);
}

void StoredTransactionLog::logStep(std::uint32_t step, std::uint32_t party, std::uint32_t phase,
                                   bool success, std::string_view bundleId,
                                   std::string_view description) noexcept {
  TransactionRecord record;
  record.step = step;
  record.party = party;
  record.phase = phase;
  record.success = success;
  record.bundleId = bundleId;
  record.description = description;
  keep(record);
}

void StoredTransactionLog::keep(const TransactionRecord& record) noexcept {
  const std::lock_guard lock(mutex_);
  database_.change(
      "a transaction record could not be kept", Database::Commit::Ordinary,
      [&](SQLite::Database& database) {
        Query(database,
              "INSERT INTO transactions (time, subsystem, category, scenario, step, party, phase, "
              "success, identifier, description) VALUES (?, ?, ?, ?, ?, ?, ?, ?, ?, ?)",
              secondsSince1970(), subsystem_, category_, record.scenario, record.step, record.party,
              record.phase, record.success, record.bundleId, record.description)
            .run();
      });
}

std::vector<TransactionRecord> StoredTransactionLog::recordsAfter(std::int64_t number) noexcept {
  std::vector<TransactionRecord> records;
  database_.read("the transaction records could not be read", [&](SQLite::Database& database) {
    Query query(database,
                "SELECT number, time, scenario, step, party, phase, success, identifier, "
                "description FROM transactions WHERE number > ? ORDER BY number",
                number);
    while (query.next()) {
      TransactionRecord record;
      record.number = query.integer(0);
      record.time = query.real(1);
      record.scenario = query.text(2);
      if (!query.isNull(3)) record.step = query.as<std::uint32_t>(3);
      record.party = query.as<std::uint32_t>(4);
      record.phase = query.as<std::uint32_t>(5);
      record.success = query.boolean(6);
      record.bundleId = query.text(7);
      record.description = query.text(8);
      records.push_back(std::move(record));
    }
  });
  return records;
}

}  // namespace appsync::device
