#pragma once

#include <functional>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "platform/error.h"
#include "platform/property_list.h"
#include "platform/sync_asset.h"

namespace appsync {

/// What the sync host asks of a plug-in for one dataclass. The host calls it on its own threads,
/// one call of a session after another; every call blocks until it is done.
class SyncClient {
 public:
  /// How far a long call has come, as a fraction.
  using ProgressCallback = std::function<void(double fraction)>;

  virtual ~SyncClient() = default;

  virtual std::vector<std::string> supportedDataclasses() noexcept = 0;
  virtual std::string currentSyncAnchor() noexcept = 0;
  /// First call of a sync. `hostAnchor` is the anchor that the desktop remembers.
  [[nodiscard]] virtual bool prepareForSyncWithHostAnchor(std::string_view hostAnchor,
                                                          const ProgressCallback& progressCallback,
                                                          std::optional<Error>* error) noexcept = 0;
  /// The dataclasses that device restrictions disable; nullopt when nothing is disabled.
  virtual std::optional<std::set<std::string>> disabledAssetTypes() noexcept = 0;

  /// What disappeared since the last sync: { "_Deleted": [ { KBBundleIdentifier: identifier } ] }.
  virtual PropertyList::Dictionary installedAssets() noexcept = 0;
  /// { "_Count", "_PhysicalSize" (bytes), "_PurgeableSize" (bytes) } of the user's applications.
  virtual PropertyList::Dictionary installedAssetMetrics() noexcept = 0;
  /// The store accounts that the installed applications were bought with.
  virtual std::set<std::string> corvaneIDsForAssets() noexcept = 0;

  /// Takes over what the desktop staged and carries out its deletions.
  [[nodiscard]] virtual bool reconcileSync(const PropertyList& syncDescription,
                                           std::string_view newAnchor,
                                           const ProgressCallback& progressCallback,
                                           std::optional<Error>* error) noexcept = 0;
  /// The counterpart after a device restore. Type 2: from a desktop backup. Always true; clears
  /// `error`.
  virtual bool reconcileRestoreOfType(std::int32_t type, std::optional<Error>* error) noexcept = 0;

  /// The packages that the host must still send, in the order in which it should.
  virtual std::vector<SyncAssetPtr> outstandingAssetTransfers() noexcept = 0;
  /// `fraction` of the asset's transfer is done, 0.0 to 1.0.
  virtual void assetTransferUpdatedProgress(const SyncAssetPtr& asset,
                                            double fraction) noexcept = 0;
  virtual void assetTransferSucceeded(const SyncAssetPtr& asset, bool succeeded,
                                      const std::optional<Error>& error) noexcept = 0;
  /// No more transfers will come. Waits without limit until every install is settled.
  virtual void assetTransferEndedWithSuccess(bool success) noexcept = 0;

  virtual void assetInstallSucceeded(const SyncAssetPtr& asset) noexcept = 0;
  virtual void assetInstallFailed(const SyncAssetPtr& asset, const Error& error) noexcept = 0;

  virtual void syncEndedWithSuccess(bool success) noexcept = 0;
  /// Forgets all sync state and takes every placeholder away.
  virtual void clearSyncData() noexcept = 0;
  virtual void prepareForBackup() noexcept = 0;
};

}  // namespace appsync
