#include "host/backup/backup_files.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>

#include "base/confined_directory.h"
#include "base/text.h"
#include "platform/property_list_codec.h"

namespace appsync::host {
namespace {

BackupProblem problemOf(const std::string& name, int errnoValue) {
  if (errnoValue == ENOENT) return {name + " is missing", true};
  if (errnoValue == ELOOP) return {name + " is a link", true};
  const std::string reason = systemText(errnoValue);
  return {fmt::format("{} cannot be read: {}", name, reason), false};
}

}  // namespace

FileDescriptor openBackupFile(const std::filesystem::path& path, std::uint64_t& size,
                              BackupProblem& problem) {
  const std::string name = printable(path.filename().string());
  const auto top = ConfinedDirectory::open("/", Confinement::Beneath);
  if (!top.isOpen()) {
    problem = problemOf(name, errno);
    return {};
  }
  auto file = top.openAt(path.relative_path().string(), O_RDONLY | O_NONBLOCK);
  struct stat status {};
  const int reason = file && ::fstat(file.get(), &status) == 0 ? 0 : errno;
  if (reason != 0) {
    problem = problemOf(name, reason);
    return {};
  }
  if (!S_ISREG(status.st_mode)) {
    problem = {name + " is no file", true};
    return {};
  }
  size = static_cast<std::uint64_t>(status.st_size);
  return file;
}

std::optional<BackupManifest> readBackupManifest(const std::filesystem::path& folder,
                                                 BackupProblem& problem) {
  const std::filesystem::path path = folder / BackupManifestFile;
  struct stat status {};
  if (::lstat(path.c_str(), &status) != 0 && errno == ENOENT) {
    problem = {"it holds no Manifest.plist, so it is no backup", true};
    return std::nullopt;
  }
  std::uint64_t size = 0;
  const auto file = openBackupFile(path, size, problem);
  if (!file) return std::nullopt;
  // What is cut off here is refused as damaged.
  Bytes bytes(std::min<std::uint64_t>(size, PropertyListLimits{}.bytes));
  const std::int64_t count = readAt(file.get(), bytes, 0);
  if (count < 0) {
    problem = problemOf(std::string(BackupManifestFile), errno);
    return std::nullopt;
  }
  bytes.resize(static_cast<std::size_t>(count));
  problem.isWrongFolder = true;
  return parseManifest(bytes, problem.text);
}

}  // namespace appsync::host
