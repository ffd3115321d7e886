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
  std::function<std::vector<AppRecord>(std::optional<Error>* error)> applications;
  std::function<bool(std::string_view bundleId, const DataSink& sink, std::optional<Error>* error)>
      saveData;
  std::function<std::optional<Bytes>(std::string_view bundleId, std::optional<Error>* error)>
      opaqueBlob;
  std::function<bool(std::string_view bundleId)> isBusyWith;
};

/// Borrows both.
BackupPhone backupPhoneOf(device::EmbeddedDevice& device, SyncHost& host);

/// The applications of the user that are there or to come, sorted by identifier. What a broken-off
/// sync left a placeholder of is neither. Empty, with an error, when they cannot be told.
std::vector<AppRecord> applicationsToSave(const BackupPhone& phone, std::optional<Error>* error);

/// What the application is restored from. nullopt, with the reason, when any of it cannot be read.
std::optional<PropertyList::Dictionary> restoreEntry(const BackupPhone& phone,
                                                     const AppRecord& record, std::string& problem);

/// Which of the applications are to stay placeholders until a person asks for them, by what demoted
/// them. nullopt, with an error, when that cannot be read.
std::optional<PropertyList::Dictionary> demotionsAmong(FileManager& files,
                                                       const std::vector<AppRecord>& applications,
                                                       std::optional<Error>* error);

}  // namespace appsync::host
