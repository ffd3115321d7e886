#include "tests/device/failing_calls.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstdarg>
#include <cstdio>

namespace {

thread_local bool counting = false;
thread_local int callsLeft = 0;

bool fails(int reason) {
  if (!counting || callsLeft-- != 0) return false;
  errno = reason;
  return true;
}

mode_t modeIn(int flags, va_list arguments) {
  return flags & (O_CREAT | O_TMPFILE) ? va_arg(arguments, mode_t) : 0;
}

}  // namespace

// The linker gives the device these in the place of the system's (see CMakeLists.txt).

// NOLINTBEGIN(bugprone-reserved-identifier)
extern "C" {

int __real_open(const char* path, int flags, ...);
int __real_openat(int directory, const char* path, int flags, ...);
long __real_syscall(long number, ...);
DIR* __real_fdopendir(int fd);

int __wrap_open(const char* path, int flags, ...) {
  va_list arguments;
  va_start(arguments, flags);
  const mode_t mode = modeIn(flags, arguments);
  va_end(arguments);
  return fails(EMFILE) ? -1 : __real_open(path, flags, mode);
}

int __wrap_openat(int directory, const char* path, int flags, ...) {
  va_list arguments;
  va_start(arguments, flags);
  const mode_t mode = modeIn(flags, arguments);
  va_end(arguments);
  return fails(EMFILE) ? -1 : __real_openat(directory, path, flags, mode);
}

/// The device makes only one call in this way: openat2. Waiting threads make others, with fewer
/// arguments than are handed on here, which the address sanitizer must not take for a fault.
__attribute__((no_sanitize("address"))) long __wrap_syscall(long number, ...) {
  std::array<long, 6> values;
  va_list arguments;
  va_start(arguments, number);
  for (long& value : values) value = va_arg(arguments, long);
  va_end(arguments);
  if (number == SYS_openat2 && fails(EMFILE)) return -1;
  return __real_syscall(number, values[0], values[1], values[2], values[3], values[4], values[5]);
}

DIR* __wrap_fdopendir(int fd) { return fails(EMFILE) ? nullptr : __real_fdopendir(fd); }

#define FAILING_CALL(type, failure, name, parameters, arguments) \
  type __real_##name parameters;                                 \
  type __wrap_##name parameters { return fails(EIO) ? failure : __real_##name arguments; }

FAILING_CALL(dirent*, nullptr, readdir, (DIR * stream), (stream))
FAILING_CALL(int, -1, fstat, (int fd, struct stat* status), (fd, status))
FAILING_CALL(int, -1, fstatat, (int fd, const char* path, struct stat* status, int flags),
             (fd, path, status, flags))
FAILING_CALL(int, -1, mkdirat, (int fd, const char* path, mode_t mode), (fd, path, mode))
FAILING_CALL(int, -1, unlinkat, (int fd, const char* path, int flags), (fd, path, flags))
FAILING_CALL(int, -1, renameat, (int fd, const char* path, int to, const char* target),
             (fd, path, to, target))
FAILING_CALL(int, -1, renameat2, (int fd, const char* path, int to, const char* target, unsigned f),
             (fd, path, to, target, f))
FAILING_CALL(ssize_t, -1, read, (int fd, void* bytes, std::size_t size), (fd, bytes, size))
FAILING_CALL(ssize_t, -1, pread, (int fd, void* bytes, std::size_t size, off_t offset),
             (fd, bytes, size, offset))
FAILING_CALL(ssize_t, -1, write, (int fd, const void* bytes, std::size_t size), (fd, bytes, size))
FAILING_CALL(ssize_t, -1, pwrite, (int fd, const void* bytes, std::size_t size, off_t offset),
             (fd, bytes, size, offset))
FAILING_CALL(int, -1, fsync, (int fd), (fd))
FAILING_CALL(int, -1, syncfs, (int fd), (fd))

#undef FAILING_CALL

}  // extern "C"
// NOLINTEND(bugprone-reserved-identifier)

namespace appsync::device {

FailingCalls::FailingCalls(int number) {
  callsLeft = number;
  counting = true;
}

FailingCalls::~FailingCalls() { counting = false; }

bool FailingCalls::struck() const { return callsLeft < 0; }

}  // namespace appsync::device
