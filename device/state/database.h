#pragma once

#include <concepts>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <type_traits>
#include <vector>

#include "device/state/connection.h"
#include "platform/bytes.h"
#include "platform/error.h"
#include "platform/log.h"
#include "platform/mutex.h"

namespace appsync::device {

/// A prepared statement with its arguments. Throws SQLite::Exception; used within Database's work.
class Query {
 public:
  template <typename... Arguments>
  Query(Connection& database, const char* sql, const Arguments&... arguments)
      : database_(database), statement_(database.prepare(sql)) {
    int index = 0;
    (bind(++index, arguments), ...);
  }
  ~Query() { database_.giveBack(std::move(statement_)); }
  Query(const Query&) = delete;
  Query& operator=(const Query&) = delete;

  /// Steps to the next row; false when there is none.
  bool next() { return statement_->executeStep(); }
  /// What `read` makes of each row that is left.
  template <typename Read>
  auto all(const Read& read) {
    std::vector<std::invoke_result_t<Read, const Query&>> rows;
    while (next()) rows.push_back(read(*this));
    return rows;
  }
  /// The first column of each row that is left.
  std::vector<std::string> texts() {
    return all([](const Query& row) { return row.text(0); });
  }
  /// Runs a statement that gives no rows; the number of rows it changed.
  int run() { return statement_->exec(); }

  // Columns of the current row, from 0.
  std::int64_t integer(int column) const { return statement_->getColumn(column).getInt64(); }
  bool boolean(int column) const { return integer(column) != 0; }
  double real(int column) const { return statement_->getColumn(column).getDouble(); }
  std::string text(int column) const { return statement_->getColumn(column).getString(); }
  template <typename Enumeration>
  Enumeration as(int column) const {
    return static_cast<Enumeration>(integer(column));
  }
  /// The columns from `first` on, each into a value of its type.
  template <typename... Values>
  void take(int first, Values&... values) const {
    (read(first++, values), ...);
  }

 private:
  void read(int column, bool& value) const { value = boolean(column); }
  void read(int column, double& value) const { value = real(column); }
  void read(int column, std::string& value) const { value = text(column); }
  void read(int column, Bytes& value) const { value = toBytes(text(column)); }
  template <typename Number>
  requires std::integral<Number> || std::is_enum_v<Number>
  void read(int column, Number& value) const { value = as<Number>(column); }
  template <typename Value>
  void read(int column, std::optional<Value>& value) const {
    value.reset();
    if (!statement_->isColumnNull(column)) read(column, value.emplace());
  }

  void bind(int index, std::nullopt_t) { statement_->bind(index); }
  void bind(int index, std::string_view text) { statement_->bind(index, std::string(text)); }
  void bind(int index, const char* text) { bind(index, std::string_view(text)); }
  void bind(int index, const std::string& text) { statement_->bind(index, text); }
  void bind(int index, double value) { statement_->bind(index, value); }
  void bind(int index, const Bytes& bytes) {
    statement_->bind(index, bytes.data(), static_cast<int>(bytes.size()));
  }
  template <typename Number>
  requires std::integral<Number> || std::is_enum_v<Number>
  void bind(int index, Number value) { statement_->bind(index, static_cast<std::int64_t>(value)); }
  template <typename Value>
  void bind(int index, const std::optional<Value>& value) {
    value ? bind(index, *value) : bind(index, std::nullopt);
  }

  Connection& database_;
  std::unique_ptr<SQLite::Statement> statement_;
};

/// Thrown by work to roll it back and give its caller this error.
struct Refused {
  Error error;
};

/// The connection to a device's database. Thread-safe: one piece of work runs at a time, so work
/// must not call back into the database. Failures are logged and become errors; nothing throws.
class Database {
 public:
  using Work = std::function<void(Connection&)>;

  enum class Commit {
    Ordinary,  ///< survives the end of the process; a power failure may undo the last changes
    OnDisk     ///< on disk when the call returns, with all changes before it
  };

  Database(Connection connection, bool writable, Log& log)
      : connection_(std::move(connection)), writable_(writable), log_(log) {}

  bool writable() const { return writable_; }

  /// `purpose` names the work in the log: "the policies could not be read".
  [[nodiscard]] bool read(std::string_view purpose, const Work& work,
                          std::optional<Error>* error = nullptr) noexcept;
  /// What the work finds; nullopt, with an error, when it fails.
  template <typename LookUp>
  [[nodiscard]] auto lookUp(std::string_view purpose, const LookUp& work,
                            std::optional<Error>* error = nullptr) noexcept {
    std::optional<std::invoke_result_t<LookUp, Connection&>> found;
    const auto find = [&](Connection& database) { found.emplace(work(database)); };
    if (!read(purpose, find, error)) found.reset();
    return found;
  }
  /// Runs the work in one transaction. False: the change does not hold, and never will once
  /// `settle` says so.
  [[nodiscard]] bool change(std::string_view purpose, Commit commit, const Work& work,
                            std::optional<Error>* error = nullptr) noexcept;

  /// A commit whose last flush fails is undone, but stands in the write-ahead log: whoever opens
  /// the database next may find it made. Writes over it, if there may be such, and is true when no
  /// failed change can come back. Until then nothing may be removed that one of them names.
  [[nodiscard]] bool settle(std::optional<Error>* error = nullptr) noexcept;

 private:
  /// Runs work with mutex_ held.
  [[nodiscard]] bool attempt(std::string_view purpose, const std::function<void()>& work,
                             std::optional<Error>* error) noexcept;

  Mutex mutex_;
  Connection connection_ APPSYNC_GUARDED_BY(mutex_);
  const bool writable_;
  /// At first not, for a process may have been killed.
  bool settled_ APPSYNC_GUARDED_BY(mutex_) = false;
  Log& log_;
};

/// What SQLite found, in plain words, with the system's error number that says it best.
Error errorOf(const SQLite::Exception& exception);

}  // namespace appsync::device
