#pragma once

#include <optional>
#include <string>

#include "platform/file_manager.h"

namespace appsync {

// A received package is installed and then deleted, so that not any path will do.

/// Whether a package may be taken from `path`: it lies where packages arrive and is no folder, as
/// far as can be seen now.
bool isPackagePath(FileManager& files, const std::optional<std::string>& path);

/// Removes a package whose install is over. What lies elsewhere stays, and so does what is not seen
/// to be a file.
void removePackage(FileManager& files, const std::optional<std::string>& path);

}  // namespace appsync
