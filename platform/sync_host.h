#pragma once

#include <functional>
#include <optional>
#include <string>
#include <string_view>

#include "platform/error.h"
#include "platform/sync_asset.h"

namespace appsync {

/// The sync host daemon's own bundle identifier.
inline constexpr std::string_view SyncHostBundleIdentifier = "com.corvane.twc";
/// Posted by the sync host when it has started and is ready for events.
inline constexpr std::string_view TWStartupCompleteNotification =
    "com.corvane.twc.TWStartupCompleteNotification";

/// The sync host's device service. Requests return at once. Called from any thread.
class SyncHostService {
 public:
  virtual ~SyncHostService() = default;

  virtual bool supportsPrioritizeAsset() noexcept = 0;
  /// Sends this asset next. The completion runs once, with none on success.
  virtual void prioritizeAsset(
      const SyncAssetPtr& asset,
      std::function<void(const std::optional<Error>&)> completion) noexcept = 0;

  virtual bool supportsCancelAssetAsFailed() noexcept = 0;
  /// Stops sending this asset and reports its transfer as failed.
  virtual void cancelAssetAsFailed(const SyncAssetPtr& asset) noexcept = 0;
};

/// The process that loaded the plug-in. Called from any thread.
class SyncHost {
 public:
  virtual ~SyncHost() = default;

  /// Main bundle identifier of the process; SyncHostBundleIdentifier only in the sync host itself.
  virtual std::string mainBundleIdentifier() noexcept = 0;
  /// Bundle identifier of the loaded plug-in.
  virtual std::string pluginBundleIdentifier() noexcept = 0;

  /// A new record of a download asset. `prettyName` may be none.
  virtual SyncAssetPtr makeDownload(std::string_view identifier, std::string_view dataclass,
                                    const std::optional<std::string>& prettyName) noexcept = 0;

  /// Whether trying again later may help.
  virtual bool TWIsRecoverableError(const Error& error) noexcept = 0;

  virtual SyncHostService& service() noexcept = 0;
};

}  // namespace appsync
