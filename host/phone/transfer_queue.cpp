#include "host/phone/transfer_queue.h"

#include <algorithm>
#include <cerrno>

namespace appsync::host {

void TransferQueue::add(const std::vector<SyncAssetPtr>& assets) {
  const Lock lock(mutex_);
  waiting_.insert(waiting_.end(), assets.begin(), assets.end());
  for (const SyncAssetPtr& asset : assets) finished_.erase(asset->identifier);
}

void TransferQueue::forgetCancelled() {
  const Lock lock(mutex_);
  cancelled_.clear();
}

TransferQueue::Next TransferQueue::next() {
  const Lock lock(mutex_);
  if (waiting_.empty()) return {};
  const SyncAssetPtr& first = waiting_.front();
  return {first, cancelled_.count(first->identifier) > 0};
}

void TransferQueue::finish(const SyncAssetPtr& asset) {
  const Lock lock(mutex_);
  waiting_.erase(std::remove(waiting_.begin(), waiting_.end(), asset), waiting_.end());
  cancelled_.erase(asset->identifier);
  finished_.insert(asset->identifier);
}

// The client names an asset by a record of its own, so only identifiers are compared.
bool TransferQueue::moveToFront(const std::string& identifier) {
  const auto found = std::find_if(waiting_.begin(), waiting_.end(), [&](const SyncAssetPtr& asset) {
    return asset->identifier == identifier;
  });
  if (found == waiting_.end()) return false;
  std::rotate(waiting_.begin(), found, found + 1);
  return true;
}

void TransferQueue::prioritizeAsset(
    const SyncAssetPtr& asset,
    std::function<void(const std::optional<Error>&)> completion) noexcept {
  bool found = false;
  if (asset) {
    const Lock lock(mutex_);
    found = moveToFront(asset->identifier);
  }
  if (!completion) return;
  if (found) {
    completion(std::nullopt);
  } else {
    completion(
        Error::withDescription(POSIXErrorDomain, ENOENT, "no such package waits to be sent"));
  }
}

void TransferQueue::cancelAssetAsFailed(const SyncAssetPtr& asset) noexcept {
  if (!asset) return;
  const Lock lock(mutex_);
  if (finished_.contains(asset->identifier)) return;
  moveToFront(asset->identifier);
  cancelled_.insert(asset->identifier);
}

}  // namespace appsync::host
