#pragma once

#include <functional>
#include <memory>
#include <stdexcept>

#include "device/apps/app_registry.h"
#include "device/apps/installs.h"
#include "device/apps/removal.h"
#include "device/device_folder.h"
#include "device/journal/log_files.h"
#include "device/schema.h"

namespace appsync::device {

/// The parts of a device on an existing folder, put together as the device itself does, for tests
/// that reach between them.
class DeviceParts {
 public:
  /// Stands between the services and the phone's files.
  using Between = std::function<std::unique_ptr<FileManager>(FileManager& files)>;

  explicit DeviceParts(const std::filesystem::path& folder, const Between& between = {})
      : paths_(folder), between_(between ? between(handles_) : nullptr) {}

  Database& database() { return *database_; }
  DeviceCore& core() { return core_; }
  DeviceAppRegistry& registry() { return registry_; }

 private:
  std::unique_ptr<Database> open() {
    DeviceError problem;
    auto database = openDatabase(paths_.folder, paths_.database, Access::Write, log_, problem);
    if (!database) throw std::runtime_error(problem.message);
    return database;
  }
  FileManager& files() { return between_ ? *between_ : handles_; }

  const DevicePaths paths_;
  LogFiles log_{paths_.log, true};
  const std::unique_ptr<Database> database_ = open();
  ConfinedFileManager handles_{paths_.root};
  const std::unique_ptr<FileManager> between_;
  Containers containers_{files(), handles_, log_};
  RegistryObservers observers_{[this] { return reportInstalls(*database_); }};
  WatcherSlot watcher_;
  Foreground foreground_{paths_.foreground};
  KeyedMutex locks_;
  DeviceCore core_{*database_, files(),  handles_,    containers_, log_,
                   observers_, watcher_, foreground_, locks_};
  DeviceAppRegistry registry_{core_};
};

}  // namespace appsync::device
