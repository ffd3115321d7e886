#pragma once

#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "device/files/file_manager.h"
#include "platform/log.h"
#include "platform/shared_work.h"

namespace appsync::device {

/// Directories of the phone that hold applications, their data, and data that a restore has still
/// to give back. All paths are the phone's. Identifiers must be usable. Thread-safe.
class Containers {
 public:
  /// Each application's data lies here in a folder of its identifier.
  static constexpr std::string_view DataDirectory = "/var/mobile/Containers/Data";

  /// Changes go through `files`, handles come from `handles`; both show the same phone.
  Containers(FileManager& files, ConfinedFileManager& handles, Log& log)
      : files_(files), handles_(handles), log_(log) {}

  static std::string dataPath(std::string_view identifier);
  static std::string waitingDataPath(std::string_view identifier);

  /// Makes an empty container, private until a row of the registry names it.
  [[nodiscard]] std::optional<std::string> make(std::optional<Error>* error);
  /// Removes a container. What cannot be removed is logged, and swept when the device is opened.
  void remove(const std::string& container);
  /// nullopt (with a reason) when they cannot be looked at.
  [[nodiscard]] std::optional<std::vector<std::string>> list(std::optional<Error>* error);

  /// Puts all of the phone's files on disk; installs that end together share it.
  [[nodiscard]] bool flush(std::optional<Error>* error);

  /// Whether a restore left data that is still to be given back to the application; nullopt (with
  /// a reason) when it cannot be looked at.
  [[nodiscard]] std::optional<bool> dataWaits(std::string_view identifier,
                                              std::optional<Error>* error);
  /// Gives the waiting data to the application; what it has is set aside. On failure both are as
  /// they were.
  [[nodiscard]] bool adoptWaitingData(std::string_view identifier, std::optional<Error>* error);
  /// Makes an adoption undone that set data aside: all waits, or is the application's, as before.
  /// Broken off, it is done again. True when there is nothing to undo.
  [[nodiscard]] bool undoAdoption(std::string_view identifier, std::optional<Error>* error);
  /// The name among the applications' data of what was set aside. No application can have it.
  static std::string asideName(std::string_view identifier);
  /// The applications of which data is set aside.
  std::vector<std::string> setAside();
  [[nodiscard]] bool removeWaitingData(std::string_view identifier, std::optional<Error>* error);
  [[nodiscard]] bool makeData(std::string_view identifier, std::optional<Error>* error);
  /// Removes the data directories that have nothing in them, but for those of these applications.
  void removeEmptyData(const std::set<std::string>& besides);
  /// True when the application has no data any more.
  [[nodiscard]] bool removeData(std::string_view identifier, std::optional<Error>* error);

  /// The names in any directory, none of one that is not there; nullopt (with an error) when they
  /// cannot be read.
  [[nodiscard]] std::optional<std::vector<std::string>> namesIn(std::string_view directory,
                                                                std::optional<Error>* error);

 private:
  using Flush = std::optional<Error>;  ///< why it failed

  /// A failure is logged, too.
  [[nodiscard]] bool removeIfThere(const std::string& path, std::optional<Error>* error);
  Flush flushNow();

  FileManager& files_;
  ConfinedFileManager& handles_;
  Log& log_;
  SharedWork<Flush> flushes_{[this](std::span<Flush* const> flushes) {
    const Flush done = flushNow();
    for (Flush* const flush : flushes) *flush = done;
  }};
};

}  // namespace appsync::device
