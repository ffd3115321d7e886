#include "host/backup/backup_files.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <system_error>

#include "device/base/confined_directory.h"
#include "host/base/text.h"
#include "platform/property_list_codec.h"

namespace appsync::host {
namespace {

std::string reasonOf(int errnoValue) {
  if (errnoValue == ENOENT) return "is missing";
  if (errnoValue == ELOOP) return "is a link";
  return "cannot be read: " + std::generic_category().message(errnoValue);
}

}  // namespace

device::FileDescriptor openBackupFile(const std::filesystem::path& path, std::uint64_t& size,
                                      std::string& problem) {
  const auto top = device::ConfinedDirectory::open("/", device::Confinement::Beneath);
  auto file = top.openAt(path.relative_path().string(), O_RDONLY | O_NONBLOCK);
  struct stat status {};
  const int reason = file && ::fstat(file.get(), &status) == 0 ? 0 : errno;
  const std::string name = printable(path.filename().string());
  if (reason != 0) {
    problem = fmt::format("{} {}", name, reasonOf(reason));
    return {};
  }
  if (!S_ISREG(status.st_mode)) {
    problem = name + " is no file";
    return {};
  }
  size = static_cast<std::uint64_t>(status.st_size);
  return file;
}

std::int64_t readSome(int fd, std::uint8_t* bytes, std::size_t size) {
  while (true) {
    const ssize_t count = ::read(fd, bytes, size);
    if (count >= 0 || errno != EINTR) return count;
  }
}

std::optional<BackupManifest> readBackupManifest(const std::filesystem::path& folder,
                                                 std::string& problem) {
  const std::filesystem::path path = folder / BackupManifestFile;
  std::error_code failure;
  if (!std::filesystem::exists(std::filesystem::symlink_status(path, failure))) {
    problem = "it holds no Manifest.plist, so it is no backup";
    return std::nullopt;
  }
  std::uint64_t size = 0;
  const auto file = openBackupFile(path, size, problem);
  if (!file) return std::nullopt;
  // What is cut off here is refused as damaged.
  Bytes bytes(std::min<std::uint64_t>(size, PropertyListLimits{}.bytes));
  std::size_t filled = 0;
  while (filled < bytes.size()) {
    const std::int64_t count = readSome(
        file.get(), reinterpret_cast<std::uint8_t*>(bytes.data()) + filled, bytes.size() - filled);
    if (count <= 0) break;
    filled += static_cast<std::size_t>(count);
  }
  bytes.resize(filled);
  return parseManifest(bytes, problem);
}

}  // namespace appsync::host
