#include "device/state/database.h"

#include <fmt/format.h>
#include <sqlite3.h>

#include <cerrno>
#include <utility>

namespace appsync::device {
namespace {

struct Reason {
  int errnoValue;
  std::string_view text;
};

Reason reasonOf(int code) {
  switch (code) {
    case SQLITE_FULL:
      return {ENOSPC, "the disk is full"};
    case SQLITE_READONLY:
      return {EROFS, "it can only be read"};
    case SQLITE_BUSY:
    case SQLITE_LOCKED:
      return {EBUSY, "another process is using it"};
    case SQLITE_NOMEM:
      return {ENOMEM, "there is not enough memory"};
    case SQLITE_PERM:
    case SQLITE_AUTH:
      return {EACCES, "it may not be used"};
    case SQLITE_CANTOPEN:
      return {EIO, "it cannot be opened"};
    case SQLITE_CORRUPT:
    case SQLITE_NOTADB:
      return {EIO, "it is damaged"};
    default:
      return {EIO, "it cannot be read or written"};
  }
}

/// While it lives, a commit waits until the write-ahead log is on disk. Between two such commits
/// the log is only written: a crash of the process loses nothing then either, and a progress update
/// costs no disk flush.
class FullSynchronisation {
 public:
  explicit FullSynchronisation(Connection& database) : database_(database) {
    database_.exec("PRAGMA synchronous=FULL");
  }
  ~FullSynchronisation() { database_.tryExec("PRAGMA synchronous=NORMAL"); }
  FullSynchronisation(const FullSynchronisation&) = delete;
  FullSynchronisation& operator=(const FullSynchronisation&) = delete;

 private:
  Connection& database_;
};

}  // namespace

Error errorOf(const SQLite::Exception& exception) {
  const Reason reason = reasonOf(exception.getErrorCode());
  return Error::withDescription(POSIXErrorDomain, reason.errnoValue,
                                fmt::format("the phone's database: {}", reason.text));
}

bool Database::attempt(std::string_view purpose, const std::function<void()>& work,
                       std::optional<Error>* error) noexcept {
  Error reason;
  std::string cause;
  try {
    const Lock lock(mutex_);
    work();
    return true;
  } catch (const Refused& refused) {
    return failWith(error, refused.error);
  } catch (const SQLite::Exception& exception) {
    reason = errorOf(exception);
    cause = exception.what();
  } catch (const std::exception& exception) {
    reason = Error::withDescription(POSIXErrorDomain, EIO, exception.what());
    cause = exception.what();
  }
  log_.write(LogChannel::TWLogCategoryFramework, LogLevel::Error,
             fmt::format("{} (the phone's database: {})", purpose, cause));
  return failWith(error, std::move(reason));
}

bool Database::read(std::string_view purpose, const Work& work,
                    std::optional<Error>* error) noexcept {
  return attempt(
      purpose, [&]() APPSYNC_REQUIRES(mutex_) { work(connection_); }, error);
}

bool Database::change(std::string_view purpose, Commit commit, const Work& work,
                      std::optional<Error>* error) noexcept {
  return attempt(
      purpose,
      [&]() APPSYNC_REQUIRES(mutex_) {
        std::optional<FullSynchronisation> full;
        if (commit == Commit::OnDisk && writable_) full.emplace(connection_);
        SQLite::Transaction transaction(connection_, SQLite::TransactionBehavior::IMMEDIATE);
        work(connection_);
        const bool wasSettled = std::exchange(settled_, false);
        transaction.commit();
        settled_ = wasSettled;  // not more: a change may write nothing
      },
      error);
}

bool Database::settle(std::optional<Error>* error) noexcept {
  return attempt(
      "it is not sure what the database will hold when it is next opened",
      [&]() APPSYNC_REQUIRES(mutex_) {
        if (settled_) return;
        const FullSynchronisation full(connection_);
        SQLite::Transaction transaction(connection_, SQLite::TransactionBehavior::IMMEDIATE);
        // Any page will do. This one is written even with what it holds already.
        const int version = connection_.execAndGet("PRAGMA user_version").getInt();
        connection_.exec(fmt::format("PRAGMA user_version={}", version));
        transaction.commit();
        settled_ = true;
      },
      error);
}

}  // namespace appsync::device
