#pragma once

#include <filesystem>
#include <map>
#include <optional>
#include <string>
#include <vector>

#include "packages/package_facts.h"

namespace appsync::host {

/// The packages of a folder. Files whose names begin with "." are passed over, subfolders too.
struct Library {
  std::filesystem::path folder;
  /// By identifier; of several packages of one application the one of the highest version, of
  /// several of that the first that is not damaged.
  std::map<std::string, PackageFacts, std::less<>> packages;
  std::vector<UnreadablePackage> unreadable;  ///< in the order of their names

  const PackageFacts* find(std::string_view identifier) const;
};

/// nullopt, with one line for people, when the folder itself cannot be read.
[[nodiscard]] std::optional<Library> readLibrary(const std::filesystem::path& folder,
                                                 std::string& problem);

}  // namespace appsync::host
