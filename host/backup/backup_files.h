#pragma once

#include <cstdint>
#include <filesystem>
#include <optional>

#include "base/file_descriptor.h"
#include "host/backup/backup_folder.h"
#include "host/backup/backup_manifest.h"

namespace appsync::host {

// How a backup is read from its folder, whose path must hold no link.

/// A regular file reached through no link. Not valid, with a problem, for anything else.
FileDescriptor openBackupFile(const std::filesystem::path& path, std::uint64_t& size,
                              BackupProblem& problem);
std::optional<BackupManifest> readBackupManifest(const std::filesystem::path& folder,
                                                 BackupProblem& problem);

}  // namespace appsync::host
