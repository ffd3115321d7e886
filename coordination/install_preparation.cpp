#include "coordination/install_preparation.h"

#include <tuple>

#include "coordination/failure.h"
#include "coordination/install_options.h"
#include "coordination/transaction_steps.h"
#include "platform/bundle.h"
#include "restore/placeholder_info.h"

namespace appsync {
namespace {

std::optional<PropertyList::Dictionary> dictionaryAt(FileManager& files,
                                                     const std::optional<std::string>& path) {
  return path ? loadDictionary(files, *path) : std::nullopt;
}

}  // namespace

InstallPreparation::InstallPreparation(AppsClient& client, const Platform& platform,
                                       const ClientLog& log, const SyncAsset& asset,
                                       bool existingApp)
    : client_(client),
      platform_(platform),
      log_(log),
      asset_(asset),
      existingApp_(existingApp),
      bundleId_(asset.identifier),
      info_(dictionaryAt(platform.files, asset.infoPlist)),
      store_(dictionaryAt(platform.files, asset.storePlist)),
      version_(versionOf(asset)) {}

bool InstallPreparation::run() {
  log_.oversize(
      "processing app install for bundle '%{public}@', title %{public}@ assetplist %{public}@, "
      "version %{public}@ with install coordination",
      bundleId_, asset_.prettyName, info_, version_);
  logStepBegin(platform_.transactionLog, TransactionStep::InstallApp, bundleId_,
               existingApp_ ? "Update app" : "Install App");
  const bool status = prepare();
  log_.normal(
      "processing app install for bundle %{public}@ finished with status %d error %{public}@",
      bundleId_, status, error_);
  logStepEnd(platform_.transactionLog, TransactionStep::InstallApp, status, bundleId_,
             "Install app");
  if (!status) cancel();
  return status;
}

bool InstallPreparation::prepare() {
  if (bundleId_.empty() && asset_.prettyName.value_or("").empty()) return false;
  coordinator_ = client_._initiatingOrUpdatingAppInstallCoordinatorForBundleIdentifier(
      bundleId_, existingApp_, true, &error_);
  if (!coordinator_) return false;
  coordinator_->setObserver(&client_);
  return addInstallOptions() && addInitialAssetPromises() && addAppAssetPromise() &&
         addPlaceholder();
}

bool InstallPreparation::addInstallOptions() {
  if (coordinator_->hasInstallOptions()) {
    log_.normal("coordinator for %{public}@ has install options", bundleId_);
    return true;
  }
  storeMetadata_ = StoreMetadata::fromDictionary(store_.value_or(PropertyList::Dictionary{}));
  if (!coordinator_->setInstallOptions(installOptions(InstallType::Sync, storeMetadata_),
                                       &error_)) {
    log_.error("Error %{public}@ setting install options on coordinator for '%{public}@'", error_,
               bundleId_);
    return false;
  }
  log_.normal("set install options on coordinator for %{public}@", bundleId_);
  return true;
}

bool InstallPreparation::addInitialAssetPromises() {
  if (coordinator_->hasInitialQPKAssetPromises()) {
    log_.normal("coordinator for %{public}@ has an QPK app asset promise", bundleId_);
    return true;
  }
  if (!coordinator_->setInitialQPKAssetPromises({}, &error_)) {
    log_.error("Error %{public}@ setting QPK asset promise for '%{public}@'", error_, bundleId_);
    return false;
  }
  log_.normal("set QPK asset promise to install coordinator for %{public}@", bundleId_);
  return true;
}

bool InstallPreparation::addAppAssetPromise() {
  if (coordinator_->hasAppAssetPromise()) {
    log_.normal("coordinator for %{public}@ has an app asset promise", bundleId_);
    return true;
  }
  // The package's place is told when it has arrived.
  return client_._createAppAssetPromiseForBundleIdentifier(bundleId_, std::nullopt,
                                                           coordinator_.get()) != nullptr;
}

bool InstallPreparation::addPlaceholder() {
  if (coordinator_->hasPlaceholderPromise()) {
    log_.normal("coordinator for %{public}@ has a placeholder promise", bundleId_);
    return true;
  }
  configurePlaceholder();
  // An unfinished placeholder, or none, is still handed over: the coordinator's answer decides.
  if (!coordinator_->setPlaceholderPromise(placeholder_, &error_)) {
    log_.error("Error %{public}@ adding placeholder promise to coordinator for '%{public}@'",
               error_, bundleId_);
    adrift_ = placeholder_;
    return false;
  }
  log_.normal("added placeholder promise to coordinator for %{public}@", bundleId_);
  return true;
}

void InstallPreparation::configurePlaceholder() {
  const std::string bundlePath = client_.placeholderAppPathForBundleIdentifier(bundleId_);
  if (client_.createPlaceHolderPath(bundlePath, bundleId_, placeholderFileAttributes())) {
    copyIcon(bundlePath);
  }
  const std::string title = asset_.prettyName.value_or("");
  placeholder_ = client_._placeHolderForBundleIdentifier(
      bundleId_, title.empty() ? bundleId_ : title, InstallType::Sync);
  if (!placeholder_ || !addIconPromise(bundlePath)) return;
  if (setAttributes() && setStoreMetadata()) setConfigurationComplete();
}

void InstallPreparation::copyIcon(const std::string& bundlePath) {
  if (!asset_.icon || asset_.icon->path.empty()) return;
  const std::string& source = asset_.icon->path;
  const std::string target = joinPath(bundlePath, PlaceholderIconName);
  logStepBegin(platform_.transactionLog, TransactionStep::CopyIcon, bundleId_, "Copying icon");
  // The directory of an earlier placeholder is used again.
  std::ignore = platform_.files.removeItem(target);
  std::optional<Error> error;
  if (platform_.files.copyItem(source, target, &error)) {
    const std::optional<ItemAttributes> attributes = platform_.files.attributesOfItem(target);
    if (attributes) iconSize_ = attributes->size;
    log_.normal("icon for %{public}@ at %{public}@ has a size of %llu", bundleId_, target,
                iconSize_);
  }
  log_.normal(
      "Copied icon from %{public}@ to %{public}@ with error %{public}@ for '%{public}@', "
      "sizeOnDisk:%llu",
      source, target, error, bundleId_, iconSize_);
  // A missing icon is no reason to give up, so the step counts as a success.
  logStepEnd(platform_.transactionLog, TransactionStep::CopyIcon, true, bundleId_, "Copying icon");
}

bool InstallPreparation::addIconPromise(const std::string& bundlePath) {
  if (iconSize_ == 0) return true;
  return client_._createIconPromiseForBundleIdentifier(
             bundleId_, joinPath(bundlePath, PlaceholderIconName), iconSize_, placeholder_.get(),
             true) != nullptr;
}

bool InstallPreparation::setAttributes() {
  const PropertyList::Dictionary info = info_.value_or(PropertyList::Dictionary{});
  PlaceholderAttributes attributes = PlaceholderAttributes::fromInfoDictionary(info);
  attributes.setLaunchProhibited(infoProhibitsLaunch(info));
  attributes.setBundleVersion(version_);
  if (!placeholder_->setPlaceholderAttributes(attributes, &error_)) {
    log_.error("Error %{public}@ setting attributes on placeholder for '%{public}@'", error_,
               bundleId_);
    return false;
  }
  log_.normal("set %{public}@ attributes on placeholder for %{public}@", attributes, bundleId_);
  return true;
}

bool InstallPreparation::setStoreMetadata() {
  if (!placeholder_->setMetadata(storeMetadata_, &error_)) {
    log_.error("Error %{public}@ setting store metadata on placeholder for '%{public}@'", error_,
               bundleId_);
    return false;
  }
  log_.normal("set store metadata on placeholder for %{public}@", bundleId_);
  return true;
}

void InstallPreparation::setConfigurationComplete() {
  if (!placeholder_->setConfigurationComplete(&error_)) {
    log_.error("Error %{public}@ setting placeholder configuration as complete for '%{public}@'",
               error_, bundleId_);
    return;
  }
  log_.normal("set placeholder configuration as complete for %{public}@", bundleId_);
}

void InstallPreparation::cancel() {
  const Error reason = failure(FailureCode::InstallFailed);
  cancelPlaceholder(log_, bundleId_, adrift_, reason);
  cancelCoordinator(log_, bundleId_, coordinator_, reason);
}

}  // namespace appsync
