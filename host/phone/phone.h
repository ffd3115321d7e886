#pragma once

#include <functional>
#include <map>
#include <memory>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "device/embedded_device.h"
#include "platform/app_registry.h"
#include "platform/existence.h"
#include "platform/file_manager.h"
#include "platform/install_coordination.h"
#include "platform/sync_files.h"

namespace appsync::host {

/// What a sync needs of a phone beside the client. All outlive the sync.
struct Phone {
  FileManager& files;
  AppRegistry& apps;
  /// See EmbeddedDevice.
  std::function<std::unique_ptr<device::FileReceiver>(std::string_view path,
                                                      std::optional<Error>* error)>
      receiveFile;
  std::function<std::optional<std::vector<std::string>>(std::string_view directory,
                                                        std::optional<Error>* error)>
      namesIn;
  std::function<void(device::DeviceWatcher*)> setWatcher;
  std::function<void()> hurry;
  std::function<bool(std::string_view bundleId)> isBusyWith;
  std::function<bool(std::string_view bundleId, const DataSink& sink, std::optional<Error>* error)>
      saveData;
  std::function<std::vector<std::string>(CoordinationClientId client)> packagesOwedBy;
  /// nullptr when installs are not driven through coordinators.
  InstallCoordination* coordination = nullptr;
};

/// Borrows the device.
Phone phoneOf(device::EmbeddedDevice& device);

/// What a restore needs of a phone beside that. See EmbeddedDevice.
struct RestorePhone : Phone {
  HomeScreenService& homeScreen;
  std::function<bool(std::string_view bundleId, const DataSource& source,
                     std::optional<Error>* error)>
      restoreData;
  std::function<bool(std::string_view bundleId, const DataSource& source,
                     std::optional<Error>* error)>
      overwriteData;
};

/// Borrows the device.
RestorePhone restorePhoneOf(device::EmbeddedDevice& device);

/// The dictionary in a file of the phone, empty when the file is missing or holds none; nullopt
/// (with an error) when it cannot be read.
std::optional<PropertyList::Dictionary> readDictionary(FileManager& files, std::string_view path,
                                                       std::optional<Error>* error);

/// Whether an application that has only a placeholder has data of its own, which it made before it
/// lost its package and which is worth more than a backup's; nullopt (with an error) when that
/// cannot be told.
std::optional<bool> ownsData(const Phone& phone, const std::string& identifier,
                             std::optional<Error>* error);

/// Waits until the phone has nothing left to do for these applications by itself.
void waitUntilIdle(const Phone& phone, const std::set<std::string>& identifiers);

/// The applications that the registry knows.
struct ApplicationsPresent {
  std::set<std::string, std::less<>> installed;
  std::map<std::string, AppRecord, std::less<>> placeholders;
};
/// nullopt (with an error) when the registry cannot be read.
std::optional<ApplicationsPresent> applicationsPresent(AppRegistry& registry,
                                                       std::optional<Error>* error);

/// "<what>: <the error's description>", or only what, for people.
std::string withReason(std::string_view what, const std::optional<Error>& error);

inline constexpr std::string_view CannotTellApplications =
    "the phone's applications cannot be told";

/// Shows the store's downloads but `except` as under way, which they are once a person has asked
/// for them: the client asks the host for the package of every other placeholder, and takes it away
/// when the host has none. False (with an error) when the registry cannot be read.
bool claimDownloads(AppRegistry& apps, const std::set<std::string>& except,
                    std::optional<Error>* error);

/// What an entry of the todo list says of an application.
struct TodoState {
  std::string identifier;
  std::string operation;
};

/// The todo list in a directory of the phone, empty when there is none; nullopt (with an error)
/// when it cannot be read.
std::optional<std::vector<TodoState>> readTodoList(FileManager& files, std::string_view directory,
                                                   std::optional<Error>* error = nullptr);

}  // namespace appsync::host
