#pragma once

#include <string>
#include <vector>

#include "device/coordination/coordinated_installs.h"
#include "device/coordination/coordination_handles.h"
#include "device/coordination/presentable_error.h"
#include "platform/install_coordination.h"

namespace appsync::device {

/// The install coordination service of a device that is open for writing. Coordinators, promises,
/// placeholders and undelivered events live in the device's database and are carried on when the
/// device is opened anew.
///
/// An application has at most one live coordinator. Its placeholder is installed as soon as it is
/// promised and its icon has come (all that is left of an application, a demoted one say, stands in
/// the stead of a sync's); its package, a complete path promise, as soon as
/// the placeholder stands and there are options. An application in the foreground keeps its
/// package waiting until it is closed. A demoted restore ends with its placeholder. A coordinator
/// that fails keeps its error, loses its placeholder (but not that of a restored application, which
/// waits on) and leaves an installed version alone; until
/// its package is being installed it can be cancelled, with the same effect.
///
/// The service takes a package away when its coordinator is over. Events come from one thread; one
/// that nobody is there for is kept until an observer or listener appears, at the latest when the
/// device is next opened. Objects may outlive the service. Destroying the service lets a running
/// install end; it must not be done from an event.
class DeviceInstallCoordination final : public InstallCoordination {
 public:
  /// Carries on what was left from before.
  DeviceInstallCoordination(DeviceCore& device, DeviceAppRegistry& registry);
  /// Lets a running install end; what waits is carried on when the device is next opened.
  ~DeviceInstallCoordination() override;

  bool coordinationIsEnabled() noexcept override { return true; }
  /// With `createIfNotExisting`, this client's live coordinator that cannot go on makes room.
  std::shared_ptr<InstallCoordinator> coordinatorFor(CoordinatorKind kind,
                                                     std::string_view bundleId,
                                                     CoordinationClientId client,
                                                     bool createIfNotExisting, bool* created,
                                                     std::optional<Error>* error) noexcept override;
  void removeObserver(CoordinatorObserver* observer) noexcept override;
  std::shared_ptr<PathTransferPromise> createPathTransferPromise(
      std::string_view name, CoordinationClientId client,
      const std::optional<FileLocation>& transferPath,
      std::uint64_t diskSpaceNeeded) noexcept override;
  std::shared_ptr<OutOfBandTransferPromise> createOutOfBandTransferPromise(
      std::string_view name, CoordinationClientId client,
      std::uint64_t diskSpaceNeeded) noexcept override;
  /// nullptr for an identifier that no application can have.
  std::shared_ptr<InstallPlaceholder> createAppPlaceholder(
      std::string_view appName, std::string_view bundleId, InstallType installType,
      CoordinationClientId client) noexcept override;
  /// Takes what the registry's uninstallApplication would and ends a live coordinator.
  void uninstallApp(std::string_view bundleId, bool requestUserConfirmation,
                    std::function<void(const std::optional<Error>&)> completion) noexcept override;
  Error createUserPresentableError(std::int64_t code, std::uint64_t flag,
                                   const std::optional<Error>& underlying) noexcept override {
    return presentableError(code, flag, underlying);
  }
  std::unique_ptr<CoordinatorEventListener> createEventListener(
      std::string_view serviceName, const std::set<CoordinationClientId>& clients,
      CoordinatorObserver& delegate) noexcept override;

  // What a person does on the home screen. False when no install of the application is live, or
  // when it is past cancelling.
  [[nodiscard]] bool tap(std::string_view bundleId) noexcept;
  bool cancelInstall(std::string_view bundleId) noexcept;

  /// Whether the service has something left to do for the application by itself: to install, to
  /// remove, or to tell somebody who is there. False for an install that waits for its client.
  bool isBusy(std::string_view bundleId) noexcept;
  /// The applications whose package this client was named to bring and has not brought.
  std::set<std::string> packagesOwedBy(CoordinationClientId client) noexcept;
  /// Installs that wait for an application to be closed fail, now and from now on.
  void expedite() noexcept;

 private:
  /// Does what follows from a change.
  void carryOut(const Consequences& consequences);
  void showProgress(std::string_view identifier, double fraction);
  /// nullopt when there is none, and with an error when that cannot be read.
  [[nodiscard]] std::optional<CoordinatorRow> liveCoordinator(std::string_view bundleId,
                                                              std::optional<Error>* error);
  /// Why it could not be uninstalled.
  [[nodiscard]] std::optional<Error> uninstall(const std::string& identifier);
  /// Whether there was a live coordinator that could be ended; nullopt with an error.
  [[nodiscard]] std::optional<bool> endLive(const std::string& identifier,
                                            std::optional<Error>* error);
  /// Ends a live coordinator that nobody is served by going on with, if it is this client's. Throws
  /// Refused when one that does not serve cannot be ended.
  bool endedFor(Connection& database, const CoordinatorRow& live, CoordinatorKind kind,
                CoordinationClientId client, Consequences& consequences);
  /// Enters a promise or a placeholder.
  template <typename Row>
  [[nodiscard]] bool enter(Row& row);

  // In the order in which they need one another.
  DeviceCore& device_;
  CoordinationStore store_{device_.database,
                           [this](const auto& consequences) { carryOut(consequences); }};
  EventDelivery events_{device_.database};
  CoordinationObjects objects_{store_, events_};
  KeyedWorkers workers_;
  CoordinatedInstalls installs_;
};

}  // namespace appsync::device
