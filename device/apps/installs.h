#pragma once

#include <memory>
#include <string_view>

#include "device/state/database.h"
#include "device/state/registry_observers.h"
#include "platform/app_registry.h"

namespace appsync::device {

// Installs that are under way. These throw SQLite::Exception and are used within Database's work.

/// Begins an application's install: waiting, loading, nothing done. One that was under way is over.
void beginInstall(Connection& database, std::string_view identifier);
/// False when none was under way.
bool endInstall(Connection& database, std::string_view identifier, InstallState finalState);
/// Whether an install is under way that has neither failed nor been cancelled.
bool isInstalling(Connection& database, std::string_view identifier);

/// The installs under way, by priority: first come, first served.
RegistryObservers::Report reportInstalls(Database& database);

/// The progress of the application's install under way; nullptr when there is none. The objects
/// borrow what they are given for as long as they live.
std::shared_ptr<InstallProgress> currentProgress(Database& database, RegistryObservers& observers,
                                                 std::string_view identifier);

}  // namespace appsync::device
