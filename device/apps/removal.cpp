#include "device/apps/removal.h"

#include <fmt/format.h>

#include <cerrno>
#include <tuple>

#include "device/apps/idle_application.h"
#include "device/apps/installer_service.h"
#include "device/apps/installs.h"
#include "device/home/icon_order.h"
#include "device/journal/history.h"
#include "device/state/application_rows.h"
#include "device/state/device_policy.h"

namespace appsync::device {
namespace {

Refused notInstalled(std::string_view identifier) {
  return {objection(ENOENT, identifier, "is not installed")};
}

/// What the phone has of an application beside its rows.
void forgetApplication(Connection& database, std::string_view identifier) {
  removeFromIconOrder(database, identifier);
  abandonData(database, identifier);
}

void eraseInstalled(Connection& database, const ApplicationRow& installed) {
  if (installed.type == ApplicationTypeSystem) {
    throw Refused{
        objection(EPERM, installed.identifier, "belongs to the system and cannot be removed")};
  }
  eraseApplication(database, installed);
  recordUninstalled(database, installed.identifier);
  forgetApplication(database, installed.identifier);
}

void erasePlaceholder(Connection& database, const ApplicationRow& placeholder) {
  eraseApplication(database, placeholder);
  endInstall(database, placeholder.identifier, InstallState::Canceled);
}

void enterRemoval(Connection& database, const ApplicationRow& removed, HistoryOrigin origin) {
  enterInHistory(database, {.event = HistoryEvent::Removed,
                            .origin = origin,
                            .bundleId = removed.identifier,
                            .version = removed.version});
}

/// Without it the application is as it was before an install that did not come to its end.
bool isMerelyOfAnInstall(const ApplicationRows& present) {
  return present.installed || present.placeholder->installType == InstallType::Sync;
}

void removeFiles(DeviceCore& core, const std::string& identifier, const ApplicationRows& removed) {
  if (removed.placeholder) core.containers.remove(removed.placeholder->container);
  if (removed.installed) {
    // Its files go whether or not its mark does; the mark goes when the device is next opened.
    std::ignore = core.foreground.quit(identifier, nullptr);
    core.containers.remove(removed.installed->container);
  }
  // What stays is on record as abandoned, and goes when the device is next opened.
  std::ignore = removeAbandonedData(core, identifier, nullptr);
}

std::string purpose(std::string_view identifier) {
  return fmt::format("{} could not be taken out of the registry", identifier);
}

}  // namespace

bool removeForClient(DeviceCore& core, const std::string& identifier, bool placeholderOnly,
                     std::optional<Error>* error) {
  ApplicationRows removed;
  const bool erased = core.database.change(
      purpose(identifier), Database::Commit::OnDisk,
      [&](Connection& database) {
        ApplicationRows present = findApplication(database, identifier);
        if (present.placeholder) {
          erasePlaceholder(database, *present.placeholder);
          if (!isMerelyOfAnInstall(present)) {
            enterRemoval(database, *present.placeholder, HistoryOrigin::Sync);
            if (!placeholderOnly) forgetApplication(database, identifier);
          }
          removed.placeholder = std::move(present.placeholder);
        } else if (present.installed && !placeholderOnly) {
          eraseInstalled(database, *present.installed);
          enterRemoval(database, *present.installed, HistoryOrigin::Sync);
          removed.installed = std::move(present.installed);
        } else {
          throw notInstalled(identifier);
        }
      },
      error);
  if (!erased) return false;
  removeFiles(core, identifier, removed);
  core.observers.installsChanged();
  return true;
}

bool mayRemove(DeviceCore& core, std::optional<Error>* error) {
  const PolicyValue wish =
      StoredDevicePolicy(core.database).effectiveBoolValue(PolicySetting::AppRemovalAllowed);
  if (wish != PolicyValue::ExplicitlyNo) return true;
  return failWith(error,
                  Error::withDescription(POSIXErrorDomain, EPERM,
                                         "removing applications is forbidden on this phone"));
}

bool removeForPerson(DeviceCore& core, const std::string& identifier, std::optional<Error>* error) {
  if (!mayRemove(core, error)) return false;
  ApplicationRows removed;
  bool brokenOff = false;
  const bool erased = core.database.change(
      purpose(identifier), Database::Commit::OnDisk,
      [&](Connection& database) {
        removed = findApplication(database, identifier);
        if (!removed.any()) throw notInstalled(identifier);
        brokenOff = removed.placeholder && isInstalling(database, identifier);
        enterRemoval(database, *(removed.installed ? removed.installed : removed.placeholder),
                     HistoryOrigin::Person);
        if (removed.installed) eraseInstalled(database, *removed.installed);
        if (!removed.placeholder) return;
        erasePlaceholder(database, *removed.placeholder);
        recordUninstalled(database, identifier);
        forgetApplication(database, identifier);
      },
      error);
  if (!erased) return false;
  removeFiles(core, identifier, removed);
  if (brokenOff) core.observers.installsCancelled({removed.placeholder->record()});
  core.observers.installsChanged();
  return true;
}

bool forgetWaitingData(DeviceCore& core, const std::string& identifier,
                       std::optional<Error>* error) {
  const auto rows = readApplication(core.database, identifier, error);
  return rows && !rows->any() && core.containers.removeWaitingData(identifier, error);
}

void abandonData(Connection& database, std::string_view name) {
  Query(database, "INSERT OR REPLACE INTO abandoned_data VALUES (?)", name).run();
}

std::optional<bool> isAbandoned(DeviceCore& core, std::string_view name,
                                std::optional<Error>* error) {
  const auto isNamed = [&](Connection& database) {
    return Query(database, "SELECT 1 FROM abandoned_data WHERE identifier = ?", name).next();
  };
  return core.database.lookUp("the list of abandoned data could not be read", isNamed, error);
}

bool removeAbandonedData(DeviceCore& core, const std::string& name, std::optional<Error>* error) {
  const std::optional<bool> abandoned = isAbandoned(core, name, error);
  if (!abandoned || !*abandoned) return abandoned.has_value();
  if (!core.containers.removeData(Containers::asideName(name), error) ||
      !core.containers.removeData(name, error) || !core.containers.removeWaitingData(name, error)) {
    return false;
  }
  return core.database.change(
      // On disk before the application can have new data, which a list come back would name.
      "the list of abandoned data could not be changed", Database::Commit::OnDisk,
      [&](Connection& database) {
        Query(database, "DELETE FROM abandoned_data WHERE identifier = ?", name).run();
      },
      error);
}

}  // namespace appsync::device
