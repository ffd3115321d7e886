#pragma once

#include "platform/background_queue.h"
#include "platform/install_coordination.h"

namespace appsync::device {

/// The install coordination service of a device on which it is switched off: refuses everything.
class NoCoordination final : public InstallCoordination {
 public:
  /// Completions run on the queue.
  explicit NoCoordination(BackgroundQueue& queue) : queue_(queue) {}

  bool coordinationIsEnabled() noexcept override { return false; }
  std::shared_ptr<InstallCoordinator> coordinatorFor(CoordinatorKind kind,
                                                     std::string_view bundleId,
                                                     CoordinationClientId client,
                                                     bool createIfNotExisting, bool* created,
                                                     std::optional<Error>* error) noexcept override;
  void removeObserver(CoordinatorObserver* observer) noexcept override { (void)observer; }
  std::shared_ptr<PathTransferPromise> createPathTransferPromise(
      std::string_view name, CoordinationClientId client,
      const std::optional<FileLocation>& transferPath,
      std::uint64_t diskSpaceNeeded) noexcept override;
  std::shared_ptr<OutOfBandTransferPromise> createOutOfBandTransferPromise(
      std::string_view name, CoordinationClientId client,
      std::uint64_t diskSpaceNeeded) noexcept override;
  std::shared_ptr<InstallPlaceholder> createAppPlaceholder(
      std::string_view appName, std::string_view bundleId, InstallType installType,
      CoordinationClientId client) noexcept override;
  void uninstallApp(std::string_view bundleId, bool requestUserConfirmation,
                    std::function<void(const std::optional<Error>&)> completion) noexcept override;
  Error createUserPresentableError(std::int64_t code, std::uint64_t flag,
                                   const std::optional<Error>& underlying) noexcept override;
  /// A listener that hears nothing.
  std::unique_ptr<CoordinatorEventListener> createEventListener(
      std::string_view serviceName, const std::set<CoordinationClientId>& clients,
      CoordinatorObserver& delegate) noexcept override;

 private:
  BackgroundQueue& queue_;
};

}  // namespace appsync::device
