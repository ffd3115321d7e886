#include "platform/plugin.h"

#define EXPORTED __attribute__((visibility("default")))

extern "C" {
EXPORTED std::uint32_t appsync_plugin_interface_version() noexcept {
  return appsync::PluginInterfaceVersion + 1;
}
// Neither may run: the host asks for the version first.
EXPORTED appsync::SyncClient* appsync_plugin_create(const appsync::Platform*) noexcept {
  __builtin_abort();
}
EXPORTED void appsync_plugin_destroy(appsync::SyncClient*) noexcept { __builtin_abort(); }
}
