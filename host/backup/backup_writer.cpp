#include <dirent.h>
#include <fcntl.h>
#include <fmt/format.h>
#include <stdio.h>
#include <stdlib.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <system_error>
#include <tuple>
#include <vector>

#include "base/directory_tree.h"
#include "base/file_descriptor.h"
#include "base/identifiers.h"
#include "base/text.h"
#include "host/backup/backup_files.h"
#include "host/backup/backup_folder.h"
#include "host/backup/backup_manifest.h"
#include "host/backup/digest.h"
#include "platform/property_list_codec.h"

namespace appsync::host {
namespace {

namespace fs = std::filesystem;

constexpr std::string_view UnfinishedMark = ".partial-";
constexpr std::size_t UnfinishedDigits = 6;

FileDescriptor openFolder(int directory, const std::string& name) {
  return FileDescriptor(
      ::openat(directory, name.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
}

/// Where a backup is to be: a folder of this machine, and its name in it.
struct Target {
  fs::path path;  ///< without links
  FileDescriptor parent;
  bool replaces = false;  ///< an older backup stands there

  std::string name() const { return path.filename().string(); }
};

/// The path that a person means by `folder`: one that is a link keeps being one.
fs::path resolve(const fs::path& folder) {
  std::error_code failure;
  fs::path path = fs::weakly_canonical(fs::absolute(folder), failure);
  if (failure) path = fs::absolute(folder).lexically_normal();
  return path.has_filename() ? path : path.parent_path();
}

BackupProblem wrongFolder(std::string text) { return {std::move(text), true}; }

BackupProblem refusedBySystem(int errnoValue) { return {systemText(errnoValue), false}; }

/// It would be lost with an older backup.
bool isForeign(const std::string& name) {
  return name != BackupManifestFile && name != BackupApplicationsFile &&
         name != BackupDemotionsFile && name != BackupIconLayoutFile && name != BackupDataFolder;
}

/// Why the folder that stands there cannot give way to a backup.
std::optional<BackupProblem> objectionToContents(Target& target) {
  std::vector<std::string> names;
  const FileDescriptor folder = openFolder(target.parent.get(), target.name());
  if (!folder || !listNames(folder.get(), names)) return refusedBySystem(errno);
  if (names.empty()) return std::nullopt;
  BackupProblem problem;
  if (!readBackupManifest(target.path, problem)) {
    problem.text.insert(0, "it is not empty, and ");
    return problem;
  }
  const auto foreign = std::ranges::find_if(names, isForeign);
  if (foreign != names.end()) {
    return wrongFolder(
        fmt::format("it holds \"{}\", which is no part of a backup", printable(*foreign)));
  }
  target.replaces = true;
  return std::nullopt;
}

/// Opens the folder around. Why the target cannot become a backup, if so.
std::optional<BackupProblem> objectionTo(Target& target) {
  if (target.path == target.path.root_path()) return wrongFolder("it is no folder for a backup");
  const fs::path around = target.path.parent_path();
  target.parent = FileDescriptor(::open(around.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  struct stat parent {};
  struct stat status {};
  if (!target.parent || ::fstat(target.parent.get(), &parent) != 0) {
    const int reason = errno;
    return BackupProblem{fmt::format("{}: {}", printable(around.string()), systemText(reason)),
                         reason == ENOENT || reason == ENOTDIR};
  }
  if (::fstatat(target.parent.get(), target.name().c_str(), &status, AT_SYMLINK_NOFOLLOW) != 0) {
    return errno == ENOENT ? std::nullopt : std::optional(refusedBySystem(errno));
  }
  if (!S_ISDIR(status.st_mode)) return wrongFolder("it is no folder");
  if (parent.st_dev != status.st_dev) {
    return wrongFolder("it is a mount point; name a folder in it");
  }
  return objectionToContents(target);
}

bool isUnfinished(const std::string& name, const std::string& backupName) {
  const std::string prefix = fmt::format("{}{}", backupName, UnfinishedMark);
  return name.starts_with(prefix) && name.size() == prefix.size() + UnfinishedDigits;
}

/// A writer at work holds the lock of its folder.
bool lockFolder(int folder) { return ::flock(folder, LOCK_EX | LOCK_NB) == 0; }

/// Removes what killed writers left beside the target.
void sweep(const Target& target) {
  std::error_code failure;
  std::vector<std::string> names;
  for (fs::directory_iterator item(target.path.parent_path(), failure), end;
       !failure && item != end; item.increment(failure)) {
    names.push_back(item->path().filename().string());
  }
  for (const std::string& name : names) {
    if (!isUnfinished(name, target.name())) continue;
    const FileDescriptor folder = openFolder(target.parent.get(), name);
    if (!folder || !lockFolder(folder.get())) continue;
    std::ignore = removeTree(target.parent.get(), name);  // else the next writer does
  }
}

class FolderWriter final : public BackupWriter {
 public:
  explicit FolderWriter(Target target) : target_(std::move(target)) {}

  ~FolderWriter() override {
    file_.reset();
    if (!unfinished_.empty()) std::ignore = removeTree(target_.parent.get(), unfinished_);
  }

  bool begin() {
    std::string pattern = fmt::format("{}{}XXXXXX", target_.path.string(), UnfinishedMark);
    if (!::mkdtemp(pattern.data())) return fail("", errno);
    unfinished_ = fs::path(pattern).filename().string();
    folder_ = openFolder(target_.parent.get(), unfinished_);
    const std::string data(BackupDataFolder);
    if (!folder_ || !lockFolder(folder_.get()) ||
        ::mkdirat(folder_.get(), data.c_str(), 0700) != 0) {
      return fail("", errno);
    }
    data_ = openFolder(folder_.get(), data);
    return data_ || fail(data, errno);
  }

  bool olderHolds(std::string_view identifier) override {
    if (!target_.replaces) return false;
    const PropertyList::Dictionary* applications = older();
    return !applications || find(*applications, identifier);
  }

  std::vector<std::string> olderApplications() override {
    std::vector<std::string> identifiers;
    const PropertyList::Dictionary* applications = target_.replaces ? older() : nullptr;
    if (!applications) return identifiers;
    for (const auto& application : *applications) identifiers.push_back(application.first);
    return identifiers;
  }

  bool addFile(std::string_view name, ByteView contents) override {
    return create(folder_.get(), std::string(name)) && append(contents) &&
           close(manifest_.files, name);
  }

  bool beginData(std::string_view identifier) override {
    identifier_ = identifier;
    if (!isUsableIdentifier(identifier)) return fail(identifier_, EINVAL);
    return create(data_.get(), backupDataName(identifier));
  }

  bool append(ByteView contents) override {
    if (!problem_.empty()) return false;
    if (!writeAll(file_.get(), contents)) return fail(name_, errno);
    digest_.add(contents);
    size_ += contents.size();
    return true;
  }

  bool endData() override { return close(manifest_.data, identifier_); }

  void dropData() override {
    if (!problem_.empty() || !file_) return;
    file_.reset();
    if (::unlinkat(data_.get(), name_.c_str(), 0) != 0) fail(name_, errno);
  }

  bool finish() override {
    if (!problem_.empty()) return false;
    const auto manifest = serializeManifest(manifest_);
    const std::string name(BackupManifestFile);
    if (!manifest) return fail(name, EFBIG);
    return addFile(name, *manifest) && putOnDisk() && takePlace();
  }

  const std::string& problem() const override { return problem_; }

 private:
  /// The older backup's list of applications, read once; nullptr when it cannot be.
  const PropertyList::Dictionary* older() {
    if (!isOlderRead_) {
      std::string ignored;
      const auto backup = readBackup(target_.path, ignored);
      older_ = backup ? parseDictionary(backup->applications) : std::nullopt;
      isOlderRead_ = true;
    }
    return older_ ? &*older_ : nullptr;
  }

  using Entries = std::map<std::string, ManifestEntry, std::less<>>;

  // Both are always false.

  bool fail(const std::string& item, int errnoValue) { return fail(item, systemText(errnoValue)); }

  bool fail(const std::string& item, const std::string& reason) {
    if (!problem_.empty()) return false;
    const fs::path path = item.empty() ? target_.path : target_.path / item;
    problem_ = fmt::format("cannot write the backup {}: {}", printable(path.string()), reason);
    return false;
  }

  bool create(int directory, const std::string& name) {
    if (!problem_.empty()) return false;
    name_ = name;
    size_ = 0;
    digest_.finish();
    file_ = FileDescriptor(::openat(directory, name.c_str(),
                                    O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0600));
    return file_ || fail(name, errno);
  }

  bool close(Entries& entries, std::string_view key) {
    if (!problem_.empty()) return false;
    entries.emplace(key, ManifestEntry{size_, digest_.finish()});
    // Some file systems tell only here that there is no room.
    return ::close(file_.release()) == 0 || fail(name_, errno);
  }

  bool syncFile(int directory, const std::string& name) {
    const FileDescriptor file(::openat(directory, name.c_str(), O_RDONLY | O_NOFOLLOW | O_CLOEXEC));
    return (file && syncToDisk(file.get())) || fail(name, errno);
  }

  /// All at the end: one by one would wait for the disk as often as there are files.
  bool putOnDisk() {
    for (const auto& [identifier, entry] : manifest_.data) {
      if (!syncFile(data_.get(), backupDataName(identifier))) return false;
    }
    for (const auto& [name, entry] : manifest_.files) {
      if (!syncFile(folder_.get(), name)) return false;
    }
    return (syncToDisk(data_.get()) || fail(std::string(BackupDataFolder), errno)) &&
           (syncToDisk(folder_.get()) || fail("", errno));
  }

  bool takePlace() {
    const int parent = target_.parent.get();
    const std::string name = target_.name();
    if (target_.replaces) {
      if (::renameat2(parent, unfinished_.c_str(), parent, name.c_str(), RENAME_EXCHANGE) != 0) {
        if (errno != EINVAL) return fail("", errno);
        return fail("", "the file system cannot exchange folders; name a new folder");
      }
    } else if (::renameat(parent, unfinished_.c_str(), parent, name.c_str()) != 0) {
      return fail("", errno);  // something has come there meanwhile
    } else {
      unfinished_.clear();
    }
    if (!syncToDisk(parent)) return fail("", errno);
    // The older backup, now under the other name. What cannot be removed is swept the next time.
    if (!unfinished_.empty()) std::ignore = removeTree(parent, std::exchange(unfinished_, {}));
    return true;
  }

  const Target target_;
  std::optional<PropertyList::Dictionary> older_;  ///< the applications of the older backup
  bool isOlderRead_ = false;
  std::string unfinished_;  ///< name beside the target; empty when there is none any more
  FileDescriptor folder_;
  FileDescriptor data_;
  BackupManifest manifest_;
  std::string problem_;

  // The file being written.
  FileDescriptor file_;
  std::string name_;
  std::string identifier_;
  Sha256 digest_;
  std::uint64_t size_ = 0;
};

}  // namespace

std::unique_ptr<BackupWriter> BackupWriter::open(const fs::path& folder, BackupProblem& problem) {
  Target target;
  target.path = resolve(folder);
  if (auto objection = objectionTo(target)) {
    problem = *std::move(objection);
    problem.text.insert(0, fmt::format("cannot make a backup in {}: ", printable(folder.string())));
    return nullptr;
  }
  sweep(target);
  auto writer = std::make_unique<FolderWriter>(std::move(target));
  if (writer->begin()) return writer;
  problem = {writer->problem(), false};
  return nullptr;
}

}  // namespace appsync::host
