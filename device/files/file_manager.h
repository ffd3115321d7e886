#pragma once

#include <sys/types.h>

#include <filesystem>

#include "base/confined_directory.h"
#include "base/directory_tree.h"
#include "platform/file_manager.h"

namespace appsync::device {

/// The phone's file system in a folder of this machine. The account "mobile" is the user who owns
/// the folder; no other account's name is accepted for new items. The last component of a path that
/// is written, moved, copied or removed is taken as it stands: a link there is replaced, moved,
/// copied or removed itself. Paths of more than 256 components fail with POSIX 36.
class ConfinedFileManager final : public FileManager {
 public:
  /// No file that is read whole may be larger; larger ones fail with POSIX 27.
  static constexpr std::uint64_t MaximumContents = std::uint64_t{256} << 20;

  /// `root` is the folder that the phone sees as "/". If it cannot be opened, every call fails with
  /// the reason.
  explicit ConfinedFileManager(const std::filesystem::path& root) noexcept;

  bool isOpen() const noexcept { return root_.isOpen(); }

  std::optional<Bytes> contentsAtPath(std::string_view path,
                                      std::optional<Error>* error = nullptr) noexcept override;
  bool writeAtomically(std::string_view path, ByteView bytes,
                       std::optional<Error>* error = nullptr) noexcept override;
  bool createFile(std::string_view path, ByteView bytes,
                  const FileAttributes& attributes) noexcept override;
  bool createDirectory(std::string_view path, bool withIntermediates,
                       const FileAttributes& attributes,
                       std::optional<Error>* error = nullptr) noexcept override;
  bool removeItem(std::string_view path, std::optional<Error>* error = nullptr) noexcept override;
  bool moveItem(std::string_view from, std::string_view to,
                std::optional<Error>* error = nullptr) noexcept override;
  bool copyItem(std::string_view from, std::string_view to,
                std::optional<Error>* error = nullptr) noexcept override;
  bool fileExists(std::string_view path) noexcept override;
  bool directoryExists(std::string_view path) noexcept override;
  std::optional<ItemAttributes> attributesOfItem(
      std::string_view path, std::optional<Error>* error = nullptr) noexcept override;
  bool touch(std::string_view path, std::optional<Error>* error = nullptr) noexcept override;
  std::string temporaryDirectory() noexcept override { return "/tmp"; }

  // For the device's own services, which work on handles. Not valid, with an error, on failure.

  /// A regular file, for reading; anything else is refused without waiting for it.
  [[nodiscard]] FileDescriptor openFile(std::string_view path,
                                        std::optional<Error>* error = nullptr) noexcept;
  [[nodiscard]] FileDescriptor openDirectory(std::string_view path,
                                             std::optional<Error>* error = nullptr) noexcept;

  /// Removes what killed processes left under temporary names in the directory. Only for a time
  /// when nobody writes there.
  void removeTemporaries(std::string_view directory, Reach reach) noexcept;

 private:
  /// The directory that holds the path's last component, and that component.
  struct Place {
    FileDescriptor directory;
    std::string name;
  };

  [[nodiscard]] bool usable(std::string_view path, std::optional<Error>* error) const noexcept;
  [[nodiscard]] std::optional<Place> placeOf(std::string_view path,
                                             std::optional<Error>* error) const noexcept;
  [[nodiscard]] FileDescriptor lookAt(std::string_view path,
                                      std::optional<Error>* error) const noexcept;
  [[nodiscard]] bool makeDirectory(std::string_view path, const FileAttributes& attributes,
                                   std::optional<Error>* error) noexcept;
  [[nodiscard]] bool replaceFile(std::string_view path, ByteView bytes,
                                 const FileAttributes& attributes, bool durable,
                                 std::optional<Error>* error) noexcept;
  bool mayGive(const FileAttributes& attributes) const noexcept;
  [[nodiscard]] bool give(int fd, const FileAttributes& attributes) const noexcept;

  ConfinedDirectory root_;
  int openErrno_ = 0;  ///< why the root is not open
  uid_t owner_ = 0;    ///< of the root folder
  gid_t group_ = 0;
};

}  // namespace appsync::device
