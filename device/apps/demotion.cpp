#include "device/apps/demotion.h"

#include <fmt/format.h>

#include <cerrno>

#include "device/apps/idle_application.h"
#include "device/apps/installers.h"
#include "device/journal/history.h"
#include "platform/bundle.h"
#include "platform/existence.h"
#include "platform/property_list_codec.h"
#include "platform/sync_files.h"

namespace appsync::device {
namespace {

constexpr std::string_view IconFile = "Icon.png";
constexpr std::string_view BundleParts = "/tmp/com.corvane.demotion";

std::string iconOf(FileManager& files, const ApplicationRow& installed) {
  const auto info = loadDictionary(files, joinPath(installed.bundlePath(), "Info.plist"));
  const std::string* name = info ? findString(*info, KBBundleIconFile) : nullptr;
  const std::string icon = name ? joinPath(installed.bundlePath(), *name) : std::string();
  const auto attributes = icon.empty() ? std::nullopt : files.attributesOfItem(icon);
  return attributes && !attributes->isDirectory
             ? icon
             : joinPath(installed.container, exchange::ArtworkName);
}

/// A placeholder without an icon is better than none.
bool buildBundle(FileManager& files, const ApplicationRow& installed, const std::string& bundle,
                 std::optional<Error>* error) {
  PropertyList::Dictionary info{{std::string(KBBundleIdentifier), installed.identifier},
                                {std::string(KBBundleDisplayName), installed.displayName},
                                {std::string(KBBundleExecutable), installed.displayName},
                                {std::string(KBBundleIconFile), IconFile}};
  if (installed.version) info.emplace(KBBundleVersion, *installed.version);
  const auto bytes = serializePropertyList(info, PropertyListFormat::Xml, error);
  files.removeItem(bundle);
  if (!bytes || !files.createDirectory(bundle, true, {}, error) ||
      !files.writeAtomically(joinPath(bundle, "Info.plist"), *bytes, error)) {
    return false;
  }
  files.copyItem(iconOf(files, installed), joinPath(bundle, IconFile));
  return true;
}

bool layPlaceholder(DeviceCore& core, const ApplicationRow& installed,
                    std::optional<Error>* error) {
  const std::string bundle = joinPath(BundleParts, installed.identifier + ".app");
  InstallDetails details{InstallType::IntentionalDowngrade, std::nullopt, installed.sinf};
  const std::string metadata = joinPath(installed.container, exchange::MetadataName);
  if (!readIfThere(core.files, metadata, details.metadata, error)) return false;
  const bool laid = buildBundle(core.files, installed, bundle, error) &&
                    installPlaceholder(core, bundle, installed.identifier, details, error);
  core.files.removeItem(bundle);
  return laid;
}

bool takePackage(DeviceCore& core, const ApplicationRow& installed, std::optional<Error>* error) {
  const bool erased = core.database.change(
      fmt::format("{} could not be demoted", installed.identifier), Database::Commit::OnDisk,
      [&](SQLite::Database& database) {
        eraseApplication(database, installed);
        HistoryEntry entry;
        entry.event = HistoryEvent::Demoted;
        entry.origin = HistoryOrigin::Person;
        entry.bundleId = installed.identifier;
        entry.version = installed.version;
        enterInHistory(database, entry);
      },
      error);
  if (erased) core.containers.remove(installed.container);
  return erased;
}

}  // namespace

bool demoteForPerson(DeviceCore& core, const std::string& identifier, std::optional<Error>* error) {
  const std::optional<IdleApplication> idle = holdIdle(core, identifier, error);
  if (!idle) return false;
  if (idle->row.type == ApplicationTypeSystem) {
    setError(error, objection(EPERM, identifier, "belongs to the system"));
    return false;
  }
  return layPlaceholder(core, idle->row, error) && takePackage(core, idle->row, error);
}

}  // namespace appsync::device
