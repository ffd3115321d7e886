#pragma once

#include <cstdint>

#include "platform/platform.h"
#include "platform/sync_client.h"

/// What a plug-in bundle's shared object exports. Host and plug-in are built by the same compiler;
/// the version says which headers of platform/ the plug-in was built against, and a host loads only
/// its own.
extern "C" {

/// Callable before anything else.
std::uint32_t appsync_plugin_interface_version() noexcept;

/// Makes the client. Borrows the services until appsync_plugin_destroy. A completion that a service
/// has not called by then may be called later; it uses the log and the transaction log only, which
/// stay until then, like this library. nullptr on failure.
appsync::SyncClient* appsync_plugin_create(const appsync::Platform* platform) noexcept;

/// Destroys a client made here; nullptr is passed over.
void appsync_plugin_destroy(appsync::SyncClient* client) noexcept;
}

namespace appsync {

inline constexpr std::uint32_t PluginInterfaceVersion = 1;

// Names of the entry points for a loader.
inline constexpr const char* PluginInterfaceVersionSymbol = "appsync_plugin_interface_version";
inline constexpr const char* PluginCreateSymbol = "appsync_plugin_create";
inline constexpr const char* PluginDestroySymbol = "appsync_plugin_destroy";

/// Key of a plug-in bundle's Info.plist: the interface version it was built against (number).
inline constexpr std::string_view PluginInterfaceVersionKey = "PluginInterfaceVersion";

}  // namespace appsync
