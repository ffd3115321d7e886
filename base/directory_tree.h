#pragma once

#include <string>
#include <vector>

namespace appsync {

/// The names in an open directory, in any order. False with errno set.
[[nodiscard]] bool listNames(int directory, std::vector<std::string>& names);

// Both work on handles all the way, so that nothing moved or linked about meanwhile leads them out
// of the tree, and follow no link. False with errno set; ENAMETOOLONG for a tree nested deeper than
// 500 directories.

/// Removes the item `name` of `directory` with all in it.
[[nodiscard]] bool removeTree(int directory, const std::string& name) noexcept;

/// Copies files, directories and links; keeps modes. EINVAL for an item of another kind and for a
/// copy into itself, EEXIST when the target exists. The target appears in one step.
[[nodiscard]] bool copyTree(int fromDirectory, const std::string& from, int toDirectory,
                            const std::string& to) noexcept;

enum class Reach { Here, AllBelow };

/// Removes every item with a temporary name from the directory, or from it and all below it, as far
/// as that can be done.
void removeTemporaryFiles(int directory, Reach reach) noexcept;

}  // namespace appsync
