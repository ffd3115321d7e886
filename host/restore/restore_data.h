#pragma once

#include <optional>
#include <string>

#include "host/backup/backup_folder.h"
#include "host/base/interruption.h"
#include "host/library/events.h"
#include "host/phone/phone.h"
#include "host/restore/restore_list.h"

namespace appsync::host {

/// Why an application did not come back that a restore did not get to.
inline constexpr const char* InterruptedReason = "interrupted; the next restore does it";

/// Whether an application that has only a placeholder has data of its own, which it made before it
/// lost its package and which is worth more than a backup's.
bool ownsData(const RestorePhone& phone, const std::string& identifier);

/// Lays an application's data out on the phone, where it waits for the application; does nothing
/// when just this waits there already. `file` is nullptr for an application without data. Gives the
/// reason, for people, when the data could not be read from the backup or laid out.
std::optional<std::string> giveBackData(const RestorePhone& phone, const BackedUpApplication& app,
                                        const BackupFile* file, Reporter& reporter,
                                        const Interruption& interruption);

}  // namespace appsync::host
