#pragma once

#include <functional>
#include <map>
#include <mutex>
#include <vector>

#include "platform/sync_host.h"
#include "tests/fakes/call_trace.h"

namespace appsync::fakes {

/// The host's device service; completions run before the request returns, unless they are held.
class FakeSyncHostService : public SyncHostService {
 public:
  explicit FakeSyncHostService(CallTrace& trace) : trace_(trace) {}

  bool supportsPrioritizeAsset() noexcept override;
  void prioritizeAsset(
      const SyncAssetPtr& asset,
      std::function<void(const std::optional<Error>&)> completion) noexcept override;
  bool supportsCancelAssetAsFailed() noexcept override;
  void cancelAssetAsFailed(const SyncAssetPtr& asset) noexcept override;

  /// Both are supported at first.
  void setSupportsPrioritize(bool supported);
  void setSupportsCancel(bool supported);
  /// What completions of prioritizeAsset are given.
  void setPrioritizeError(std::optional<Error> error);
  /// From now on completions are called only by completePrioritize.
  void holdCompletions();
  /// Calls all completions that are held; they stay, and can be called again.
  void completePrioritize(const std::optional<Error>& error);
  std::vector<SyncAssetPtr> prioritized() const;
  std::vector<SyncAssetPtr> canceled() const;

 private:
  CallTrace& trace_;
  mutable std::mutex mutex_;
  bool supportsPrioritize_ = true;
  bool supportsCancel_ = true;
  std::optional<Error> prioritizeError_;
  bool holdsCompletions_ = false;
  std::vector<std::function<void(const std::optional<Error>&)>> heldCompletions_;
  std::vector<SyncAssetPtr> prioritized_;
  std::vector<SyncAssetPtr> canceled_;
};

/// A process that loaded the plug-in "com.corvane.twc.AppsClient"; at first the sync host itself.
class FakeSyncHost : public SyncHost {
 public:
  explicit FakeSyncHost(CallTrace& trace) : trace_(trace), service_(trace) {}

  std::string mainBundleIdentifier() noexcept override;
  std::string pluginBundleIdentifier() noexcept override;
  SyncAssetPtr makeDownload(std::string_view identifier, std::string_view dataclass,
                            const std::optional<std::string>& prettyName) noexcept override;
  /// True unless setRecoverable said otherwise of the domain.
  bool TWIsRecoverableError(const Error& error) noexcept override;
  FakeSyncHostService& service() noexcept override { return service_; }

  void setMainBundleIdentifier(std::string identifier);
  void setRecoverable(std::string_view errorDomain, bool recoverable);
  /// Every asset made, oldest first.
  std::vector<SyncAssetPtr> made() const;

 private:
  CallTrace& trace_;
  mutable std::mutex mutex_;
  std::string mainBundleIdentifier_{SyncHostBundleIdentifier};
  std::map<std::string, bool, std::less<>> recoverable_;
  std::vector<SyncAssetPtr> made_;
  FakeSyncHostService service_;
};

}  // namespace appsync::fakes
