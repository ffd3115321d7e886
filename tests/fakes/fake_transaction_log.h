#pragma once

#include <mutex>
#include <string>
#include <vector>

#include "platform/transaction_log.h"
#include "tests/fakes/call_trace.h"

namespace appsync::fakes {

/// Keeps transaction records, and writes them into the trace.
class FakeTransactionLog : public TransactionLog {
 public:
  struct Record {
    std::string scenario;  ///< empty for a step of a coordinated install
    std::optional<std::uint32_t> step;
    std::uint32_t party = 0;
    std::uint32_t phase = 0;
    bool success = false;
    std::string bundleId;
    std::string description;
    bool operator==(const Record&) const = default;
  };

  explicit FakeTransactionLog(CallTrace& trace) : trace_(trace) {}

  void initializeWithLog(const LogHandle& handle) noexcept override {
    trace_.add(TraceCall,
               callText("TransactionLog.initializeWithLog", handle.subsystem, handle.category));
    const std::scoped_lock lock(mutex_);
    handles_.emplace_back(std::string(handle.subsystem), std::string(handle.category));
  }

  void logScenario(std::string_view scenario, std::optional<std::uint32_t> step, bool success,
                   std::string_view bundleId, std::string_view description) noexcept override {
    std::string head = "scenario \"" + std::string(scenario) + "\"";
    if (step) head += " step " + std::to_string(*step);
    keep(head, {std::string(scenario), step, 0, 0, success, std::string(bundleId),
                std::string(description)});
  }

  void logStep(std::uint32_t step, std::uint32_t party, std::uint32_t phase, bool success,
               std::string_view bundleId, std::string_view description) noexcept override {
    const std::string head = "step " + std::to_string(step) + " party " + std::to_string(party) +
                             " phase " + std::to_string(phase);
    keep(head, {{}, step, party, phase, success, std::string(bundleId), std::string(description)});
  }

  std::vector<Record> records() const {
    const std::scoped_lock lock(mutex_);
    return records_;
  }
  /// Subsystem and category of every initialisation.
  std::vector<std::pair<std::string, std::string>> handles() const {
    const std::scoped_lock lock(mutex_);
    return handles_;
  }

 private:
  void keep(const std::string& head, Record record) {
    trace_.add(TraceTransaction, "transaction " + head + (record.success ? " ok " : " failed ") +
                                     record.bundleId + " \"" + record.description + "\"");
    const std::scoped_lock lock(mutex_);
    records_.push_back(std::move(record));
  }

  CallTrace& trace_;
  mutable std::mutex mutex_;
  std::vector<Record> records_;
  std::vector<std::pair<std::string, std::string>> handles_;
};

}  // namespace appsync::fakes
