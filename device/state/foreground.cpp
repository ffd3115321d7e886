#include "device/state/foreground.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>

#include "base/directory_tree.h"

namespace appsync::device {
namespace {

constexpr std::string_view RunningSuffix = ".running";
constexpr std::string_view HeldSuffix = ".held";

std::string fileFor(const std::string& identifier, std::string_view suffix) {
  return identifier + std::string(suffix);
}

/// The directory, locked against every other thread and process for as long as this is open.
FileDescriptor lockDirectory(const std::filesystem::path& path) {
  FileDescriptor directory(open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  while (directory && flock(directory.get(), LOCK_EX) != 0) {
    if (errno != EINTR) directory.reset();
  }
  return directory;
}

// nullopt, with errno set, when that cannot be told.

std::optional<bool> exists(const FileDescriptor& directory, const std::string& file) {
  struct stat status {};
  if (fstatat(directory.get(), file.c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0) return true;
  return errno == ENOENT ? std::optional(false) : std::nullopt;
}

std::optional<bool> isHeld(const FileDescriptor& directory, const std::string& identifier) {
  const FileDescriptor file(openat(directory.get(), fileFor(identifier, HeldSuffix).c_str(),
                                   O_RDONLY | O_CLOEXEC | O_NOFOLLOW));
  if (!file) return errno == ENOENT ? std::optional(false) : std::nullopt;
  if (flock(file.get(), LOCK_EX | LOCK_NB) == 0) return false;
  return errno == EWOULDBLOCK ? std::optional(true) : std::nullopt;
}

class Hold final : public TerminationAssertion {
 public:
  Hold(std::filesystem::path directory, std::string name, FileDescriptor file)
      : directory_(std::move(directory)), name_(std::move(name)), file_(std::move(file)) {}

  ~Hold() override {
    const FileDescriptor directory = lockDirectory(directory_);
    // Another hold of the same application keeps the file.
    const bool last = flock(file_.get(), LOCK_EX | LOCK_NB) == 0;
    if (directory && last) unlinkat(directory.get(), name_.c_str(), 0);
  }

 private:
  const std::filesystem::path directory_;
  const std::string name_;
  const FileDescriptor file_;
};

/// The identifiers of all files with this suffix, sorted.
std::vector<std::string> identifiersWith(const std::filesystem::path& directory,
                                         std::string_view suffix) {
  std::vector<std::string> names, identifiers;
  const FileDescriptor opened(open(directory.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (!opened || !listNames(opened.get(), names)) return identifiers;
  for (const std::string& name : names) {
    if (!name.ends_with(suffix)) continue;
    identifiers.push_back(name.substr(0, name.size() - suffix.size()));
  }
  std::ranges::sort(identifiers);
  return identifiers;
}

}  // namespace

std::vector<std::string> Foreground::running() const {
  return identifiersWith(directory_, RunningSuffix);
}

bool Foreground::launch(const std::string& identifier,
                        const std::function<std::optional<Error>()>& objection,
                        std::optional<Error>* error) const {
  const auto fail = [&] { return failWith(error, Error::posix(errno, directory_.native())); };
  const FileDescriptor directory = lockDirectory(directory_);
  if (!directory) return fail();
  if (const auto reason = objection()) return failWith(error, *reason);
  const std::optional<bool> held = isHeld(directory, identifier);
  if (!held) return fail();
  if (*held) {
    return failWith(error, Error::withDescription(
                               POSIXErrorDomain, EBUSY,
                               fmt::format("{} is being installed; try again later", identifier)));
  }
  const FileDescriptor file(openat(directory.get(), fileFor(identifier, RunningSuffix).c_str(),
                                   O_WRONLY | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0644));
  return file || fail();
}

bool Foreground::quit(const std::string& identifier, std::optional<Error>* error) const {
  const FileDescriptor directory = lockDirectory(directory_);
  if (directory && (unlinkat(directory.get(), fileFor(identifier, RunningSuffix).c_str(), 0) == 0 ||
                    errno == ENOENT)) {
    return true;
  }
  return failWith(error, Error::posix(errno, directory_.native()));
}

Foreground::HoldResult Foreground::hold(const std::string& identifier) const {
  const FileDescriptor directory = lockDirectory(directory_);
  if (!directory) return {};
  const std::optional<bool> running = exists(directory, fileFor(identifier, RunningSuffix));
  if (!running || *running) return {nullptr, running.has_value()};
  const std::string name = fileFor(identifier, HeldSuffix);
  FileDescriptor file(
      openat(directory.get(), name.c_str(), O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0644));
  if (!file || flock(file.get(), LOCK_SH | LOCK_NB) != 0) return {};
  return {std::make_unique<Hold>(directory_, name, std::move(file)), false};
}

void Foreground::sweep() const {
  const FileDescriptor directory = lockDirectory(directory_);
  if (!directory) return;
  for (const std::string& identifier : identifiersWith(directory_, HeldSuffix)) {
    if (isHeld(directory, identifier) != false) continue;
    unlinkat(directory.get(), fileFor(identifier, HeldSuffix).c_str(), 0);
  }
}

}  // namespace appsync::device
