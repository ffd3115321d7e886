#pragma once

#include <map>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "base/interruption.h"
#include "host/library/events.h"
#include "host/phone/phone_state.h"
#include "host/phone/sync_host.h"
#include "host/transfer/install_watch.h"
#include "host/transfer/package_sender.h"
#include "platform/sync_client.h"

namespace appsync::host {

struct SyncResult {
  Summary summary;
  /// The sync or restore ran to its end, though single applications may have failed.
  bool completed = false;
};

/// What a sync and a restore have in common: who takes part, how packages go out, and how it breaks
/// off. Borrows everything; used once, by one thread.
class Visit {
 protected:
  Visit(SyncClient& client, HostProcess& host, Phone phone, Reporter& reporter,
        Interruption& interruption);
  ~Visit() = default;

  /// Whether the plug-in is one for applications; else the visit is broken off.
  bool isServed();
  /// Has the client begin; else the visit is broken off, told as this.
  [[nodiscard]] bool begin(std::string_view hostAnchor, std::string_view failure);

  /// Sends what the client asks for.
  void sendToClient(const std::vector<SyncAssetPtr>& assets, const Library& library);
  /// Brings what waits for the store, and notes what failed. See shipmentsFromStore.
  void bringFromStore(const ApplicationsPresent& present, const Library& catalogue,
                      std::optional<InstallType> origin, const std::set<std::string>& identifiers,
                      std::string_view ifInterrupted);

  /// nullopt when they cannot be told, which breaks the visit off.
  std::optional<ApplicationsPresent> applicationsNow();

  /// Lets the client wait for its installs; then nothing of what it was sent is left lying.
  void endTransfers();

  /// Of several reasons for one application the first counts.
  void note(const std::map<std::string, std::string>& failures);
  /// Always false.
  bool breakOff(std::string_view what, const std::optional<Error>& error = std::nullopt);

  PackageSender makeSender() { return {host_.transfers(), phone_, reporter_, interruption_}; }

  SyncClient& client_;
  HostProcess& host_;
  const Phone phone_;
  Reporter& reporter_;
  Interruption& interruption_;
  InstallWatch watch_;
  PackageSender sender_;                         ///< of what the client asks for
  std::map<std::string, std::string> failures_;  ///< reason by identifier
  std::optional<std::string> broken_;            ///< why it broke off as a whole
};

}  // namespace appsync::host
