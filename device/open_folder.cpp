#include "device/open_folder.h"

#include "device/schema.h"

namespace appsync::device {

namespace {

/// False with an error. Nobody guesses: with the other answer the phone would work in another way.
bool readOptions(OpenFolder& opened, DeviceError& error) {
  std::optional<Error> reason;
  const bool read = opened.database->read(
      "the phone's options could not be read",
      [&](Connection& connection) {
        Query query(connection, "SELECT value FROM settings WHERE key = 'coordination'");
        opened.options.coordination = query.next() && query.boolean(0);
      },
      &reason);
  if (read) return true;
  error = deviceError(DeviceProblem::Unusable, opened.paths.folder, reason->localizedDescription(),
                      "try again, or check the disk");
  return false;
}

}  // namespace

std::optional<OpenFolder> openFolder(const std::filesystem::path& folder, Access access,
                                     DeviceError& error) {
  OpenFolder opened{DevicePaths(folder), nullptr, nullptr, nullptr, {}};
  const DevicePaths& paths = opened.paths;
  if (!checkDeviceFolder(paths, error)) return std::nullopt;
  if (access == Access::Write) {
    opened.lock = WriteLock::take(paths, error);
    if (!opened.lock) return std::nullopt;
  }
  opened.log = std::make_unique<LogFiles>(paths.log, access == Access::Write);
  opened.database = openDatabase(paths.folder, paths.database, access, *opened.log, error);
  if (!opened.database) return std::nullopt;
  if (!std::filesystem::is_directory(paths.root)) {
    error = damagedDevice(paths.folder, "its files are missing");
    return std::nullopt;
  }
  if (!readOptions(opened, error)) return std::nullopt;
  return opened;
}

}  // namespace appsync::device
