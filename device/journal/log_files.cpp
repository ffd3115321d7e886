#include "device/journal/log_files.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <vector>

#include "device/journal/log_format.h"

namespace appsync::device {

namespace {

constexpr const char* NewestName = "device.log";

/// What the file holds now; nothing when it cannot be read.
std::string wholeFile(int fd) {
  struct stat status {};
  if (::fstat(fd, &status) != 0) return {};
  std::string bytes(static_cast<std::size_t>(status.st_size), '\0');
  const std::int64_t count = readAt(fd, std::as_writable_bytes(std::span(bytes)), 0);
  bytes.resize(count < 0 ? 0 : static_cast<std::size_t>(count));
  return bytes;
}

void visitLines(std::string_view bytes, const std::function<void(const LogLine&)>& visitor) {
  for (std::size_t end = 0; (end = bytes.find('\n')) != std::string_view::npos;) {
    if (const std::optional<LogLine> record = parseLogLine(bytes.substr(0, end))) visitor(*record);
    bytes.remove_prefix(end + 1);
  }
}

}  // namespace

LogFiles::LogFiles(const std::filesystem::path& folder, bool writable,
                   std::uint64_t fileSize) noexcept
    : writable_(writable), fileSize_(fileSize) {
  if (writable_) ::mkdir(folder.c_str(), 0755);
  folder_.reset(::open(folder.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (writable_) openNewest();
}

void LogFiles::write(LogChannel channel, LogLevel level, std::string_view text) noexcept {
  if (!writable_) return;
  const std::string line = formatLogLine(std::chrono::system_clock::now(), channel, level, text);
  const Lock lock(mutex_);
  if (size_ > 0 && size_ + line.size() > fileSize_) moveOn();
  if (!newest_) openNewest();
  if (!newest_) return;
  const std::string whole = torn_ ? '\n' + line : line;
  const ssize_t written = ::write(newest_.get(), whole.data(), whole.size());
  if (written <= 0) return;
  size_ += static_cast<std::uint64_t>(written);
  torn_ = static_cast<std::size_t>(written) < whole.size();
}

void LogFiles::read(const std::function<void(const LogLine&)>& visitor) noexcept {
  // From the newest to the oldest: when a writer moves the files on meanwhile, one may turn up
  // twice but none is missed.
  std::vector<FileDescriptor> files;
  std::vector<std::pair<dev_t, ino_t>> seen;
  for (int age = 0; age <= OldFiles; ++age) {
    FileDescriptor file(
        ::openat(folder_.get(), fileName(age).c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC));
    struct stat status {};
    if (!file || ::fstat(file.get(), &status) != 0 || !S_ISREG(status.st_mode)) continue;
    const std::pair inode(status.st_dev, status.st_ino);
    if (std::ranges::find(seen, inode) != seen.end()) continue;
    seen.push_back(inode);
    files.push_back(std::move(file));
  }
  // The newest is taken as it is now, so that a visitor that writes comes to an end.
  const std::string newest = files.empty() ? std::string() : wholeFile(files.front().get());
  for (std::size_t i = files.size(); i-- > 1;) visitLines(wholeFile(files[i].get()), visitor);
  visitLines(newest, visitor);
}

void LogFiles::openNewest() noexcept {
  newest_.reset(::openat(folder_.get(), NewestName,
                         O_RDWR | O_APPEND | O_CREAT | O_NOFOLLOW | O_CLOEXEC, 0644));
  struct stat status {};
  if (!newest_ || ::fstat(newest_.get(), &status) != 0) return;
  size_ = static_cast<std::uint64_t>(status.st_size);
  char last = '\n';
  torn_ = status.st_size > 0 &&
          (::pread(newest_.get(), &last, 1, status.st_size - 1) != 1 || last != '\n');
}

void LogFiles::moveOn() noexcept {
  for (int age = OldFiles; age > 0; --age)
    ::renameat(folder_.get(), fileName(age - 1).c_str(), folder_.get(), fileName(age).c_str());
  openNewest();
}

std::string LogFiles::fileName(int age) const {
  return age == 0 ? NewestName : std::string(NewestName) + "." + std::to_string(age);
}

}  // namespace appsync::device
