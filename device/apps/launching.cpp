#include "device/apps/launching.h"

#include <fmt/format.h>

#include <cerrno>

#include "device/state/application_rows.h"

namespace appsync::device {

std::optional<Error> objectionToLaunch(Database& database, std::string_view identifier) {
  ApplicationRows rows;
  std::optional<Error> error;
  const bool read = database.read(
      "the registry could not be read",
      [&](SQLite::Database& connection) { rows = findApplication(connection, identifier); },
      &error);
  if (!read) return error;
  const auto refuse = [&](int code, std::string_view reason) {
    return Error::withDescription(POSIXErrorDomain, code, fmt::format("{} {}", identifier, reason));
  };
  if (!rows.any()) return refuse(ENOENT, "is not installed");
  if (!rows.installed) return refuse(ENOENT, "is not installed yet");
  if (rows.installed->launchProhibited) return refuse(EPERM, "may not be launched");
  return std::nullopt;
}

}  // namespace appsync::device
