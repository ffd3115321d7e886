#include "tests/fakes/fake_sync_host.h"

namespace appsync::fakes {

bool FakeSyncHostService::supportsPrioritizeAsset() noexcept {
  trace_.add(TraceQuery, callText("SyncHostService.supportsPrioritizeAsset"));
  const std::scoped_lock lock(mutex_);
  return supportsPrioritize_;
}

void FakeSyncHostService::prioritizeAsset(
    const SyncAssetPtr& asset,
    std::function<void(const std::optional<Error>&)> completion) noexcept {
  trace_.add(TraceCall, callText("SyncHostService.prioritizeAsset", asset->identifier));
  std::optional<Error> error;
  {
    const std::scoped_lock lock(mutex_);
    prioritized_.push_back(asset);
    if (holdsCompletions_) {
      heldCompletions_.push_back(std::move(completion));
      return;
    }
    error = prioritizeError_;
  }
  completion(error);
}

bool FakeSyncHostService::supportsCancelAssetAsFailed() noexcept {
  trace_.add(TraceQuery, callText("SyncHostService.supportsCancelAssetAsFailed"));
  const std::scoped_lock lock(mutex_);
  return supportsCancel_;
}

void FakeSyncHostService::cancelAssetAsFailed(const SyncAssetPtr& asset) noexcept {
  trace_.add(TraceCall, callText("SyncHostService.cancelAssetAsFailed", asset->identifier));
  const std::scoped_lock lock(mutex_);
  canceled_.push_back(asset);
}

void FakeSyncHostService::setSupportsPrioritize(bool supported) {
  const std::scoped_lock lock(mutex_);
  supportsPrioritize_ = supported;
}

void FakeSyncHostService::setSupportsCancel(bool supported) {
  const std::scoped_lock lock(mutex_);
  supportsCancel_ = supported;
}

void FakeSyncHostService::setPrioritizeError(std::optional<Error> error) {
  const std::scoped_lock lock(mutex_);
  prioritizeError_ = std::move(error);
}

void FakeSyncHostService::holdCompletions() {
  const std::scoped_lock lock(mutex_);
  holdsCompletions_ = true;
}

void FakeSyncHostService::completePrioritize(const std::optional<Error>& error) {
  std::unique_lock lock(mutex_);
  const auto completions = heldCompletions_;
  lock.unlock();
  for (const auto& completion : completions) completion(error);
}

std::vector<SyncAssetPtr> FakeSyncHostService::prioritized() const {
  const std::scoped_lock lock(mutex_);
  return prioritized_;
}

std::vector<SyncAssetPtr> FakeSyncHostService::canceled() const {
  const std::scoped_lock lock(mutex_);
  return canceled_;
}

std::string FakeSyncHost::mainBundleIdentifier() noexcept {
  trace_.add(TraceQuery, callText("SyncHost.mainBundleIdentifier"));
  const std::scoped_lock lock(mutex_);
  return mainBundleIdentifier_;
}

std::string FakeSyncHost::pluginBundleIdentifier() noexcept {
  return std::string(PluginLogPrefix.substr(0, PluginLogPrefix.size() - 1));
}

SyncAssetPtr FakeSyncHost::makeDownload(std::string_view identifier, std::string_view dataclass,
                                        const std::optional<std::string>& prettyName) noexcept {
  trace_.add(TraceQuery, callText("SyncHost.makeDownload", identifier, dataclass, prettyName));
  auto asset = std::make_shared<SyncAsset>();
  asset->identifier = identifier;
  asset->dataclass = dataclass;
  asset->prettyName = prettyName;
  asset->isDownload = true;
  const std::scoped_lock lock(mutex_);
  made_.push_back(asset);
  return asset;
}

bool FakeSyncHost::TWIsRecoverableError(const Error& error) noexcept {
  trace_.add(TraceQuery, callText("SyncHost.TWIsRecoverableError", error));
  const std::scoped_lock lock(mutex_);
  const auto found = recoverable_.find(error.domain);
  return found == recoverable_.end() || found->second;
}

void FakeSyncHost::setMainBundleIdentifier(std::string identifier) {
  const std::scoped_lock lock(mutex_);
  mainBundleIdentifier_ = std::move(identifier);
}

void FakeSyncHost::setRecoverable(std::string_view errorDomain, bool recoverable) {
  const std::scoped_lock lock(mutex_);
  recoverable_.insert_or_assign(std::string(errorDomain), recoverable);
}

std::vector<SyncAssetPtr> FakeSyncHost::made() const {
  const std::scoped_lock lock(mutex_);
  return made_;
}

}  // namespace appsync::fakes
