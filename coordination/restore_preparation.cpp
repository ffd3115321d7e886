#include "coordination/restore_preparation.h"

#include "coordination/failure.h"
#include "coordination/install_options.h"
#include "coordination/transaction_steps.h"
#include "platform/property_list_codec.h"
#include "restore/halvo_metadata.h"

namespace appsync {

bool RestorePreparation::runNonDemoted() {
  log_.normal(
      "processing app restore for non demoted bundle '%{public}@' with install coordination",
      app_.bundleId);
  logStepBegin(platform_.transactionLog, TransactionStep::RestoreApp, app_.bundleId, "Restore app");
  bool status = parseMetadata();
  if (status) {
    obtainCoordinator();
    if (storeBringsPackage()) {
      logStepEnd(platform_.transactionLog, TransactionStep::RestoreApp, true, app_.bundleId,
                 "Restore app");
      return true;
    }
    status = prepareNonDemoted();
  }
  log_.normal("processing app restore for %{public}@ finished with status %d error %{public}@",
              app_.bundleId, status, error_);
  logStepEnd(platform_.transactionLog, TransactionStep::RestoreApp, status, app_.bundleId,
             "Restore app");
  if (!status) cancel();
  return status;
}

bool RestorePreparation::runDemoted(DemotionStatus demotionStatus) {
  log_.normal("processing app restore for demoted bundle '%{public}@' with install coordination",
              app_.bundleId);
  logStepBegin(platform_.transactionLog, TransactionStep::RestoreApp, app_.bundleId,
               "Restore demoted app");
  const bool status = parseMetadata() && prepareDemoted(demotionStatus);
  log_.normal(
      "processing app restore for demoted app %{public}@ finished with status %d error %{public}@",
      app_.bundleId, status, error_);
  logStepEnd(platform_.transactionLog, TransactionStep::RestoreApp, status, app_.bundleId,
             "Restore demoted app");
  if (!status) cancel();
  return status;
}

bool RestorePreparation::prepareNonDemoted() {
  bool ready = coordinator_ && addUserDataPromise();
  if (coordinator_ && coordinator_->hasInstallOptions()) {
    log_.normal("Coordinator for %{public}@ has a valid install options", app_.bundleId);
  } else {
    // Options that can be set make up for user data that could not be promised.
    ready = addInstallOptions();
  }
  return ready && addPlaceholderPromise(DemotionStatus::NotDemoted) && leavePackageToStore();
}

bool RestorePreparation::prepareDemoted(DemotionStatus demotionStatus) {
  coordinator_ = platform_.installCoordination.coordinatorFor(
      CoordinatorKind::RestoringDemoted, app_.bundleId, SyncHostClientID, true, nullptr, nullptr);
  return coordinator_ && addUserDataPromise() && addPlaceholderPromise(demotionStatus);
}

bool RestorePreparation::parseMetadata() {
  std::optional<PropertyList::Dictionary> parsed = parseDictionary(app_.metadata, &error_);
  if (!parsed) {
    log_.error("failed to parse halvo metadata for '%{public}@'. err=%{public}@", app_.bundleId,
               error_);
    return false;
  }
  metadata_ = std::move(*parsed);
  sayUnexpectedTypesOfMetadata(log_, app_.bundleId, metadata_);
  return true;
}

void RestorePreparation::obtainCoordinator() {
  coordinator_ = platform_.installCoordination.coordinatorFor(
      CoordinatorKind::Restoring, app_.bundleId, SyncHostClientID, true, nullptr, &error_);
  if (!coordinator_) {
    log_.error("Error '%{public}@' creating restore coordinator for %{public}@", error_,
               app_.bundleId);
  }
}

bool RestorePreparation::storeBringsPackage() const {
  if (!coordinator_) return false;
  const CoordinationClientId responsible = coordinator_->appAssetPromiseResponsibleClient();
  if (responsible != KQClientKiosk) return false;
  log_.normal("App asset DRI for %{public}@ is set to %lu - nothing more for twc to do",
              app_.bundleId, responsible);
  return true;
}

bool RestorePreparation::addUserDataPromise() {
  if (coordinator_->hasUserDataPromise()) {
    log_.normal("Coordinator for %{public}@ has a valid user data promise", app_.bundleId);
    return true;
  }
  const std::shared_ptr<OutOfBandTransferPromise> promise =
      client_._userDataPromiseForBundleIdentifier(app_.bundleId);
  if (!promise) return true;
  if (!coordinator_->setUserDataPromise(promise, &error_)) {
    log_.error("Error %{public}@ adding out of band data promise for '%{public}@'", error_,
               app_.bundleId);
    return false;
  }
  log_.normal("Added out of band user data promise for for %{public}@", app_.bundleId);
  return true;
}

bool RestorePreparation::addInstallOptions() {
  InstallOptions options =
      installOptions(InstallType::Restore, StoreMetadata::fromDictionary(metadata_));
  options.sinfData = app_.sinf;
  if (!coordinator_ || !coordinator_->setInstallOptions(options, &error_)) {
    log_.error("Error %{public}@ setting install options for '%{public}@'", error_, app_.bundleId);
    return false;
  }
  log_.normal("added install options for %{public}@", app_.bundleId);
  return true;
}

bool RestorePreparation::addPlaceholderPromise(DemotionStatus demotionStatus) {
  if (coordinator_->hasPlaceholderPromise()) {
    log_.normal("Coordinator for %{public}@ has a valid placeholder promise", app_.bundleId);
    return true;
  }
  const std::shared_ptr<InstallPlaceholder> placeholder = client_._placeHolderForBundleIdentifier(
      app_.bundleId, metadata_, app_.sinf, app_.icon, demotionStatus);
  if (!placeholder) return false;
  if (!coordinator_->setPlaceholderPromise(placeholder, &error_)) {
    log_.error("Error %{public}@ setting placeholder promise for '%{public}@'", error_,
               app_.bundleId);
    adrift_ = placeholder;
    return false;
  }
  log_.normal("added placeholder promise for %{public}@", app_.bundleId);
  return true;
}

bool RestorePreparation::leavePackageToStore() {
  if (!coordinator_->setAppAssetPromiseResponsibleClient(KQClientKiosk, &error_)) {
    log_.error(
        "Error %{public}@ setting KQClientKiosk to satisfy app data promise for "
        "'%{public}@'",
        error_, app_.bundleId);
    return false;
  }
  log_.normal("set KQClientKiosk to satisfy app asset promise for %{public}@", app_.bundleId);
  return true;
}

void RestorePreparation::cancel() {
  const Error reason = failure(FailureCode::RestoreFailed);
  cancelCoordinator(log_, app_.bundleId, coordinator_, reason);
  cancelPlaceholder(log_, app_.bundleId, adrift_, reason);
}

}  // namespace appsync
