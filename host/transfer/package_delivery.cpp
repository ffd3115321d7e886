#include "host/transfer/package_delivery.h"

#include <tuple>

#include "base/text.h"
#include "platform/bundle.h"

namespace appsync::host {
namespace {

constexpr std::int64_t ProgressUnits = 1000;
constexpr const char* NotInstalled = "the phone did not install it (appsync log tells more)";

class ClientDelivery final : public PackageDelivery {
 public:
  ClientDelivery(SyncClient& client, const SyncAssetPtr& asset, const std::string& name)
      : client_(client), asset_(asset), name_(name) {}

  // The package of a sync that is broken off is sent once more; a restore's may wait for its data.
  Durability durability() const override {
    return asset_->isRestore ? Durability::Durable : Durability::Cached;
  }

  void progressed(double fraction) override {
    asset_->downloadProgress = fraction;
    client_.assetTransferUpdatedProgress(asset_, fraction);
  }

  void gaveUp(const Error& why) override { client_.assetTransferSucceeded(asset_, false, why); }

  void arrived(const std::string&) override {
    asset_->path = name_;
    asset_->completedAssetParts = kTWAssetPartApplication;
    client_.assetTransferSucceeded(asset_, true, std::nullopt);
  }

  std::optional<std::string> settle() override { return std::nullopt; }

 private:
  SyncClient& client_;
  const SyncAssetPtr asset_;
  const std::string name_;
};

class CoordinatedDelivery final : public PackageDelivery {
 public:
  CoordinatedDelivery(const Phone& phone, const std::string& identifier,
                      std::shared_ptr<InstallCoordinator> coordinator, CoordinationClientId client)
      : phone_(phone),
        identifier_(identifier),
        coordinator_(std::move(coordinator)),
        client_(client) {}

  Durability durability() const override { return Durability::Durable; }

  void progressed(double fraction) override {
    if (const auto package = promise()) package->setPercentComplete(fraction);
  }

  void gaveUp(const Error&) override { progressed(0); }

  void arrived(const std::string& path) override {
    path_ = path;
    const auto package = promise();
    if (!package) return;
    package->setTransferPath(FileLocation::file(path));
    package->setComplete(true);
  }

  std::optional<std::string> settle() override {
    waitUntilIdle(phone_, {identifier_});
    const auto error = coordinator_->error();
    const auto record = phone_.apps.recordForIdentifier(identifier_, false);
    if (!error && record && !record->isPlaceholder) return std::nullopt;
    // One that is over before its package was promised leaves the file alone.
    std::ignore = phone_.files.removeItem(path_);
    return error ? oneLine(error->localizedDescription()) : NotInstalled;
  }

 private:
  /// A restore that was broken off may have made it already.
  std::shared_ptr<PathTransferPromise> promise() {
    if (!promise_) promise_ = coordinator_->appAssetPromise(nullptr);
    if (promise_) return promise_;
    promise_ = phone_.coordination->createPathTransferPromise(identifier_ + "-Asset", client_,
                                                              std::nullopt, 0);
    if (promise_ && !coordinator_->setAppAssetPromise(promise_, nullptr)) promise_.reset();
    return promise_;
  }

  const Phone& phone_;
  const std::string identifier_;
  const std::shared_ptr<InstallCoordinator> coordinator_;
  const CoordinationClientId client_;
  std::shared_ptr<PathTransferPromise> promise_;
  std::string path_;
};

class RegistryDelivery final : public PackageDelivery {
 public:
  RegistryDelivery(const Phone& phone, const AppRecord& placeholder,
                   std::optional<InstallType> origin)
      : phone_(phone),
        origin_(origin),
        identifier_(placeholder.applicationIdentifier),
        progress_(phone.apps.installProgress(placeholder, InstallPhase::Loading)) {}

  // It is installed as soon as it has arrived.
  Durability durability() const override { return Durability::Cached; }

  void progressed(double fraction) override {
    if (!progress_) return;
    if (!begun_) {
      progress_->setInstallState(InstallState::Active);
      progress_->setTotalUnitCount(ProgressUnits);
      begun_ = true;
    }
    progress_->setCompletedUnitCount(static_cast<std::int64_t>(fraction * ProgressUnits));
  }

  void gaveUp(const Error&) override {
    if (progress_) progress_->setInstallState(InstallState::Paused);
  }

  void arrived(const std::string& path) override {
    PropertyList::Dictionary options{{std::string(SWPackageTypeKey), SWPackageTypeCustomer},
                                     {std::string(KBBundleIdentifier), identifier_}};
    if (origin_) {
      options.emplace(std::string(SWInstallTypeKey), static_cast<std::uint64_t>(*origin_));
    }
    std::optional<Error> error;
    if (!phone_.apps.installApplication(FileLocation::file(path), options, &error)) {
      failure_ = oneLine(error->localizedDescription());
    }
    // What stays is taken away by the next sync.
    std::ignore = phone_.files.removeItem(path);
  }

  std::optional<std::string> settle() override { return failure_; }

 private:
  const Phone& phone_;
  const std::optional<InstallType> origin_;
  const std::string identifier_;
  const std::shared_ptr<InstallProgress> progress_;
  bool begun_ = false;
  std::optional<std::string> failure_;
};

}  // namespace

std::unique_ptr<PackageDelivery> deliverToClient(SyncClient& client, const SyncAssetPtr& asset,
                                                 const std::string& name) {
  return std::make_unique<ClientDelivery>(client, asset, name);
}

std::unique_ptr<PackageDelivery> deliverToCoordinator(
    const Phone& phone, const std::string& identifier,
    std::shared_ptr<InstallCoordinator> coordinator, std::optional<InstallType> origin) {
  const bool isStores = origin == InstallType::StoreDownload;
  return std::make_unique<CoordinatedDelivery>(phone, identifier, std::move(coordinator),
                                               isStores ? KQClientKiosk : SyncHostClientID);
}

std::unique_ptr<PackageDelivery> deliverToRegistry(const Phone& phone, const AppRecord& placeholder,
                                                   std::optional<InstallType> origin) {
  return std::make_unique<RegistryDelivery>(phone, placeholder, origin);
}

}  // namespace appsync::host
