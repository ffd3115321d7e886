#include "device/apps/application_data.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <stdio.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <new>
#include <tuple>

#include "base/directory_tree.h"
#include "base/temporary_file.h"
#include "base/text.h"
#include "device/apps/idle_application.h"
#include "device/apps/removal.h"
#include "device/journal/history.h"
#include "device/state/application_rows.h"
#include "packages/data_archive.h"

namespace appsync::device {
namespace {

std::string parentOf(const std::string& path) { return path.substr(0, path.rfind('/')); }
std::string nameOf(const std::string& path) { return path.substr(path.rfind('/') + 1); }

/// Whether what a restore has still to give back is the application's data; nullopt with an error.
std::optional<bool> ownsWaitingData(DeviceCore& core, std::string_view identifier,
                                    std::optional<Error>* error) {
  const auto rows = readApplication(core.database, identifier, error);
  if (!rows) return std::nullopt;
  return rows->installed ? false : core.containers.dataWaits(identifier, error);
}

std::optional<Error> save(DeviceCore& core, const std::string& identifier, const DataSink& sink) {
  const KeyedMutex::Guard guard(core.applicationLocks, identifier);
  std::optional<Error> error;
  const std::optional<bool> waiting = ownsWaitingData(core, identifier, &error);
  if (!waiting) return error;
  const std::string path =
      *waiting ? Containers::waitingDataPath(identifier) : Containers::dataPath(identifier);
  const FileDescriptor parent = core.handles.openDirectory(parentOf(path), &error);
  const FileDescriptor directory(parent ? ::openat(parent.get(), identifier.c_str(),
                                                   O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC)
                                        : -1);
  if (!directory) {
    if (parent) error = Error::posix(errno, path);
    return error->code == ENOENT ? std::nullopt : error;  // it never had any
  }
  return writeDataArchive(directory.get(), sink, [&](std::string_view skipped) {
    core.log.write(LogChannel::TWLogCategoryFramework, LogLevel::Default,
                   fmt::format("{} is left out of the backup: it is no file, folder or link",
                               shown(joinPath(path, skipped))));
  });
}

/// A folder under a temporary name, which disappears with the object whatever stands there then.
class UnfinishedFolder {
 public:
  explicit UnfinishedFolder(int parent) : parent_(parent), name_(makeTemporaryName()) {
    if (::mkdirat(parent, name_.c_str(), 0755) != 0) return;
    folder_ = FileDescriptor(
        ::openat(parent, name_.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
  }
  ~UnfinishedFolder() { std::ignore = removeTree(parent_, name_); }
  UnfinishedFolder(const UnfinishedFolder&) = delete;
  UnfinishedFolder& operator=(const UnfinishedFolder&) = delete;

  int fd() const { return folder_.get(); }

  /// Takes the name, in one step and on the disk; what had it disappears with this object. False
  /// with errno set; what has this name is then as it was.
  bool takePlaceOf(const std::string& name) {
    unsigned way = RENAME_NOREPLACE;
    if (!move(name_, name, way)) {
      way = RENAME_EXCHANGE;
      if (errno != EEXIST || !move(name_, name, way)) return false;
    }
    if (syncToDisk(parent_)) return true;
    const int failure = errno;
    move(name, name_, way);
    errno = failure;
    return false;
  }

 private:
  bool move(const std::string& from, const std::string& to, unsigned way) const {
    return ::renameat2(parent_, from.c_str(), parent_, to.c_str(), way) == 0;
  }

  const int parent_;
  const std::string name_;
  FileDescriptor folder_;
};

/// Lays an archive out in the place of the folder that bears the application's name; `entries`
/// tells how much that was. One without entries takes the place only of what is to stay a folder.
std::optional<Error> layOut(DeviceCore& core, const std::string& path, const DataSource& source,
                            bool evenEmpty, std::uint64_t& entries) {
  std::optional<Error> error;
  if (!core.files.createDirectory(parentOf(path), true, {}, &error)) return error;
  const FileDescriptor parent = core.handles.openDirectory(parentOf(path), &error);
  if (!parent) return error;
  UnfinishedFolder folder(parent.get());
  if (folder.fd() < 0) return Error::posix(errno, path);
  if (auto refusal = readDataArchive(source, folder.fd(), entries)) return refusal;
  if (entries == 0 && !evenEmpty) return std::nullopt;
  // One flush for all of it, before it can be seen.
  if (syncFileSystem(folder.fd()) && folder.takePlaceOf(nameOf(path))) return std::nullopt;
  return Error::posix(errno, path);
}

std::optional<Error> restore(DeviceCore& core, const std::string& identifier,
                             const DataSource& source) {
  const KeyedMutex::Guard guard(core.applicationLocks, identifier);
  std::optional<Error> failure;
  if (!removeAbandonedData(core, identifier, &failure)) return failure;
  const std::string path = Containers::waitingDataPath(identifier);
  std::uint64_t entries = 0;
  if (auto error = layOut(core, path, source, false, entries)) return error;
  if (entries > 0 || core.containers.removeWaitingData(identifier, &failure)) return std::nullopt;
  return failure;
}

/// The data is in its place whether or not this can be written.
void enterOverwriting(DeviceCore& core, const ApplicationRow& application) {
  const HistoryEntry entry{.event = HistoryEvent::DataOverwritten,
                           .bundleId = application.identifier,
                           .version = application.version};
  std::ignore =
      core.database.change("the history lacks an overwriting of data", Database::Commit::Ordinary,
                           [&](Connection& database) { enterInHistory(database, entry); });
}

std::optional<Error> overwrite(DeviceCore& core, const std::string& identifier,
                               const DataSource& source) {
  const KeyedMutex::Guard guard(core.applicationLocks, identifier);
  std::optional<Error> error;
  const std::optional<IdleApplication> idle = holdIdle(core, identifier, &error);
  if (!idle) return error;
  std::uint64_t entries = 0;
  if (auto failure = layOut(core, Containers::dataPath(identifier), source, true, entries)) {
    return failure;
  }
  enterOverwriting(core, idle->row);
  return std::nullopt;
}

/// Runs the work, which must not throw.
template <typename Work>
bool guarded(std::optional<Error>* error, Work work) {
  std::optional<Error> reason;
  try {
    reason = work();
  } catch (const std::bad_alloc&) {
    reason = Error::posix(ENOMEM);
  }
  if (!reason) return true;
  return failWith(error, std::move(*reason));
}

}  // namespace

bool saveApplicationData(DeviceCore& core, std::string_view identifier, const DataSink& sink,
                         std::optional<Error>* error) {
  return guarded(error, [&] { return save(core, std::string(identifier), sink); });
}

bool restoreApplicationData(DeviceCore& core, std::string_view identifier, const DataSource& source,
                            std::optional<Error>* error) {
  return guarded(error, [&] { return restore(core, std::string(identifier), source); });
}

bool overwriteApplicationData(DeviceCore& core, std::string_view identifier,
                              const DataSource& source, std::optional<Error>* error) {
  return guarded(error, [&] { return overwrite(core, std::string(identifier), source); });
}

}  // namespace appsync::device
