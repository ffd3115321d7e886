#include "device/coordination/no_coordination.h"

#include <cerrno>

namespace appsync::device {
namespace {

Error switchedOff() {
  return Error::withDescription(POSIXErrorDomain, ENOTSUP,
                                "install coordination is switched off on this device");
}

class SilentListener final : public CoordinatorEventListener {};

}  // namespace

std::shared_ptr<InstallCoordinator> NoCoordination::coordinatorFor(
    CoordinatorKind, std::string_view, CoordinationClientId, bool, bool* created,
    std::optional<Error>* error) noexcept {
  if (created) *created = false;
  setError(error, switchedOff());
  return nullptr;
}

std::shared_ptr<PathTransferPromise> NoCoordination::createPathTransferPromise(
    std::string_view, CoordinationClientId, const std::optional<FileLocation>&,
    std::uint64_t) noexcept {
  return nullptr;
}

std::shared_ptr<OutOfBandTransferPromise> NoCoordination::createOutOfBandTransferPromise(
    std::string_view, CoordinationClientId, std::uint64_t) noexcept {
  return nullptr;
}

std::shared_ptr<InstallPlaceholder> NoCoordination::createAppPlaceholder(
    std::string_view, std::string_view, InstallType, CoordinationClientId) noexcept {
  return nullptr;
}

void NoCoordination::uninstallApp(
    std::string_view, bool, std::function<void(const std::optional<Error>&)> completion) noexcept {
  queue_.after(std::chrono::milliseconds(0), [completion] { completion(switchedOff()); });
}

Error NoCoordination::createUserPresentableError(std::int64_t code, std::uint64_t,
                                                 const std::optional<Error>& underlying) noexcept {
  Error error = Error::withDescription(
      TWErrorDomain, code,
      underlying ? underlying->localizedDescription() : "The application could not be installed.");
  if (underlying) error.underlying = std::make_shared<const Error>(*underlying);
  return error;
}

std::unique_ptr<CoordinatorEventListener> NoCoordination::createEventListener(
    std::string_view, const std::set<CoordinationClientId>&, CoordinatorObserver&) noexcept {
  return std::make_unique<SilentListener>();
}

}  // namespace appsync::device
