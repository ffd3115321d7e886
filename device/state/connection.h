#pragma once

#include <SQLiteCpp/SQLiteCpp.h>

#include <map>
#include <memory>
#include <string>

namespace appsync::device {

/// A connection that keeps the statements it has prepared: to prepare one costs more than to run
/// it. Used by one thread at a time.
class Connection : public SQLite::Database {
 public:
  using SQLite::Database::Database;

  /// A statement that nobody else runs. Throws SQLite::Exception.
  std::unique_ptr<SQLite::Statement> prepare(const char* sql);
  /// Takes back a statement that is no longer run.
  void giveBack(std::unique_ptr<SQLite::Statement> statement) noexcept;

  /// From now on each statement is prepared anew: for whoever watches that.
  void keepNothing();

 private:
  /// One by its text; nullptr while it is run.
  std::map<std::string, std::unique_ptr<SQLite::Statement>, std::less<>> kept_;
  bool keeps_ = true;
};

}  // namespace appsync::device
