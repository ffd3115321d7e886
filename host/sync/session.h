#pragma once

#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "host/transfer/settlement.h"
#include "host/transfer/visit.h"

namespace appsync::host {

struct SyncInput {
  Library library;
  SyncPlan plan;
  std::optional<Bytes> iconLayout;  ///< property list
  std::string newAnchor;            ///< names this sync in the client's log
};

/// One desktop sync: the client's calls in their order and the desktop's own work between them.
/// Borrows everything; used once, by one thread.
class Session : Visit {
 public:
  Session(SyncClient& client, HostProcess& host, Phone phone, Reporter& reporter,
          Interruption& interruption)
      : Visit(client, host, std::move(phone), reporter, interruption) {}

  SyncResult run(const SyncInput& input);

 private:
  [[nodiscard]] bool callClient(const SyncInput& input);
  [[nodiscard]] bool prepare();
  [[nodiscard]] bool reconcile(const SyncInput& input);
  [[nodiscard]] bool transfer(const SyncInput& input);
  void sendWhatIsAskedFor(const SyncInput& input);
  void findCoordinators(const std::vector<SyncAssetPtr>& assets);
  bool isSettled(const std::string& identifier, const std::optional<std::vector<TodoState>>& todo,
                 const std::set<std::string>& busy);
  void waitForCoordination(const SyncPlan& plan);

  [[nodiscard]] bool sweepPlaceholders();
  void reportDeletions(const PropertyList::Dictionary& inventory);
  void writeApplicationsPresent();
  SyncEnd end();

  std::map<std::string, std::shared_ptr<InstallCoordinator>> coordinators_;  ///< by identifier
  std::set<std::string> carriedOut_;  ///< by the phone itself, before the client was called
  bool disabled_ = false;
  bool reconciled_ = false;
};

}  // namespace appsync::host
