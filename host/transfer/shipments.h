#pragma once

#include <optional>
#include <set>
#include <string>
#include <vector>

#include "host/library/library.h"
#include "host/phone/phone_state.h"
#include "host/phone/sync_host.h"
#include "host/transfer/package_sender.h"
#include "platform/sync_client.h"

namespace appsync::host {

/// The packages that the client asks for, which it installs itself.
std::vector<Shipment> shipmentsTo(SyncClient& client, const std::vector<SyncAssetPtr>& assets,
                                  const Library& library);

/// The applications that wait for a package of the store's. Demoted ones do not until a person asks
/// for them.
std::set<std::string> waitingForStore(const Phone& phone, const ApplicationsPresent& present);

/// The store's part: what the catalogue has for these applications, as far as they have a
/// placeholder. The phone takes it for a sync's unless an origin is given.
///
/// Packages that install coordinators expect of the store go to them. Every other one goes to the
/// registry by itself: a coordinator that fails takes its placeholder along, which here is all that
/// is left of the application.
std::vector<Shipment> shipmentsFromStore(HostProcess& host, const Phone& phone,
                                         const ApplicationsPresent& present,
                                         const Library& catalogue,
                                         std::optional<InstallType> origin,
                                         const std::set<std::string>& identifiers);

}  // namespace appsync::host
