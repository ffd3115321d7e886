#include "device/files/containers.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/random.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <tuple>

#include "base/temporary_file.h"
#include "platform/existence.h"
#include "platform/sync_files.h"

namespace appsync::device {
namespace {

/// Begins with a character that no identifier has.
constexpr std::string_view AsideEnding = "~older";
constexpr std::string_view ApplicationsDirectory = "/var/mobile/Containers/Applications";

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
  return joinPath(exchange::WaitingData, identifier);
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

void Containers::remove(const std::string& container) {
  std::ignore = removeIfThere(container, nullptr);
}

bool Containers::removeIfThere(const std::string& path, std::optional<Error>* error) {
  std::optional<Error> reason;
  if (files_.removeItem(path, &reason) || isMissing(reason)) return true;
  log_.write(LogChannel::TWLogCategoryFramework, LogLevel::Error,
             fmt::format("{} could not be removed: {}", path, reason->localizedDescription()));
  return failWith(error, *std::move(reason));
}

std::optional<std::vector<std::string>> Containers::namesIn(std::string_view directory,
                                                            std::optional<Error>* error) {
  std::vector<std::string> names;
  std::optional<Error> reason;
  const FileDescriptor opened = handles_.openDirectory(directory, &reason);
  if (!opened && isMissing(reason)) return names;
  if (opened && listNames(opened.get(), names)) return names;
  setError(error, opened ? Error::posix(errno, directory) : *reason);
  return std::nullopt;
}

std::optional<std::vector<std::string>> Containers::list(std::optional<Error>* error) {
  std::optional<std::vector<std::string>> paths = namesIn(ApplicationsDirectory, error);
  if (!paths) return paths;
  for (std::string& path : *paths) path = joinPath(ApplicationsDirectory, path);
  return paths;
}

bool Containers::flush(std::optional<Error>* error) {
  Flush failure;
  flushes_.serve(failure);
  return !failure || failWith(error, *std::move(failure));
}

Containers::Flush Containers::flushNow() {
  Flush failure;
  const FileDescriptor directory = handles_.openDirectory(ApplicationsDirectory, &failure);
  if (directory && !syncFileSystem(directory.get())) {
    failure = Error::posix(errno, ApplicationsDirectory);
  }
  return failure;
}

std::optional<bool> Containers::dataWaits(std::string_view identifier,
                                          std::optional<Error>* error) {
  const auto names = namesIn(waitingDataPath(identifier), error);
  return names ? std::optional(!names->empty()) : std::nullopt;
}

bool Containers::adoptWaitingData(std::string_view identifier, std::optional<Error>* error) {
  const std::string data = dataPath(identifier);
  const std::string aside = dataPath(asideName(identifier));
  if (!files_.createDirectory(DataDirectory, true, {}, error)) return false;
  std::optional<Error> reason;
  const bool hadData = files_.moveItem(data, aside, &reason);
  const bool adopted =
      (hadData || isMissing(reason)) && files_.moveItem(waitingDataPath(identifier), data, &reason);
  if (adopted) return true;
  // What cannot be put back is when the device is next opened.
  if (hadData) std::ignore = files_.moveItem(aside, data);
  return failWith(error, *std::move(reason));
}

bool Containers::undoAdoption(std::string_view identifier, std::optional<Error>* error) {
  const std::string data = dataPath(identifier);
  const std::string aside = dataPath(asideName(identifier));
  const std::string waiting = waitingDataPath(identifier);
  const auto isAside = isThere(files_, aside, error);
  if (!isAside || !*isAside) return isAside.has_value();
  const auto adopted = isThere(files_, data, error);
  const auto waits = adopted ? isThere(files_, waiting, error) : std::nullopt;
  if (!waits) return false;
  if (*adopted) {
    // What waits by now has come later, and from a backup too.
    const bool cleared = *waits ? files_.removeItem(data, error)
                                : files_.createDirectory(exchange::WaitingData, true, {}, error) &&
                                      files_.moveItem(data, waiting, error);
    if (!cleared) return false;
  }
  return files_.moveItem(aside, data, error);
}

std::string Containers::asideName(std::string_view identifier) {
  return std::string(identifier).append(AsideEnding);
}

std::vector<std::string> Containers::setAside() {
  std::vector<std::string> names =
      namesIn(DataDirectory, nullptr).value_or(std::vector<std::string>{});
  std::erase_if(names, [](const std::string& name) { return !name.ends_with(AsideEnding); });
  for (std::string& name : names) name.resize(name.size() - AsideEnding.size());
  return names;
}

bool Containers::removeWaitingData(std::string_view identifier, std::optional<Error>* error) {
  return removeIfThere(waitingDataPath(identifier), error);
}

bool Containers::makeData(std::string_view identifier, std::optional<Error>* error) {
  return files_.createDirectory(dataPath(identifier), true, {}, error);
}

void Containers::removeEmptyData(const std::set<std::string>& besides) {
  const FileDescriptor directory = handles_.openDirectory(DataDirectory);
  std::vector<std::string> names;
  if (!directory || !listNames(directory.get(), names)) return;
  for (const std::string& name : names) {
    // The system itself refuses when there is something in it.
    if (!besides.contains(name)) ::unlinkat(directory.get(), name.c_str(), AT_REMOVEDIR);
  }
}

bool Containers::removeData(std::string_view identifier, std::optional<Error>* error) {
  return removeIfThere(dataPath(identifier), error);
}

}  // namespace appsync::device
