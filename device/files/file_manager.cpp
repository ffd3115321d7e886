#include "device/files/file_manager.h"

#include <fcntl.h>
#include <grp.h>
#include <pwd.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <new>

#include "base/temporary_file.h"

namespace appsync::device {

namespace {

constexpr std::string_view MobileAccount = "mobile";
constexpr std::size_t MaximumComponents = 256;

std::string_view withoutSlashesAtEnd(std::string_view path) {
  const std::size_t last = path.find_last_not_of('/');
  return last == std::string_view::npos ? path.substr(0, 1) : path.substr(0, last + 1);
}

/// 0 or an errno value. No path leads up: a name that somebody else chose and that was joined to a
/// directory stays in it.
int objectionTo(std::string_view path) {
  if (!path.starts_with('/') || path.find('\0') != std::string_view::npos) return EINVAL;
  std::size_t count = 0;
  for (std::string_view rest = path; !rest.empty();) {
    const std::size_t end = std::min(rest.find('/'), rest.size());
    const std::string_view component = rest.substr(0, end);
    rest.remove_prefix(std::min(end + 1, rest.size()));
    if (component == "." || component == "..") return EINVAL;
    if (!component.empty() && ++count > MaximumComponents) return ENAMETOOLONG;
  }
  return 0;
}

double secondsOf(const timespec& time) {
  return static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_nsec) * 1e-9;
}

std::string userName(uid_t uid) {
  std::array<char, 4096> buffer;
  passwd entry{};
  passwd* found = nullptr;
  ::getpwuid_r(uid, &entry, buffer.data(), buffer.size(), &found);
  return found ? found->pw_name : std::to_string(uid);
}

std::string groupName(gid_t gid) {
  std::array<char, 4096> buffer;
  group entry{};
  group* found = nullptr;
  ::getgrgid_r(gid, &entry, buffer.data(), buffer.size(), &found);
  return found ? found->gr_name : std::to_string(gid);
}

/// The rest of an open file; the size is a hint. 0 or an errno value.
int readAll(int fd, std::size_t expected, Bytes& bytes) {
  bytes.resize(expected + 1);  // one more shows the end without another round
  std::size_t filled = 0;
  while (true) {
    const std::int64_t count = readSome(fd, std::span(bytes).subspan(filled));
    if (count < 0) return errno;
    if (count == 0) break;
    filled += static_cast<std::size_t>(count);
    if (filled > ConfinedFileManager::MaximumContents) return EFBIG;
    if (filled == bytes.size()) bytes.resize(bytes.size() + bytes.size() / 2 + 4096);
  }
  bytes.resize(filled);
  return 0;
}

bool fail(std::optional<Error>* error, int reason, std::string_view path) {
  return failWith(error, Error::posix(reason, path));
}

/// Nobody looks for a temporary file after a power failure, so none waits for the disk.
bool isTemporary(std::string_view path) { return path.starts_with("/tmp/"); }

}  // namespace

ConfinedFileManager::ConfinedFileManager(const std::filesystem::path& root) noexcept
    : root_(ConfinedDirectory::open(root, Confinement::Root)) {
  struct stat status {};
  if (!root_.isOpen() || ::fstat(root_.fd(), &status) != 0) {
    openErrno_ = errno;
    return;
  }
  owner_ = status.st_uid;
  group_ = status.st_gid;
}

std::optional<Bytes> ConfinedFileManager::contentsAtPath(std::string_view path,
                                                         std::optional<Error>* error) noexcept {
  const FileDescriptor file = openFile(path, error);
  if (!file) return std::nullopt;
  struct stat status {};
  int failure = ::fstat(file.get(), &status) == 0 ? 0 : errno;
  if (failure == 0 && static_cast<std::uint64_t>(status.st_size) > MaximumContents) failure = EFBIG;
  Bytes bytes;
  try {
    if (failure == 0)
      failure = readAll(file.get(), static_cast<std::size_t>(status.st_size), bytes);
  } catch (const std::bad_alloc&) {
    failure = ENOMEM;
  }
  if (failure == 0) return bytes;
  fail(error, failure, path);
  return std::nullopt;
}

bool ConfinedFileManager::writeAtomically(std::string_view path, ByteView bytes,
                                          std::optional<Error>* error) noexcept {
  return replaceFile(path, bytes, {}, !isTemporary(path), error);
}

bool ConfinedFileManager::createFile(std::string_view path, ByteView bytes,
                                     const FileAttributes& attributes) noexcept {
  return replaceFile(path, bytes, attributes, false, nullptr);
}

bool ConfinedFileManager::replaceFile(std::string_view path, ByteView bytes,
                                      const FileAttributes& attributes, bool durable,
                                      std::optional<Error>* error) noexcept {
  if (!mayGive(attributes)) return fail(error, EPERM, path);
  const std::optional<Place> place = placeOf(path, error);
  if (!place) return false;
  TemporaryFile file(place->directory.get());
  const Durability durability = durable ? Durability::Durable : Durability::Cached;
  if (!file.isOpen() || !writeAll(file.fd(), bytes) || !give(file.fd(), attributes) ||
      !file.takePlaceOf(place->name, durability))
    return fail(error, errno, path);
  return true;
}

bool ConfinedFileManager::createDirectory(std::string_view path, bool withIntermediates,
                                          const FileAttributes& attributes,
                                          std::optional<Error>* error) noexcept {
  if (!usable(path, error)) return false;
  if (!mayGive(attributes)) return fail(error, EPERM, path);
  if (!withIntermediates) return makeDirectory(path, attributes, error);
  if (directoryExists(path)) return true;
  for (std::size_t end = 0; end < path.size();) {
    end = std::min(path.find('/', end + 1), path.size());
    const std::string_view part = path.substr(0, end);
    if (!directoryExists(part) && !makeDirectory(part, attributes, error) &&
        !directoryExists(part))  // another thread may have been first
      return false;
  }
  return true;
}

bool ConfinedFileManager::makeDirectory(std::string_view path, const FileAttributes& attributes,
                                        std::optional<Error>* error) noexcept {
  if (withoutSlashesAtEnd(path) == "/") return fail(error, EEXIST, path);
  const std::optional<Place> place = placeOf(path, error);
  if (!place) return false;
  if (::mkdirat(place->directory.get(), place->name.c_str(), 0755) != 0)
    return fail(error, errno, path);
  if (!attributes.owner && !attributes.group) return true;
  const FileDescriptor made(::openat(place->directory.get(), place->name.c_str(),
                                     O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
  return (made && give(made.get(), attributes)) || fail(error, errno, path);
}

bool ConfinedFileManager::removeItem(std::string_view path, std::optional<Error>* error) noexcept {
  const std::optional<Place> place = placeOf(path, error);
  if (!place) return false;
  return removeTree(place->directory.get(), place->name) || fail(error, errno, path);
}

bool ConfinedFileManager::moveItem(std::string_view from, std::string_view to,
                                   std::optional<Error>* error) noexcept {
  const std::optional<Place> source = placeOf(from, error);
  const std::optional<Place> target = source ? placeOf(to, error) : std::nullopt;
  if (!target) return false;
  const int result = ::renameat2(source->directory.get(), source->name.c_str(),
                                 target->directory.get(), target->name.c_str(), RENAME_NOREPLACE);
  if (result == 0) return true;
  return fail(error, errno, errno == EEXIST ? to : from);
}

bool ConfinedFileManager::copyItem(std::string_view from, std::string_view to,
                                   std::optional<Error>* error) noexcept {
  const std::optional<Place> source = placeOf(from, error);
  const std::optional<Place> target = source ? placeOf(to, error) : std::nullopt;
  if (!target) return false;
  if (copyTree(source->directory.get(), source->name, target->directory.get(), target->name))
    return true;
  return fail(error, errno, errno == EEXIST ? to : from);
}

bool ConfinedFileManager::fileExists(std::string_view path) noexcept {
  return static_cast<bool>(lookAt(path, nullptr));
}

bool ConfinedFileManager::directoryExists(std::string_view path) noexcept {
  const FileDescriptor item = lookAt(path, nullptr);
  struct stat status {};
  return item && ::fstat(item.get(), &status) == 0 && S_ISDIR(status.st_mode);
}

std::optional<ItemAttributes> ConfinedFileManager::attributesOfItem(
    std::string_view path, std::optional<Error>* error) noexcept {
  const FileDescriptor item = lookAt(path, error);
  if (!item) return std::nullopt;
  struct stat status {};
  if (::fstat(item.get(), &status) != 0) {
    fail(error, errno, path);
    return std::nullopt;
  }
  ItemAttributes attributes;
  attributes.size = static_cast<std::uint64_t>(status.st_size);
  attributes.isDirectory = S_ISDIR(status.st_mode);
  attributes.owner = status.st_uid == owner_ ? MobileAccount : userName(status.st_uid);
  attributes.group = status.st_gid == group_ ? MobileAccount : groupName(status.st_gid);
  attributes.modificationTime = secondsOf(status.st_mtim);
  attributes.accessTime = secondsOf(status.st_atim);
  return attributes;
}

bool ConfinedFileManager::touch(std::string_view path, std::optional<Error>* error) noexcept {
  const FileDescriptor item = lookAt(path, error);
  if (!item) return false;
  return ::utimensat(item.get(), "", nullptr, AT_EMPTY_PATH) == 0 || fail(error, errno, path);
}

FileDescriptor ConfinedFileManager::openFile(std::string_view path,
                                             std::optional<Error>* error) noexcept {
  if (!usable(path, error)) return {};
  // Opening a pipe for reading would otherwise wait for its writer.
  FileDescriptor file = root_.openAt(path, O_RDONLY | O_NONBLOCK);
  struct stat status {};
  int failure = file && ::fstat(file.get(), &status) == 0 ? 0 : errno;
  if (failure == 0 && S_ISDIR(status.st_mode)) failure = EISDIR;
  if (failure == 0 && !S_ISREG(status.st_mode)) failure = EINVAL;
  if (failure == 0) return file;
  fail(error, failure, path);
  return {};
}

FileDescriptor ConfinedFileManager::openDirectory(std::string_view path,
                                                  std::optional<Error>* error) noexcept {
  if (!usable(path, error)) return {};
  FileDescriptor directory = root_.openDirectoryAt(path);
  if (!directory) fail(error, errno, path);
  return directory;
}

void ConfinedFileManager::removeTemporaries(std::string_view directory, Reach reach) noexcept {
  const FileDescriptor opened = openDirectory(directory);
  if (opened) removeTemporaryFiles(opened.get(), reach);
}

bool ConfinedFileManager::usable(std::string_view path,
                                 std::optional<Error>* error) const noexcept {
  if (!root_.isOpen()) return fail(error, openErrno_, path);
  const int objection = objectionTo(path);
  return objection == 0 || fail(error, objection, path);
}

std::optional<ConfinedFileManager::Place> ConfinedFileManager::placeOf(
    std::string_view path, std::optional<Error>* error) const noexcept {
  if (!usable(path, error)) return std::nullopt;
  const std::string_view item = withoutSlashesAtEnd(path);
  const std::size_t slash = item.rfind('/');
  const std::string_view name = item.substr(slash + 1);
  if (name.empty()) {
    fail(error, EBUSY, path);
    return std::nullopt;
  }
  FileDescriptor directory = root_.openDirectoryAt(slash == 0 ? "/" : item.substr(0, slash));
  if (!directory) {
    fail(error, errno, path);
    return std::nullopt;
  }
  return Place{std::move(directory), std::string(name)};
}

FileDescriptor ConfinedFileManager::lookAt(std::string_view path,
                                           std::optional<Error>* error) const noexcept {
  if (!usable(path, error)) return {};
  FileDescriptor item = root_.openAt(path, O_PATH);
  if (!item) fail(error, errno, path);
  return item;
}

bool ConfinedFileManager::mayGive(const FileAttributes& attributes) const noexcept {
  return attributes.owner.value_or(std::string(MobileAccount)) == MobileAccount &&
         attributes.group.value_or(std::string(MobileAccount)) == MobileAccount;
}

bool ConfinedFileManager::give(int fd, const FileAttributes& attributes) const noexcept {
  struct stat status {};
  if (::fstat(fd, &status) != 0) return false;
  const bool ownerStands = !attributes.owner || status.st_uid == owner_;
  const bool groupStands = !attributes.group || status.st_gid == group_;
  if (ownerStands && groupStands) return true;
  return ::fchown(fd, ownerStands ? static_cast<uid_t>(-1) : owner_,
                  groupStands ? static_cast<gid_t>(-1) : group_) == 0;
}

}  // namespace appsync::device
