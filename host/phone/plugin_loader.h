#pragma once

#include <filesystem>
#include <memory>
#include <optional>
#include <string>

#include "platform/platform.h"
#include "platform/sync_client.h"

namespace appsync::host {

/// A loaded plug-in bundle ("Name.syncplugin/" with an Info.plist and a shared object). The code
/// stays loaded until the plug-in and every client made from it are gone.
class Plugin {
 public:
  /// Checks the bundle's description and the interface version of its code before anything else of
  /// it runs. nullptr with one line for people: which bundle, why, what to do.
  [[nodiscard]] static std::unique_ptr<Plugin> load(const std::filesystem::path& bundle,
                                                    std::string& problem);

  /// The bundle's own identifier.
  const std::string& identifier() const { return identifier_; }

  /// Borrows the platform's services until the client is destroyed. nullptr when the plug-in makes
  /// none.
  std::shared_ptr<SyncClient> createClient(const Platform& platform);

 private:
  struct Code;
  explicit Plugin(std::string identifier) : identifier_(std::move(identifier)) {}

  std::string identifier_;
  std::shared_ptr<Code> code_;
};

inline constexpr std::string_view PluginBundleName = "AppsClient.syncplugin";

/// Where the bundle is: `given` if not empty, else beside the running program, else in
/// "../lib/appsync" seen from there. nullopt with one line for people when there is none.
[[nodiscard]] std::optional<std::filesystem::path> findPlugin(const std::filesystem::path& given,
                                                              std::string& problem);

}  // namespace appsync::host
