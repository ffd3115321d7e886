#pragma once

#include "device/coordination/coordination_store.h"
#include "device/coordination/event_delivery.h"
#include "platform/mutex.h"

namespace appsync::device {

class CoordinationObjects;
class CoordinatorHandle;
class PathPromiseHandle;

/// The way to a service that may be gone. Whoever holds it may outlive the service.
class CoordinationGate {
 public:
  explicit CoordinationGate(CoordinationObjects& objects) : objects_(&objects) {}

  /// Gives `otherwise` when the service is gone; else it stays until `use` has returned.
  template <typename Result, typename Use>
  Result with(Result otherwise, const Use& use) {
    const SharedLock lock(mutex_);
    return objects_ ? Result(use(*objects_)) : otherwise;
  }
  /// Waits for those who use the service.
  void close() {
    const Lock lock(mutex_);
    objects_ = nullptr;
  }

 private:
  SharedMutex mutex_;
  CoordinationObjects* objects_ APPSYNC_GUARDED_BY(mutex_);
};

/// Gives out the objects of the service, which are thin: they hold a row's number. Thread-safe.
class CoordinationObjects {
 public:
  CoordinationObjects(CoordinationStore& ofRows, EventDelivery& ofEvents)
      : store(ofRows), events(ofEvents) {}

  // The one object for a row as long as somebody holds it.
  std::shared_ptr<CoordinatorHandle> of(const CoordinatorRow& row);
  std::shared_ptr<PathPromiseHandle> of(const PromiseRow& row);
  const std::shared_ptr<CoordinationGate>& gate() const { return gate_; }

  CoordinationStore& store;
  EventDelivery& events;

 private:
  const std::shared_ptr<CoordinationGate> gate_ = std::make_shared<CoordinationGate>(*this);
  Mutex mutex_;
  std::map<std::int64_t, std::weak_ptr<CoordinatorHandle>> coordinators_ APPSYNC_GUARDED_BY(mutex_);
  std::map<std::int64_t, std::weak_ptr<PathPromiseHandle>> promises_ APPSYNC_GUARDED_BY(mutex_);
};

/// What every object of the service has. It stays usable when the service is gone.
class ServiceObject {
 public:
  ServiceObject(std::shared_ptr<CoordinationGate> gate, std::int64_t number)
      : gate_(std::move(gate)), number_(number) {}
  virtual ~ServiceObject() = default;

  std::int64_t number() const { return number_; }
  /// Whether both are of one service.
  bool belongsWith(const ServiceObject& other) const { return gate_ == other.gate_; }
  /// Why it cannot be promised to a coordinator any more.
  virtual std::optional<Error> trouble() const { return std::nullopt; }

 protected:
  template <typename Result, typename Use>
  Result with(Result otherwise, const Use& use) const {
    return gate_->with(std::move(otherwise), use);
  }
  /// What the work finds, which is an optional row; nullopt also when it cannot be read (then with
  /// an error) or the service is gone.
  template <typename LookUp>
  auto lookUp(const LookUp& work, std::optional<Error>* error) const {
    using Found = std::invoke_result_t<LookUp, Connection&>;
    return with(Found(), [&](CoordinationObjects& service) {
      return service.store.lookUp(work, error).value_or(Found());
    });
  }
  /// False with an error when the service is gone, else what `use` gives.
  [[nodiscard]] bool attempt(const std::function<bool(CoordinationStore&)>& use,
                             std::optional<Error>* error) const;

 private:
  const std::shared_ptr<CoordinationGate> gate_;
  const std::int64_t number_;
};

template <typename Promise>
class PromiseHandle : public Promise, public ServiceObject {
 public:
  PromiseHandle(std::shared_ptr<CoordinationGate> gate, const PromiseRow& row)
      : ServiceObject(std::move(gate), row.number), name_(row.name) {}

  std::string name() const override { return name_; }
  std::uint64_t identifier() const noexcept override {
    return static_cast<std::uint64_t>(number());
  }
  double percentComplete() const noexcept override { return row().percent; }
  void setPercentComplete(double fraction) noexcept override;
  bool isComplete() const noexcept override { return row().complete; }
  void setComplete(bool complete) noexcept override {
    fulfil([&](PromiseRow& row) { row.complete = complete; });
  }
  void cancel(const Error& reason, CoordinationClientId client) noexcept override {
    with(false, [&](CoordinationObjects& service) {
      return service.store.cancelPromise(number(), reason, client);
    });
  }
  std::string description() const override { return "<Promise " + name_ + ">"; }

  std::optional<Error> trouble() const override {
    const Lock lock(mutex_);
    return trouble_;
  }

 protected:
  PromiseRow row() const {
    const auto find = [&](Connection& database) { return findPromise(database, number()); };
    return lookUp(find, nullptr).value_or(PromiseRow());
  }
  /// For what its coordinator cannot do without.
  void fulfil(const CoordinationStore::PromiseChange& change) {
    with(false, [&](CoordinationObjects& service) {
      std::optional<Error> error;
      const bool done = service.store.changePromise(number(), change, &error);
      if (!done) service.store.noteTroubleWithPromise(number(), *error);
      const Lock lock(mutex_);
      if (!done) trouble_ = error;
      return done;
    });
  }

 private:
  const std::string name_;
  mutable Mutex mutex_;
  std::optional<Error> trouble_ APPSYNC_GUARDED_BY(mutex_);
};

class PathPromiseHandle final : public PromiseHandle<PathTransferPromise> {
 public:
  using PromiseHandle::PromiseHandle;
  std::optional<FileLocation> transferPath() const override;
  void setTransferPath(const FileLocation& location) noexcept override;
};

using OutOfBandPromiseHandle = PromiseHandle<OutOfBandTransferPromise>;

class PlaceholderHandle final : public InstallPlaceholder, public ServiceObject {
 public:
  PlaceholderHandle(std::shared_ptr<CoordinationGate> gate, const PlaceholderRow& row)
      : ServiceObject(std::move(gate), row.number), identifier_(row.identifier) {}

  std::string bundleIdentifier() const override { return identifier_; }
  bool setIconPromise(const std::shared_ptr<PathTransferPromise>& promise,
                      std::optional<Error>* error) noexcept override;
  bool setPlaceholderAttributes(const PlaceholderAttributes& attributes,
                                std::optional<Error>* error) noexcept override;
  bool setMetadata(const StoreMetadata& metadata, std::optional<Error>* error) noexcept override;
  bool setSinfData(ByteView sinf, std::optional<Error>* error) noexcept override;
  bool setConfigurationComplete(std::optional<Error>* error) noexcept override;
  bool cancel(const Error& reason, CoordinationClientId client) noexcept override;
  std::string description() const override { return "<Placeholder " + identifier_ + ">"; }

 private:
  [[nodiscard]] bool change(const CoordinationStore::PlaceholderChange& change,
                            std::optional<Error>* error);

  const std::string identifier_;
};

class CoordinatorHandle final : public InstallCoordinator, public ServiceObject {
 public:
  CoordinatorHandle(std::shared_ptr<CoordinationGate> gate, const CoordinatorRow& row)
      : ServiceObject(std::move(gate), row.number),
        identifier_(row.identifier),
        creator_(row.creator) {}

  std::optional<std::string> bundleIdentifier() const override { return identifier_; }
  CoordinationClientId creatorIdentifier() const noexcept override { return creator_; }
  std::optional<Error> error() const override;
  void setObserver(CoordinatorObserver* observer) noexcept override;
  bool hasInstallOptions() const noexcept override { return row().options.has_value(); }
  bool setInstallOptions(const InstallOptions& options,
                         std::optional<Error>* error) noexcept override;
  bool hasInitialQPKAssetPromises() const noexcept override {
    return row().initialPromises.has_value();
  }
  bool setInitialQPKAssetPromises(const std::vector<std::shared_ptr<DataPromise>>& promises,
                                  std::optional<Error>* error) noexcept override;
  bool hasAppAssetPromise() const noexcept override { return row().package.has_value(); }
  std::shared_ptr<PathTransferPromise> appAssetPromise(
      std::optional<Error>* error) noexcept override;
  bool setAppAssetPromise(const std::shared_ptr<PathTransferPromise>& promise,
                          std::optional<Error>* error) noexcept override;
  CoordinationClientId appAssetPromiseResponsibleClient() const noexcept override {
    return row().responsible;
  }
  bool setAppAssetPromiseResponsibleClient(CoordinationClientId client,
                                           std::optional<Error>* error) noexcept override;
  bool hasUserDataPromise() const noexcept override { return row().userData.has_value(); }
  bool setUserDataPromise(const std::shared_ptr<OutOfBandTransferPromise>& promise,
                          std::optional<Error>* error) noexcept override;
  bool hasPlaceholderPromise() const noexcept override { return row().placeholder.has_value(); }
  bool setPlaceholderPromise(const std::shared_ptr<InstallPlaceholder>& placeholder,
                             std::optional<Error>* error) noexcept override;
  bool cancel(const Error& reason, CoordinationClientId client) noexcept override;
  std::string description() const override { return "<Coordinator " + identifier_ + ">"; }

  /// Tells how the coordinator ended, so that it need not be read any more.
  void settle(const CoordinatorRow& row);

 private:
  /// nullopt when there is none any more, or when it cannot be read (then with an error).
  [[nodiscard]] std::optional<CoordinatorRow> find(std::optional<Error>* error) const;
  CoordinatorRow row() const { return find(nullptr).value_or(CoordinatorRow()); }
  [[nodiscard]] bool change(const CoordinationStore::CoordinatorChange& change,
                            std::optional<Error>* error);

  const std::string identifier_;
  const CoordinationClientId creator_;
  mutable Mutex mutex_;
  std::optional<CoordinatorRow> settled_ APPSYNC_GUARDED_BY(mutex_);
};

}  // namespace appsync::device
