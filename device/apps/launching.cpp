#include "device/apps/launching.h"

#include <cerrno>

#include "device/apps/idle_application.h"
#include "device/state/application_rows.h"
#include "platform/existence.h"

namespace appsync::device {
namespace {

std::optional<Error> objectionToExecutable(FileManager& files, const ApplicationRow& row) {
  std::optional<Error> error;
  const std::optional<bool> there = isExecutableThere(files, row.bundlePath(), &error);
  if (!there) return error;
  if (*there) return std::nullopt;
  return objection(ENOENT, row.identifier,
                   "cannot be launched: its executable is gone; install it anew");
}

}  // namespace

std::optional<Error> objectionToLaunch(Database& database, FileManager& files,
                                       std::string_view identifier) {
  std::optional<Error> error;
  const auto rows = readApplication(database, identifier, &error);
  if (!rows) return error;
  if (!rows->any()) return objection(ENOENT, identifier, "is not installed");
  if (!rows->installed) return objection(ENOENT, identifier, "is not installed yet");
  if (rows->installed->launchProhibited) return objection(EPERM, identifier, "may not be launched");
  return objectionToExecutable(files, *rows->installed);
}

}  // namespace appsync::device
