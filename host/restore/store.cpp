#include "host/restore/store.h"

#include "host/base/text.h"
#include "host/phone/demotions.h"
#include "host/restore/restore_data.h"
#include "host/transfer/staging.h"

namespace appsync::host {

void Store::deliver(const std::set<std::string>& except) {
  takeOrders(except);
  send();
  for (const auto& [identifier, order] : orders_) {
    if (!order->arrived) continue;
    if (auto failure = order->delivery->settle()) failures_[identifier] = *failure;
  }
}

void Store::takeOrders(const std::set<std::string>& except) {
  const ApplicationsPresent present = applicationsPresent(phone_.apps);
  const auto nameOf = [&](const std::string& identifier) {
    const auto placeholder = present.placeholders.find(identifier);
    const bool named =
        placeholder != present.placeholders.end() && !placeholder->second.displayName.empty();
    return named ? placeholder->second.displayName : identifier;
  };
  const auto coordinatorOf = [&](const std::string& identifier) {
    return phone_.coordination
               ? phone_.coordination->coordinatorFor(CoordinatorKind::Any, identifier,
                                                     KQClientKiosk, false, nullptr, nullptr)
               : nullptr;
  };
  for (const std::string& identifier : phone_.packagesOwedBy(KQClientKiosk)) {
    const auto coordinator = coordinatorOf(identifier);
    if (!coordinator || except.contains(identifier)) continue;
    order(identifier, nameOf(identifier), deliverToCoordinator(phone_, identifier, coordinator));
  }
  const Demotions demotions(phone_.files);
  for (const auto& [identifier, record] : present.placeholders) {
    const bool isStores = record.installType == InstallType::StoreDownload ||
                          record.installType == InstallType::Restore;
    if (!isStores || demotions.holdBack(record) || except.contains(identifier) ||
        coordinatorOf(identifier)) {
      continue;
    }
    order(identifier, nameOf(identifier), deliverToRegistry(phone_, record));
  }
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
      finish(order, InterruptedReason);
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
