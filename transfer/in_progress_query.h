#pragma once

#include <optional>
#include <string>
#include <vector>

#include "client/log_message.h"
#include "client/queues.h"
#include "platform/app_registry.h"

namespace appsync {

/// One question to the registry: which applications are being installed or restored right now?
/// Lives for one call of currentInProgressAssetIDs.
class InProgressAssetQuery final : public AppRegistryObserver {
 public:
  struct Answer {
    std::optional<std::vector<std::string>> inProgress;
    std::optional<std::vector<std::string>> restoring;
  };

  /// Blocks until the registry has reported its installs; both lists are none when it failed.
  static Answer currentInProgressAssetIDs(AppRegistry& registry, const ClientLog& log);

  void applicationInstallsArePrioritized(const std::vector<AppRecord>& prioritized,
                                         const std::vector<AppRecord>& paused) noexcept override;

 private:
  InProgressAssetQuery(AppRegistry& registry, const ClientLog& log)
      : _registry(registry), _log(log) {}

  [[nodiscard]] bool _fetchResults();
  void _sort(const AppRecord& record);

  AppRegistry& _registry;
  const ClientLog& _log;
  /// Signalled once, when the first report has been sorted. The lists are written only before that
  /// and read only after it, so they need no lock.
  Semaphore _waitForInitialObservationData;
  std::optional<std::vector<std::string>> _inProgressAssetIDs;
  std::optional<std::vector<std::string>> _restoringAssetIDs;
};

}  // namespace appsync
