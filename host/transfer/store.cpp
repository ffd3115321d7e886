#include "host/transfer/store.h"

#include <algorithm>

#include "host/base/text.h"
#include "host/phone/demotions.h"
#include "host/transfer/staging.h"

namespace appsync::host {

std::set<std::string> waitingForStore(const Phone& phone, const ApplicationsPresent& present) {
  const std::vector<std::string> owed = phone.packagesOwedBy(KQClientKiosk);
  std::set<std::string> waiting(owed.begin(), owed.end());
  const Demotions demotions(phone.files);
  for (const auto& [identifier, record] : present.placeholders) {
    const bool isStores = record.installType == InstallType::StoreDownload ||
                          record.installType == InstallType::Restore;
    if (isStores && !demotions.holdBack(record)) waiting.insert(identifier);
  }
  return waiting;
}

void Store::deliver(const std::set<std::string>& identifiers) {
  takeOrders(identifiers);
  send();
  for (const auto& [identifier, order] : orders_) {
    if (!order->arrived) continue;
    if (auto failure = order->delivery->settle()) failures_[identifier] = *failure;
  }
}

void Store::takeOrders(const std::set<std::string>& identifiers) {
  if (identifiers.empty()) return;
  std::optional<Error> error;
  const auto present = applicationsPresent(phone_.apps, &error);
  if (!present) {
    const std::string reason = withReason(CannotTellApplications, error);
    for (const std::string& identifier : identifiers) failures_.emplace(identifier, reason);
    return;
  }
  const std::vector<std::string> owed = phone_.packagesOwedBy(KQClientKiosk);
  for (const std::string& identifier : identifiers) {
    const auto found = present->placeholders.find(identifier);
    const AppRecord* placeholder = found == present->placeholders.end() ? nullptr : &found->second;
    const bool named = placeholder && !placeholder->displayName.empty();
    auto delivery = deliveryFor(identifier, placeholder, std::ranges::count(owed, identifier) > 0);
    if (delivery) {
      order(identifier, named ? placeholder->displayName : identifier, std::move(delivery));
    }
  }
}

std::unique_ptr<PackageDelivery> Store::deliveryFor(const std::string& identifier,
                                                    const AppRecord* placeholder, bool owed) const {
  const auto coordinator = phone_.coordination ? phone_.coordination->coordinatorFor(
                                                     CoordinatorKind::Any, identifier,
                                                     KQClientKiosk, false, nullptr, nullptr)
                                               : nullptr;
  if (coordinator && owed) {
    return deliverToCoordinator(phone_, identifier, coordinator, origin_);
  }
  return placeholder && !coordinator ? deliverToRegistry(phone_, *placeholder, origin_) : nullptr;
}

void Store::order(const std::string& identifier, const std::string& name,
                  std::unique_ptr<PackageDelivery> delivery) {
  const LibraryPackage* package = catalogue_.find(identifier);
  if (!package) return;
  const std::string target = joinPath(exchange::Downloads, stagedPackageName(*package));
  orders_.emplace(identifier,
                  new Order{host_.makeDownload(identifier, ApplicationDataclass, name),
                            std::move(delivery), target, PackageTransfer(package->file, target)});
}

void Store::send() {
  TransferQueue& queue = host_.transfers();
  for (const auto& item : orders_) queue.add({item.second->asset});
  for (auto next = queue.next(); next.asset; next = queue.next()) {
    Order& order = *orders_.at(next.asset->identifier);
    if (interruption_.requested()) {
      finish(order, ifInterrupted_);
    } else if (next.cancelled) {
      finish(order, "cancelled on the phone");
    } else {
      sendChunk(order);
    }
  }
}

void Store::sendChunk(Order& order) {
  const SyncAsset& asset = *order.asset;
  PackageTransfer& transfer = order.transfer;
  std::optional<Error> error;
  const PackageTransfer::Step step = transfer.sendChunk(phone_, &error);
  if (step == PackageTransfer::Step::Failed) {
    const std::string cause = error ? oneLine(error->localizedDescription()) : "";
    return finish(order, "could not be sent: " + cause);
  }
  if (transfer.progressed()) {
    const auto total = static_cast<double>(transfer.total());
    order.delivery->progressed(total > 0 ? static_cast<double>(transfer.sent()) / total : 1);
    reporter_.report(
        TransferProgress{asset.identifier, *asset.prettyName, transfer.sent(), transfer.total()});
  }
  if (step == PackageTransfer::Step::Done) finish(order, std::nullopt);
}

void Store::finish(Order& order, const std::optional<std::string>& failure) {
  const SyncAsset& asset = *order.asset;
  host_.transfers().finish(order.asset);
  reporter_.report(TransferEnded{asset.identifier, *asset.prettyName, failure});
  if (failure) {
    order.delivery->gaveUp();
    failures_[asset.identifier] = *failure;
  } else {
    order.arrived = true;
    order.delivery->arrived(order.target);
  }
}

}  // namespace appsync::host
