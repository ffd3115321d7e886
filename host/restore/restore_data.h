#pragma once

#include <optional>
#include <string>

#include "base/interruption.h"
#include "host/backup/backup_folder.h"
#include "host/library/events.h"
#include "host/phone/phone_state.h"
#include "host/restore/restore_list.h"

namespace appsync::host {

/// Why an application did not come back that a restore did not get to.
inline constexpr const char* InterruptedReason = "interrupted; the next restore does it";

/// Whether the application's data on the phone is just this.
bool hasData(const Phone& phone, const std::string& identifier, const BackupFile& file);

/// Gives an installed application this data in the place of its own, in one step. Gives the reason,
/// for people, when its own stays.
std::optional<std::string> overwriteData(const Phone& phone, const BackedUpApplication& app,
                                         const BackupFile& file, Reporter& reporter,
                                         const Interruption& interruption);

/// Lays an application's data out on the phone, where it waits for the application; does nothing
/// when just this waits there already. `file` is nullptr for an application without data. Gives the
/// reason, for people, when the data could not be read from the backup or laid out.
std::optional<std::string> giveBackData(const Phone& phone, const BackedUpApplication& app,
                                        const BackupFile* file, Reporter& reporter,
                                        const Interruption& interruption);

}  // namespace appsync::host
