#include "host/phone/plugin_loader.h"

#include <dlfcn.h>
#include <fmt/format.h>

#include <fstream>
#include <iterator>
#include <system_error>

#include "base/program_parts.h"
#include "base/text.h"
#include "platform/bundle.h"
#include "platform/plugin.h"
#include "platform/property_list_codec.h"

namespace appsync::host {
namespace fs = std::filesystem;
namespace {

struct BundleDescription {
  std::string identifier;
  fs::path executable;  ///< absolute
};

std::optional<PropertyList::Dictionary> readInfo(const fs::path& bundle) {
  std::ifstream file(bundle / "Info.plist", std::ios::binary);
  const std::string text{std::istreambuf_iterator<char>(file), {}};
  return file ? parseDictionary(asBytes(text)) : std::nullopt;
}

std::string otherVersion(std::uint64_t version) {
  return fmt::format(
      "it was built for interface version {}, this program needs {}; install the "
      "plug-in that came with appsync",
      version, PluginInterfaceVersion);
}

std::optional<BundleDescription> describe(const fs::path& bundle, std::string& reason) {
  std::error_code error;
  const fs::path absolute = fs::canonical(bundle, error);
  if (error || !fs::is_directory(absolute, error)) {
    reason = "there is no such folder; give the right one with --plugin";
    return std::nullopt;
  }
  const auto info = readInfo(absolute);
  if (!info) {
    reason = "it has no readable Info.plist, so it is no plug-in";
    return std::nullopt;
  }
  const std::string* identifier = findString(*info, KBBundleIdentifier);
  const std::string* executable = findString(*info, KBBundleExecutable);
  const PropertyList* version = find(*info, PluginInterfaceVersionKey);
  if (!identifier || identifier->empty() || !executable || executable->empty() || !version ||
      !version->asUnsigned()) {
    reason = "its Info.plist does not describe a sync plug-in";
    return std::nullopt;
  }
  if (*version->asUnsigned() != PluginInterfaceVersion) {
    reason = otherVersion(*version->asUnsigned());
    return std::nullopt;
  }
  const fs::path name = *executable;
  if (name != name.filename() || name == "." || name == "..") {
    reason = "its Info.plist names an executable outside the bundle";
    return std::nullopt;
  }
  return BundleDescription{*identifier, absolute / name};
}

}  // namespace

/// The shared object with its entry points.
struct Plugin::Code {
  void* handle = nullptr;
  decltype(&appsync_plugin_interface_version) interfaceVersion = nullptr;
  decltype(&appsync_plugin_create) create = nullptr;
  decltype(&appsync_plugin_destroy) destroy = nullptr;

  Code() = default;
  Code(const Code&) = delete;
  Code& operator=(const Code&) = delete;
  ~Code() {
    if (handle) ::dlclose(handle);
  }

  template <typename Function>
  bool find(const char* symbol, Function& function) {
    function = reinterpret_cast<Function>(::dlsym(handle, symbol));
    return function != nullptr;
  }

  bool load(const fs::path& file, std::string& reason) {
    handle = ::dlopen(file.c_str(), RTLD_NOW | RTLD_LOCAL);
    if (!handle) {
      const char* text = ::dlerror();
      reason = fmt::format("its code cannot be loaded: {}", printable(text ? text : "?"));
      return false;
    }
    if (!find(PluginInterfaceVersionSymbol, interfaceVersion) ||
        !find(PluginCreateSymbol, create) || !find(PluginDestroySymbol, destroy)) {
      reason = "its code has no plug-in entry points";
      return false;
    }
    if (const std::uint32_t version = interfaceVersion(); version != PluginInterfaceVersion) {
      reason = otherVersion(version);
      return false;
    }
    return true;
  }
};

std::unique_ptr<Plugin> Plugin::load(const fs::path& bundle, std::string& problem) {
  std::string reason;
  const auto code = std::make_shared<Code>();
  const auto description = describe(bundle, reason);
  if (!description || !code->load(description->executable, reason)) {
    problem = fmt::format("cannot use the plug-in {}: {}", printable(bundle.string()), reason);
    return nullptr;
  }
  std::unique_ptr<Plugin> plugin(new Plugin(description->identifier));
  plugin->code_ = code;
  return plugin;
}

std::shared_ptr<SyncClient> Plugin::createClient(const Platform& platform) {
  // The plug-in may keep the pointer it is given, so the client's owner keeps a copy alive.
  const auto services = std::make_shared<const Platform>(platform);
  SyncClient* client = code_->create(services.get());
  if (!client) return nullptr;
  return {client, [code = code_, services](SyncClient* made) { code->destroy(made); }};
}

std::optional<fs::path> findPlugin(const fs::path& given, std::string& problem) {
  if (!given.empty()) return given;
  if (auto found = findProgramPart(PluginBundleName)) return found;
  const std::vector<fs::path> folders = programPartFolders();
  problem =
      fmt::format("there is no {} in {} or {}; say where it is with --plugin or APPSYNC_PLUGIN",
                  PluginBundleName, printable(folders[0].string()), printable(folders[1].string()));
  return std::nullopt;
}

}  // namespace appsync::host
