#pragma once

#include <cstdint>
#include <span>
#include <utility>

#include "platform/bytes.h"

namespace appsync {

/// Owns an open descriptor and closes it. Not valid: -1.
class [[nodiscard]] FileDescriptor {
 public:
  FileDescriptor() noexcept = default;
  explicit FileDescriptor(int fd) noexcept : fd_(fd) {}
  FileDescriptor(FileDescriptor&& other) noexcept : fd_(other.release()) {}
  FileDescriptor& operator=(FileDescriptor&& other) noexcept {
    if (this != &other) reset(other.release());
    return *this;
  }
  ~FileDescriptor() { reset(); }

  int get() const noexcept { return fd_; }
  explicit operator bool() const noexcept { return fd_ >= 0; }
  int release() noexcept { return std::exchange(fd_, -1); }
  /// Leaves errno as it is, so that a failure's reason survives the clean-up.
  void reset(int fd = -1) noexcept;

 private:
  int fd_ = -1;
};

// Interrupted calls are carried on.

/// Reads what there is, up to `bytes`: how many bytes, 0 at the end, -1 with errno set.
std::int64_t readSome(int fd, std::span<std::byte> bytes) noexcept;
/// Fills `bytes` from `offset` on, or as far as the file goes: how many bytes, -1 with errno set.
std::int64_t readAt(int fd, std::span<std::byte> bytes, std::uint64_t offset) noexcept;

// Each returns false with errno set.

[[nodiscard]] bool writeAll(int fd, ByteView bytes) noexcept;
/// Writes at `offset`; past the end of the file this leaves a hole.
[[nodiscard]] bool writeAllAt(int fd, ByteView bytes, std::uint64_t offset) noexcept;
/// Puts a file or directory on disk.
[[nodiscard]] bool syncToDisk(int fd) noexcept;
/// Puts everything of the descriptor's file system on disk.
[[nodiscard]] bool syncFileSystem(int fd) noexcept;

}  // namespace appsync
