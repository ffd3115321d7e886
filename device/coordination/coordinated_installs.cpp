#include "device/coordination/coordinated_installs.h"

#include <fmt/format.h>

#include <cerrno>
#include <tuple>
#include <utility>

#include "device/apps/idle_application.h"
#include "device/apps/installs.h"
#include "device/apps/person_wishes.h"
#include "device/journal/history.h"
#include "device/state/application_rows.h"
#include "platform/bundle.h"
#include "platform/existence.h"
#include "platform/property_list_codec.h"

namespace appsync::device {
namespace {

constexpr std::string_view LaunchProhibitedKey = "SWApplicationLaunchProhibited";
/// Between two looks whether an application has left the foreground: a file's worth of work.
constexpr std::chrono::milliseconds ForegroundPoll{200};
/// Until a coordinator that could not be read is looked at again.
constexpr std::chrono::milliseconds RetryDelay{200};

PlaceholderFace faceOf(const CoordinatorState& state) {
  const PlaceholderRow& row = *state.placeholder;
  const auto attributes =
      attributesFrom(row.attributes.value_or(Bytes{})).value_or(PlaceholderAttributes{});
  PlaceholderFace face{row.name, attributes.bundleVersion, {}, attributes.infoDictionary};
  face.info.insert_or_assign(std::string(LaunchProhibitedKey), attributes.launchProhibited);
  if (state.icon && !state.icon->over) face.icon = state.icon->path.value_or("");
  return face;
}

/// The serialised dictionary; none when there is nothing in it.
std::optional<Bytes> metadataFile(const std::optional<StoreMetadata>& metadata) {
  if (!metadata || metadata->values.empty()) return std::nullopt;
  return serializePropertyList(metadata->values, PropertyListFormat::Binary);
}

InstallDetails detailsOf(const PlaceholderRow& row) {
  return {row.installType, metadataFile(metadataFrom(row.metadata.value_or(Bytes{}))), row.sinf,
          HistoryOrigin::Sync};
}

/// Who brings the package.
HistoryOrigin originOf(const CoordinatorState& state) {
  const auto client = state.package ? state.package->client : state.coordinator.responsible;
  return client == KQClientKiosk ? HistoryOrigin::Store : HistoryOrigin::Sync;
}

/// What the options say of a package that takes its placeholder's place.
InstallDetails detailsOf(const CoordinatorState& state) {
  const auto given = optionsFrom(*state.coordinator.options).value_or(InstallOptions{});
  return {given.installType, metadataFile(given.storeMetadata), given.sinfData, originOf(state)};
}

HistoryEntry failureOf(const CoordinatorState& state, const Error& reason) {
  const auto attributes = attributesFrom(state.placeholder->attributes.value_or(Bytes{}));
  return {.event = HistoryEvent::Failed,
          .origin = originOf(state),
          .bundleId = state.coordinator.identifier,
          .version = attributes ? attributes->bundleVersion : std::nullopt,
          .reason = reason.localizedDescription()};
}

/// Whether a sync finds all that is left of an application: if the sync comes to nothing, that must
/// not be gone.
bool isToStay(Connection& database, const PlaceholderRow& placeholder) {
  const ApplicationRows present = findApplication(database, placeholder.identifier);
  return placeholder.installType == InstallType::Sync && !present.installed &&
         present.placeholder && present.placeholder->installType != InstallType::Sync;
}

}  // namespace

void CoordinatedInstalls::expedite() {
  const Lock lock(mutex_);
  expedited_ = true;
}

void CoordinatedInstalls::leaveWaiting() {
  const Lock lock(mutex_);
  leaving_ = true;
}

bool CoordinatedInstalls::isLeaving() {
  const Lock lock(mutex_);
  return leaving_;
}

void CoordinatedInstalls::advance(const std::string& identifier, std::int64_t coordinator) {
  tidyUp(identifier);
  if (carryOn(coordinator, nullptr)) return;
  // Once more, when whatever it was may have passed.
  const auto again = [this, coordinator] {
    std::optional<Error> error;
    if (!carryOn(coordinator, &error)) store_.noteTrouble(coordinator, *error);
  };
  workers_.add(identifier, again, RetryDelay);
}

bool CoordinatedInstalls::carryOn(std::int64_t coordinator, std::optional<Error>* error) {
  while (!isLeaving()) {
    const auto state = store_.lookUp(
        [&](Connection& database) -> std::optional<CoordinatorState> {
          const auto row = findCoordinator(database, coordinator);
          if (!row) return std::nullopt;
          return loadState(database, *row);
        },
        error);
    if (!state) return false;
    if (!*state || !take(nextStep(**state), **state)) break;
  }
  return true;
}

bool CoordinatedInstalls::take(Step step, const CoordinatorState& state) {
  switch (step) {
    case Step::None:
      break;
    case Step::InstallPlaceholder:
      return installPlaceholder(state);
    case Step::InstallPackage:
      return installPackage(state);
    case Step::Complete:
      finish(state, std::nullopt);
      break;
  }
  return false;
}

void CoordinatedInstalls::removePlaceholder(const std::string& identifier,
                                            const PlaceholderRow& placeholder) {
  // What stays is still on record, and tidied up again.
  if (placeholder.presence == Presence::Forsaken) {
    std::ignore = registry_.change(identifier, cancelWish, nullptr);
    return;
  }
  if (placeholder.presence != Presence::Adopted) {
    const PropertyList::Dictionary options{{std::string(UninstallPlaceholdersOnlyKey), true}};
    std::ignore = registry_.uninstallApplication(identifier, options);
    return;
  }
  std::ignore = device_.database.change(
      "an install could not be ended", Database::Commit::Ordinary,
      [&](Connection& database) { endInstall(database, identifier, InstallState::Canceled); });
  device_.observers.installsChanged();
}

void CoordinatedInstalls::tidyUp(const std::string& identifier) {
  auto left =
      store_.lookUp([&](Connection& database) { return findLeftovers(database, identifier); });
  if (!left) return;
  for (const PlaceholderRow& placeholder : left->placeholders) {
    removePlaceholder(identifier, placeholder);
    // What cannot be written is found, and tidied up, again.
    std::ignore = store_.change(
        [&](Connection& database, Consequences&) {
          const bool isAdopted = placeholder.presence == Presence::Adopted;
          if (!isAdopted && findApplication(database, identifier).placeholder) return;
          setPresence(database, placeholder, Presence::None);
        },
        nullptr);
  }
  FileManager& files = device_.files;
  for (PromiseRow& package : left->packages) {
    // What cannot be removed is swept by the next sync.
    if (isFile(files, *package.path)) std::ignore = files.removeItem(*package.path);
    package.path.reset();
    std::ignore = store_.change(
        [&](Connection& database, Consequences&) { put(database, package); }, nullptr);
  }
}

bool CoordinatedInstalls::change(const CoordinatorState& state,
                                 const std::function<void(Connection&, Consequences&)>& work,
                                 Database::Commit commit) {
  std::optional<Error> error;
  if (store_.change(work, &error, commit)) return true;
  store_.noteTrouble(state.coordinator.number, *error);
  return false;
}

Presence CoordinatedInstalls::note(const CoordinatorState& state, Presence presence) {
  Presence noted = Presence::None;
  const bool changed = change(state, [&](Connection& database, Consequences& consequences) {
    const auto row = findCoordinator(database, state.coordinator.number);
    const auto placeholder = findPlaceholder(database, state.placeholder->number);
    if (!row || !placeholder || !row->isLive() || row->placeholder != placeholder->number) return;
    const bool adopts = presence == Presence::Begun && isToStay(database, *placeholder);
    noted = adopts ? Presence::Adopted : presence;
    setPresence(database, *placeholder, noted);
    if (noted == Presence::Begun) return;
    if (adopts) beginInstall(database, placeholder->identifier);
    addEvent(database, *row, EventKind::PlaceholderInstalled);
    consequences.events = true;
  });
  return changed ? noted : Presence::None;
}

bool CoordinatedInstalls::installPlaceholder(const CoordinatorState& state) {
  // Noted first, so that whoever cancels meanwhile, or a crash, leaves no placeholder behind.
  const Presence noted = note(state, Presence::Begun);
  if (noted == Presence::Adopted) device_.observers.installsChanged();
  if (noted != Presence::Begun) return noted == Presence::Adopted;
  std::optional<Error> error;
  const PlaceholderRow& row = *state.placeholder;
  if (registry_.buildPlaceholder(row.identifier, faceOf(state), detailsOf(row), &error)) {
    return note(state, Presence::Installed) != Presence::None;
  }
  finish(state, error);
  return false;
}

bool CoordinatedInstalls::installPackage(const CoordinatorState& state) {
  const std::string& identifier = state.coordinator.identifier;
  const Foreground::HoldResult held = device_.foreground.hold(identifier);
  if (!held.hold) {
    const std::optional<Error> error =
        held.isRunning ? waitForForeground(state.coordinator) : Error::posix(EIO, identifier);
    if (error) finish(state, error);
    return false;
  }
  const Beginning beginning = begin(state);
  if (beginning != Beginning::Made) return beginning == Beginning::NotReady;
  std::optional<Error> error;
  const FileLocation package{*state.package->path, state.package->pathIsDirectory};
  const bool installed =
      registry_.installPackageWith(package, identifier, detailsOf(state), &error);
  finish(state, installed ? std::nullopt : error);
  return false;
}

CoordinatedInstalls::Beginning CoordinatedInstalls::begin(const CoordinatorState& state) {
  bool ready = false;
  const bool begun = change(state, [&](Connection& database, Consequences&) {
    auto row = findCoordinator(database, state.coordinator.number);
    ready = row && row->package == state.coordinator.package &&
            nextStep(loadState(database, *row)) == Step::InstallPackage;
    if (!ready) return;
    row->stage = Stage::Installing;
    put(database, *row);
  });
  if (!begun) return Beginning::Failed;
  return ready ? Beginning::Made : Beginning::NotReady;
}

void CoordinatedInstalls::finish(const CoordinatorState& state, const std::optional<Error>& error) {
  if (error && !fail(state, *error)) return;
  std::ignore = change(  // else trouble of the coordinator's
      state,
      [&](Connection& database, Consequences& consequences) {
        const auto row = findCoordinator(database, state.coordinator.number);
        if (row) complete(database, *row, error, consequences);
      },
      Database::Commit::OnDisk);
}

bool CoordinatedInstalls::fail(const CoordinatorState& state, const Error& error) {
  const std::string& identifier = state.coordinator.identifier;
  device_.log.write(LogChannel::TWLogCategoryFramework, LogLevel::Default,
                    fmt::format("The coordinated install of {} failed: {}", identifier,
                                error.localizedDescription()));
  PlaceholderRow left;
  // On record before anything is taken away: what is not, is tried again when the device is next
  // opened.
  const bool noted = change(state, [&](Connection& database, Consequences&) {
    auto row = findCoordinator(database, state.coordinator.number);
    if (!row || !row->isLive()) return;
    row->error = bytesOf(error);
    put(database, *row);
    // The installer tells of its own failures.
    if (row->stage == Stage::Waiting) enterInHistory(database, failureOf(state, error));
    left = *state.placeholder;
    if (waitsOn(database, *row, left)) left.presence = Presence::Adopted;
    put(database, left);
  });
  if (noted && left.presence != Presence::None) removePlaceholder(identifier, left);
  return noted;
}

std::optional<Error> CoordinatedInstalls::waitForForeground(const CoordinatorRow& coordinator) {
  const std::string& identifier = coordinator.identifier;
  const Wait wait{coordinator.number, true};
  Wait before;
  {
    const Lock lock(mutex_);
    if (expedited_) {
      return objection(EBUSY, identifier, "is in the foreground and was not closed in time");
    }
    before = std::exchange(waits_[identifier], wait);
  }
  if (before.coordinator != wait.coordinator) device_.watcher.assertionDenied(identifier);
  if (before.isLookDue) return std::nullopt;
  const auto look = [this, identifier, wait] { lookAgain(identifier, wait.coordinator); };
  workers_.add(identifier, look, ForegroundPoll);
  return std::nullopt;
}

void CoordinatedInstalls::lookAgain(const std::string& identifier, std::int64_t coordinator) {
  {
    const Lock lock(mutex_);
    waits_[identifier].isLookDue = false;
  }
  advance(identifier, coordinator);
  const Lock lock(mutex_);
  if (!waits_[identifier].isLookDue) waits_.erase(identifier);
}

}  // namespace appsync::device
