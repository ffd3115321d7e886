#include "device/apps/demotion.h"

#include <fmt/format.h>

#include <cerrno>

#include "device/apps/idle_application.h"
#include "device/apps/installers.h"
#include "device/apps/removal.h"
#include "device/journal/history.h"
#include "platform/bundle.h"
#include "platform/existence.h"
#include "platform/sync_files.h"

namespace appsync::device {
namespace {

/// Empty when there is none.
std::string iconOf(FileManager& files, const ApplicationRow& installed) {
  const auto info = loadDictionary(files, joinPath(installed.bundlePath(), "Info.plist"));
  const std::string* name = info ? findString(*info, KBBundleIconFile) : nullptr;
  const std::string icon = name ? joinPath(installed.bundlePath(), *name) : std::string();
  if (name && isFile(files, icon)) return icon;
  const std::string artwork = joinPath(installed.container, exchange::ArtworkName);
  return isFile(files, artwork) ? artwork : std::string();
}

bool layPlaceholder(DeviceCore& core, const ApplicationRow& installed,
                    std::optional<Error>* error) {
  InstallDetails details{InstallType::IntentionalDowngrade, std::nullopt, installed.sinf};
  const std::string metadata = joinPath(installed.container, exchange::MetadataName);
  if (!readIfThere(core.files, metadata, details.metadata, error)) return false;
  const PlaceholderFace face{installed.displayName, installed.version,
                             iconOf(core.files, installed)};
  return buildPlaceholder(core, installed.identifier, face, details, error);
}

bool takePackage(DeviceCore& core, const ApplicationRow& installed, std::optional<Error>* error) {
  const bool erased = core.database.change(
      fmt::format("{} could not be demoted", installed.identifier), Database::Commit::OnDisk,
      [&](Connection& database) {
        eraseApplication(database, installed);
        enterInHistory(database, {.event = HistoryEvent::Demoted,
                                  .origin = HistoryOrigin::Person,
                                  .bundleId = installed.identifier,
                                  .version = installed.version});
      },
      error);
  if (erased) core.containers.remove(installed.container);
  return erased;
}

}  // namespace

bool demoteForPerson(DeviceCore& core, const std::string& identifier, std::optional<Error>* error) {
  if (!mayRemove(core, error)) return false;
  const std::optional<IdleApplication> idle = holdIdle(core, identifier, error);
  if (!idle) return false;
  if (idle->row.type == ApplicationTypeSystem) {
    return failWith(error, objection(EPERM, identifier, "belongs to the system"));
  }
  return layPlaceholder(core, idle->row, error) && takePackage(core, idle->row, error);
}

}  // namespace appsync::device
