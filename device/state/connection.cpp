#include "device/state/connection.h"

namespace appsync::device {

std::unique_ptr<SQLite::Statement> Connection::prepare(const char* sql) {
  const auto kept = kept_.find(sql);
  if (kept != kept_.end() && kept->second) return std::move(kept->second);
  auto statement = std::make_unique<SQLite::Statement>(*this, sql);
  if (keeps_ && kept == kept_.end()) kept_.emplace(sql, nullptr);
  return statement;
}

void Connection::giveBack(std::unique_ptr<SQLite::Statement> statement) noexcept {
  const auto kept = kept_.find(statement->getQuery());
  if (kept == kept_.end()) return;
  // Until then it would hold a transaction open, and what was bound to it in memory.
  statement->tryReset();
  statement->clearBindings();
  kept->second = std::move(statement);
}

void Connection::keepNothing() {
  keeps_ = false;
  kept_.clear();
}

}  // namespace appsync::device
