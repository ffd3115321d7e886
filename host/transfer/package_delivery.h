#pragma once

#include <memory>
#include <optional>
#include <string>

#include "host/phone/phone_state.h"
#include "platform/sync_client.h"

namespace appsync::host {

/// What a package that is being sent to a file of the phone is for. Used by one thread.
class PackageDelivery {
 public:
  virtual ~PackageDelivery() = default;

  /// What the package must survive on the phone once it has arrived: all, where the phone may
  /// install it after this process has ended.
  virtual Durability durability() const = 0;
  /// A fraction of the package has been sent.
  virtual void progressed(double fraction) = 0;
  /// The package will not come now.
  virtual void gaveUp(const Error& why) = 0;
  /// The package lies at `path` of the phone and is the delivery's from now on.
  virtual void arrived(const std::string& path) = 0;
  /// Waits until the phone has installed or refused the package that arrived; gives the reason, for
  /// people, when it was not installed.
  virtual std::optional<std::string> settle() = 0;
};

/// Hands the package to the client, which waits for its install at the end of the transfers. `name`
/// is the file's in the staging root.
std::unique_ptr<PackageDelivery> deliverToClient(SyncClient& client, const SyncAssetPtr& asset,
                                                 const std::string& name);

// The phone takes the package for a sync's unless an origin is given.

/// Keeps the promise of a package that an install coordinator expects of the store.
std::unique_ptr<PackageDelivery> deliverToCoordinator(
    const Phone& phone, const std::string& identifier,
    std::shared_ptr<InstallCoordinator> coordinator, std::optional<InstallType> origin);

/// Installs the package in the place of the application's placeholder.
std::unique_ptr<PackageDelivery> deliverToRegistry(const Phone& phone, const AppRecord& placeholder,
                                                   std::optional<InstallType> origin);

}  // namespace appsync::host
