#include "device/state/database.h"

#include <fmt/format.h>
#include <sqlite3.h>

#include <cerrno>

namespace appsync::device {
namespace {

int systemError(int code) {
  switch (code) {
    case SQLITE_FULL:
      return ENOSPC;
    case SQLITE_READONLY:
      return EROFS;
    case SQLITE_BUSY:
    case SQLITE_LOCKED:
      return EBUSY;
    case SQLITE_NOMEM:
      return ENOMEM;
    case SQLITE_PERM:
    case SQLITE_AUTH:
      return EACCES;
    default:
      return EIO;
  }
}

/// While it lives, a commit waits until the write-ahead log is on disk. Between two such commits
/// the log is only written: a crash of the process loses nothing then either, and a progress update
/// costs no disk flush.
class FullSynchronisation {
 public:
  explicit FullSynchronisation(SQLite::Database& database) : database_(database) {
    database_.exec("PRAGMA synchronous=FULL");
  }
  ~FullSynchronisation() { database_.tryExec("PRAGMA synchronous=NORMAL"); }
  FullSynchronisation(const FullSynchronisation&) = delete;
  FullSynchronisation& operator=(const FullSynchronisation&) = delete;

 private:
  SQLite::Database& database_;
};

}  // namespace

std::optional<std::string> Query::optionalText(int column) const {
  if (isNull(column)) return std::nullopt;
  return text(column);
}

std::optional<Bytes> Query::optionalBytes(int column) const {
  if (isNull(column)) return std::nullopt;
  return toBytes(text(column));
}

Error errorOf(const SQLite::Exception& exception) {
  return Error::withDescription(POSIXErrorDomain, systemError(exception.getErrorCode()),
                                fmt::format("the device's database: {}", exception.what()));
}

bool Database::attempt(std::string_view purpose, const std::function<void()>& work,
                       std::optional<Error>* error) noexcept {
  Error reason;
  try {
    const std::lock_guard lock(mutex_);
    work();
    return true;
  } catch (const Refused& refused) {
    setError(error, refused.error);
    return false;
  } catch (const SQLite::Exception& exception) {
    reason = errorOf(exception);
  } catch (const std::exception& exception) {
    reason = Error::withDescription(POSIXErrorDomain, EIO, exception.what());
  }
  log_.write(LogChannel::TWLogCategoryFramework, LogLevel::Error,
             fmt::format("{} ({})", purpose, reason.localizedDescription()));
  setError(error, std::move(reason));
  return false;
}

bool Database::read(std::string_view purpose, const Work& work,
                    std::optional<Error>* error) noexcept {
  return attempt(
      purpose, [&] { work(connection_); }, error);
}

bool Database::change(std::string_view purpose, Commit commit, const Work& work,
                      std::optional<Error>* error) noexcept {
  return attempt(
      purpose,
      [&] {
        std::optional<FullSynchronisation> full;
        if (commit == Commit::OnDisk && writable_) full.emplace(connection_);
        SQLite::Transaction transaction(connection_, SQLite::TransactionBehavior::IMMEDIATE);
        work(connection_);
        transaction.commit();
      },
      error);
}

}  // namespace appsync::device
