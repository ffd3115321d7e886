#pragma once

#include <sys/types.h>

#include <filesystem>
#include <string_view>

#include "base/file_descriptor.h"

namespace appsync {

/// How names are resolved below a directory. Neither way ever leads out of it, also while others
/// move and link things about, and links of /proc that jump to open files are never followed.
enum class Confinement {
  /// The directory is "/": absolute links and ".." are followed and end there.
  Root,
  /// Only plain names downwards; a symbolic link anywhere on the way is refused (ELOOP).
  Beneath,
};

/// A directory as the place from which names are resolved. Const calls may come from any thread.
class ConfinedDirectory {
 public:
  /// A directory of this machine. The result is not open (errno says why) when that cannot be.
  static ConfinedDirectory open(const std::filesystem::path& path,
                                Confinement confinement) noexcept;

  /// `directory` is an open directory, or not valid for a directory that is not open.
  ConfinedDirectory(FileDescriptor directory, Confinement confinement) noexcept
      : directory_(std::move(directory)), confinement_(confinement) {}

  bool isOpen() const noexcept { return static_cast<bool>(directory_); }
  int fd() const noexcept { return directory_.get(); }

  /// Opens what `path` names; close-on-exec and never the controlling terminal. `mode` counts only
  /// where `flags` may make a file. Not valid, with errno set, on failure; EINVAL for a path that
  /// is empty or holds a NUL byte.
  FileDescriptor openAt(std::string_view path, int flags, mode_t mode = 0) const noexcept;
  /// Opens a directory, readable and fit for syncToDisk.
  FileDescriptor openDirectoryAt(std::string_view path) const noexcept;

 private:
  FileDescriptor directory_;
  Confinement confinement_;
};

}  // namespace appsync
