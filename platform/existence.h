#pragma once

#include <optional>
#include <string_view>

#include "platform/file_manager.h"

namespace appsync {

// What cannot be looked at is not missing: whoever removes, replaces or leaves out what is "not
// there" must know that it is not.

/// Whether an operation failed because the item is not there. Any other reason, or none, leaves
/// that open.
bool isMissing(const std::optional<Error>& reason);

/// nullopt (with a reason) when the item cannot be looked at.
[[nodiscard]] std::optional<bool> isThere(FileManager& files, std::string_view path,
                                          std::optional<Error>* error);

/// The whole file, none when it is not there. False (with a reason) when it cannot be read.
[[nodiscard]] bool readIfThere(FileManager& files, std::string_view path,
                               std::optional<Bytes>& contents, std::optional<Error>* error);

/// The dictionary in a file, empty when the file is missing or holds none. nullopt (with a reason)
/// when it cannot be read.
[[nodiscard]] std::optional<PropertyList::Dictionary> readDictionary(FileManager& files,
                                                                     std::string_view path,
                                                                     std::optional<Error>* error);

/// Whether the executable that a bundle's information names is in it; true when it names none.
/// nullopt (with a reason) when that cannot be told.
[[nodiscard]] std::optional<bool> isExecutableThere(FileManager& files, std::string_view bundlePath,
                                                    std::optional<Error>* error);

/// Whether anything but a directory is there; false also when that cannot be told.
bool isFile(FileManager& files, std::string_view path);

}  // namespace appsync
