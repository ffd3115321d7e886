#include "host/transfer/package_sender.h"

#include <cerrno>

#include "host/base/text.h"
#include "host/transfer/staging.h"

namespace appsync::host {
namespace {

/// The sync host's code for a transfer that was given up.
constexpr std::int64_t TransferFailedCode = 30;

std::string nameOf(const SyncAsset& asset) { return asset.prettyName.value_or(asset.identifier); }

}  // namespace

void PackageSender::send(const std::vector<SyncAssetPtr>& assets) {
  for (const SyncAssetPtr& asset : assets) outcome_.asked.insert(asset->identifier);
  queue_.add(assets);
  for (auto next = queue_.next(); next.asset; next = queue_.next()) {
    if (interruption_.requested()) {
      fail(next.asset, Error::posix(ECANCELED), "interrupted before it was sent");
    } else if (next.cancelled) {
      const std::string reason = "cancelled on the phone";
      fail(next.asset, Error::withDescription(TWErrorDomain, TransferFailedCode, reason), reason);
    } else {
      sendChunk(next.asset);
    }
  }
}

void PackageSender::sendChunk(const SyncAssetPtr& asset) {
  auto& transfer = transfers_[asset];
  if (!transfer) {
    const LibraryPackage* package = library_.find(asset->identifier);
    if (!package) {
      const std::string reason = "the library has no package for it";
      return fail(asset, Error::withDescription(POSIXErrorDomain, ENOENT, reason), reason);
    }
    transfer = std::make_unique<PackageTransfer>(
        package->file, joinPath(exchange::StagingRoot, stagedPackageName(*package)));
  }
  std::optional<Error> error;
  const PackageTransfer::Step step = transfer->sendChunk(phone_, &error);
  if (step == PackageTransfer::Step::Failed) {
    const Error reason = error.value_or(Error::posix(EIO));
    return fail(asset, reason, "could not be sent: " + oneLine(reason.localizedDescription()));
  }
  if (transfer->progressed()) reportProgress(asset, *transfer);
  if (step == PackageTransfer::Step::Done) succeed(asset);
}

void PackageSender::reportProgress(const SyncAssetPtr& asset, const PackageTransfer& transfer) {
  const auto total = static_cast<double>(transfer.total());
  const double fraction = transfer.total() == 0 ? 1 : static_cast<double>(transfer.sent()) / total;
  asset->downloadProgress = fraction;
  client_.assetTransferUpdatedProgress(asset, fraction);
  reporter_.report(
      TransferProgress{asset->identifier, nameOf(*asset), transfer.sent(), transfer.total()});
}

void PackageSender::succeed(const SyncAssetPtr& asset) {
  asset->path = stagedPackageName(*library_.find(asset->identifier));
  asset->completedAssetParts = kTWAssetPartApplication;
  transfers_.erase(asset);
  queue_.finish(asset);
  outcome_.sent.insert(asset->identifier);
  reporter_.report(TransferEnded{asset->identifier, nameOf(*asset), std::nullopt});
  client_.assetTransferSucceeded(asset, true, std::nullopt);
}

void PackageSender::fail(const SyncAssetPtr& asset, const Error& error, const std::string& reason) {
  transfers_.erase(asset);
  queue_.finish(asset);
  outcome_.failures[asset->identifier] = reason;
  reporter_.report(TransferEnded{asset->identifier, nameOf(*asset), reason});
  client_.assetTransferSucceeded(asset, false, error);
}

void PackageSender::removeSentPackages() {
  for (const std::string& identifier : outcome_.sent) {
    const LibraryPackage* package = library_.find(identifier);
    phone_.files.removeItem(joinPath(exchange::StagingRoot, stagedPackageName(*package)));
  }
}

}  // namespace appsync::host
