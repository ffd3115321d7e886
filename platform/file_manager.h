#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "platform/bytes.h"
#include "platform/error.h"

namespace appsync {

/// A place in the phone's file system, as services that take packages and images want it.
struct FileLocation {
  std::string path;
  bool isDirectory = false;

  static FileLocation file(std::string path) { return {std::move(path), false}; }
  static FileLocation directory(std::string path) { return {std::move(path), true}; }
  bool operator==(const FileLocation&) const = default;
};

/// What a new file or directory is given. "none" leaves it to the system.
struct FileAttributes {
  std::optional<std::string> owner;  ///< owner account name
  std::optional<std::string> group;  ///< group owner account name
};

struct ItemAttributes {
  std::uint64_t size = 0;  ///< bytes
  bool isDirectory = false;
  std::string owner;
  std::string group;
  /// Seconds since 1970-01-01T00:00:00Z, with fractions.
  double modificationTime = 0;
  double accessTime = 0;
};

/// The phone's file system. Every path is absolute and the phone's own ("/var/mobile/..."); a path
/// that is relative, empty, holds a NUL byte or has a part "." or ".." fails with POSIX 22.
/// Symbolic links are followed inside the phone's file system and never lead out of it. Failures
/// carry POSIXErrorDomain. Called from any thread at once; calls on one path are as atomic as said
/// and no more.
class FileManager {
 public:
  virtual ~FileManager() = default;

  /// The whole file, read past any cache of this service. nullopt when it is missing or unreadable;
  /// an empty file gives empty bytes.
  [[nodiscard]] virtual std::optional<Bytes> contentsAtPath(
      std::string_view path, std::optional<Error>* error = nullptr) noexcept = 0;

  /// Replaces the file in one step: a reader sees the old bytes or the new ones, also after a
  /// crash, and when this returns true they are on disk. The directory must exist. Files below the
  /// temporary directory need not survive a power failure.
  [[nodiscard]] virtual bool writeAtomically(std::string_view path, ByteView bytes,
                                             std::optional<Error>* error = nullptr) noexcept = 0;

  /// Makes the file with these bytes and attributes, replacing an existing one. Not atomic.
  [[nodiscard]] virtual bool createFile(std::string_view path, ByteView bytes,
                                        const FileAttributes& attributes) noexcept = 0;

  /// Makes a directory. With `withIntermediates`, missing parents are made too and an existing
  /// directory counts as success; without, an existing item fails (POSIX 17). The attributes go to
  /// every directory made.
  [[nodiscard]] virtual bool createDirectory(std::string_view path, bool withIntermediates,
                                             const FileAttributes& attributes,
                                             std::optional<Error>* error = nullptr) noexcept = 0;

  /// Removes a file, a link (never what it points to) or a directory with all in it. A missing item
  /// fails with POSIX 2.
  [[nodiscard]] virtual bool removeItem(std::string_view path,
                                        std::optional<Error>* error = nullptr) noexcept = 0;

  /// Moves an item; the target must not exist (POSIX 17) and its directory must.
  [[nodiscard]] virtual bool moveItem(std::string_view from, std::string_view to,
                                      std::optional<Error>* error = nullptr) noexcept = 0;

  /// Copies a file, or a directory with all in it; the target must not exist (POSIX 17).
  [[nodiscard]] virtual bool copyItem(std::string_view from, std::string_view to,
                                      std::optional<Error>* error = nullptr) noexcept = 0;

  /// True for an existing file or directory.
  virtual bool fileExists(std::string_view path) noexcept = 0;
  /// True for an existing directory.
  virtual bool directoryExists(std::string_view path) noexcept = 0;

  [[nodiscard]] virtual std::optional<ItemAttributes> attributesOfItem(
      std::string_view path, std::optional<Error>* error = nullptr) noexcept = 0;

  /// Sets access and modification time to now.
  [[nodiscard]] virtual bool touch(std::string_view path,
                                   std::optional<Error>* error = nullptr) noexcept = 0;

  /// The temporary directory of the process, without a "/" at its end.
  virtual std::string temporaryDirectory() noexcept = 0;
};

/// `directory` and `name` joined by exactly one "/".
std::string joinPath(std::string_view directory, std::string_view name);

}  // namespace appsync
