#pragma once

#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "base/interruption.h"
#include "host/library/events.h"
#include "host/phone/phone_state.h"
#include "host/phone/transfer_queue.h"
#include "host/transfer/package_delivery.h"
#include "host/transfer/package_transfer.h"

namespace appsync::host {

/// Why a package that the client asks for was not sent.
inline constexpr const char* InterruptedTransfer = "interrupted before it was sent";

/// A package that is to be sent, and what for.
struct Shipment {
  SyncAssetPtr asset;                     ///< stands for it in the queue
  const PackageFacts* package = nullptr;  ///< without one it fails when its turn comes
  std::string target;                     ///< file of the phone
  std::unique_ptr<PackageDelivery> delivery;
};

/// What became of the packages.
struct TransferOutcome {
  std::set<std::string> asked;
  std::set<std::string> sent;
  std::map<std::string, std::string> failures;  ///< reason by identifier
};

/// Sends packages in the queue's order, and tells their deliveries and the reporter how far they
/// have come. Borrows everything; used by one thread.
class PackageSender {
 public:
  PackageSender(TransferQueue& queue, const Phone& phone, Reporter& reporter,
                const Interruption& interruption)
      : queue_(queue), phone_(phone), reporter_(reporter), interruption_(interruption) {}

  /// Returns when every package was sent or has failed. After an interruption what remains fails
  /// with this reason, and with an error that lets the phone ask again.
  void send(std::vector<Shipment> shipments, std::string_view ifInterrupted);
  /// Waits until the phone has installed or refused what was sent.
  void settle();

  const TransferOutcome& outcome() const { return outcome_; }
  /// Removes packages sent that still lie where they arrived.
  void removeSentPackages();

 private:
  struct Sending {
    explicit Sending(Shipment what)
        : shipment(std::move(what)),
          transfer(shipment.package ? shipment.package->file : std::filesystem::path(),
                   shipment.target, shipment.delivery->durability()) {}

    Shipment shipment;
    PackageTransfer transfer;
  };
  struct Failure {
    Error error;         ///< for the phone
    std::string reason;  ///< for people
  };

  void sendChunk(const SyncAssetPtr& asset);
  void reportProgress(Sending& sending);
  void finish(const SyncAssetPtr& asset, const std::optional<Failure>& failure);

  TransferQueue& queue_;
  const Phone& phone_;
  Reporter& reporter_;
  const Interruption& interruption_;
  std::map<SyncAssetPtr, Sending> onTheWay_;
  std::map<std::string, Shipment> arrived_;  ///< by identifier
  TransferOutcome outcome_;
};

}  // namespace appsync::host
