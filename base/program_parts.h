#pragma once

#include <filesystem>
#include <optional>
#include <string_view>
#include <vector>

namespace appsync {

/// Folders in which parts of the running program that are loaded may be: its own, and
/// "../lib/appsync" seen from there.
std::vector<std::filesystem::path> programPartFolders();

/// The part of this name that is found first.
std::optional<std::filesystem::path> findProgramPart(std::string_view name);

}  // namespace appsync
