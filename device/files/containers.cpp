#include "device/files/containers.h"

#include <dirent.h>
#include <fmt/format.h>
#include <sys/random.h>

#include <array>
#include <cerrno>
#include <memory>

namespace appsync::device {
namespace {

constexpr std::string_view ApplicationsDirectory = "/var/mobile/Containers/Applications";
constexpr std::string_view WaitingDataDirectory = "/var/mobile/Media/HalvoRestore/Data";

/// A random UUID, as the names of containers are.
std::string makeUuid() {
  std::array<unsigned char, 16> bytes;
  // Small requests are always answered whole once the system has started.
  if (getrandom(bytes.data(), bytes.size(), 0) != static_cast<ssize_t>(bytes.size())) return {};
  bytes[6] = static_cast<unsigned char>((bytes[6] & 0x0f) | 0x40);
  bytes[8] = static_cast<unsigned char>((bytes[8] & 0x3f) | 0x80);
  std::string text;
  for (std::size_t i = 0; i < bytes.size(); ++i) {
    if (i == 4 || i == 6 || i == 8 || i == 10) text += '-';
    text += fmt::format("{:02X}", bytes[i]);
  }
  return text;
}

}  // namespace

std::string Containers::dataPath(std::string_view identifier) {
  return joinPath(DataDirectory, identifier);
}

std::string Containers::waitingDataPath(std::string_view identifier) {
  return joinPath(WaitingDataDirectory, identifier);
}

std::optional<std::string> Containers::make(std::optional<Error>* error) {
  const std::string uuid = makeUuid();
  if (uuid.empty()) {
    setError(error, Error::posix(EAGAIN));
    return std::nullopt;
  }
  const std::string path = joinPath(ApplicationsDirectory, uuid);
  if (!files_.createDirectory(ApplicationsDirectory, true, {}, error) ||
      !files_.createDirectory(path, false, {}, error)) {
    return std::nullopt;
  }
  return path;
}

void Containers::remove(const std::string& container) { removeIfThere(container); }

bool Containers::removeIfThere(const std::string& path) {
  std::optional<Error> error;
  if (files_.removeItem(path, &error)) return true;
  if (error && error->domain == POSIXErrorDomain && error->code == ENOENT) return true;
  log_.write(LogChannel::TWLogCategoryFramework, LogLevel::Error,
             fmt::format("{} could not be removed: {}", path,
                         error ? error->localizedDescription() : "unknown reason"));
  return false;
}

std::vector<std::string> Containers::namesIn(std::string_view directory) {
  std::vector<std::string> names;
  FileDescriptor opened = handles_.openDirectory(directory);
  if (!opened) return names;
  const std::unique_ptr<DIR, int (*)(DIR*)> stream(fdopendir(opened.get()), closedir);
  if (!stream) return names;
  opened.release();
  while (const dirent* entry = readdir(stream.get())) {
    const std::string_view name = entry->d_name;
    if (name != "." && name != "..") names.emplace_back(name);
  }
  return names;
}

std::vector<std::string> Containers::list() {
  std::vector<std::string> paths = namesIn(ApplicationsDirectory);
  for (std::string& path : paths) path = joinPath(ApplicationsDirectory, path);
  return paths;
}

bool Containers::flush(std::optional<Error>* error) {
  const FileDescriptor directory = handles_.openDirectory(ApplicationsDirectory, error);
  if (!directory) return false;
  if (syncFileSystem(directory.get())) return true;
  setError(error, Error::posix(errno, ApplicationsDirectory));
  return false;
}

bool Containers::dataWaits(std::string_view identifier) {
  return !namesIn(waitingDataPath(identifier)).empty();
}

bool Containers::adoptWaitingData(std::string_view identifier, std::optional<Error>* error) {
  if (!removeData(identifier)) {
    setError(error, Error::posix(EIO, dataPath(identifier)));
    return false;
  }
  return files_.createDirectory(DataDirectory, true, {}, error) &&
         files_.moveItem(waitingDataPath(identifier), dataPath(identifier), error);
}

bool Containers::removeWaitingData(std::string_view identifier) {
  return removeIfThere(waitingDataPath(identifier));
}

bool Containers::makeData(std::string_view identifier, std::optional<Error>* error) {
  return files_.createDirectory(dataPath(identifier), true, {}, error);
}

std::vector<std::string> Containers::emptyData() {
  std::vector<std::string> identifiers = namesIn(DataDirectory);
  std::erase_if(identifiers, [&](const std::string& identifier) {
    return !namesIn(dataPath(identifier)).empty();
  });
  return identifiers;
}

bool Containers::removeData(std::string_view identifier) {
  return removeIfThere(dataPath(identifier));
}

}  // namespace appsync::device
