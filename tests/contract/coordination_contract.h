#pragma once

#include "tests/contract/phone.h"
#include "tests/fakes/event_recorder.h"

namespace appsync::contract {

using fakes::EventRecorder;
using Events = EventRecorder::Events;

/// A phone whose installs are coordinated, and a client of its coordination service.
class CoordinationContract : public ServiceContract {
 protected:
  CoordinationContract() : ServiceContract(PhoneOptions{.coordination = true}) {}

  std::shared_ptr<InstallCoordinator> make(std::string_view identifier,
                                           CoordinatorKind kind = CoordinatorKind::Initiating,
                                           CoordinationClientId client = SyncHostClientID);
  /// The live coordinator, or nullptr.
  std::shared_ptr<InstallCoordinator> live(std::string_view identifier);
  std::shared_ptr<PathTransferPromise> packagePromise(std::string_view identifier);
  std::shared_ptr<PathTransferPromise> iconPromise(std::string_view identifier);
  /// One that nobody has configured yet.
  std::shared_ptr<InstallPlaceholder> barePlaceholder(std::string_view identifier);
  /// One of version 2.0 that can be handed over.
  std::shared_ptr<InstallPlaceholder> placeholder(std::string_view identifier);

  /// All that a client does before the package comes.
  std::shared_ptr<InstallCoordinator> prepare(std::string_view identifier, CoordinatorKind kind,
                                              CoordinatorObserver* observer);
  /// The same; `recorder` observes.
  std::shared_ptr<InstallCoordinator> prepare(std::string_view identifier,
                                              CoordinatorKind kind = CoordinatorKind::Initiating) {
    return prepare(identifier, kind, &recorder);
  }
  /// A package of version 2.0 comes, of the application `content`, and all is done that follows.
  void deliver(InstallCoordinator& coordinator, std::string_view content);

  /// The version of the installed application; "none" without one.
  std::string version(std::string_view identifier);
  bool hasPlaceholder(std::string_view identifier);

  InstallCoordination& coordination = platform.installCoordination;
  const Error reason = Error::withDescription(TWErrorDomain, 30, "given up");
  EventRecorder recorder;
};

}  // namespace appsync::contract
