#include "device/recovery.h"

#include <fmt/format.h>

#include <set>
#include <tuple>

#include "device/apps/removal.h"
#include "device/state/application_rows.h"
#include "platform/existence.h"
#include "platform/sync_files.h"

namespace appsync::device {
namespace {

/// Where files are written piece by piece.
constexpr std::string_view WrittenTrees[] = {"/tmp", "/var/mobile/Library", exchange::StagingRoot,
                                             exchange::Downloads};
/// The same, above what belongs to applications and people.
constexpr std::string_view WrittenDirectories[] = {
    "/var/mobile/Media", "/var/mobile/Media/HalvoRestore", exchange::WaitingData,
    Containers::DataDirectory};

void note(DeviceCore& core, std::string_view text) {
  core.log.write(LogChannel::TWLogCategoryFramework, LogLevel::Default, text);
}

/// Only what is known to be missing counts: a bundle that cannot be looked at is left alone.
bool isGone(DeviceCore& core, const ApplicationRow& row) {
  return isThere(core.files, joinPath(row.bundlePath(), "Info.plist"), nullptr) == false;
}

void dropRowsWithoutBundle(DeviceCore& core, std::vector<ApplicationRow>& rows) {
  std::erase_if(rows, [&](const ApplicationRow& row) {
    if (!isGone(core, row)) return false;
    note(core, fmt::format("{} is dropped from the registry: {} is gone", row.identifier,
                           row.bundlePath()));
    return core.database.change("a row without a bundle could not be dropped",
                                Database::Commit::Ordinary,
                                [&](Connection& database) { eraseApplication(database, row); });
  });
}

void removeUnnamedContainers(DeviceCore& core, const std::vector<ApplicationRow>& rows) {
  std::set<std::string> named;
  for (const ApplicationRow& row : rows) named.insert(row.container);
  std::optional<Error> error;
  const auto containers = core.containers.list(&error);
  if (!containers) return note(core, error->localizedDescription());
  for (const std::string& container : *containers) {
    if (named.contains(container)) continue;
    note(core, fmt::format("{} is removed: nothing in the registry names it", container));
    core.containers.remove(container);
  }
}

void removeAllAbandonedData(DeviceCore& core) {
  const auto identifiers = core.database.lookUp(
      "the list of abandoned data could not be read", [](Connection& database) {
        return Query(database, "SELECT identifier FROM abandoned_data").texts();
      });
  if (!identifiers) return;
  for (const std::string& identifier : *identifiers) {
    std::ignore = removeAbandonedData(core, identifier, nullptr);  // else the next time
  }
}

/// The installs that set data aside never came to their end, or the data would be abandoned.
void undoAdoptions(DeviceCore& core) {
  for (const std::string& identifier : core.containers.setAside()) {
    std::optional<Error> error;
    const auto abandoned = isAbandoned(core, Containers::asideName(identifier), &error);
    const bool done = abandoned && (*abandoned || core.containers.undoAdoption(identifier, &error));
    if (!done) note(core, error->localizedDescription());
  }
}

void pauseInstalls(DeviceCore& core) {
  std::ignore = core.database.change(
      "the installs under way could not be paused", Database::Commit::Ordinary,
      [](Connection& database) {
        Query(database,
              "DELETE FROM installs WHERE over OR identifier NOT IN "
              "(SELECT identifier FROM applications WHERE placeholder)")
            .run();
        Query(database, "UPDATE installs SET state = ? WHERE state IN (?, ?)", InstallState::Paused,
              InstallState::Waiting, InstallState::Active)
            .run();
      });
}

std::set<std::string> installedAmong(const std::vector<ApplicationRow>& rows) {
  std::set<std::string> installed;
  for (const ApplicationRow& row : rows) {
    if (!row.placeholder) installed.insert(row.identifier);
  }
  return installed;
}

void clearForeground(const Foreground& foreground, const std::set<std::string>& installed) {
  foreground.sweep();
  for (const std::string& identifier : foreground.running()) {
    if (!installed.contains(identifier)) std::ignore = foreground.quit(identifier, nullptr);
  }
}

/// Of an application's own data only what stands beside it is the device's, also while it waits;
/// and what a package holds was written before its container was named.
void removeTemporaries(DeviceCore& core, const std::vector<ApplicationRow>& rows) {
  for (const std::string_view tree : WrittenTrees) {
    core.handles.removeTemporaries(tree, Reach::AllBelow);
  }
  for (const std::string_view directory : WrittenDirectories) {
    core.handles.removeTemporaries(directory, Reach::Here);
  }
  for (const ApplicationRow& row : rows) {
    core.handles.removeTemporaries(row.container, Reach::Here);
    // A package may have brought such a name; in the bundles of placeholders the device writes.
    if (row.placeholder) core.handles.removeTemporaries(row.bundlePath(), Reach::Here);
  }
}

}  // namespace

void finishInterruptedWork(DeviceCore& core) {
  // Nothing is removed on the word of a registry that cannot be read, or may take it back.
  if (!core.database.settle()) return;
  auto rows = readApplications(core.database);
  if (!rows) return;
  dropRowsWithoutBundle(core, *rows);
  removeUnnamedContainers(core, *rows);
  const std::set<std::string> installed = installedAmong(*rows);
  removeAllAbandonedData(core);
  undoAdoptions(core);
  // What a first install left that did not come to its end. Data with something in it is never
  // removed without an order to do so.
  core.containers.removeEmptyData(installed);
  pauseInstalls(core);
  clearForeground(core.foreground, installed);
  removeTemporaries(core, *rows);
}

}  // namespace appsync::device
