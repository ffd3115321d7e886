#pragma once

#include <map>
#include <mutex>
#include <string>

#include "device/coordination/coordination_state.h"

namespace appsync::device {

class CoordinationCore;

/// Does what the service does by itself: installs placeholders and packages, and takes away what
/// was given up. Each operation is called by one worker of the application at a time.
class CoordinatedInstalls {
 public:
  explicit CoordinatedInstalls(CoordinationCore& core) : core_(core) {}

  /// Goes on with the application's live coordinator as far as it can.
  void advance(const std::string& identifier);
  /// Removes what coordinators that are over leave behind: their package and, if they failed or
  /// were cancelled, their placeholder.
  void tidyUp(const std::string& identifier);

  /// Installs that wait for an application to leave the foreground fail from now on.
  void hurry();
  /// Nothing more is begun.
  void leaveWaiting();

 private:
  // False when there is nothing more to be done now.
  bool installPlaceholder(const CoordinatorState& state);
  bool installPackage(const CoordinatorState& state);
  bool completeDemoted(const CoordinatorState& state);

  /// Builds the bundle of a placeholder in a directory of its own.
  bool buildBundle(const CoordinatorState& state, const std::string& bundle,
                   std::optional<Error>* error);
  void copyIcon(const CoordinatorState& state, const std::string& bundle);
  bool installBundle(const CoordinatorState& state, const std::string& bundle,
                     std::optional<Error>* error);
  enum class Beginning { Made, NotReady, Failed };
  /// Marks the package as being installed, unless the coordinator is not ready any more.
  Beginning begin(const CoordinatorState& state);
  /// Gives the placeholder what the options say of the package that takes its place.
  bool adoptOptions(const CoordinatorState& state, std::optional<Error>* error);
  void finish(const CoordinatorState& state, const std::optional<Error>& error);
  void removePlaceholder(const std::string& identifier);

  /// Comes back later; an error when that is not to be.
  std::optional<Error> waitForForeground(const std::string& identifier);
  bool isLeaving();

  CoordinationCore& core_;
  std::mutex mutex_;
  // Guarded by mutex_.
  std::map<std::string, bool> waiting_;  ///< for the foreground, and whether the next look is due
  bool hurried_ = false;
  bool leaving_ = false;
};

/// Where placeholder bundles are built.
inline constexpr std::string_view PlaceholderBundles = "/var/mobile/Library/InstallCoordination";

}  // namespace appsync::device
