#pragma once

#include <deque>
#include <set>
#include <string>
#include <vector>

#include "platform/mutex.h"
#include "platform/sync_host.h"

namespace appsync::host {

/// The packages still to be sent, the next chunk always from the first. The sync takes from it; the
/// client's wishes reorder it, from any thread.
class TransferQueue : public SyncHostService {
 public:
  void add(const std::vector<SyncAssetPtr>& assets);

  /// What was cancelled before a sync or a restore began does not concern it.
  void forgetCancelled();

  struct Next {
    SyncAssetPtr asset;
    bool cancelled = false;  ///< report it as failed instead of sending on
  };
  /// nullptr as asset when nothing is left.
  Next next();
  /// Nothing more is to be sent of it.
  void finish(const SyncAssetPtr& asset);

  bool supportsPrioritizeAsset() noexcept override { return true; }
  /// Puts the waiting asset of this identifier at the front, before the one being sent. The
  /// completion runs before this returns; its error says that no such asset waits.
  void prioritizeAsset(
      const SyncAssetPtr& asset,
      std::function<void(const std::optional<Error>&)> completion) noexcept override;

  bool supportsCancelAssetAsFailed() noexcept override { return true; }
  /// Brings the asset of this identifier to the front, to be reported as failed. One that has not
  /// been added yet is treated so when it is; one that is finished is left alone.
  void cancelAssetAsFailed(const SyncAssetPtr& asset) noexcept override;

 private:
  bool moveToFront(const std::string& identifier) APPSYNC_REQUIRES(mutex_);

  Mutex mutex_;
  std::deque<SyncAssetPtr> waiting_ APPSYNC_GUARDED_BY(mutex_);
  std::set<std::string> cancelled_ APPSYNC_GUARDED_BY(mutex_);
  std::set<std::string> finished_ APPSYNC_GUARDED_BY(mutex_);
};

}  // namespace appsync::host
