#pragma once

#include <map>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "host/base/interruption.h"
#include "host/library/events.h"
#include "host/phone/phone.h"
#include "host/phone/transfer_queue.h"
#include "host/transfer/package_transfer.h"
#include "platform/sync_client.h"

namespace appsync::host {

/// What became of the packages that the client asked for.
struct TransferOutcome {
  std::set<std::string> asked;
  std::set<std::string> sent;
  std::map<std::string, std::string> failures;  ///< reason by identifier
};

/// Sends the packages that the client asks for, in the queue's order, and tells the client and the
/// reporter how far they have come. Borrows everything; used by one thread.
class PackageSender {
 public:
  PackageSender(SyncClient& client, TransferQueue& queue, const Phone& phone, Reporter& reporter,
                const Interruption& interruption, const Library& library)
      : client_(client),
        queue_(queue),
        phone_(phone),
        reporter_(reporter),
        interruption_(interruption),
        library_(library) {}

  /// Returns when every asset was sent or has failed. After an interruption what remains fails with
  /// an error that lets the phone ask again.
  void send(const std::vector<SyncAssetPtr>& assets);

  const TransferOutcome& outcome() const { return outcome_; }
  /// Removes packages sent that still lie in the staging root.
  void removeSentPackages();

 private:
  void sendChunk(const SyncAssetPtr& asset);
  void reportProgress(const SyncAssetPtr& asset, const PackageTransfer& transfer);
  void succeed(const SyncAssetPtr& asset);
  void fail(const SyncAssetPtr& asset, const Error& error, const std::string& reason);

  SyncClient& client_;
  TransferQueue& queue_;
  const Phone& phone_;
  Reporter& reporter_;
  const Interruption& interruption_;
  const Library& library_;
  std::map<SyncAssetPtr, std::unique_ptr<PackageTransfer>> transfers_;
  TransferOutcome outcome_;
};

}  // namespace appsync::host
