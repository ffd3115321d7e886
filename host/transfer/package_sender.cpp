#include "host/transfer/package_sender.h"

#include <cerrno>
#include <tuple>

namespace appsync::host {
namespace {

/// The sync host's code for a transfer that was given up.
constexpr std::int64_t TransferFailedCode = 30;

std::string nameOf(const SyncAsset& asset) { return asset.prettyName.value_or(asset.identifier); }

}  // namespace

void PackageSender::send(std::vector<Shipment> shipments, std::string_view ifInterrupted) {
  for (Shipment& shipment : shipments) {
    const SyncAssetPtr asset = shipment.asset;
    outcome_.asked.insert(asset->identifier);
    queue_.add({asset});
    onTheWay_.emplace(asset, std::move(shipment));
  }
  for (auto next = queue_.next(); next.asset; next = queue_.next()) {
    if (interruption_.requested()) {
      finish(next.asset, Failure{Error::posix(ECANCELED), std::string(ifInterrupted)});
    } else if (next.cancelled) {
      const std::string reason = "cancelled on the phone";
      finish(next.asset,
             Failure{Error::withDescription(TWErrorDomain, TransferFailedCode, reason), reason});
    } else {
      sendChunk(next.asset);
    }
  }
}

void PackageSender::sendChunk(const SyncAssetPtr& asset) {
  Sending& sending = onTheWay_.at(asset);
  if (!sending.shipment.package) {
    const std::string reason = "the library has no package for it";
    return finish(asset, Failure{Error::withDescription(POSIXErrorDomain, ENOENT, reason), reason});
  }
  std::optional<Error> error;
  const PackageTransfer::Step step = sending.transfer.sendChunk(phone_, &error);
  if (step == PackageTransfer::Step::Failed) {
    return finish(asset, Failure{*error, withReason("could not be sent", error)});
  }
  if (sending.transfer.progressed()) reportProgress(sending);
  if (step == PackageTransfer::Step::Done) finish(asset, std::nullopt);
}

void PackageSender::reportProgress(Sending& sending) {
  const SyncAsset& asset = *sending.shipment.asset;
  const std::uint64_t sent = sending.transfer.sent();
  const std::uint64_t total = sending.transfer.total();
  sending.shipment.delivery->progressed(
      total == 0 ? 1 : static_cast<double>(sent) / static_cast<double>(total));
  reporter_.report(TransferProgress{asset.identifier, nameOf(asset), sent, total});
}

void PackageSender::finish(const SyncAssetPtr& asset, const std::optional<Failure>& failure) {
  const std::string& identifier = asset->identifier;
  Shipment shipment = std::move(onTheWay_.at(asset).shipment);
  // What the phone has of a package that was not sent whole goes with it.
  onTheWay_.erase(asset);
  queue_.finish(asset);
  reporter_.report(TransferEnded{identifier, nameOf(*asset),
                                 failure ? std::optional(failure->reason) : std::nullopt});
  if (failure) {
    outcome_.failures[identifier] = failure->reason;
    shipment.delivery->gaveUp(failure->error);
  } else {
    outcome_.sent.insert(identifier);
    shipment.delivery->arrived(shipment.target);
    arrived_.insert_or_assign(identifier, std::move(shipment));
  }
}

void PackageSender::settle() {
  for (const auto& [identifier, shipment] : arrived_) {
    if (auto failure = shipment.delivery->settle()) outcome_.failures[identifier] = *failure;
  }
}

void PackageSender::removeSentPackages() {
  for (const auto& arrived : arrived_) {
    std::ignore = phone_.files.removeItem(arrived.second.target);  // else the next sync does
  }
}

}  // namespace appsync::host
