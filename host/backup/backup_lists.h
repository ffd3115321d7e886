#pragma once

#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "device/embedded_device.h"
#include "platform/platform.h"

namespace appsync::host {

/// What a backup needs of a phone. All outlive the backup.
struct BackupPhone {
  Platform services;
  // See EmbeddedDevice.
  std::function<bool(std::string_view bundleId, const device::DataSink& sink,
                     std::optional<Error>* error)>
      saveData;
  std::function<std::optional<Bytes>(std::string_view bundleId)> opaqueBlob;
  std::function<bool(std::string_view bundleId)> isBusyWith;
};

/// Borrows both.
BackupPhone backupPhoneOf(device::EmbeddedDevice& device, SyncHost& host);

/// The applications of the user that are there or to come, sorted by identifier. What a broken-off
/// sync left a placeholder of is neither.
std::vector<AppRecord> applicationsToSave(AppRegistry& registry);

/// What the application is restored from. nullopt, with the reason, when its metadata cannot be
/// read.
std::optional<PropertyList::Dictionary> restoreEntry(const BackupPhone& phone,
                                                     const AppRecord& record, std::string& problem);

/// Which of the applications are to stay placeholders until a person asks for them, by what demoted
/// them.
PropertyList::Dictionary demotionsAmong(FileManager& files,
                                        const std::vector<AppRecord>& applications);

}  // namespace appsync::host
