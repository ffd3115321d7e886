#include "platform/plugin.h"

#include "client/apps_client.h"

#define APPSYNC_EXPORT __attribute__((visibility("default")))

extern "C" {

APPSYNC_EXPORT std::uint32_t appsync_plugin_interface_version() noexcept {
  return appsync::PluginInterfaceVersion;
}

APPSYNC_EXPORT appsync::SyncClient* appsync_plugin_create(
    const appsync::Platform* platform) noexcept {
  if (!platform) return nullptr;
  try {
    return new appsync::AppsClient(*platform);
  } catch (...) {
    return nullptr;
  }
}

APPSYNC_EXPORT void appsync_plugin_destroy(appsync::SyncClient* client) noexcept { delete client; }
}
