#pragma once

#include <filesystem>
#include <memory>
#include <string>

#include "base/interruption.h"
#include "client/apps_client.h"
#include "device/embedded_device.h"
#include "host/phone/sync_host.h"

namespace appsync::bench {

/// A folder that is gone with its owner.
class TemporaryFolder {
 public:
  explicit TemporaryFolder(
      const std::filesystem::path& parent = std::filesystem::temp_directory_path());
  ~TemporaryFolder();
  TemporaryFolder(const TemporaryFolder&) = delete;
  TemporaryFolder& operator=(const TemporaryFolder&) = delete;

  const std::filesystem::path& path() const { return path_; }

 private:
  std::filesystem::path path_;
};

/// A new embedded device with a client on it.
class BenchPhone {
 public:
  BenchPhone();

  FileManager& files() { return device_->files(); }
  AppRegistry& registry() { return device_->appRegistry(); }
  Platform& platform() { return platform_; }
  AppsClient& client() { return client_; }

  /// Puts a todo list of so many applications to install into the work area. With bundles, each has
  /// an Info.plist and an icon there too.
  void putTodoList(std::size_t entries, bool withBundles);
  /// Writes the file with its parents.
  void put(const std::string& path, ByteView bytes);

 private:
  TemporaryFolder folder_;
  Interruption interruption_;
  host::HostProcess host_;
  std::unique_ptr<device::EmbeddedDevice> device_;
  Platform platform_;
  AppsClient client_;
};

std::string identifierOf(std::size_t index);

/// A square picture with something on it, as PNG.
Bytes pngOf(std::uint32_t side);

/// How a package is packed; large: one file in place of many of 64 KiB.
enum class PackageForm { Deflate, DeflateLarge, Store, TarZst };
/// A package of so many KiB that compress to about half.
void writePackage(const std::filesystem::path& file, PackageForm form, std::size_t kib);

inline const std::string WorkArea = "/var/mobile/Library/ApplicationSync/HalvoStuff";
inline const std::string TodoList = WorkArea + "/ApplicationsSync.plist";

}  // namespace appsync::bench
