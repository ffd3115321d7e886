#pragma once

#include "device/state/database.h"

namespace appsync::device {

/// Makes those of the coordination service's tables that are missing. Throws SQLite::Exception.
void makeCoordinationTables(SQLite::Database& database);

}  // namespace appsync::device
