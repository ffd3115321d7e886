#pragma once

#include <string>
#include <string_view>
#include <vector>

#include "device/state/database.h"

namespace appsync::device {

// The order of the home screen's icons. These throw SQLite::Exception and are used within
// Database's work.

/// An application that has no place yet gets the last one.
void appendToIconOrder(Connection& database, std::string_view identifier);
void removeFromIconOrder(Connection& database, std::string_view identifier);
/// Puts these first, in this order, and all others behind them as they stood.
void adoptIconOrder(Connection& database, const std::vector<std::string>& identifiers);
/// The applications and placeholders on the device, in the order of their icons.
std::vector<std::string> shownIconOrder(Connection& database);

}  // namespace appsync::device
