#include "transfer/in_progress_query.h"

#include "transfer/status_names.h"

namespace appsync {

InProgressAssetQuery::Answer InProgressAssetQuery::currentInProgressAssetIDs(AppRegistry& registry,
                                                                             const ClientLog& log) {
  InProgressAssetQuery query(registry, log);
  registry.addObserver(&query);
  const bool fetched = query._fetchResults();
  registry.removeObserver(&query);
  if (!fetched) return {};
  return {std::move(query._inProgressAssetIDs), std::move(query._restoringAssetIDs)};
}

bool InProgressAssetQuery::_fetchResults() {
  _log.normal("Waiting for -applicationInstallsArePrioritized:arePaused: to complete...");
  if (!_waitForInitialObservationData.wait()) {
    _log.error("Query for in progress assets timed out");
    return false;
  }
  _log.normal("Wait completed");
  return true;
}

void InProgressAssetQuery::applicationInstallsArePrioritized(
    const std::vector<AppRecord>& prioritized, const std::vector<AppRecord>& paused) noexcept {
  _log.oversize("prioritized proxies %{public}@ paused proxies %{public}@", prioritized, paused);
  if (_inProgressAssetIDs) return;
  _inProgressAssetIDs.emplace();
  _restoringAssetIDs.emplace();
  if (prioritized.empty()) _log.normal("No assets currently in progress.");
  for (const AppRecord& record : prioritized) _sort(record);
  _log.normal("signaling semaphore");
  _waitForInitialObservationData.signal();
}

void InProgressAssetQuery::_sort(const AppRecord& record) {
  const std::string& identifier = record.applicationIdentifier;
  if (!record.isPlaceholder) {
    _log.normal("No placeholder for asset identifier %{public}@", identifier);
    return;
  }
  const std::shared_ptr<InstallProgress> progress = _registry.installProgressSync(record);
  if (!progress) {
    _log.normal("No install progress found for asset identifier %{public}@", identifier);
    return;
  }
  const InstallType type = record.installType;
  const InstallState state = progress->installState();
  const InstallPhase phase = progress->installPhase();
  _log.normal("Got install type=%{public}@ state=%{public}@ phase=%{public}@ for %{public}@",
              installTypeName(type), installStateName(state), installPhaseName(phase), identifier);

  if (state != InstallState::Active) return;
  const bool loading = phase == InstallPhase::Loading;
  const bool installing = phase == InstallPhase::Installing;
  if (type == InstallType::Restore) {
    if (loading || installing) _restoringAssetIDs->push_back(identifier);
  } else if (installing || (loading && type == InstallType::StoreDownload)) {
    _inProgressAssetIDs->push_back(identifier);
  }
}

}  // namespace appsync
