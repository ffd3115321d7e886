#include <fmt/format.h>

#include <tuple>

#include "device/apps/installer_service.h"
#include "device/apps/installers.h"
#include "device/apps/installs.h"
#include "device/apps/removal.h"
#include "device/apps/staged_container.h"
#include "device/home/icon_order.h"
#include "device/journal/history.h"
#include "platform/bundle.h"
#include "platform/existence.h"
#include "platform/sync_files.h"

namespace appsync::device {
namespace {

/// A package without a store file of its own keeps the placeholder's or the old version's.
bool carryOver(DeviceCore& core, std::string_view file, const ApplicationRows& before,
               const std::string& container, std::optional<Error>* error) {
  for (const std::optional<ApplicationRow>& row : {before.placeholder, before.installed}) {
    if (!row) continue;
    const std::string source = joinPath(row->container, file);
    const std::optional<bool> there = isThere(core.files, source, error);
    if (!there) return false;
    if (*there) return core.files.copyItem(source, joinPath(container, file), error);
  }
  return true;
}

/// An earlier install may have set data aside and then failed.
bool undoEarlierAdoption(DeviceCore& core, const std::string& identifier,
                         std::optional<Error>* error) {
  const std::string aside = Containers::asideName(identifier);
  const auto there = isThere(core.files, Containers::dataPath(aside), error);
  if (!there || !*there) return there.has_value();
  return core.database.settle(error) && removeAbandonedData(core, aside, error) &&
         core.containers.undoAdoption(identifier, error);
}

/// Done before the switch: if that fails or never comes, the data waits where the next attempt
/// leaves it.
bool prepareData(DeviceCore& core, const std::string& identifier, const ApplicationRows& before,
                 std::optional<Error>* error) {
  if (!removeAbandonedData(core, identifier, error) ||
      !undoEarlierAdoption(core, identifier, error)) {
    return false;
  }
  // What the person has made with an installed version since is worth more than old data.
  const bool comesBack =
      !before.installed ||
      (before.placeholder && before.placeholder->installType == InstallType::Restore);
  const auto waits = comesBack ? core.containers.dataWaits(identifier, error) : false;
  if (!waits) return false;
  return *waits ? core.containers.adoptWaitingData(identifier, error)
                : core.containers.makeData(identifier, error);
}

bool extractInto(DeviceCore& core, const std::string& package, const std::string& container,
                 const std::string& identifier, ApplicationRow& row, const ApplicationRows& before,
                 const InstallDetails& details, std::optional<Error>* error) {
  const FileDescriptor file = core.handles.openFile(package, error);
  if (!file) return false;
  const FileDescriptor target = core.handles.openDirectory(container, error);
  if (!target) return false;
  const std::optional<ExtractedPackage> extracted =
      extractPackage(file.get(), target.get(), identifier, PackageLimits{}, error);
  if (!extracted) return false;
  row.bundle = extracted->bundleName;
  row.diskUsage = extracted->bytes;
  describe(row, extracted->info);
  if (!extracted->hasMetadata && details.metadata &&
      !core.files.writeAtomically(joinPath(container, exchange::MetadataName), *details.metadata,
                                  error)) {
    return false;
  }
  const bool hasMetadata = extracted->hasMetadata || details.metadata;
  return (hasMetadata || carryOver(core, exchange::MetadataName, before, container, error)) &&
         (extracted->hasArtwork ||
          carryOver(core, exchange::ArtworkName, before, container, error));
}

/// What the metadata says; of one that does not parse nothing is expected.
bool readMetadata(DeviceCore& core, ApplicationRow& row, std::optional<Error>* error) {
  const auto metadata =
      readDictionary(core.files, joinPath(row.container, exchange::MetadataName), error);
  row.deviceBased = metadata && findFlag(*metadata, "DeviceBasedQLP");
  return metadata.has_value();
}

void inherit(ApplicationRow& row, const ApplicationRows& before, const InstallDetails& details) {
  row.type = before.type();
  if (before.installed) row.sinf = before.installed->sinf;
  if (before.placeholder) {
    row.installType = before.placeholder->installType;
    if (before.placeholder->sinf) row.sinf = before.placeholder->sinf;
  }
  if (details.installType != InstallType::None) row.installType = details.installType;
  if (details.sinf) row.sinf = details.sinf;
}

HistoryEntry installOf(const ApplicationRow& row, const ApplicationRows& before,
                       HistoryOrigin origin) {
  HistoryEntry entry{.origin = origin, .bundleId = row.identifier, .version = row.version};
  if (before.installed) entry.replaced = before.installed->version.value_or("");
  return entry;
}

bool switchTo(DeviceCore& core, const ApplicationRow& row, const ApplicationRows& before,
              HistoryOrigin origin, std::optional<Error>* error) {
  const std::string aside = Containers::asideName(row.identifier);
  const auto isAside = isThere(core.files, Containers::dataPath(aside), error);
  if (!isAside) return false;
  const bool switched = core.database.change(
      fmt::format("{} could not be entered in the registry", row.identifier),
      Database::Commit::OnDisk,
      [&](Connection& database) {
        if (before.placeholder) eraseApplication(database, *before.placeholder);
        putApplication(database, row);
        endInstall(database, row.identifier, InstallState::Finished);
        forgetUninstalled(database, row.identifier);
        appendToIconOrder(database, row.identifier);
        enterInHistory(database, installOf(row, before, origin));
        if (*isAside) abandonData(database, aside);
      },
      error);
  // What stays is on record as abandoned, and goes when the device is next opened.
  if (switched && *isAside) std::ignore = removeAbandonedData(core, aside, nullptr);
  return switched;
}

bool replaceApplication(DeviceCore& core, const std::string& package, const std::string& identifier,
                        const ApplicationRows& before, const InstallDetails& details,
                        std::optional<Error>* error) {
  StagedContainer staged(core, error);
  if (!staged.isMade()) return false;
  ApplicationRow row;
  row.identifier = identifier;
  row.container = staged.path();
  inherit(row, before, details);
  // One flush for all files of the package, before a row of the registry names them.
  if (!extractInto(core, package, staged.path(), identifier, row, before, details, error) ||
      !readMetadata(core, row, error) || !prepareData(core, identifier, before, error) ||
      !core.containers.flush(error) || !switchTo(core, row, before, details.origin, error)) {
    return false;
  }
  staged.keep();
  if (before.installed) core.containers.remove(before.installed->container);
  if (before.placeholder) core.containers.remove(before.placeholder->container);
  return true;
}

void markInstalling(DeviceCore& core, const std::string& identifier) {
  if (const auto progress = currentProgress(core.database, core.observers, identifier)) {
    progress->setInstallState(InstallState::Active);
    if (progress->installPhase() == InstallPhase::Loading) {
      progress->setInstallPhase(InstallPhase::Installing);
    }
  }
}

HistoryEntry failureOf(const std::string& identifier, const ApplicationRows& before,
                       HistoryOrigin origin, const Error& reason) {
  return {.event = HistoryEvent::Failed,
          .origin = origin,
          .bundleId = identifier,
          .version = before.placeholder ? before.placeholder->version : std::nullopt,
          .reason = reason.localizedDescription()};
}

void markFailed(DeviceCore& core, const HistoryEntry& failure) {
  // The log tells; the install counts as paused when the device is next opened.
  std::ignore = core.database.change("a failed install could not be ended",
                                     Database::Commit::Ordinary, [&](Connection& database) {
                                       endInstall(database, failure.bundleId, InstallState::Failed);
                                       enterInHistory(database, failure);
                                     });
}

}  // namespace

bool installPackage(DeviceCore& core, const std::string& package, const std::string& identifier,
                    const InstallDetails& details, std::optional<Error>* error) {
  const auto before = readApplication(core.database, identifier, error);
  if (!before) return false;
  markInstalling(core, identifier);
  std::optional<Error> reason;
  const bool installed = replaceApplication(core, package, identifier, *before, details, &reason);
  if (!installed) {
    markFailed(core, failureOf(identifier, *before, details.origin, *reason));
    setError(error, *std::move(reason));
  }
  core.observers.installsChanged();
  return installed;
}

}  // namespace appsync::device
