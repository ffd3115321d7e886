#include <fmt/format.h>

#include <cerrno>
#include <system_error>

#include "base/text.h"
#include "host/backup/backup_files.h"
#include "host/backup/backup_folder.h"
#include "host/backup/backup_manifest.h"
#include "host/backup/digest.h"
#include "platform/property_list_codec.h"

namespace appsync::host {
namespace {

namespace fs = std::filesystem;

constexpr std::uint64_t LargestList = PropertyListLimits{}.bytes;

std::optional<Bytes> wholeList(const BackupFile& file, std::string& problem) {
  if (file.size > LargestList) {
    problem = fmt::format("{} is too large", file.path.filename().string());
    return std::nullopt;
  }
  BackupFileReader reader(file);
  Bytes bytes(file.size + 1);  // room to meet the end
  std::size_t filled = 0;
  while (true) {
    const std::int64_t count =
        reader.read(reinterpret_cast<std::uint8_t*>(bytes.data()) + filled, bytes.size() - filled);
    if (count < 0) {
      problem = reader.problem();
      return std::nullopt;
    }
    if (count == 0) break;
    filled += static_cast<std::size_t>(count);
  }
  bytes.resize(filled);
  return bytes;
}

bool readContents(const fs::path& folder, Backup& backup, std::string& problem) {
  BackupProblem unusable;
  const auto manifest = readBackupManifest(folder, unusable);
  if (!manifest) {
    problem = unusable.text;
    return false;
  }
  for (const auto& [name, entry] : manifest->files) {
    auto bytes = wholeList({folder / name, entry.size, entry.digest}, problem);
    if (!bytes) return false;
    if (name == BackupApplicationsFile)
      backup.applications = std::move(*bytes);
    else if (name == BackupDemotionsFile)
      backup.demotions = std::move(*bytes);
    else if (name == BackupIconLayoutFile)
      backup.iconLayout = std::move(*bytes);
  }
  for (const auto& [identifier, entry] : manifest->data) {
    const fs::path path = folder / BackupDataFolder / backupDataName(identifier);
    backup.data.emplace(identifier, BackupFile{path, entry.size, entry.digest});
  }
  return true;
}

}  // namespace

std::optional<Backup> readBackup(const fs::path& folder, std::string& problem) {
  const auto refuse = [&](const std::string& reason) {
    problem = fmt::format("cannot use the backup {}: {}", printable(folder.string()), reason);
    return std::nullopt;
  };
  std::error_code failure;
  const fs::path real = fs::canonical(folder, failure);
  if (failure == std::errc::no_such_file_or_directory) return refuse("there is no such folder");
  if (failure) return refuse(failure.message());
  const bool isFolder = fs::is_directory(real, failure);
  if (failure) return refuse(failure.message());
  if (!isFolder) return refuse("it is no folder");
  Backup backup;
  std::string reason;
  if (!readContents(real, backup, reason)) return refuse(reason);
  return backup;
}

BackupFileReader::BackupFileReader(const BackupFile& file) : file_(file) {
  std::uint64_t size = 0;
  BackupProblem unusable;
  descriptor_ = openBackupFile(file.path, size, unusable);
  problem_ = unusable.text;
  if (descriptor_ && size != file.size) fail("is shorter or longer than the manifest tells");
}

std::int64_t BackupFileReader::fail(const std::string& reason) {
  problem_ = fmt::format("{} {}", file_.path.filename().string(), reason);
  return -1;
}

std::int64_t BackupFileReader::checkEnd() {
  if (position_ != file_.size) return fail("is shorter or longer than the manifest tells");
  if (!ended_ && digest_.finish() != file_.digest) return fail("does not match its digest");
  ended_ = true;
  return 0;
}

std::int64_t BackupFileReader::read(std::uint8_t* bytes, std::size_t size) {
  if (!problem_.empty()) return -1;
  if (size == 0 || ended_) return 0;
  const std::span target = std::as_writable_bytes(std::span(bytes, size));
  const std::int64_t count = readSome(descriptor_.get(), target);
  if (count < 0) return fail("cannot be read: " + systemText(errno));
  if (count == 0) return checkEnd();
  position_ += static_cast<std::uint64_t>(count);
  if (position_ > file_.size) return checkEnd();
  digest_.add(target.first(static_cast<std::size_t>(count)));
  return count;
}

}  // namespace appsync::host
