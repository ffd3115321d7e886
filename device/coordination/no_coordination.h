#pragma once

#include <cerrno>

#include "device/coordination/presentable_error.h"
#include "platform/background_queue.h"
#include "platform/install_coordination.h"

namespace appsync::device {

/// The install coordination service of a device on which it is switched off: refuses everything.
class NoCoordination final : public InstallCoordination {
 public:
  /// Completions run on the queue.
  explicit NoCoordination(BackgroundQueue& queue) : queue_(queue) {}

  bool coordinationIsEnabled() noexcept override { return false; }
  std::shared_ptr<InstallCoordinator> coordinatorFor(
      CoordinatorKind, std::string_view, CoordinationClientId, bool, bool* created,
      std::optional<Error>* error) noexcept override {
    if (created) *created = false;
    setError(error, switchedOff());
    return nullptr;
  }
  void removeObserver(CoordinatorObserver*) noexcept override {}
  std::shared_ptr<PathTransferPromise> createPathTransferPromise(std::string_view,
                                                                 CoordinationClientId,
                                                                 const std::optional<FileLocation>&,
                                                                 std::uint64_t) noexcept override {
    return nullptr;
  }
  std::shared_ptr<OutOfBandTransferPromise> createOutOfBandTransferPromise(
      std::string_view, CoordinationClientId, std::uint64_t) noexcept override {
    return nullptr;
  }
  std::shared_ptr<InstallPlaceholder> createAppPlaceholder(std::string_view, std::string_view,
                                                           InstallType,
                                                           CoordinationClientId) noexcept override {
    return nullptr;
  }
  void uninstallApp(std::string_view, bool,
                    std::function<void(const std::optional<Error>&)> completion) noexcept override {
    queue_.after({}, [completion] { completion(switchedOff()); });
  }
  Error createUserPresentableError(std::int64_t code, std::uint64_t flag,
                                   const std::optional<Error>& underlying) noexcept override {
    return presentableError(code, flag, underlying);
  }
  /// A listener that hears nothing.
  std::unique_ptr<CoordinatorEventListener> createEventListener(
      std::string_view, const std::set<CoordinationClientId>&,
      CoordinatorObserver&) noexcept override {
    return std::make_unique<SilentListener>();
  }

 private:
  class SilentListener final : public CoordinatorEventListener {};

  static Error switchedOff() {
    return Error::withDescription(POSIXErrorDomain, ENOTSUP,
                                  "install coordination is switched off on this phone");
  }

  BackgroundQueue& queue_;
};

}  // namespace appsync::device
