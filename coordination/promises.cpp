// How coordinators, placeholders and data promises are obtained.

#include "client/apps_client.h"
#include "coordination/failure.h"
#include "coordination/transaction_steps.h"

namespace appsync {
namespace {

std::string promiseName(std::string_view bundleId, std::string_view suffix) {
  return std::string(bundleId).append(suffix);
}

/// What the client owes with these promises is there from the beginning.
void satisfyAtOnce(DataPromise& promise) {
  promise.setPercentComplete(1.0);
  promise.setComplete(true);
}

}  // namespace

std::shared_ptr<InstallCoordinator>
AppsClient::_initiatingOrUpdatingAppInstallCoordinatorForBundleIdentifier(
    std::string_view bundleId, bool existingApp, bool createIfNotExisting,
    std::optional<Error>* error) {
  logStepBegin(_platform.transactionLog, TransactionStep::CreateCoordinator, bundleId,
               "Create coordinator");
  const std::string_view kindName = existingApp ? "updating" : "initiating";
  std::optional<Error> reason;
  std::shared_ptr<InstallCoordinator> coordinator = _platform.installCoordination.coordinatorFor(
      existingApp ? CoordinatorKind::Updating : CoordinatorKind::Initiating, bundleId,
      SyncHostClientID, createIfNotExisting, nullptr, &reason);
  if (coordinator && coordinator->creatorIdentifier() != SyncHostClientID) {
    _log.normal(
        "IC returned %s coordinator %{public}@ (createIfNotExisting:%d, existingApp:%d, "
        "creatorIdentifier=%lu) for %{public}@ with error %{public}@ - Will not perform "
        "install/update for this bundle",
        kindName, coordinator, createIfNotExisting, existingApp, coordinator->creatorIdentifier(),
        bundleId, reason);
    // Dropped but not cancelled: it belongs to another client.
    coordinator = nullptr;
  } else if (coordinator) {
    _log.normal(
        "Created %s coordinator %{public}@ (createIfNotExisting:%d, existingApp:%d) for "
        "%{public}@ with error %{public}@",
        kindName, coordinator, createIfNotExisting, existingApp, bundleId, reason);
  }
  if (error) *error = std::move(reason);
  logStepEnd(_platform.transactionLog, TransactionStep::CreateCoordinator, coordinator != nullptr,
             bundleId, "Finished creating coordinator");
  return coordinator;
}

std::shared_ptr<InstallCoordinator> AppsClient::_restoringAppInstallCoordinatorForBundleIdentifier(
    std::string_view bundleId, bool createIfNotExisting, std::optional<Error>* error) {
  logStepBegin(_platform.transactionLog, TransactionStep::CreateCoordinator, bundleId,
               "Create restore coordinator");
  std::optional<Error> reason;
  std::shared_ptr<InstallCoordinator> coordinator = _platform.installCoordination.coordinatorFor(
      CoordinatorKind::Restoring, bundleId, SyncHostClientID, createIfNotExisting, nullptr,
      &reason);
  _log.normal(
      "Created restore coordinator %{public}@ (createIfNotExisting:%d) for %{public}@ with error "
      "%{public}@",
      coordinator, createIfNotExisting, bundleId, reason);
  if (error) *error = std::move(reason);
  logStepEnd(_platform.transactionLog, TransactionStep::CreateCoordinator, coordinator != nullptr,
             bundleId, "Finished creating restore coordinator");
  return coordinator;
}

std::shared_ptr<PathTransferPromise> AppsClient::_createAppAssetPromiseForBundleIdentifier(
    std::string_view bundleId, const std::optional<std::string>& path,
    InstallCoordinator* coordinator) {
  if (!coordinator) return nullptr;
  const std::optional<FileLocation> location =
      path ? std::optional(FileLocation::file(*path)) : std::nullopt;
  std::shared_ptr<PathTransferPromise> promise =
      _platform.installCoordination.createPathTransferPromise(promiseName(bundleId, "-Asset"),
                                                              SyncHostClientID, location, 0);
  if (!promise) {
    _log.error("Error creating asset promise for '%{public}@'", bundleId);
    return nullptr;
  }
  std::optional<Error> error;
  if (!coordinator->setAppAssetPromise(promise, &error)) {
    _log.error("Error %{public}@ adding app asset promise at %{public}@ to '%{public}@'", error,
               path, bundleId);
    _log.error("Cancelling asset promise for '%{public}@'", bundleId);
    promise->cancel(failure(FailureCode::TransferFailed), SyncHostClientID);
    return nullptr;
  }
  _log.normal("Added app asset promise to coordinator for '%{public}@'", bundleId);
  return promise;
}

std::shared_ptr<OutOfBandTransferPromise> AppsClient::_userDataPromiseForBundleIdentifier(
    std::string_view bundleId) {
  std::shared_ptr<OutOfBandTransferPromise> promise =
      _platform.installCoordination.createOutOfBandTransferPromise(
          promiseName(bundleId, "-UserData"), SyncHostClientID, 0);
  // The sync host brings no user data itself.
  if (promise) satisfyAtOnce(*promise);
  return promise;
}

std::shared_ptr<PathTransferPromise> AppsClient::_createIconPromiseForBundleIdentifier(
    std::string_view bundleId, std::string_view transferPath, std::uint64_t diskSpaceNeeded,
    InstallPlaceholder* placeholder, bool forAppInstall) {
  if (!placeholder) {
    _log.error("Placeholder to add icon promise is nil for '%{public}@'", bundleId);
    return nullptr;
  }
  std::shared_ptr<PathTransferPromise> promise =
      _platform.installCoordination.createPathTransferPromise(
          promiseName(bundleId, "-Icon"), SyncHostClientID,
          FileLocation::file(std::string(transferPath)), diskSpaceNeeded);
  if (!promise) return nullptr;
  satisfyAtOnce(*promise);
  std::optional<Error> error;
  if (!placeholder->setIconPromise(promise, &error)) {
    _log.error("Error %{public}@ adding icon promise to placeholder for '%{public}@'", error,
               bundleId);
    promise->cancel(
        failure(forAppInstall ? FailureCode::TransferFailed : FailureCode::RestoreFailed),
        SyncHostClientID);
    return nullptr;
  }
  _log.normal("Added icon promise to placeholder for '%{public}@'", bundleId);
  return promise;
}

std::shared_ptr<InstallPlaceholder> AppsClient::_placeHolderForBundleIdentifier(
    std::string_view bundleId, std::string_view name, InstallType installType) {
  logStepBegin(_platform.transactionLog, TransactionStep::CreatePlaceholder, bundleId,
               "Create placeholder");
  std::shared_ptr<InstallPlaceholder> placeholder =
      _platform.installCoordination.createAppPlaceholder(name, bundleId, installType,
                                                         SyncHostClientID);
  _log.normal("Created placeholder %{public}@ for '%{public}@' of type %lu", placeholder, bundleId,
              static_cast<std::uint64_t>(installType));
  logStepEnd(_platform.transactionLog, TransactionStep::CreatePlaceholder, placeholder != nullptr,
             bundleId, "Finished creating placeholder");
  return placeholder;
}

}  // namespace appsync
