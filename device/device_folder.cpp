#include "device/device_folder.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/file.h>
#include <unistd.h>

#include <cerrno>
#include <system_error>

#include "base/text.h"
#include "device/schema.h"

namespace appsync::device {
namespace {

namespace fs = std::filesystem;

/// Directories that a phone has from the start.
constexpr std::string_view PhoneDirectories[] = {
    "tmp",
    "var/mobile/Containers/Applications",
    "var/mobile/Containers/Data",
    "var/mobile/Library/Logs/Vellum",
    "var/mobile/Library/Preferences",
    "var/mobile/Media/PublicStaging",
};

/// The path without "." parts and a "/" at its end, usable after a change of directory.
fs::path normalized(const fs::path& folder) {
  std::error_code failure;
  const fs::path absolute = fs::absolute(folder, failure);
  fs::path path = (failure ? folder : absolute).lexically_normal();
  return path.has_filename() || !path.has_relative_path() ? path : path.parent_path();
}

DeviceError missing(const fs::path& folder, std::string_view reason) {
  return deviceError(DeviceProblem::Missing, folder, reason, "make one with 'appsync init'");
}

std::error_code lastError() { return {errno, std::system_category()}; }

/// What the lock file says about its holder.
std::string holder(int lockFd) {
  char text[32] = {};
  const ssize_t length = pread(lockFd, text, sizeof text - 1, 0);
  const int pid = length > 0 ? std::atoi(text) : 0;
  return pid > 0 ? fmt::format("process {}", pid) : "another process";
}

/// Whether nothing stands in the folder but, perhaps, the lock of someone about to make a device.
bool isEmpty(const DevicePaths& paths) {
  for (const auto& entry : fs::directory_iterator(paths.folder)) {
    if (entry.path() != paths.lock) return false;
  }
  return true;
}

bool groundIsFree(const DevicePaths& paths, DeviceError& error) {
  if (isEmpty(paths) || fs::exists(paths.unfinished)) return true;
  const bool device = fs::exists(paths.database);
  error = deviceError(DeviceProblem::Exists, paths.folder,
                      device ? "there is a phone already" : "the folder is not empty",
                      device ? "use it, or choose another folder" : "choose a new or empty one");
  return false;
}

/// Takes away what a broken-off making left.
void clearGround(const DevicePaths& paths) {
  for (const fs::path& made : {paths.root, paths.log, paths.foreground}) fs::remove_all(made);
  for (const char* suffix : {"", "-wal", "-shm", "-journal"}) {
    fs::remove(paths.database.native() + suffix);
  }
}

void flushToDisk(const fs::path& folder) {
  const FileDescriptor directory(open(folder.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (!directory || !syncFileSystem(directory.get())) {
    throw fs::filesystem_error("cannot flush", folder, lastError());
  }
}

/// The marker is taken away last, when everything is on disk: until then the folder is no device.
void build(const DevicePaths& paths, const DeviceOptions& options) {
  for (const std::string_view directory : PhoneDirectories) {
    fs::create_directories(paths.root / directory);
  }
  fs::create_directories(paths.log);
  fs::create_directories(paths.foreground);
  createDatabase(paths.database, options);
  flushToDisk(paths.folder);
  fs::remove(paths.unfinished);
  flushToDisk(paths.folder);
}

bool mark(const DevicePaths& paths, DeviceError& error) {
  const FileDescriptor marker(open(paths.unfinished.c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0644));
  if (!marker) error = unusableFolder(paths.folder, lastError().message());
  return static_cast<bool>(marker);
}

}  // namespace

DevicePaths::DevicePaths(const fs::path& givenFolder)
    : folder(normalized(givenFolder)),
      database(folder / "device.db"),
      root(folder / "root"),
      log(folder / "log"),
      foreground(folder / "foreground"),
      lock(folder / "lock"),
      unfinished(folder / "unfinished") {}

DeviceError deviceError(DeviceProblem problem, const fs::path& folder, std::string_view reason,
                        std::string_view remedy) {
  return {problem, printable(fmt::format("{}: {}; {}", folder.native(), reason, remedy))};
}

DeviceError unusableFolder(const fs::path& folder, std::string_view reason) {
  return deviceError(DeviceProblem::Unusable, folder, reason,
                     "check the permissions of the folder and the free space");
}

DeviceError foreignFolder(const fs::path& folder) {
  return deviceError(DeviceProblem::Foreign, folder, "the folder holds something that is no phone",
                     "choose the folder of a phone, or make one with 'appsync init'");
}

DeviceError damagedDevice(const fs::path& folder, std::string_view damage) {
  return deviceError(DeviceProblem::Damaged, folder,
                     fmt::format("the phone is damaged ({})", damage),
                     "restore the folder from a copy, or make a new phone elsewhere");
}

std::unique_ptr<WriteLock> WriteLock::take(const DevicePaths& paths, DeviceError& error) {
  FileDescriptor file(open(paths.lock.c_str(), O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0644));
  if (!file) {
    error = unusableFolder(paths.folder, lastError().message());
    return nullptr;
  }
  if (flock(file.get(), LOCK_EX | LOCK_NB) != 0) {
    error = errno == EWOULDBLOCK
                ? deviceError(DeviceProblem::Busy, paths.folder,
                              fmt::format("the phone is in use by {}", holder(file.get())),
                              "try again when that has ended")
                : unusableFolder(paths.folder, lastError().message());
    return nullptr;
  }
  if (ftruncate(file.get(), 0) != 0 ||
      !writeAll(file.get(), asBytes(fmt::format("{}\n", getpid())))) {
    error = unusableFolder(paths.folder, lastError().message());
    return nullptr;
  }
  return std::unique_ptr<WriteLock>(new WriteLock(std::move(file)));
}

bool makeDeviceFolder(const DevicePaths& paths, const DeviceOptions& options, DeviceError& error) {
  try {
    if (fs::exists(paths.folder) && !fs::is_directory(paths.folder)) {
      error = deviceError(DeviceProblem::Exists, paths.folder, "it is not a folder",
                          "choose a new or empty one");
      return false;
    }
    fs::create_directories(paths.folder);
    if (!groundIsFree(paths, error)) return false;
    const std::unique_ptr<WriteLock> lock = WriteLock::take(paths, error);
    // Looked at again under the lock: another process may have made a device meanwhile.
    if (!lock || !groundIsFree(paths, error) || !mark(paths, error)) return false;
    clearGround(paths);
    build(paths, options);
    return true;
  } catch (const fs::filesystem_error& failure) {
    error = unusableFolder(paths.folder, failure.code().message());
  } catch (const std::exception& failure) {
    error = unusableFolder(paths.folder, failure.what());
  }
  return false;
}

bool checkDeviceFolder(const DevicePaths& paths, DeviceError& error) {
  try {
    if (!fs::exists(paths.folder)) {
      error = missing(paths.folder, "there is no phone");
    } else if (!fs::is_directory(paths.folder)) {
      error = foreignFolder(paths.folder);
    } else if (isEmpty(paths)) {
      error = missing(paths.folder, "the folder is empty");
    } else if (fs::exists(paths.unfinished)) {
      error = missing(paths.folder, "the phone was not made to its end");
    } else if (!fs::exists(paths.database)) {
      error = fs::is_directory(paths.root) ? damagedDevice(paths.folder, "its database is missing")
                                           : foreignFolder(paths.folder);
    } else {
      return true;
    }
  } catch (const fs::filesystem_error& failure) {
    error = unusableFolder(paths.folder, failure.code().message());
  }
  return false;
}

}  // namespace appsync::device
