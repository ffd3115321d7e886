#include "device/apps/idle_application.h"

#include <fmt/format.h>

#include <cerrno>

namespace appsync::device {
namespace {

/// The placeholder of a demotion that broke off brings no update.
bool isUpdating(const ApplicationRows& rows) {
  return rows.placeholder && rows.placeholder->installType != InstallType::IntentionalDowngrade;
}

}  // namespace

std::optional<IdleApplication> holdIdle(DeviceCore& core, const std::string& identifier,
                                        std::optional<Error>* error) {
  const auto refuse = [&](Error reason) {
    setError(error, std::move(reason));
    return std::nullopt;
  };
  auto rows = readApplication(core.database, identifier, error);
  if (!rows) return std::nullopt;
  if (!rows->installed) return refuse(objection(ENOENT, identifier, "is not installed"));
  if (isUpdating(*rows)) return refuse(objection(EBUSY, identifier, "is just being updated"));
  Foreground::HoldResult held = core.foreground.hold(identifier);
  if (held.isRunning) return refuse(objection(EBUSY, identifier, "is open; close it first"));
  if (!held.hold) return refuse(Error::posix(EIO, identifier));
  return IdleApplication{std::move(*rows->installed), std::move(held.hold)};
}

Error objection(int code, std::string_view identifier, std::string_view reason) {
  return Error::withDescription(POSIXErrorDomain, code, fmt::format("{} {}", identifier, reason));
}

}  // namespace appsync::device
