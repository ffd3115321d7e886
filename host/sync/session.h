#pragma once

#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "host/base/interruption.h"
#include "host/library/events.h"
#include "host/phone/phone.h"
#include "host/phone/sync_host.h"
#include "host/transfer/install_watch.h"
#include "host/transfer/package_sender.h"
#include "host/transfer/settlement.h"
#include "platform/sync_client.h"

namespace appsync::host {

/// Whether the plug-in is one for applications.
bool servesApplications(SyncClient& client);

struct SyncInput {
  Library library;
  SyncPlan plan;
  std::optional<Bytes> iconLayout;  ///< property list
  std::string newAnchor;            ///< names this sync in the client's log
};

struct SyncResult {
  Summary summary;
  /// The sync ran to its end, though single applications may have failed.
  bool completed = false;
};

/// One desktop sync: the client's calls in their order and the desktop's own work between them.
/// Borrows everything; used once, by one thread.
class Session {
 public:
  Session(SyncClient& client, HostProcess& host, Phone phone, Reporter& reporter,
          Interruption& interruption);

  SyncResult run(const SyncInput& input);

 private:
  bool callClient(const SyncInput& input, PackageSender& sender);
  bool isServed();
  bool reconcile(const SyncInput& input);
  bool transfer(const SyncInput& input, PackageSender& sender);
  void bringWhatWaits(const SyncInput& input);
  void findCoordinators(const std::vector<SyncAssetPtr>& assets);
  bool isSettled(const std::string& identifier, const std::optional<std::vector<TodoState>>& todo);
  void waitForCoordination(const SyncPlan& plan, const std::set<std::string>& sent);

  bool sweepPlaceholders();
  void reportDeletions(const PropertyList::Dictionary& inventory);
  void writeApplicationsPresent();
  SyncEnd end(const PackageSender& sender);
  /// Always false.
  bool broken(std::string_view what, const std::optional<Error>& error);

  SyncClient& client_;
  HostProcess& host_;
  const Phone phone_;
  Reporter& reporter_;
  Interruption& interruption_;
  InstallWatch watch_;
  std::map<std::string, std::shared_ptr<InstallCoordinator>> coordinators_;  ///< by identifier
  /// Reason by identifier: those sent that were cancelled, and those that the host could not bring.
  std::map<std::string, std::string> failures_;
  std::set<std::string> carriedOut_;  ///< by the phone itself, before the client was called
  bool disabled_ = false;
  bool reconciled_ = false;
  std::optional<std::string> broken_;
};

}  // namespace appsync::host
