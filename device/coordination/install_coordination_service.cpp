#include "device/coordination/install_coordination_service.h"

#include <fmt/format.h>

#include <cerrno>
#include <tuple>

#include "base/identifiers.h"
#include "device/apps/idle_application.h"
#include "device/apps/installs.h"
#include "device/apps/removal.h"
#include "device/coordination/coordination_recovery.h"
#include "device/state/application_rows.h"
#include "platform/existence.h"

namespace appsync::device {
namespace {

constexpr std::size_t InstallsAtOnce = 4;
constexpr std::int64_t ProgressUnits = 1000;

class Listener final : public CoordinatorEventListener {
 public:
  Listener(std::shared_ptr<CoordinationGate> gate, std::uint64_t number)
      : gate_(std::move(gate)), number_(number) {}
  ~Listener() override {
    gate_->with(false, [&](CoordinationObjects& service) {
      service.events.removeListener(number_);
      return true;
    });
  }

 private:
  const std::shared_ptr<CoordinationGate> gate_;
  const std::uint64_t number_;
};

Error unusable() {
  return Error::withDescription(POSIXErrorDomain, EINVAL,
                                "no application can have this identifier");
}

/// Whether both kinds end with a package, or both without.
bool endAlike(CoordinatorKind one, CoordinatorKind other) {
  return (one == CoordinatorKind::RestoringDemoted) == (other == CoordinatorKind::RestoringDemoted);
}

/// Why nobody is served by going on with a live coordinator; none if it can be taken up again.
std::optional<std::string> objectionTo(Connection& database, const CoordinatorRow& row,
                                       CoordinatorKind kind) {
  if (lostItsPlaceholder(database, row)) return "its placeholder was taken away";
  if (!endAlike(row.kind, kind)) return "it is restored in another way";
  return std::nullopt;
}

}  // namespace

DeviceInstallCoordination::DeviceInstallCoordination(DeviceCore& device,
                                                     DeviceAppRegistry& registry)
    : device_(device), workers_(InstallsAtOnce), installs_(device, registry, store_, workers_) {
  const std::optional<Consequences> left = repairCoordination(device);
  if (left) {
    for (const std::string& identifier : left->over) installs_.tidyUp(identifier);
    sweepCoordination(device);
  }
  events_.start([this](const CoordinatorRow& row) { return objects_.of(row); });
  if (left) carryOut({left->ready, {}, {}, true});
}

DeviceInstallCoordination::~DeviceInstallCoordination() {
  installs_.leaveWaiting();
  workers_.stop();
  events_.stop();
  objects_.gate()->close();
}

void DeviceInstallCoordination::expedite() noexcept {
  installs_.expedite();
  workers_.expedite();
}

void DeviceInstallCoordination::carryOut(const Consequences& consequences) {
  for (const std::string& identifier : consequences.over) {
    workers_.exclusively(identifier, [&] { installs_.tidyUp(identifier); });
  }
  for (const auto& [identifier, coordinator] : consequences.ready) {
    workers_.add(identifier,
                 [this, id = identifier, number = coordinator] { installs_.advance(id, number); });
  }
  if (consequences.events) events_.check();
  for (const auto& [identifier, fraction] : consequences.progress) {
    showProgress(identifier, fraction);
  }
}

/// People who look at the device see how far the package has come.
void DeviceInstallCoordination::showProgress(std::string_view identifier, double fraction) {
  const auto progress = currentProgress(device_.database, device_.observers, identifier);
  if (!progress) return;
  progress->setInstallState(InstallState::Active);
  progress->setTotalUnitCount(ProgressUnits);
  progress->setCompletedUnitCount(static_cast<std::int64_t>(fraction * ProgressUnits));
}

std::shared_ptr<InstallCoordinator> DeviceInstallCoordination::coordinatorFor(
    CoordinatorKind kind, std::string_view bundleId, CoordinationClientId client,
    bool createIfNotExisting, bool* created, std::optional<Error>* error) noexcept {
  if (created) *created = false;
  const bool create = createIfNotExisting && kind != CoordinatorKind::Any;
  if (!isUsableIdentifier(bundleId)) {
    if (create) setError(error, unusable());
    return nullptr;
  }
  if (!create) {
    const auto live = liveCoordinator(bundleId, error);
    return live ? objects_.of(*live) : nullptr;
  }
  std::optional<CoordinatorRow> found;
  bool made = false;
  const bool changed = store_.change(
      [&](Connection& database, Consequences& consequences) {
        found = findLiveCoordinator(database, bundleId);
        if (found && endedFor(database, *found, kind, client, consequences)) found.reset();
        made = !found;
        if (!made) return;
        found =
            CoordinatorRow{.identifier = std::string(bundleId), .kind = kind, .creator = client};
        put(database, *found);
      },
      error);
  if (!changed) return nullptr;
  if (created) *created = made;
  return objects_.of(*found);
}

std::optional<CoordinatorRow> DeviceInstallCoordination::liveCoordinator(
    std::string_view bundleId, std::optional<Error>* error) {
  return store_
      .lookUp([&](Connection& database) { return findLiveCoordinator(database, bundleId); }, error)
      .value_or(std::nullopt);
}

bool DeviceInstallCoordination::endedFor(Connection& database, const CoordinatorRow& live,
                                         CoordinatorKind kind, CoordinationClientId client,
                                         Consequences& consequences) {
  std::optional<std::string> why = objectionTo(database, live, kind);
  if (const auto trouble = store_.trouble(live.number); !why && trouble) {
    why = trouble->localizedDescription();
  }
  if (!why) return false;
  const Error reason = Error::withDescription(
      POSIXErrorDomain, ECANCELED,
      fmt::format("the install of {} was begun anew: {}", live.identifier, *why));
  if (live.creator == client && cancel(database, live, reason, client, consequences)) return true;
  if (endAlike(live.kind, kind)) return false;
  throw Refused{objection(EBUSY, live.identifier, "is being installed in another way")};
}

void DeviceInstallCoordination::removeObserver(CoordinatorObserver* observer) noexcept {
  events_.removeObserver(observer);
}

template <typename Row>
bool DeviceInstallCoordination::enter(Row& row) {
  return store_.change([&](Connection& database, Consequences&) { put(database, row); }, nullptr);
}

std::shared_ptr<PathTransferPromise> DeviceInstallCoordination::createPathTransferPromise(
    std::string_view name, CoordinationClientId client,
    const std::optional<FileLocation>& transferPath, std::uint64_t diskSpaceNeeded) noexcept {
  PromiseRow row{.name = std::string(name), .client = client, .diskSpace = diskSpaceNeeded};
  if (transferPath) {
    row.path = transferPath->path;
    row.pathIsDirectory = transferPath->isDirectory;
  }
  return enter(row) ? objects_.of(row) : nullptr;
}

std::shared_ptr<OutOfBandTransferPromise> DeviceInstallCoordination::createOutOfBandTransferPromise(
    std::string_view name, CoordinationClientId client, std::uint64_t diskSpaceNeeded) noexcept {
  PromiseRow row{.sort = PromiseSort::OutOfBand,
                 .name = std::string(name),
                 .client = client,
                 .diskSpace = diskSpaceNeeded};
  return enter(row) ? std::make_shared<OutOfBandPromiseHandle>(objects_.gate(), row) : nullptr;
}

std::shared_ptr<InstallPlaceholder> DeviceInstallCoordination::createAppPlaceholder(
    std::string_view appName, std::string_view bundleId, InstallType installType,
    CoordinationClientId client) noexcept {
  if (!isUsableIdentifier(bundleId)) return nullptr;
  PlaceholderRow row{.identifier = std::string(bundleId),
                     .name = std::string(appName),
                     .installType = installType,
                     .client = client};
  return enter(row) ? std::make_shared<PlaceholderHandle>(objects_.gate(), row) : nullptr;
}

void DeviceInstallCoordination::uninstallApp(
    std::string_view bundleId, bool,
    std::function<void(const std::optional<Error>&)> completion) noexcept {
  const auto tell = [this, completion = std::move(completion)](const std::optional<Error>& error) {
    events_.post([completion, error] { completion(error); });
  };
  if (!isUsableIdentifier(bundleId)) return tell(unusable());
  workers_.add(bundleId, [this, id = std::string(bundleId), tell] { tell(uninstall(id)); });
}

std::optional<Error> DeviceInstallCoordination::uninstall(const std::string& identifier) {
  std::optional<Error> error;
  const auto present = readApplication(device_.database, identifier, &error);
  if (!present) return error;
  const auto remove = [&](bool placeholderOnly) {
    const KeyedMutex::Guard guard(device_.applicationLocks, identifier);
    return removeForClient(device_, identifier, placeholderOnly, &error);
  };
  if (present->placeholder && !present->installed) {
    // All that is left takes its data along, if its install is not over yet.
    if (remove(false)) std::ignore = endLive(identifier, &error);  // its error is the answer
    return error;
  }
  const std::optional<bool> ended = endLive(identifier, &error);
  // What a coordinator brought has gone with it; an installed version below it stays.
  if (!ended || remove(present->placeholder.has_value())) return error;
  return *ended && isMissing(error) ? std::nullopt : error;
}

std::optional<bool> DeviceInstallCoordination::endLive(const std::string& identifier,
                                                       std::optional<Error>* error) {
  const Error reason = objection(ECANCELED, identifier, "was uninstalled");
  bool ended = false;
  const auto end = [&](Connection& database, Consequences& consequences) {
    const auto live = findLiveCoordinator(database, identifier);
    ended = live && cancel(database, *live, reason, DeviceClientID, consequences);
  };
  return store_.change(end, error) ? std::optional(ended) : std::nullopt;
}

std::unique_ptr<CoordinatorEventListener> DeviceInstallCoordination::createEventListener(
    std::string_view, const std::set<CoordinationClientId>& clients,
    CoordinatorObserver& delegate) noexcept {
  return std::make_unique<Listener>(objects_.gate(), events_.addListener(clients, delegate));
}

bool DeviceInstallCoordination::tap(std::string_view bundleId) noexcept {
  bool live = false;
  const bool noted = store_.change(
      [&](Connection& database, Consequences& consequences) {
        const auto row = findLiveCoordinator(database, bundleId);
        live = row.has_value();
        if (!live) return;
        addEvent(database, *row, EventKind::Prioritize);
        consequences.events = true;
      },
      nullptr);
  return noted && live;
}

bool DeviceInstallCoordination::cancelInstall(std::string_view bundleId) noexcept {
  const auto live = liveCoordinator(bundleId, nullptr);
  if (!live) return false;
  const Error reason =
      Error::withDescription(POSIXErrorDomain, ECANCELED,
                             fmt::format("the install of {} was cancelled on the phone", bundleId));
  return store_.cancelCoordinator(live->number, reason, PersonClientID);
}

bool DeviceInstallCoordination::isBusy(std::string_view bundleId) noexcept {
  return workers_.isBusy(bundleId) || events_.isBusy(bundleId);
}

std::set<std::string> DeviceInstallCoordination::packagesOwedBy(
    CoordinationClientId client) noexcept {
  const auto owed = [&](Connection& database) {
    std::set<std::string> identifiers;
    for (const CoordinatorRow& row : allCoordinators(database)) {
      if (!row.isLive() || row.responsible != client) continue;
      const auto package = findPromise(database, row.package);
      if (!package || !package->complete) identifiers.insert(row.identifier);
    }
    return identifiers;
  };
  return store_.lookUp(owed).value_or(std::set<std::string>());
}

}  // namespace appsync::device
