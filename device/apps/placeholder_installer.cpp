#include <fmt/format.h>

#include <cerrno>
#include <filesystem>

#include "device/apps/installers.h"
#include "device/apps/installs.h"
#include "device/apps/staged_container.h"
#include "device/home/icon_order.h"
#include "device/journal/history.h"
#include "platform/bundle.h"
#include "platform/existence.h"
#include "platform/installer_service.h"
#include "platform/property_list_codec.h"
#include "platform/sync_files.h"

namespace appsync::device {
namespace {

constexpr std::string_view IconFile = "Icon.png";

/// The bundle's information dictionary, if it is one of a placeholder of this application.
std::optional<PropertyList::Dictionary> readInfo(DeviceCore& core, const std::string& bundle,
                                                 const std::string& identifier,
                                                 std::optional<Error>* error) {
  std::optional<Error> cause;
  auto info = loadDictionary(core.files, joinPath(bundle, "Info.plist"), &cause);
  if (!info && cause->domain == POSIXErrorDomain && !isMissing(cause)) {
    setError(error, *cause);  // the phone's failure is no fault of the bundle
    return std::nullopt;
  }
  if (!info) {
    setError(error, refusal(PackageRefusal::BadInfo, cause->localizedDescription()));
    return std::nullopt;
  }
  const std::string* found = findString(*info, KBBundleIdentifier);
  if (found && *found == identifier) return info;
  setError(error, found ? refusal(PackageRefusal::WrongIdentifier,
                                  fmt::format("Info.plist names {}, not {}", *found, identifier))
                        : refusal(PackageRefusal::BadInfo, "Info.plist names no application"));
  return std::nullopt;
}

std::string bundleName(const std::string& directory, const std::string& identifier) {
  const std::string last = std::filesystem::path(directory).filename();
  return last.size() > 4 && last.ends_with(".app") ? last : identifier + ".app";
}

std::uint64_t sizeOf(DeviceCore& core, const std::string& file) {
  const auto attributes = core.files.attributesOfItem(file);
  return attributes ? attributes->size : 0;
}

PropertyList::Dictionary infoOf(const std::string& identifier, const PlaceholderFace& face) {
  PropertyList::Dictionary info = face.info;
  const auto set = [&info](std::string_view key, std::string_view value) {
    info.insert_or_assign(std::string(key), value);
  };
  set(KBBundleIdentifier, identifier);
  set(KBBundleDisplayName, face.name);
  set(KBBundleExecutable, face.name);
  set(KBBundleIconFile, IconFile);
  if (face.version) set(KBBundleVersion, *face.version);
  return info;
}

/// A placeholder without an icon is better than none.
void copyIcon(DeviceCore& core, const std::string& icon, const ApplicationRow& row) {
  if (icon.empty()) return;
  std::optional<Error> error = Error::posix(ENOENT, icon);
  if (isFile(core.files, icon) &&
      core.files.copyItem(icon, joinPath(row.bundlePath(), IconFile), &error)) {
    return;
  }
  core.log.write(LogChannel::TWLogCategoryFramework, LogLevel::Default,
                 fmt::format("The placeholder of {} goes without its icon: {}", row.identifier,
                             error->localizedDescription()));
}

bool writeInfo(DeviceCore& core, const ApplicationRow& row, const PropertyList::Dictionary& info,
               std::optional<Error>* error) {
  const auto bytes = serializePropertyList(info, PropertyListFormat::Xml, error);
  return bytes && core.files.createDirectory(row.bundlePath(), false, {}, error) &&
         core.files.writeAtomically(joinPath(row.bundlePath(), "Info.plist"), *bytes, error);
}

/// What the container holds beside its bundle, and how much it is.
bool complete(DeviceCore& core, const InstallDetails& details, ApplicationRow& row,
              std::optional<Error>* error) {
  row.diskUsage = sizeOf(core, joinPath(row.bundlePath(), "Info.plist")) +
                  sizeOf(core, joinPath(row.bundlePath(), IconFile));
  if (!details.metadata) return true;
  const std::string metadata = joinPath(row.container, exchange::MetadataName);
  row.diskUsage += details.metadata->size();
  return core.files.writeAtomically(metadata, *details.metadata, error);
}

/// A sync's placeholder that a power failure takes is made anew by the next sync; any other is all
/// that is left of its application.
bool mustLast(const ApplicationRow& row) { return row.installType != InstallType::Sync; }

bool isRestored(const ApplicationRow& placeholder) {
  return placeholder.installType == InstallType::Restore || isDemotion(placeholder.installType);
}

/// Enters the placeholder; `replaced` is the one it takes the place of.
bool enter(DeviceCore& core, ApplicationRow& row, std::optional<ApplicationRow>& replaced,
           std::optional<Error>* error) {
  return core.database.change(
      fmt::format("the placeholder of {} could not be entered in the registry", row.identifier),
      mustLast(row) ? Database::Commit::OnDisk : Database::Commit::Ordinary,
      [&](Connection& database) {
        ApplicationRows before = findApplication(database, row.identifier);
        row.type = before.type();
        putApplication(database, row);
        beginInstall(database, row.identifier);
        appendToIconOrder(database, row.identifier);
        if (!before.any() && isRestored(row)) {
          enterInHistory(database, {.event = HistoryEvent::Restored,
                                    .bundleId = row.identifier,
                                    .version = row.version});
        }
        replaced = std::move(before.placeholder);
      },
      error);
}

using MakeBundle = std::function<bool(const ApplicationRow& row, std::optional<Error>* error)>;

/// Installs the placeholder whose bundle is of this name and says this of itself.
bool install(DeviceCore& core, const std::string& identifier, const std::string& bundle,
             const PropertyList::Dictionary& info, const InstallDetails& details,
             const MakeBundle& makeBundle, std::optional<Error>* error) {
  StagedContainer staged(core, error);
  if (!staged.isMade()) return false;
  ApplicationRow row;
  row.identifier = identifier;
  row.placeholder = true;
  row.container = staged.path();
  row.bundle = bundle;
  row.installType = details.installType;
  row.sinf = details.sinf;
  describe(row, info);
  std::optional<ApplicationRow> replaced;
  if (!makeBundle(row, error) || !complete(core, details, row, error) ||
      (mustLast(row) && !core.containers.flush(error)) || !enter(core, row, replaced, error)) {
    return false;
  }
  staged.keep();
  if (replaced) core.containers.remove(replaced->container);
  core.observers.installsChanged();
  return true;
}

}  // namespace

bool installPlaceholder(DeviceCore& core, const std::string& bundleDirectory,
                        const std::string& identifier, const InstallDetails& details,
                        std::optional<Error>* error) {
  const auto info = readInfo(core, bundleDirectory, identifier, error);
  if (!info) return false;
  const auto copy = [&](const ApplicationRow& row, std::optional<Error>* reason) {
    return core.files.copyItem(bundleDirectory, row.bundlePath(), reason);
  };
  const std::string bundle = bundleName(bundleDirectory, identifier);
  return install(core, identifier, bundle, *info, details, copy, error);
}

bool buildPlaceholder(DeviceCore& core, const std::string& identifier, const PlaceholderFace& face,
                      const InstallDetails& details, std::optional<Error>* error) {
  const PropertyList::Dictionary info = infoOf(identifier, face);
  const auto build = [&](const ApplicationRow& row, std::optional<Error>* reason) {
    if (!writeInfo(core, row, info, reason)) return false;
    copyIcon(core, face.icon, row);
    return true;
  };
  return install(core, identifier, identifier + ".app", info, details, build, error);
}

bool installSystemApplication(DeviceCore& core, const std::string& identifier,
                              const std::string& displayName, const std::string& version,
                              std::optional<Error>* error) {
  StagedContainer staged(core, error);
  if (!staged.isMade()) return false;
  ApplicationRow row;
  row.identifier = identifier;
  row.type = ApplicationTypeSystem;
  row.container = staged.path();
  row.bundle = identifier + ".app";
  const PropertyList::Dictionary info{{std::string(KBBundleIdentifier), identifier},
                                      {std::string(KBBundleDisplayName), displayName},
                                      {std::string(KBBundleVersion), version}};
  describe(row, info);
  if (!writeInfo(core, row, info, error)) return false;
  ApplicationRows before;
  const bool entered = core.database.change(
      fmt::format("{} could not be entered in the registry", identifier), Database::Commit::OnDisk,
      [&](Connection& database) {
        before = findApplication(database, identifier);
        putApplication(database, row);
        appendToIconOrder(database, identifier);
      },
      error);
  if (!entered) return false;
  staged.keep();
  if (before.installed) core.containers.remove(before.installed->container);
  return true;
}

Error refusal(PackageRefusal reason, std::string_view detail) {
  return Error::withDescription(InstallerServiceErrorDomain, static_cast<std::int64_t>(reason),
                                fmt::format("{}: {}", name(reason), detail));
}

}  // namespace appsync::device
