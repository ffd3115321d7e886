#include "base/confined_directory.h"

#include <fcntl.h>
#include <linux/openat2.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <string>

namespace appsync {

namespace {

constexpr std::uint64_t resolveFlags(Confinement confinement) {
  return confinement == Confinement::Root
             ? RESOLVE_IN_ROOT | RESOLVE_NO_MAGICLINKS
             : RESOLVE_BENEATH | RESOLVE_NO_SYMLINKS | RESOLVE_NO_MAGICLINKS;
}

FileDescriptor openat2(int directory, const char* path, const open_how& how) noexcept {
  // The kernel gives EAGAIN when something on the way was moved while it resolved "..".
  for (int attempt = 0; attempt < 100; ++attempt) {
    const long fd = ::syscall(SYS_openat2, directory, path, &how, sizeof how);
    if (fd >= 0) return FileDescriptor(static_cast<int>(fd));
    if (errno != EAGAIN && errno != EINTR) break;
  }
  return {};
}

}  // namespace

ConfinedDirectory ConfinedDirectory::open(const std::filesystem::path& path,
                                          Confinement confinement) noexcept {
  return {FileDescriptor(::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC)), confinement};
}

FileDescriptor ConfinedDirectory::openAt(std::string_view path, int flags,
                                         mode_t mode) const noexcept {
  if (path.empty() || path.find('\0') != std::string_view::npos) {
    errno = EINVAL;
    return {};
  }
  open_how how{};
  how.flags = static_cast<std::uint64_t>(flags | O_CLOEXEC | (flags & O_PATH ? 0 : O_NOCTTY));
  how.mode = flags & O_CREAT ? mode : 0;
  how.resolve = resolveFlags(confinement_);
  return openat2(directory_.get(), std::string(path).c_str(), how);
}

FileDescriptor ConfinedDirectory::openDirectoryAt(std::string_view path) const noexcept {
  return openAt(path, O_RDONLY | O_DIRECTORY);
}

}  // namespace appsync
