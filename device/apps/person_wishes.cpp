#include "device/apps/person_wishes.h"

#include <algorithm>

#include "device/apps/installs.h"
#include "device/apps/removal.h"
#include "device/state/application_rows.h"
#include "platform/existence.h"
#include "platform/sync_files.h"

namespace appsync::device {
namespace {

/// What came from a backup may be demoted too, and asking twice is no harm.
bool canBeAskedFor(InstallType placeholder) {
  return isDemotion(placeholder) || placeholder == InstallType::Restore ||
         placeholder == InstallType::StoreDownload;
}

/// A placeholder with what it was before a person asked for it.
struct Asked {
  std::optional<ApplicationRow> placeholder;
  std::optional<InstallType> before;
};

Asked findAsked(Connection& database, std::string_view identifier) {
  ApplicationRows rows = findApplication(database, identifier);
  if (rows.installed || !rows.placeholder) return {};
  Asked asked{std::move(rows.placeholder), std::nullopt};
  if (asked.placeholder->installType != InstallType::StoreDownload) return asked;
  Query query(database, "SELECT install_type FROM asked_for WHERE identifier = ?", identifier);
  if (query.next()) asked.before = query.as<InstallType>(0);
  return asked;
}

/// Whether a restore was told to leave the application demoted, which its placeholder does not show
/// without coordination; nullopt (with an error) when that cannot be read.
std::optional<bool> isListedAsDemoted(FileManager& files, const std::string& identifier,
                                      std::optional<Error>* error) {
  const auto lists = readDictionary(files, exchange::DemotedApplications, error);
  if (!lists) return std::nullopt;
  const auto isIn = [&](std::string_view key) {
    return std::ranges::count(findStrings(*lists, key), identifier) > 0;
  };
  return isIn(exchange::AutomaticDowngradesKey) || isIn(exchange::IntentionalDowngradesKey);
}

bool isComing(DeviceCore& core, const std::string& identifier) {
  const auto progress = currentProgress(core.database, core.observers, identifier);
  return progress && progress->installState() == InstallState::Active;
}

}  // namespace

bool askFor(DeviceCore& core, const std::string& identifier, std::optional<Error>* error) {
  bool asked = false;
  const bool changed = core.database.change(
      "the application could not be asked for", Database::Commit::OnDisk,
      [&](Connection& database) {
        std::optional<ApplicationRow> row = findApplication(database, identifier).placeholder;
        asked = row && canBeAskedFor(row->installType);
        if (!asked || row->installType == InstallType::StoreDownload) return;
        Query(database, "INSERT OR REPLACE INTO asked_for VALUES (?, ?)", identifier,
              row->installType)
            .run();
        row->installType = InstallType::StoreDownload;
        putApplication(database, *row);
      },
      error);
  return changed && asked;
}

std::optional<Cancelling> effectOfCancelling(DeviceCore& core, const std::string& identifier,
                                             std::optional<Error>* error) {
  const auto asked = core.database.lookUp(
      "the registry could not be read",
      [&](Connection& database) { return findAsked(database, identifier); }, error);
  if (!asked) return std::nullopt;
  if (!asked->placeholder) return Cancelling::Nothing;
  if (asked->before && isComing(core, identifier)) return Cancelling::Nothing;
  if (asked->before && *asked->before != InstallType::Restore) return Cancelling::Undoing;
  if (asked->before.value_or(asked->placeholder->installType) != InstallType::Restore) {
    return Cancelling::Nothing;
  }
  const std::optional<bool> demoted = isListedAsDemoted(core.files, identifier, error);
  if (!demoted) return std::nullopt;
  if (*demoted) return asked->before ? Cancelling::Undoing : Cancelling::Nothing;
  return Cancelling::Forgetting;
}

bool undoAsking(DeviceCore& core, const std::string& identifier, std::optional<Error>* error) {
  return core.database.change(
      "the application could not be demoted again", Database::Commit::OnDisk,
      [&](Connection& database) {
        Asked asked = findAsked(database, identifier);
        if (!asked.before) return;
        asked.placeholder->installType = *asked.before;
        putApplication(database, *asked.placeholder);
        Query(database, "DELETE FROM asked_for WHERE identifier = ?", identifier).run();
      },
      error);
}

bool cancelWish(DeviceCore& core, const std::string& identifier, std::optional<Error>* error) {
  const auto effect = effectOfCancelling(core, identifier, error);
  switch (effect.value_or(Cancelling::Nothing)) {
    case Cancelling::Nothing:
      break;
    case Cancelling::Undoing:
      return undoAsking(core, identifier, error);
    case Cancelling::Forgetting:
      return removeForPerson(core, identifier, error);
  }
  return false;
}

}  // namespace appsync::device
