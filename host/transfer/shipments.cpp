#include "host/transfer/shipments.h"

#include "host/phone/demotions.h"
#include "host/transfer/staging.h"

namespace appsync::host {
namespace {

/// nullptr when nothing waits for the package.
std::unique_ptr<PackageDelivery> deliveryOfStore(const Phone& phone, const std::string& identifier,
                                                 const AppRecord* placeholder, bool owed,
                                                 std::optional<InstallType> origin) {
  const auto coordinator = phone.coordination ? phone.coordination->coordinatorFor(
                                                    CoordinatorKind::Any, identifier, KQClientKiosk,
                                                    false, nullptr, nullptr)
                                              : nullptr;
  if (coordinator && owed) return deliverToCoordinator(phone, identifier, coordinator, origin);
  return placeholder && !coordinator ? deliverToRegistry(phone, *placeholder, origin) : nullptr;
}

}  // namespace

std::vector<Shipment> shipmentsTo(SyncClient& client, const std::vector<SyncAssetPtr>& assets,
                                  const Library& library) {
  std::vector<Shipment> shipments;
  for (const SyncAssetPtr& asset : assets) {
    const PackageFacts* package = library.find(asset->identifier);
    const std::string name = package ? stagedPackageName(*package) : std::string();
    shipments.push_back({asset, package, joinPath(exchange::StagingRoot, name),
                         deliverToClient(client, asset, name)});
  }
  return shipments;
}

std::set<std::string> waitingForStore(const Phone& phone, const ApplicationsPresent& present) {
  std::set<std::string> waiting = phone.activity.packagesOwedBy(KQClientKiosk);
  const Demotions demotions(phone.files);
  for (const auto& [identifier, record] : present.placeholders) {
    const bool isStores = record.installType == InstallType::StoreDownload ||
                          record.installType == InstallType::Restore;
    if (isStores && !demotions.holdBack(record)) waiting.insert(identifier);
  }
  return waiting;
}

std::vector<Shipment> shipmentsFromStore(HostProcess& host, const Phone& phone,
                                         const ApplicationsPresent& present,
                                         const Library& catalogue,
                                         std::optional<InstallType> origin,
                                         const std::set<std::string>& identifiers) {
  const std::set<std::string> owed = phone.activity.packagesOwedBy(KQClientKiosk);
  std::vector<Shipment> shipments;
  for (const std::string& identifier : identifiers) {
    const auto found = present.placeholders.find(identifier);
    const AppRecord* placeholder = found == present.placeholders.end() ? nullptr : &found->second;
    auto delivery =
        deliveryOfStore(phone, identifier, placeholder, owed.contains(identifier), origin);
    const PackageFacts* package = catalogue.find(identifier);
    if (!delivery || !package) continue;
    const bool named = placeholder && !placeholder->displayName.empty();
    shipments.push_back({host.makeDownload(identifier, ApplicationDataclass,
                                           named ? placeholder->displayName : identifier),
                         package, joinPath(exchange::Downloads, stagedPackageName(*package)),
                         std::move(delivery)});
  }
  return shipments;
}

}  // namespace appsync::host
