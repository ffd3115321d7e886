#include "device/coordination/coordination_core.h"

#include <cerrno>

#include "device/apps/installs.h"
#include "device/coordination/coordination_handles.h"
#include "device/coordination/coordination_recovery.h"

namespace appsync::device {
namespace {

constexpr std::size_t InstallsAtOnce = 4;
constexpr std::string_view ChangeFailed = "an install's coordination could not be changed";
constexpr std::string_view ReadFailed = "an install's coordination could not be read";
constexpr std::int64_t ProgressUnits = 1000;

/// The row's object, made if nobody holds one.
template <typename Handle, typename Make>
std::shared_ptr<Handle> shared(std::map<std::int64_t, std::weak_ptr<Handle>>& handles,
                               std::int64_t number, const Make& make) {
  if (const auto found = handles.find(number); found != handles.end()) {
    if (std::shared_ptr<Handle> held = found->second.lock()) return held;
  }
  std::erase_if(handles, [](const auto& item) { return item.second.expired(); });
  std::shared_ptr<Handle> made = make();
  handles[number] = made;
  return made;
}

Refused isOver(std::string_view what) {
  return {Error::withDescription(POSIXErrorDomain, ECANCELED, what)};
}

}  // namespace

CoordinationCore::CoordinationCore(DeviceCore& device, DeviceAppRegistry& registry)
    : device_(device),
      registry_(registry),
      gate_(std::make_shared<CoordinationGate>(*this)),
      events_(device.database, [this](const CoordinatorRow& row) { return handleOf(row); }),
      installs_(*this),
      workers_(InstallsAtOnce) {}

CoordinationCore::~CoordinationCore() {
  installs_.leaveWaiting();
  workers_.stop();
  events_.stop();
  gate_->close();
}

void CoordinationCore::start() {
  const std::optional<Consequences> left = repairCoordination(device_);
  if (left) {
    for (const std::string& identifier : left->over) installs_.tidyUp(identifier);
    sweepCoordination(device_);
  }
  events_.start();
  if (left) apply({left->ready, {}, true});
}

void CoordinationCore::tidyUp(const std::string& identifier) {
  workers_.exclusively(identifier, [&] { installs_.tidyUp(identifier); });
}

void CoordinationCore::hurry() {
  installs_.hurry();
  workers_.expedite();
}

bool CoordinationCore::change(const std::function<void(SQLite::Database&, Consequences&)>& work,
                              std::optional<Error>* error, Database::Commit commit) {
  Consequences consequences;
  const bool changed = device_.database.change(
      ChangeFailed, commit, [&](SQLite::Database& database) { work(database, consequences); },
      error);
  if (changed) apply(consequences);
  return changed;
}

bool CoordinationCore::read(const Database::Work& work, std::optional<Error>* error) {
  return device_.database.read(ReadFailed, work, error);
}

void CoordinationCore::apply(const Consequences& consequences) {
  for (const std::string& identifier : consequences.over) tidyUp(identifier);
  for (const auto& [identifier, coordinator] : consequences.ready) {
    workers_.add(identifier,
                 [this, id = identifier, number = coordinator] { installs_.advance(id, number); });
  }
  if (consequences.events) events_.check();
}

bool CoordinationCore::changeCoordinator(std::int64_t number, const CoordinatorChange& work,
                                         std::optional<Error>* error) {
  return change(
      [&](SQLite::Database& database, Consequences& consequences) {
        auto row = findCoordinator(database, number);
        if (!row || !row->isLive()) throw isOver("the install is over");
        if (row->stage != Stage::Waiting) throw isOver("the package is being installed already");
        work(database, *row);
        put(database, *row);
        follow(database, *row, consequences);
      },
      error);
}

bool CoordinationCore::changePromise(std::int64_t number, const PromiseChange& work,
                                     std::optional<Error>* error) {
  std::optional<PromiseRow> changed;
  const bool done = change(
      [&](SQLite::Database& database, Consequences& consequences) {
        auto row = findPromise(database, number);
        if (!row || row->over) return;
        work(*row);
        put(database, *row);
        for (const CoordinatorRow& coordinator : coordinatorsUsingPromise(database, number)) {
          follow(database, coordinator, consequences);
        }
        changed = row;
      },
      error);
  if (done && changed) showProgress(*changed);
  return done;
}

bool CoordinationCore::changePlaceholder(std::int64_t number, const PlaceholderChange& work,
                                         std::optional<Error>* error) {
  return change(
      [&](SQLite::Database& database, Consequences& consequences) {
        auto row = findPlaceholder(database, number);
        if (!row || row->over) throw isOver("the placeholder is over");
        work(database, *row);
        put(database, *row);
        if (const auto coordinator = coordinatorWithPlaceholder(database, number)) {
          follow(database, *coordinator, consequences);
        }
      },
      error);
}

bool CoordinationCore::cancelCoordinator(std::int64_t number, const Error& reason,
                                         CoordinationClientId client) {
  bool cancelled = false;
  const bool changed = change(
      [&](SQLite::Database& database, Consequences& consequences) {
        const auto row = findCoordinator(database, number);
        cancelled = row && (row->stage == Stage::Cancelled ||
                            device::cancel(database, *row, reason, client, consequences));
      },
      nullptr);
  return changed && cancelled;
}

bool CoordinationCore::cancelPromise(std::int64_t number, const Error& reason,
                                     CoordinationClientId client) {
  return change(
      [&](SQLite::Database& database, Consequences& consequences) {
        auto row = findPromise(database, number);
        if (!row || row->over) return;
        const auto users = coordinatorsUsingPromise(database, number);
        for (const CoordinatorRow& user : users) {
          // The package that is being installed cannot be taken back.
          if (user.stage == Stage::Installing) return;
        }
        row->over = true;
        put(database, *row);
        for (const CoordinatorRow& user : users) {
          if (user.package == number) {
            device::cancel(database, user, reason, client, consequences);
          } else {
            follow(database, user, consequences);  // a placeholder does without its icon
          }
        }
      },
      nullptr);
}

bool CoordinationCore::cancelPlaceholder(std::int64_t number, const Error& reason,
                                         CoordinationClientId client) {
  bool cancelled = true;
  const bool changed = change(
      [&](SQLite::Database& database, Consequences& consequences) {
        auto row = findPlaceholder(database, number);
        if (!row || row->over) return;
        if (const auto coordinator = coordinatorWithPlaceholder(database, number)) {
          cancelled = device::cancel(database, *coordinator, reason, client, consequences);
        } else {
          row->over = true;
          put(database, *row);
        }
      },
      nullptr);
  return changed && cancelled;
}

std::optional<PromiseRow> CoordinationCore::promise(std::int64_t number) {
  std::optional<PromiseRow> row;
  read([&](SQLite::Database& database) { row = findPromise(database, number); });
  return row;
}

void CoordinationCore::noteTrouble(std::int64_t coordinator, const Error& error) {
  const std::lock_guard lock(mutex_);
  troubles_.insert_or_assign(coordinator, error);
}

void CoordinationCore::noteTroubleWithPromise(std::int64_t promise, const Error& error) {
  std::vector<CoordinatorRow> users;
  read([&](SQLite::Database& database) { users = coordinatorsUsingPromise(database, promise); });
  for (const CoordinatorRow& user : users) noteTrouble(user.number, error);
}

std::optional<Error> CoordinationCore::trouble(std::int64_t coordinator) {
  const std::lock_guard lock(mutex_);
  const auto found = troubles_.find(coordinator);
  return found == troubles_.end() ? std::nullopt : std::optional(found->second);
}

/// People who look at the device see how far the package has come.
void CoordinationCore::showProgress(const PromiseRow& promise) {
  std::vector<std::string> identifiers;
  read([&](SQLite::Database& database) {
    for (const CoordinatorRow& user : coordinatorsUsingPromise(database, promise.number)) {
      if (user.package == promise.number) identifiers.push_back(user.identifier);
    }
  });
  for (const std::string& identifier : identifiers) {
    const auto progress = currentProgress(device_.database, device_.observers, identifier);
    if (!progress) continue;
    progress->setInstallState(InstallState::Active);
    progress->setTotalUnitCount(ProgressUnits);
    progress->setCompletedUnitCount(static_cast<std::int64_t>(promise.percent * ProgressUnits));
  }
}

std::shared_ptr<CoordinatorHandle> CoordinationCore::handleOf(const CoordinatorRow& row) {
  const std::lock_guard lock(mutex_);
  auto handle = shared(coordinators_, row.number,
                       [&] { return std::make_shared<CoordinatorHandle>(gate_, row); });
  if (!row.isLive()) handle->settle(row);
  return handle;
}

std::shared_ptr<PathPromiseHandle> CoordinationCore::handleOf(const PromiseRow& row) {
  const std::lock_guard lock(mutex_);
  return shared(promises_, row.number,
                [&] { return std::make_shared<PathPromiseHandle>(gate_, row); });
}

void CoordinationCore::log(std::string_view text) {
  device_.log.write(LogChannel::TWLogCategoryFramework, LogLevel::Default, text);
}

}  // namespace appsync::device
