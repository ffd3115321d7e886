#include "tests/fakes/fake_coordination_objects.h"

#include <cerrno>

namespace appsync::fakes {

namespace {

std::string promiseText(const DataPromise* promise) { return promise ? promise->name() : "none"; }

bool isOver(const DataPromise& promise) {
  if (const auto* const path = dynamic_cast<const FakePathTransferPromise*>(&promise)) {
    return path->state().isOver();
  }
  const auto* const other = dynamic_cast<const FakeOutOfBandTransferPromise*>(&promise);
  return other && other->state().isOver();
}

std::optional<Error> objection(const std::shared_ptr<InstallPlaceholder>& placeholder,
                               const std::string& bundleId, bool takesUnfinished) {
  if (!placeholder || placeholder->bundleIdentifier() != bundleId) return Error::posix(EINVAL);
  const auto* const fake = dynamic_cast<const FakeInstallPlaceholder*>(placeholder.get());
  if (!fake) return std::nullopt;
  if (fake->state().isOver()) return Error::posix(ECANCELED);
  if (fake->state().configurationComplete || takesUnfinished) return std::nullopt;
  return Error::posix(EINVAL);
}

std::string optionsText(const InstallOptions& options) {
  return "type " + std::to_string(static_cast<std::uint64_t>(options.installType)) + " target " +
         std::to_string(options.installTargetType) +
         (options.storeMetadata ? " metadata " + description(options.storeMetadata->values) : "") +
         (options.sinfData ? " sinf " + description(PropertyList(*options.sinfData)) : "");
}

}  // namespace

FakeInstallPlaceholder::State FakeInstallPlaceholder::state() const {
  const std::scoped_lock lock(mutex_);
  return state_;
}

template <typename Change>
bool FakeInstallPlaceholder::change(std::string_view operation, std::string arguments,
                                    std::optional<Error>* error, Change apply) {
  const std::string name = "InstallPlaceholder." + std::string(operation);
  const std::string bundleId = bundleIdentifier();
  if (context_.faults.strikes(name, bundleId, error)) return false;
  context_.trace.add(TraceCall, arguments.empty() ? callText(name, bundleId)
                                                  : callText(name, bundleId, arguments));
  const std::scoped_lock lock(mutex_);
  if (state_.isOver()) {
    setError(error, Error::posix(ECANCELED));
    return false;
  }
  apply(state_);
  return true;
}

void FakeInstallPlaceholder::settle() {
  const std::scoped_lock lock(mutex_);
  state_.settled = true;
}

bool FakeInstallPlaceholder::setIconPromise(const std::shared_ptr<PathTransferPromise>& promise,
                                            std::optional<Error>* error) noexcept {
  return change("setIconPromise", promiseText(promise.get()), error,
                [&](State& state) { state.iconPromise = promise; });
}

bool FakeInstallPlaceholder::setPlaceholderAttributes(const PlaceholderAttributes& attributes,
                                                      std::optional<Error>* error) noexcept {
  return change("setPlaceholderAttributes", appsync::description(attributes), error,
                [&](State& state) { state.attributes = attributes; });
}

bool FakeInstallPlaceholder::setMetadata(const StoreMetadata& metadata,
                                         std::optional<Error>* error) noexcept {
  return change("setMetadata", appsync::description(metadata.values), error,
                [&](State& state) { state.metadata = metadata; });
}

bool FakeInstallPlaceholder::setSinfData(ByteView sinf, std::optional<Error>* error) noexcept {
  const Bytes bytes(sinf.begin(), sinf.end());
  return change("setSinfData", appsync::description(PropertyList(bytes)), error,
                [&](State& state) { state.sinfData = bytes; });
}

bool FakeInstallPlaceholder::setConfigurationComplete(std::optional<Error>* error) noexcept {
  return change("setConfigurationComplete", "", error,
                [](State& state) { state.configurationComplete = true; });
}

bool FakeInstallPlaceholder::cancel(const Error& reason, CoordinationClientId client) noexcept {
  return change("cancel", argumentText(reason) + ", " + std::to_string(client), nullptr,
                [&](State& state) {
                  state.cancellation = Cancellation{reason, client};
                });
}

std::string FakeInstallPlaceholder::description() const {
  return "<Placeholder " + bundleIdentifier() + ">";
}

FakeInstallCoordinator::State FakeInstallCoordinator::state() const {
  const std::scoped_lock lock(mutex_);
  return state_;
}

void FakeInstallCoordinator::edit(const std::function<void(State&)>& apply) {
  const std::scoped_lock lock(mutex_);
  apply(state_);
}

template <typename Change>
bool FakeInstallCoordinator::change(std::string_view operation, std::string arguments,
                                    std::optional<Error>* error, Change apply,
                                    const std::optional<Error>& refusal) {
  const std::string name = "InstallCoordinator." + std::string(operation);
  if (context_.faults.strikes(name, label(), error)) return false;
  context_.trace.add(TraceCall, callText(name, label(), arguments));
  const std::scoped_lock lock(mutex_);
  const std::optional<Error> reason = state_.isLive() ? refusal : Error::posix(ECANCELED);
  if (reason) {
    setError(error, *reason);
    return false;
  }
  apply(state_);
  return true;
}

std::optional<Error> FakeInstallCoordinator::objection(const DataPromise* promise) const {
  if (!promise) return Error::posix(EINVAL);
  if (isOver(*promise)) return Error::posix(ECANCELED);
  const bool isTaken = context_.service.isPromisedElsewhere(*promise, *this);
  return isTaken ? std::optional(Error::posix(EBUSY)) : std::nullopt;
}

void FakeInstallCoordinator::setObserver(CoordinatorObserver* observer) noexcept {
  context_.trace.add(TraceCall, callText("InstallCoordinator.setObserver", label()));
  edit([&](State& state) { state.observer = observer; });
  context_.service.observerChanged();
}

bool FakeInstallCoordinator::setInstallOptions(const InstallOptions& options,
                                               std::optional<Error>* error) noexcept {
  return change("setInstallOptions", optionsText(options), error,
                [&](State& state) { state.options = options; });
}

bool FakeInstallCoordinator::setInitialQPKAssetPromises(
    const std::vector<std::shared_ptr<DataPromise>>& promises,
    std::optional<Error>* error) noexcept {
  return change("setInitialQPKAssetPromises", std::to_string(promises.size()), error,
                [&](State& state) { state.initialPromises = promises; });
}

std::shared_ptr<PathTransferPromise> FakeInstallCoordinator::appAssetPromise(
    std::optional<Error>* error) noexcept {
  if (context_.faults.strikes("InstallCoordinator.appAssetPromise", label(), error)) return nullptr;
  context_.trace.add(TraceQuery, callText("InstallCoordinator.appAssetPromise", label()));
  return state().appAssetPromise;
}

bool FakeInstallCoordinator::setAppAssetPromise(const std::shared_ptr<PathTransferPromise>& promise,
                                                std::optional<Error>* error) noexcept {
  return change(
      "setAppAssetPromise", promiseText(promise.get()), error,
      [&](State& state) { state.appAssetPromise = promise; }, objection(promise.get()));
}

bool FakeInstallCoordinator::setAppAssetPromiseResponsibleClient(
    CoordinationClientId client, std::optional<Error>* error) noexcept {
  return change("setAppAssetPromiseResponsibleClient", std::to_string(client), error,
                [&](State& state) { state.responsibleClient = client; });
}

bool FakeInstallCoordinator::setUserDataPromise(
    const std::shared_ptr<OutOfBandTransferPromise>& promise,
    std::optional<Error>* error) noexcept {
  return change(
      "setUserDataPromise", promiseText(promise.get()), error,
      [&](State& state) { state.userDataPromise = promise; }, objection(promise.get()));
}

bool FakeInstallCoordinator::setPlaceholderPromise(
    const std::shared_ptr<InstallPlaceholder>& placeholder, std::optional<Error>* error) noexcept {
  return change(
      "setPlaceholderPromise", placeholder ? placeholder->description() : "none", error,
      [&](State& state) { state.placeholder = placeholder; },
      fakes::objection(placeholder, label(), context_.service.takesUnfinishedPlaceholders()));
}

bool FakeInstallCoordinator::cancel(const Error& reason, CoordinationClientId client) noexcept {
  constexpr std::string_view operation = "InstallCoordinator.cancel";
  if (context_.faults.strikes(operation, label(), nullptr)) return false;
  context_.trace.add(TraceCall, callText(operation, label(), reason, client));
  context_.service.giveUp(*this, reason, client);
  return !state().completed;
}

std::string FakeInstallCoordinator::description() const { return "<Coordinator " + label() + ">"; }

}  // namespace appsync::fakes
