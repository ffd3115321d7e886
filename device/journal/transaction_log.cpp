#include "device/journal/transaction_log.h"

#include "device/state/clock.h"

namespace appsync::device {
namespace {

TransactionRecord recordOf(const Query& query) {
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
  return record;
}

}  // namespace

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
        Query(database, "DELETE FROM transactions WHERE number <= last_insert_rowid() - ?",
              TransactionRecordsKept)
            .run();
      });
}

std::vector<TransactionRecord> StoredTransactionLog::recordsAfter(
    std::int64_t number, std::optional<Error>* error) noexcept {
  std::vector<TransactionRecord> records;
  const bool read = database_.read(
      "the transaction records could not be read",
      [&](SQLite::Database& database) {
        Query query(database,
                    "SELECT number, time, scenario, step, party, phase, success, identifier, "
                    "description FROM transactions WHERE number > ? ORDER BY number",
                    number);
        while (query.next()) records.push_back(recordOf(query));
      },
      error);
  if (!read) records.clear();
  return records;
}

}  // namespace appsync::device
