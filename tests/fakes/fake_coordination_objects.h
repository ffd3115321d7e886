#pragma once

#include <algorithm>
#include <functional>
#include <memory>
#include <mutex>
#include <utility>
#include <vector>

#include "platform/install_coordination.h"
#include "tests/fakes/fault_plan.h"

namespace appsync::fakes {

/// A cancellation of a promise, placeholder or coordinator.
struct Cancellation {
  Error reason;
  CoordinationClientId client = 0;
  bool operator==(const Cancellation&) const = default;
};

class FakeInstallCoordinator;

/// What coordinators leave to their service.
class CoordinatorOwner {
 public:
  virtual void observerChanged() = 0;
  /// Cancels the coordinator, once, with what belongs to it.
  virtual void giveUp(FakeInstallCoordinator& coordinator, const Error& reason,
                      CoordinationClientId client) = 0;
  /// Whether another live coordinator has the promise.
  virtual bool isPromisedElsewhere(const DataPromise& promise,
                                   const FakeInstallCoordinator& coordinator) = 0;
  virtual bool takesUnfinishedPlaceholders() const = 0;

 protected:
  ~CoordinatorOwner() = default;
};

/// What the objects of a coordination service share. Operations are traced, and fail where the plan
/// says so, under "DataPromise.…", "InstallPlaceholder.…" and "InstallCoordinator.…"; their first
/// argument is the promise's name or the bundle identifier.
struct CoordinationContext {
  CallTrace& trace;
  FaultPlan& faults;
  CoordinatorOwner& service;
};

/// How a data promise stands: the same for both sorts of promise.
struct PromiseState {
  std::string name;
  CoordinationClientId client = 0;
  std::uint64_t identifier = 0;
  std::uint64_t diskSpaceNeeded = 0;
  std::optional<FileLocation> transferPath;
  double percentComplete = 0;
  bool complete = false;
  bool began = false;  ///< its coordinator's client was told so
  bool settled = false;
  std::optional<Cancellation> cancellation;

  bool isOver() const { return settled || cancellation; }
};

template <typename Promise>
class FakeDataPromise : public Promise {
 public:
  FakeDataPromise(CoordinationContext context, PromiseState state)
      : context_(context), state_(std::move(state)) {}

  std::string name() const override { return state().name; }
  std::uint64_t identifier() const noexcept override { return state().identifier; }
  double percentComplete() const noexcept override { return state().percentComplete; }
  void setPercentComplete(double fraction) noexcept override {
    change(callText("DataPromise.setPercentComplete", name(), fraction),
           [&](PromiseState& state) { state.percentComplete = std::clamp(fraction, 0.0, 1.0); });
  }
  bool isComplete() const noexcept override { return state().complete; }
  void setComplete(bool complete) noexcept override {
    change(callText("DataPromise.setComplete", name(), complete),
           [&](PromiseState& state) { state.complete = complete; });
  }
  void cancel(const Error& reason, CoordinationClientId client) noexcept override {
    change(callText("DataPromise.cancel", name(), reason, client), [&](PromiseState& state) {
      state.cancellation = Cancellation{reason, client};
    });
  }
  std::string description() const override { return "<Promise " + name() + ">"; }

  /// A copy of all there is to know.
  PromiseState state() const {
    const std::scoped_lock lock(mutex_);
    return state_;
  }
  /// Its coordinator is over: nothing changes it any more.
  void settle() {
    const std::scoped_lock lock(mutex_);
    state_.settled = true;
  }
  /// Whether there is something to tell its coordinator's client; true once.
  bool begins() {
    const std::scoped_lock lock(mutex_);
    const bool begun = state_.percentComplete > 0 || state_.transferPath;
    return begun && !std::exchange(state_.began, true);
  }

 protected:
  /// Without effect once cancelled or settled.
  template <typename Change>
  void change(std::string line, Change apply) {
    context_.trace.add(TraceCall, std::move(line));
    const std::scoped_lock lock(mutex_);
    if (!state_.isOver()) apply(state_);
  }

 private:
  CoordinationContext context_;
  mutable std::mutex mutex_;
  PromiseState state_;
};

class FakePathTransferPromise : public FakeDataPromise<PathTransferPromise> {
 public:
  using FakeDataPromise::FakeDataPromise;
  std::optional<FileLocation> transferPath() const override { return state().transferPath; }
  void setTransferPath(const FileLocation& location) noexcept override {
    change(callText("DataPromise.setTransferPath", name(), location),
           [&](PromiseState& state) { state.transferPath = location; });
  }
};

using FakeOutOfBandTransferPromise = FakeDataPromise<OutOfBandTransferPromise>;

class FakeInstallPlaceholder : public InstallPlaceholder {
 public:
  struct State {
    std::string name;
    std::string bundleIdentifier;
    InstallType installType = InstallType::None;
    CoordinationClientId client = 0;
    std::shared_ptr<PathTransferPromise> iconPromise;
    std::optional<PlaceholderAttributes> attributes;
    std::optional<StoreMetadata> metadata;
    std::optional<Bytes> sinfData;
    bool configurationComplete = false;
    bool settled = false;
    std::optional<Cancellation> cancellation;

    bool isOver() const { return settled || cancellation; }
  };

  FakeInstallPlaceholder(CoordinationContext context, State state)
      : context_(context), state_(std::move(state)) {}

  std::string bundleIdentifier() const override { return state().bundleIdentifier; }
  bool setIconPromise(const std::shared_ptr<PathTransferPromise>& promise,
                      std::optional<Error>* error) noexcept override;
  bool setPlaceholderAttributes(const PlaceholderAttributes& attributes,
                                std::optional<Error>* error) noexcept override;
  bool setMetadata(const StoreMetadata& metadata, std::optional<Error>* error) noexcept override;
  bool setSinfData(ByteView sinf, std::optional<Error>* error) noexcept override;
  bool setConfigurationComplete(std::optional<Error>* error) noexcept override;
  bool cancel(const Error& reason, CoordinationClientId client) noexcept override;
  std::string description() const override;

  State state() const;
  /// Its coordinator is over: nothing changes it any more.
  void settle();

 private:
  template <typename Change>
  bool change(std::string_view operation, std::string arguments, std::optional<Error>* error,
              Change apply);

  CoordinationContext context_;
  mutable std::mutex mutex_;
  State state_;
};

class FakeInstallCoordinator : public InstallCoordinator,
                               public std::enable_shared_from_this<FakeInstallCoordinator> {
 public:
  struct State {
    CoordinatorKind kind = CoordinatorKind::Initiating;
    std::optional<std::string> bundleIdentifier;
    CoordinationClientId creator = 0;
    std::optional<Error> error;
    CoordinatorObserver* observer = nullptr;
    std::optional<InstallOptions> options;
    std::optional<std::vector<std::shared_ptr<DataPromise>>> initialPromises;
    std::shared_ptr<PathTransferPromise> appAssetPromise;
    CoordinationClientId responsibleClient = 0;
    std::shared_ptr<OutOfBandTransferPromise> userDataPromise;
    std::shared_ptr<InstallPlaceholder> placeholder;
    bool placeholderStands = false;
    bool placeholderIsAdopted = false;  ///< it stood there before
    bool completed = false;
    std::optional<Cancellation> cancellation;

    bool isLive() const { return !completed && !cancellation; }
  };

  FakeInstallCoordinator(CoordinationContext context, State state)
      : context_(context), state_(std::move(state)) {}

  std::optional<std::string> bundleIdentifier() const override { return state().bundleIdentifier; }
  CoordinationClientId creatorIdentifier() const noexcept override { return state().creator; }
  std::optional<Error> error() const override { return state().error; }
  void setObserver(CoordinatorObserver* observer) noexcept override;
  bool hasInstallOptions() const noexcept override { return state().options.has_value(); }
  bool setInstallOptions(const InstallOptions& options,
                         std::optional<Error>* error) noexcept override;
  bool hasInitialQPKAssetPromises() const noexcept override {
    return state().initialPromises.has_value();
  }
  bool setInitialQPKAssetPromises(const std::vector<std::shared_ptr<DataPromise>>& promises,
                                  std::optional<Error>* error) noexcept override;
  bool hasAppAssetPromise() const noexcept override { return state().appAssetPromise != nullptr; }
  std::shared_ptr<PathTransferPromise> appAssetPromise(
      std::optional<Error>* error) noexcept override;
  bool setAppAssetPromise(const std::shared_ptr<PathTransferPromise>& promise,
                          std::optional<Error>* error) noexcept override;
  CoordinationClientId appAssetPromiseResponsibleClient() const noexcept override {
    return state().responsibleClient;
  }
  bool setAppAssetPromiseResponsibleClient(CoordinationClientId client,
                                           std::optional<Error>* error) noexcept override;
  bool hasUserDataPromise() const noexcept override { return state().userDataPromise != nullptr; }
  bool setUserDataPromise(const std::shared_ptr<OutOfBandTransferPromise>& promise,
                          std::optional<Error>* error) noexcept override;
  bool hasPlaceholderPromise() const noexcept override { return state().placeholder != nullptr; }
  bool setPlaceholderPromise(const std::shared_ptr<InstallPlaceholder>& placeholder,
                             std::optional<Error>* error) noexcept override;
  bool cancel(const Error& reason, CoordinationClientId client) noexcept override;
  std::string description() const override;

  /// A copy of all there is to know.
  State state() const;
  /// Changes anything, untraced: what a test, or the service, does to it.
  void edit(const std::function<void(State&)>& change);

 private:
  /// "com.a", or "none" when the coordinator is not known any more.
  std::string label() const { return state().bundleIdentifier.value_or("none"); }
  /// Why a promise is not taken.
  std::optional<Error> objection(const DataPromise* promise) const;
  /// With a reason to refuse, or once it is over, nothing is changed.
  template <typename Change>
  bool change(std::string_view operation, std::string arguments, std::optional<Error>* error,
              Change apply, const std::optional<Error>& refusal = std::nullopt);

  CoordinationContext context_;
  mutable std::mutex mutex_;
  State state_;
};

}  // namespace appsync::fakes
