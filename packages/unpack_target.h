#pragma once

#include <cstdint>
#include <string>
#include <string_view>

#include "base/confined_directory.h"

namespace appsync {

/// Makes files and folders below a directory, each relative to a handle, through no link and never
/// in the place of anything that stands there. Used by one thread.
class UnpackTarget {
 public:
  /// Borrows an open directory.
  explicit UnpackTarget(int targetDirectory);

  // False, or not valid, with errno set. Missing parents are made.

  /// A folder that stands already counts as made.
  [[nodiscard]] bool makeDirectory(std::string_view path);
  /// A new file, for reading and writing.
  FileDescriptor createFile(std::string_view path, bool executable);
  /// An existing file, for reading.
  FileDescriptor openFile(std::string_view path) const;

 private:
  FileDescriptor openOrMake(std::string_view path);

  ConfinedDirectory target_;
  std::string currentPath_;  ///< folder of the file made last
  FileDescriptor current_;
};

/// Lets everybody who may read the file run it.
[[nodiscard]] bool makeExecutable(int fd) noexcept;

}  // namespace appsync
