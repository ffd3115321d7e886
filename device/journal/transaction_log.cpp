#include "device/journal/transaction_log.h"

#include <tuple>

#include "device/state/clock.h"

namespace appsync::device {
namespace {

TransactionRecord recordOf(const Query& query) {
  TransactionRecord record;
  query.take(0, record.number, record.time, record.scenario, record.step, record.party,
             record.phase, record.success, record.bundleId, record.description);
  return record;
}

}  // namespace

void StoredTransactionLog::initializeWithLog(const LogHandle& handle) noexcept {
  const Lock lock(mutex_);
  subsystem_ = handle.subsystem;
  category_ = handle.category;
}

void StoredTransactionLog::logScenario(std::string_view scenario, std::optional<std::uint32_t> step,
                                       bool success, std::string_view bundleId,
                                       std::string_view description) noexcept {
  keep({.scenario = std::string(scenario),
        .step = step,
        .success = success,
        .bundleId = std::string(bundleId),
        .description = std::string(description)});
}

void StoredTransactionLog::logStep(std::uint32_t step, std::uint32_t party, std::uint32_t phase,
                                   bool success, std::string_view bundleId,
                                   std::string_view description) noexcept {
  keep({.step = step,
        .party = party,
        .phase = phase,
        .success = success,
        .bundleId = std::string(bundleId),
        .description = std::string(description)});
}

void StoredTransactionLog::keep(const TransactionRecord& record) noexcept {
  const Lock lock(mutex_);
  std::ignore = database_.change(
      "a transaction record could not be kept", Database::Commit::Ordinary,
      [&](Connection& database) APPSYNC_REQUIRES(mutex_) {
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
  const auto laterRecords = [&](Connection& database) {
    return Query(database,
                 "SELECT number, time, scenario, step, party, phase, success, identifier, "
                 "description FROM transactions WHERE number > ? ORDER BY number",
                 number)
        .all(recordOf);
  };
  return database_.lookUp("the transaction records could not be read", laterRecords, error)
      .value_or(std::vector<TransactionRecord>());
}

}  // namespace appsync::device
