#pragma once

#include <functional>
#include <map>

#include "device/coordination/coordination_state.h"
#include "platform/mutex.h"

namespace appsync::device {

/// What the coordination service knows, in the device's database, and every change of it that is
/// asked for: each is one transaction. Thread-safe; no lock is held while it calls out.
class CoordinationStore {
 public:
  /// `carryOut` does what follows from a change, after it.
  CoordinationStore(Database& database, std::function<void(const Consequences&)> carryOut)
      : database_(database), carryOut_(std::move(carryOut)) {}

  /// Runs work in one transaction and then does what follows from it.
  [[nodiscard]] bool change(const std::function<void(Connection&, Consequences&)>& work,
                            std::optional<Error>* error,
                            Database::Commit commit = Database::Commit::Ordinary);
  /// What the work finds; nullopt, with an error, when it fails.
  template <typename LookUp>
  auto lookUp(const LookUp& work, std::optional<Error>* error = nullptr) {
    return database_.lookUp("an install's coordination could not be read", work, error);
  }

  // Changes. False with an error when the object is over, or the change is refused (Refused thrown
  // by `change`) or fails. A promise that is over is left as it is, which is no failure.
  using CoordinatorChange = std::function<void(Connection&, CoordinatorRow&)>;
  using PromiseChange = std::function<void(PromiseRow&)>;
  using PlaceholderChange = std::function<void(Connection&, PlaceholderRow&)>;
  [[nodiscard]] bool changeCoordinator(std::int64_t number, const CoordinatorChange& change,
                                       std::optional<Error>* error);
  [[nodiscard]] bool changePromise(std::int64_t number, const PromiseChange& change,
                                   std::optional<Error>* error);
  [[nodiscard]] bool changePlaceholder(std::int64_t number, const PlaceholderChange& change,
                                       std::optional<Error>* error);

  // A cancelled package promise or placeholder takes its coordinator along. False when it is past
  // cancelling.
  bool cancelCoordinator(std::int64_t number, const Error& reason, CoordinationClientId client);
  bool cancelPromise(std::int64_t number, const Error& reason, CoordinationClientId client);
  bool cancelPlaceholder(std::int64_t number, const Error& reason, CoordinationClientId client);

  // What keeps a live coordinator from going on and could not be written down: an error of the
  // coordinator until its client asks for it anew, or the device is next opened.
  void noteTrouble(std::int64_t coordinator, const Error& error);
  void noteTroubleWithPromise(std::int64_t promise, const Error& error);
  std::optional<Error> trouble(std::int64_t coordinator);

 private:
  Database& database_;
  const std::function<void(const Consequences&)> carryOut_;
  Mutex mutex_;
  std::map<std::int64_t, Error> troubles_ APPSYNC_GUARDED_BY(mutex_);  ///< by coordinator
};

}  // namespace appsync::device
