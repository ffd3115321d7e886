#pragma once

#include <functional>
#include <memory>
#include <string_view>

#include "device/embedded_device.h"
#include "platform/app_registry.h"
#include "platform/file_manager.h"
#include "platform/install_coordination.h"

namespace appsync::host {

/// What a sync needs of a phone beside the client. All outlive the sync.
struct Phone {
  FileManager& files;
  AppRegistry& apps;
  /// See EmbeddedDevice.
  std::function<std::unique_ptr<device::FileReceiver>(std::string_view path,
                                                      std::optional<Error>* error)>
      receiveFile;
  std::function<void(device::DeviceWatcher*)> setWatcher;
  std::function<void()> hurry;
  std::function<bool(std::string_view bundleId)> isBusyWith;
  /// nullptr when installs are not driven through coordinators.
  InstallCoordination* coordination = nullptr;
};

/// Borrows the device.
Phone phoneOf(device::EmbeddedDevice& device);

// Where host and client exchange files on the phone.
namespace exchange {
inline constexpr std::string_view StagingRoot = "/var/mobile/Media/PublicStaging";
inline constexpr std::string_view StagingArea = "/var/mobile/Media/PublicStaging/ApplicationSync";
inline constexpr std::string_view SyncRoot = "/var/mobile/Library/ApplicationSync";
inline constexpr std::string_view WorkArea = "/var/mobile/Library/ApplicationSync/HalvoStuff";
inline constexpr std::string_view LastSyncState =
    "/var/mobile/Library/ApplicationSync/LastSyncAppState.plist";
inline constexpr std::string_view RestoreState =
    "/var/mobile/Library/ApplicationSync/RestoreState.plist";
inline constexpr std::string_view TodoName = "ApplicationsSync.plist";
inline constexpr std::string_view IconLayoutName = "DashelIconState.plist";
}  // namespace exchange

/// One entry of the todo list that the desktop gives the phone.
struct TodoEntry {
  std::string identifier;
  std::string operation;
};

/// The todo list in a directory of the phone; empty when there is none that can be read.
std::vector<TodoEntry> readTodoList(FileManager& files, std::string_view directory);

}  // namespace appsync::host
