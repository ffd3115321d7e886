#pragma once

#include "device/files/containers.h"
#include "device/state/database.h"
#include "device/state/foreground.h"
#include "device/state/keyed_mutex.h"
#include "device/state/registry_observers.h"
#include "device/state/watcher_slot.h"

namespace appsync::device {

/// What the device's services share; all of it outlives them.
struct DeviceCore {
  Database& database;
  FileManager& files;            ///< every change of the phone's files goes through it
  ConfinedFileManager& handles;  ///< opens files of the same phone
  Containers& containers;
  Log& log;
  RegistryObservers& observers;
  WatcherSlot& watcher;
  Foreground& foreground;
  KeyedMutex& applicationLocks;  ///< held by what installs or removes an application
};

}  // namespace appsync::device
