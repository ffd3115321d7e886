#pragma once

#include <optional>
#include <set>
#include <string>

#include "host/library/library.h"
#include "host/library/sync_plan.h"
#include "host/phone/phone_state.h"

namespace appsync::host {

/// Puts into the phone's staging area what the client takes over: the todo list, each application's
/// description, icon and metadata, and the icon layout; nothing of what the host brings by itself.
/// Whatever stood there before is gone. False with an error when the phone refuses.
[[nodiscard]] bool stage(FileManager& files, const SyncPlan& plan, const Library& library,
                         const std::optional<Bytes>& iconLayout, std::optional<Error>* error);

/// The name under which a package is sent: the identifier and the ending of the library's file.
std::string stagedPackageName(const PackageFacts& package);

/// The applications whose packages a sync or restore may have sent: those that the phone, a todo
/// list or the restore state names. What is named like a package of any other is somebody's own
/// file.
std::set<std::string> everSent(const Phone& phone);

/// Removes packages of these applications that broken-off syncs and restores left where packages
/// arrive, but none that the restore state remembers or that an install coordinator may still want.
void removeLeftOverPackages(const Phone& phone, const std::set<std::string>& sent);

}  // namespace appsync::host
