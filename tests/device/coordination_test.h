#pragma once

#include <condition_variable>
#include <mutex>
#include <thread>

#include "device/coordination/install_coordination_service.h"
#include "tests/device/device_test.h"
#include "tests/fakes/event_recorder.h"

namespace appsync::device {

using fakes::EventRecorder;

/// Waits for the device's watcher to be told of a denied assertion or a finished install.
class WaitingWatcher : public PhoneWatcher {
 public:
  void assertionDenied(std::string_view bundleId) noexcept override;
  void installFinished(std::string_view bundleId,
                       const std::optional<Error>& error) noexcept override;
  bool waitFor(std::string_view entry);
  std::vector<std::string> entries();

 private:
  void add(std::string entry);

  std::mutex mutex_;
  std::condition_variable changed_;
  std::vector<std::string> entries_;
};

/// A device whose installs are driven through coordinators, and a client of its service.
class CoordinationTest : public DeviceTest {
 protected:
  using Events = EventRecorder::Events;

  CoordinationTest();
  ~CoordinationTest() override;

  DeviceInstallCoordination& service();
  std::shared_ptr<InstallCoordinator> coordinatorFor(
      std::string_view identifier, CoordinatorKind kind = CoordinatorKind::Initiating,
      CoordinationClientId client = SyncHostClientID);
  /// The same; `recorder` observes.
  std::shared_ptr<InstallCoordinator> observed(std::string_view identifier,
                                               CoordinatorKind kind = CoordinatorKind::Initiating);
  /// The live coordinator, or nullptr.
  std::shared_ptr<InstallCoordinator> live(std::string_view identifier);
  std::shared_ptr<PathTransferPromise> packagePromise(std::string_view identifier);
  /// A placeholder of version "2.0" called "Name of <identifier>", with an icon, but for the word
  /// that it is complete.
  std::shared_ptr<InstallPlaceholder> placeholderOf(std::string_view identifier,
                                                    InstallType type = InstallType::Sync);
  /// The same, complete.
  std::shared_ptr<InstallPlaceholder> completePlaceholder(std::string_view identifier,
                                                          InstallType type = InstallType::Sync);

  /// All that a client does before the package comes.
  std::shared_ptr<InstallCoordinator> prepare(std::string_view identifier, CoordinatorKind kind,
                                              CoordinatorObserver* observer);
  /// The same; `recorder` observes.
  std::shared_ptr<InstallCoordinator> prepare(std::string_view identifier,
                                              CoordinatorKind kind = CoordinatorKind::Initiating) {
    return prepare(identifier, kind, &recorder);
  }
  /// The package comes, version 2.0.
  void deliver(InstallCoordinator& coordinator, std::string_view identifier);
  void deliver(InstallCoordinator& coordinator, const FileLocation& package);
  FileLocation stageApplication(std::string_view identifier, std::string_view version = "2.0");

  /// Until the service has nothing left to do for the application by itself.
  void waitUntilIdle(std::string_view identifier);
  bool launch(std::string_view identifier);
  void quit(std::string_view identifier);
  bool logMentions(std::string_view text);
  /// Runs SQL on the closed device.
  void edit(const std::string& sql);

  const Error reason = Error::withDescription(TWErrorDomain, 30, "given up");
  EventRecorder recorder;
};

}  // namespace appsync::device
