#pragma once

#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>

#include "host/base/interruption.h"
#include "host/library/events.h"
#include "host/library/library.h"
#include "host/phone/sync_host.h"
#include "host/transfer/package_delivery.h"
#include "host/transfer/package_transfer.h"

namespace appsync::host {

/// Those of the applications present that wait for a package of the store's. Demoted ones do not
/// until a person asks for them.
std::set<std::string> waitingForStore(const Phone& phone, const ApplicationsPresent& present);

/// The store's part: brings the packages of applications that have a placeholder, from a catalogue.
///
/// Packages that install coordinators expect of it go to them. Every other one goes to the registry
/// by itself: a coordinator that fails takes its placeholder along, which here is all that is left
/// of the application. Borrows everything; used once, by one thread.
class Store {
 public:
  /// `ifInterrupted` is the reason, for people, why a package was not sent. `origin` is how the
  /// phone is to take what it gets: none, for a sync's.
  Store(HostProcess& host, const Phone& phone, Reporter& reporter, const Interruption& interruption,
        const Library& catalogue, std::string ifInterrupted, std::optional<InstallType> origin)
      : host_(host),
        phone_(phone),
        reporter_(reporter),
        interruption_(interruption),
        catalogue_(catalogue),
        ifInterrupted_(std::move(ifInterrupted)),
        origin_(origin) {}

  /// Returns when the phone has installed or refused what the catalogue has of these.
  void deliver(const std::set<std::string>& identifiers);

  /// Why what the catalogue has was not brought, by identifier.
  const std::map<std::string, std::string>& failures() const { return failures_; }

 private:
  struct Order {
    SyncAssetPtr asset;
    std::unique_ptr<PackageDelivery> delivery;
    std::string target;  ///< file of the phone
    PackageTransfer transfer;
    bool arrived = false;
  };

  void takeOrders(const std::set<std::string>& identifiers);
  std::unique_ptr<PackageDelivery> deliveryFor(const std::string& identifier,
                                               const AppRecord* placeholder, bool owed) const;
  void order(const std::string& identifier, const std::string& name,
             std::unique_ptr<PackageDelivery> delivery);
  void send();
  void sendChunk(Order& order);
  void finish(Order& order, const std::optional<std::string>& failure);

  HostProcess& host_;
  const Phone& phone_;
  Reporter& reporter_;
  const Interruption& interruption_;
  const Library& catalogue_;
  const std::string ifInterrupted_;
  const std::optional<InstallType> origin_;
  std::map<std::string, std::unique_ptr<Order>> orders_;  ///< by identifier
  std::map<std::string, std::string> failures_;
};

}  // namespace appsync::host
