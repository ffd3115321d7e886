#include "tests/device/failing_log.h"

#include <sqlite3.h>

#include <atomic>

namespace appsync::device {
namespace {

enum class State { Works, Falters, FillsUp, IsFull };
std::atomic<State> state = State::Works;

sqlite3_vfs* systemFiles = nullptr;
sqlite3_vfs files;
sqlite3_io_methods systemLog;
sqlite3_io_methods failingLog;

int syncLog(sqlite3_file* file, int flags) {
  if (state == State::Works) return systemLog.xSync(file, flags);
  state = state == State::Falters ? State::Works : State::IsFull;
  return SQLITE_IOERR_FSYNC;
}

int writeLog(sqlite3_file* file, const void* bytes, int size, sqlite3_int64 offset) {
  return state == State::IsFull ? SQLITE_FULL : systemLog.xWrite(file, bytes, size, offset);
}

int openFile(sqlite3_vfs*, const char* name, sqlite3_file* file, int flags, int* result) {
  const int status = systemFiles->xOpen(systemFiles, name, file, flags, result);
  if (status == SQLITE_OK && (flags & SQLITE_OPEN_WAL) != 0) {
    systemLog = failingLog = *file->pMethods;
    failingLog.xSync = syncLog;
    failingLog.xWrite = writeLog;
    file->pMethods = &failingLog;
  }
  return status;
}

}  // namespace

void FailingLog::prepare() {
  if (systemFiles) return;
  systemFiles = sqlite3_vfs_find(nullptr);
  files = *systemFiles;
  files.zName = "failing";
  files.xOpen = openFile;
  sqlite3_vfs_register(&files, 1);
}

FailingLog::FailingLog(Disk disk) {
  state = disk == Disk::Falters ? State::Falters : State::FillsUp;
}
FailingLog::~FailingLog() { state = State::Works; }

}  // namespace appsync::device
