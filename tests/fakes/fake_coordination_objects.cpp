#include "tests/fakes/fake_coordination_objects.h"

#include <cerrno>

namespace appsync::fakes {

namespace {

std::string promiseText(const DataPromise* promise) { return promise ? promise->name() : "none"; }

/// Why a promise is not taken.
std::optional<Error> objection(const std::shared_ptr<PathTransferPromise>& promise) {
  if (!promise) return Error::posix(EINVAL);
  const auto* const fake = dynamic_cast<const FakePathTransferPromise*>(promise.get());
  if (!fake || !fake->state().cancellation) return std::nullopt;
  return Error::posix(ECANCELED);
}

std::optional<Error> objection(const std::shared_ptr<InstallPlaceholder>& placeholder,
                               const std::string& bundleId) {
  if (!placeholder || placeholder->bundleIdentifier() != bundleId) return Error::posix(EINVAL);
  const auto* const fake = dynamic_cast<const FakeInstallPlaceholder*>(placeholder.get());
  if (!fake || !fake->state().cancellation) return std::nullopt;
  return Error::posix(ECANCELED);
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
  if (state_.cancellation) return true;
  apply(state_);
  return true;
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
  if (refusal) {
    setError(error, *refusal);
    return false;
  }
  const std::scoped_lock lock(mutex_);
  if (state_.isLive()) apply(state_);
  return true;
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
      [&](State& state) { state.appAssetPromise = promise; }, objection(promise));
}

bool FakeInstallCoordinator::setAppAssetPromiseResponsibleClient(
    CoordinationClientId client, std::optional<Error>* error) noexcept {
  return change("setAppAssetPromiseResponsibleClient", std::to_string(client), error,
                [&](State& state) { state.responsibleClient = client; });
}

bool FakeInstallCoordinator::setUserDataPromise(
    const std::shared_ptr<OutOfBandTransferPromise>& promise,
    std::optional<Error>* error) noexcept {
  return change("setUserDataPromise", promiseText(promise.get()), error,
                [&](State& state) { state.userDataPromise = promise; });
}

bool FakeInstallCoordinator::setPlaceholderPromise(
    const std::shared_ptr<InstallPlaceholder>& placeholder, std::optional<Error>* error) noexcept {
  return change(
      "setPlaceholderPromise", placeholder ? placeholder->description() : "none", error,
      [&](State& state) { state.placeholder = placeholder; }, objection(placeholder, label()));
}

bool FakeInstallCoordinator::cancel(const Error& reason, CoordinationClientId client) noexcept {
  const bool taken = change("cancel", argumentText(reason) + ", " + std::to_string(client), nullptr,
                            [](State&) {});
  if (taken) context_.service.giveUp(*this, reason, client);
  return taken && !state().completed;
}

std::string FakeInstallCoordinator::description() const { return "<Coordinator " + label() + ">"; }

}  // namespace appsync::fakes
