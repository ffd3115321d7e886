#include "device/coordination/coordination_handles.h"

#include <fmt/format.h>

#include <algorithm>
#include <cerrno>

namespace appsync::device {
namespace {

Error posixError(int code, std::string_view reason) {
  return Error::withDescription(POSIXErrorDomain, code, reason);
}

[[noreturn]] void refuse(int code, std::string_view reason) {
  throw Refused{posixError(code, reason)};
}

/// What an object of a client stands for. Throws Refused for none and for one of another service.
template <typename Object>
std::int64_t numberOf(const std::shared_ptr<Object>& object, const ServiceObject& owner,
                      std::string_view what) {
  const auto* const known = dynamic_cast<const ServiceObject*>(object.get());
  if (!known || !known->belongsWith(owner)) {
    refuse(EINVAL,
           fmt::format("the {} is {}", what, object ? "none of this service's" : "missing"));
  }
  if (const auto trouble = known->trouble()) throw Refused{*trouble};
  return known->number();
}

/// Throws Refused for a promise that cannot be kept any more or is another coordinator's.
void checkPromise(Connection& database, std::int64_t number, std::int64_t coordinator) {
  const auto promise = findPromise(database, number);
  if (!promise || promise->over) refuse(ECANCELED, "the promise has been cancelled or is settled");
  for (const CoordinatorRow& user : coordinatorsUsingPromise(database, number)) {
    if (user.number == coordinator) continue;
    refuse(EBUSY, fmt::format("the promise is made to {} already", user.identifier));
  }
}

/// The number of a promise that can be made to the coordinator.
template <typename Promise>
std::int64_t promised(Connection& database, const std::shared_ptr<Promise>& promise,
                      const ServiceObject& owner, std::string_view what, std::int64_t coordinator) {
  const std::int64_t number = numberOf(promise, owner, what);
  checkPromise(database, number, coordinator);
  return number;
}

/// Throws Refused for a placeholder that the coordinator cannot have.
void checkPlaceholder(Connection& database, std::int64_t number, const CoordinatorRow& row) {
  const auto placeholder = findPlaceholder(database, number);
  if (!placeholder || placeholder->over) refuse(ECANCELED, "the placeholder has been cancelled");
  if (!placeholder->configured) {
    refuse(EINVAL, "the placeholder's configuration is not complete");
  }
  if (placeholder->identifier != row.identifier) {
    refuse(EINVAL, fmt::format("the placeholder is one of {}, not of {}", placeholder->identifier,
                               row.identifier));
  }
  const auto present = findPlaceholder(database, row.placeholder);
  if (present && present->number != number && present->presence != Presence::None) {
    refuse(EEXIST, fmt::format("{} has its placeholder already", row.identifier));
  }
  if (placeholder->icon) checkPromise(database, *placeholder->icon, row.number);
}

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

}  // namespace

std::shared_ptr<CoordinatorHandle> CoordinationObjects::of(const CoordinatorRow& row) {
  const Lock lock(mutex_);
  auto handle = shared(coordinators_, row.number,
                       [&] { return std::make_shared<CoordinatorHandle>(gate_, row); });
  if (!row.isLive()) handle->settle(row);
  return handle;
}

std::shared_ptr<PathPromiseHandle> CoordinationObjects::of(const PromiseRow& row) {
  const Lock lock(mutex_);
  return shared(promises_, row.number,
                [&] { return std::make_shared<PathPromiseHandle>(gate_, row); });
}

bool ServiceObject::attempt(const std::function<bool(CoordinationStore&)>& use,
                            std::optional<Error>* error) const {
  const auto done = with(std::optional<bool>(), [&](CoordinationObjects& service) {
    return std::optional(use(service.store));
  });
  if (!done) setError(error, posixError(ESHUTDOWN, "the coordination service has ended"));
  return done.value_or(false);
}

/// Only shown, so a write that fails is no loss.
template <typename Promise>
void PromiseHandle<Promise>::setPercentComplete(double fraction) noexcept {
  const double percent = fraction > 0 ? std::min(fraction, 1.0) : 0;  // also for what is no number
  with(false, [&](CoordinationObjects& service) {
    return service.store.changePromise(
        number(), [&](PromiseRow& row) { row.percent = percent; }, nullptr);
  });
}
template class PromiseHandle<PathTransferPromise>;
template class PromiseHandle<OutOfBandTransferPromise>;

std::optional<FileLocation> PathPromiseHandle::transferPath() const {
  const PromiseRow present = row();
  if (!present.path) return std::nullopt;
  return FileLocation{*present.path, present.pathIsDirectory};
}

void PathPromiseHandle::setTransferPath(const FileLocation& location) noexcept {
  fulfil([&](PromiseRow& row) {
    row.path = location.path;
    row.pathIsDirectory = location.isDirectory;
  });
}

bool PlaceholderHandle::change(const CoordinationStore::PlaceholderChange& change,
                               std::optional<Error>* error) {
  return attempt(
      [&](CoordinationStore& store) { return store.changePlaceholder(number(), change, error); },
      error);
}

bool PlaceholderHandle::setIconPromise(const std::shared_ptr<PathTransferPromise>& promise,
                                       std::optional<Error>* error) noexcept {
  return change(
      [&](Connection& database, PlaceholderRow& row) {
        const auto coordinator = coordinatorWithPlaceholder(database, row.number);
        row.icon = promised(database, promise, *this, "icon promise",
                            coordinator ? coordinator->number : 0);
      },
      error);
}

bool PlaceholderHandle::setPlaceholderAttributes(const PlaceholderAttributes& attributes,
                                                 std::optional<Error>* error) noexcept {
  const auto bytes = bytesOf(attributes, error);
  return bytes && change([&](Connection&, PlaceholderRow& row) { row.attributes = bytes; }, error);
}

bool PlaceholderHandle::setMetadata(const StoreMetadata& metadata,
                                    std::optional<Error>* error) noexcept {
  const auto bytes = bytesOf(metadata, error);
  return bytes && change([&](Connection&, PlaceholderRow& row) { row.metadata = bytes; }, error);
}

bool PlaceholderHandle::setSinfData(ByteView sinf, std::optional<Error>* error) noexcept {
  const Bytes bytes(sinf.begin(), sinf.end());
  return change([&](Connection&, PlaceholderRow& row) { row.sinf = bytes; }, error);
}

bool PlaceholderHandle::setConfigurationComplete(std::optional<Error>* error) noexcept {
  return change([](Connection&, PlaceholderRow& row) { row.configured = true; }, error);
}

bool PlaceholderHandle::cancel(const Error& reason, CoordinationClientId client) noexcept {
  return with(false, [&](CoordinationObjects& service) {
    return service.store.cancelPlaceholder(number(), reason, client);
  });
}

void CoordinatorHandle::settle(const CoordinatorRow& row) {
  const Lock lock(mutex_);
  settled_ = row;
}

std::optional<CoordinatorRow> CoordinatorHandle::find(std::optional<Error>* error) const {
  {
    const Lock lock(mutex_);
    if (settled_) return settled_;
  }
  return lookUp([&](Connection& database) { return findCoordinator(database, number()); }, error);
}

bool CoordinatorHandle::change(const CoordinationStore::CoordinatorChange& change,
                               std::optional<Error>* error) {
  return attempt(
      [&](CoordinationStore& store) { return store.changeCoordinator(number(), change, error); },
      error);
}

std::optional<Error> CoordinatorHandle::error() const {
  std::optional<Error> failure;
  const std::optional<CoordinatorRow> found = find(&failure);
  if (!found) return failure;
  if (!found->error && found->isLive()) {
    return with(std::optional<Error>(),
                [&](CoordinationObjects& service) { return service.store.trouble(number()); });
  }
  if (!found->error) return std::nullopt;
  // One that cannot be read is an error all the same.
  return errorFrom(*found->error).value_or(Error::posix(EIO));
}

void CoordinatorHandle::setObserver(CoordinatorObserver* observer) noexcept {
  with(false, [&](CoordinationObjects& service) {
    service.events.setObserver(number(), observer);
    return true;
  });
}

bool CoordinatorHandle::setInstallOptions(const InstallOptions& options,
                                          std::optional<Error>* error) noexcept {
  const auto bytes = bytesOf(options, error);
  return bytes && change([&](Connection&, CoordinatorRow& row) { row.options = bytes; }, error);
}

bool CoordinatorHandle::setInitialQPKAssetPromises(
    const std::vector<std::shared_ptr<DataPromise>>& promises,
    std::optional<Error>* error) noexcept {
  return change(
      [&](Connection& database, CoordinatorRow& row) {
        std::vector<std::int64_t> numbers;
        for (const auto& promise : promises) {
          numbers.push_back(promised(database, promise, *this, "initial promise", row.number));
        }
        row.initialPromises = bytesOf(numbers);
      },
      error);
}

std::shared_ptr<PathTransferPromise> CoordinatorHandle::appAssetPromise(
    std::optional<Error>* error) noexcept {
  using Promise = std::shared_ptr<PathTransferPromise>;
  return with(Promise(), [&](CoordinationObjects& service) -> Promise {
    const auto package = [&](Connection& database) {
      const auto row = findCoordinator(database, number());
      return row ? findPromise(database, row->package) : std::nullopt;
    };
    const auto promise = service.store.lookUp(package, error).value_or(std::nullopt);
    return promise ? service.of(*promise) : nullptr;
  });
}

bool CoordinatorHandle::setAppAssetPromise(const std::shared_ptr<PathTransferPromise>& promise,
                                           std::optional<Error>* error) noexcept {
  return change(
      [&](Connection& database, CoordinatorRow& row) {
        row.package = promised(database, promise, *this, "package promise", row.number);
      },
      error);
}

bool CoordinatorHandle::setAppAssetPromiseResponsibleClient(CoordinationClientId client,
                                                            std::optional<Error>* error) noexcept {
  return change([&](Connection&, CoordinatorRow& row) { row.responsible = client; }, error);
}

bool CoordinatorHandle::setUserDataPromise(const std::shared_ptr<OutOfBandTransferPromise>& promise,
                                           std::optional<Error>* error) noexcept {
  return change(
      [&](Connection& database, CoordinatorRow& row) {
        row.userData = promised(database, promise, *this, "user data promise", row.number);
      },
      error);
}

bool CoordinatorHandle::setPlaceholderPromise(
    const std::shared_ptr<InstallPlaceholder>& placeholder, std::optional<Error>* error) noexcept {
  if (!placeholder) return failWith(error, posixError(EINVAL, "there is no placeholder"));
  return change(
      [&](Connection& database, CoordinatorRow& row) {
        const std::int64_t number = numberOf(placeholder, *this, "placeholder");
        checkPlaceholder(database, number, row);
        row.placeholder = number;
      },
      error);
}

bool CoordinatorHandle::cancel(const Error& reason, CoordinationClientId client) noexcept {
  return with(false, [&](CoordinationObjects& service) {
    return service.store.cancelCoordinator(number(), reason, client);
  });
}

}  // namespace appsync::device
