#include "base/file_descriptor.h"

#include <unistd.h>

#include <cerrno>

namespace appsync {

namespace {

/// Hands `bytes` over piece by piece to `put`, which takes (piece, bytes handed over before).
template <typename Put>
bool putAll(ByteView bytes, Put put) noexcept {
  std::size_t done = 0;
  while (done < bytes.size()) {
    const ssize_t count = put(bytes.subspan(done), done);
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return false;
    done += static_cast<std::size_t>(count);
  }
  return true;
}

}  // namespace

void FileDescriptor::reset(int fd) noexcept {
  if (fd_ >= 0) {
    const int saved = errno;
    ::close(fd_);
    errno = saved;
  }
  fd_ = fd;
}

std::int64_t readSome(int fd, std::span<std::byte> bytes) noexcept {
  while (true) {
    const ssize_t count = ::read(fd, bytes.data(), bytes.size());
    if (count >= 0 || errno != EINTR) return count;
  }
}

std::int64_t readAt(int fd, std::span<std::byte> bytes, std::uint64_t offset) noexcept {
  std::size_t done = 0;
  while (done < bytes.size()) {
    const ssize_t count =
        ::pread(fd, bytes.data() + done, bytes.size() - done, static_cast<off_t>(offset + done));
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return -1;
    if (count == 0) break;
    done += static_cast<std::size_t>(count);
  }
  return static_cast<std::int64_t>(done);
}

bool writeAll(int fd, ByteView bytes) noexcept {
  return putAll(
      bytes, [fd](ByteView piece, std::size_t) { return ::write(fd, piece.data(), piece.size()); });
}

bool writeAllAt(int fd, ByteView bytes, std::uint64_t offset) noexcept {
  return putAll(bytes, [fd, offset](ByteView piece, std::size_t done) {
    return ::pwrite(fd, piece.data(), piece.size(), static_cast<off_t>(offset + done));
  });
}

bool syncToDisk(int fd) noexcept { return ::fsync(fd) == 0; }

bool syncFileSystem(int fd) noexcept { return ::syncfs(fd) == 0; }

}  // namespace appsync
