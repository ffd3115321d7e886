#pragma once

#include <cstdint>
#include <optional>
#include <vector>

#include "device/journal/records.h"
#include "device/state/database.h"

namespace appsync::device {

/// Older entries go.
inline constexpr std::int64_t HistoryEntriesKept = 10'000;

/// What happened to the device's applications, one entry an application and event.
void makeHistoryTable(Connection& database);

/// Belongs into the transaction that brings about what the entry tells; number and time are filled
/// in. Throws SQLite::Exception.
void enterInHistory(Connection& database, const HistoryEntry& entry);

/// Oldest first. None, with an error, when it cannot be read.
[[nodiscard]] std::vector<HistoryEntry> readHistory(Database& database,
                                                    std::optional<Error>* error);

}  // namespace appsync::device
