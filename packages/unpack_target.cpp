#include "packages/unpack_target.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

namespace appsync {

UnpackTarget::UnpackTarget(int targetDirectory)
    : target_(FileDescriptor(::fcntl(targetDirectory, F_DUPFD_CLOEXEC, 0)), Confinement::Beneath) {}

bool UnpackTarget::makeDirectory(std::string_view path) {
  return static_cast<bool>(openOrMake(path));
}

FileDescriptor UnpackTarget::openOrMake(std::string_view path) {
  FileDescriptor directory = target_.openDirectoryAt(path);
  if (directory || errno != ENOENT) return directory;
  const std::size_t slash = path.rfind('/');
  const FileDescriptor parent = slash == std::string_view::npos ? target_.openDirectoryAt(".")
                                                                : openOrMake(path.substr(0, slash));
  const std::string name(path.substr(slash + 1));
  if (!parent || (::mkdirat(parent.get(), name.c_str(), 0755) != 0 && errno != EEXIST)) return {};
  return target_.openDirectoryAt(path);
}

FileDescriptor UnpackTarget::createFile(std::string_view path, bool executable) {
  const std::size_t slash = path.rfind('/');
  const std::string_view parent = slash == std::string_view::npos ? "." : path.substr(0, slash);
  if (!current_ || currentPath_ != parent) {
    current_ = openOrMake(parent);
    if (!current_) return {};
    currentPath_ = parent;
  }
  // The folder's handle leads nowhere else; a plain name in it that must be new passes no link.
  return FileDescriptor(::openat(current_.get(), std::string(path.substr(slash + 1)).c_str(),
                                 O_RDWR | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC,
                                 executable ? 0755 : 0644));
}

FileDescriptor UnpackTarget::openFile(std::string_view path) const {
  return target_.openAt(path, O_RDONLY | O_NONBLOCK);
}

bool makeExecutable(int fd) noexcept {
  struct stat status {};
  if (::fstat(fd, &status) != 0) return false;
  return ::fchmod(fd, (status.st_mode & 0777) | (status.st_mode & 0444) >> 2) == 0;
}

}  // namespace appsync
