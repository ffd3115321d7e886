#include "base/directory_tree.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <climits>
#include <tuple>
#include <vector>

#include "base/file_descriptor.h"
#include "base/temporary_file.h"

namespace appsync {

namespace {

// Each level holds one or two descriptors.
constexpr int MaximumDepth = 500;

FileDescriptor openChild(int directory, const std::string& name) {
  return FileDescriptor(
      ::openat(directory, name.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
}

bool failWith(int reason) {
  errno = reason;
  return false;
}

/// An owner may have taken from a directory what it needs to be emptied.
FileDescriptor openToEmpty(int directory, const std::string& name) {
  const FileDescriptor handle(
      ::openat(directory, name.c_str(), O_PATH | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
  struct stat status {};
  if (handle && ::fstat(handle.get(), &status) == 0 && (status.st_mode & S_IRWXU) != S_IRWXU) {
    // fchmod takes no handle of this sort.
    ::chmod(("/proc/self/fd/" + std::to_string(handle.get())).c_str(), S_IRWXU);
  }
  return openChild(directory, name);
}

bool removeLevel(int directory, const std::string& name, int depth) {
  if (::unlinkat(directory, name.c_str(), 0) == 0) return true;
  if (errno != EISDIR && errno != EPERM) return false;
  if (depth > MaximumDepth) return failWith(ENAMETOOLONG);
  {
    const FileDescriptor child = openToEmpty(directory, name);
    std::vector<std::string> names;
    if (!child || !listNames(child.get(), names)) return false;
    for (const std::string& inner : names)
      if (!removeLevel(child.get(), inner, depth + 1) && errno != ENOENT) return false;
  }
  return ::unlinkat(directory, name.c_str(), AT_REMOVEDIR) == 0;
}

bool copyBytes(int from, int to) {
  std::vector<std::byte> buffer(std::size_t{256} << 10);
  while (true) {
    const std::int64_t count = readSome(from, buffer);
    if (count <= 0) return count == 0;
    if (!writeAll(to, ByteView(buffer.data(), static_cast<std::size_t>(count)))) return false;
  }
}

bool copyFile(int fromDirectory, const std::string& from, int toDirectory, const std::string& to,
              mode_t mode) {
  // Something else may have taken the place of the regular file seen before.
  const FileDescriptor source(
      ::openat(fromDirectory, from.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC));
  struct stat status {};
  if (!source || ::fstat(source.get(), &status) != 0) return false;
  if (!S_ISREG(status.st_mode)) return failWith(EINVAL);
  const FileDescriptor target(
      ::openat(toDirectory, to.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, mode & 0777));
  return target && copyBytes(source.get(), target.get());
}

bool copyLink(int fromDirectory, const std::string& from, int toDirectory, const std::string& to) {
  std::array<char, PATH_MAX + 1> target;
  const ssize_t length =
      ::readlinkat(fromDirectory, from.c_str(), target.data(), target.size() - 1);
  if (length < 0) return false;
  target[static_cast<std::size_t>(length)] = '\0';
  return ::symlinkat(target.data(), toDirectory, to.c_str()) == 0;
}

struct Inode {
  dev_t device = 0;
  ino_t number = 0;
};

/// `top` is the copy's own first directory, which must not turn up among what is copied.
bool copyLevel(int fromDirectory, const std::string& from, int toDirectory, const std::string& to,
               Inode top, int depth) {
  struct stat status {};
  if (::fstatat(fromDirectory, from.c_str(), &status, AT_SYMLINK_NOFOLLOW) != 0) return false;
  if (S_ISREG(status.st_mode))
    return copyFile(fromDirectory, from, toDirectory, to, status.st_mode);
  if (S_ISLNK(status.st_mode)) return copyLink(fromDirectory, from, toDirectory, to);
  if (!S_ISDIR(status.st_mode)) return failWith(EINVAL);
  if (status.st_dev == top.device && status.st_ino == top.number) return failWith(EINVAL);
  if (depth > MaximumDepth) return failWith(ENAMETOOLONG);

  const FileDescriptor source = openChild(fromDirectory, from);
  // While it is being filled the owner must be able to write in it, whatever the source allows.
  if (!source || ::mkdirat(toDirectory, to.c_str(), (status.st_mode & 0777) | S_IRWXU) != 0)
    return false;
  const FileDescriptor target = openChild(toDirectory, to);
  struct stat made {};
  if (!target || ::fstat(target.get(), &made) != 0) return false;
  if (depth == 0) top = {made.st_dev, made.st_ino};
  std::vector<std::string> names;
  if (!listNames(source.get(), names)) return false;
  for (const std::string& name : names)
    if (!copyLevel(source.get(), name, target.get(), name, top, depth + 1)) return false;
  return true;
}

void removeTemporaries(int directory, Reach reach, int depth) {
  std::vector<std::string> names;
  if (depth > MaximumDepth || !listNames(directory, names)) return;
  for (const std::string& name : names) {
    if (isTemporaryName(name)) {
      removeLevel(directory, name, depth);
    } else if (reach == Reach::AllBelow) {
      const FileDescriptor child = openChild(directory, name);
      if (child) removeTemporaries(child.get(), reach, depth + 1);
    }
  }
}

}  // namespace

bool listNames(int directory, std::vector<std::string>& names) {
  // The stream takes its descriptor over and moves its offset: it gets one of its own.
  FileDescriptor own(::openat(directory, ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  DIR* stream = own ? ::fdopendir(own.get()) : nullptr;
  if (!stream) return false;
  own.release();
  errno = 0;
  while (const dirent* entry = ::readdir(stream)) {  // NOLINT(concurrency-mt-unsafe)
    const std::string name = entry->d_name;
    if (name != "." && name != "..") names.push_back(name);
  }
  const int failure = errno;
  ::closedir(stream);
  errno = failure;
  return failure == 0;
}

bool removeTree(int directory, const std::string& name) noexcept {
  return removeLevel(directory, name, 0);
}

bool copyTree(int fromDirectory, const std::string& from, int toDirectory,
              const std::string& to) noexcept {
  struct stat status {};
  if (::fstatat(toDirectory, to.c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0)
    return failWith(EEXIST);
  // A half-made copy stands under a temporary name, so that the target appears in one step.
  const std::string unfinished = makeTemporaryName();
  if (copyLevel(fromDirectory, from, toDirectory, unfinished, {}, 0) &&
      ::renameat2(toDirectory, unfinished.c_str(), toDirectory, to.c_str(), RENAME_NOREPLACE) == 0)
    return true;
  const int failure = errno;
  std::ignore = removeTree(toDirectory, unfinished);  // else swept with other temporary files
  return failWith(failure);
}

void removeTemporaryFiles(int directory, Reach reach) noexcept {
  removeTemporaries(directory, reach, 0);
}

}  // namespace appsync
