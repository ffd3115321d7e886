#include "tests/fakes/fake_file_manager.h"

#include <cerrno>
#include <utility>

namespace appsync::fakes {

namespace {

constexpr std::string_view defaultOwner = "root";

/// Cuts the next name off the front; empty at the end.
std::string_view takeName(std::string_view& rest) {
  rest.remove_prefix(std::min(rest.find_first_not_of('/'), rest.size()));
  const std::string_view name = rest.substr(0, rest.find('/'));
  rest.remove_prefix(name.size());
  return name;
}

/// Fails unless the path is one that a file manager takes.
bool isUsable(std::string_view path, std::optional<Error>* error) {
  bool usable = path.starts_with('/') && path.find('\0') == std::string_view::npos;
  std::string_view rest = path;
  for (auto name = takeName(rest); usable && !name.empty(); name = takeName(rest)) {
    usable = name != "." && name != "..";
  }
  if (!usable) setError(error, Error::posix(EINVAL, path));
  return usable;
}

bool isBelow(std::string_view path, const std::string& directory) {
  return directory == "/" || path == directory || path.starts_with(directory + "/");
}

}  // namespace

FakeFileManager::FakeFileManager(CallTrace& trace, const FakeClock& clock)
    : trace_(trace), clock_(clock) {
  for (const char* path : {"/tmp", "/var/mobile/Library", "/var/mobile/Media/PublicStaging",
                           "/var/mobile/Containers/Applications"}) {
    makeDirectories(path, {});
  }
}

std::optional<Bytes> FakeFileManager::contentsAtPath(std::string_view path,
                                                     std::optional<Error>* error) noexcept {
  trace_.add(TraceQuery, callText("FileManager.contentsAtPath", path));
  const std::scoped_lock lock(mutex_);
  const Node* node = itemAt(path, error);
  if (!node) return std::nullopt;
  if (!node->attributes.isDirectory) return node->bytes;
  setError(error, Error::posix(EISDIR, path));
  return std::nullopt;
}

bool FakeFileManager::writeAtomically(std::string_view path, ByteView bytes,
                                      std::optional<Error>* error) noexcept {
  trace_.add(TraceFile, callText("FileManager.writeAtomically", path));
  const std::scoped_lock lock(mutex_);
  return write(path, bytes, {}, error);
}

bool FakeFileManager::createFile(std::string_view path, ByteView bytes,
                                 const FileAttributes& attributes) noexcept {
  trace_.add(TraceFile,
             callText("FileManager.createFile", path,
                      attributes.owner.value_or("-") + ":" + attributes.group.value_or("-")));
  const std::scoped_lock lock(mutex_);
  return write(path, bytes, attributes, nullptr);
}

bool FakeFileManager::createDirectory(std::string_view path, bool withIntermediates,
                                      const FileAttributes& attributes,
                                      std::optional<Error>* error) noexcept {
  trace_.add(TraceFile,
             callText("FileManager.createDirectory", path, withIntermediates,
                      attributes.owner.value_or("-") + ":" + attributes.group.value_or("-")));
  if (!isUsable(path, error)) return false;
  const std::scoped_lock lock(mutex_);
  std::string current = "/";
  std::string_view rest = path;
  bool made = false;
  for (std::string_view name = takeName(rest); !name.empty(); name = takeName(rest)) {
    current = joinPath(current, name);
    made = false;
    const auto found = tree_.find(current);
    const bool last = rest.find_first_not_of('/') == std::string_view::npos;
    if (found != tree_.end() && !found->second.attributes.isDirectory) {
      setError(error, Error::posix(last ? EEXIST : ENOTDIR, path));
      return false;
    }
    if (found != tree_.end()) continue;
    if (!withIntermediates && !last) {
      setError(error, Error::posix(ENOENT, path));
      return false;
    }
    tree_.emplace(current, newNode(true, attributes));
    made = true;
  }
  if (made || withIntermediates) return true;
  setError(error, Error::posix(EEXIST, path));
  return false;
}

bool FakeFileManager::removeItem(std::string_view path, std::optional<Error>* error) noexcept {
  trace_.add(TraceFile, callText("FileManager.removeItem", path));
  const std::scoped_lock lock(mutex_);
  std::string resolved;
  if (!itemAt(path, error, &resolved)) return false;
  if (resolved == "/") {
    setError(error, Error::posix(EBUSY, path));
    return false;
  }
  eraseTree(resolved);
  return true;
}

bool FakeFileManager::moveItem(std::string_view from, std::string_view to,
                               std::optional<Error>* error) noexcept {
  trace_.add(TraceFile, callText("FileManager.moveItem", from, to));
  const std::scoped_lock lock(mutex_);
  const auto pair = resolvePair(from, to, error);
  if (!pair) return false;
  for (auto& [path, node] : subtree(pair->first)) {
    tree_.emplace(pair->second + path.substr(pair->first.size()), node);
  }
  eraseTree(pair->first);
  return true;
}

bool FakeFileManager::copyItem(std::string_view from, std::string_view to,
                               std::optional<Error>* error) noexcept {
  trace_.add(TraceFile, callText("FileManager.copyItem", from, to));
  const std::scoped_lock lock(mutex_);
  const auto pair = resolvePair(from, to, error);
  if (!pair) return false;
  for (auto& [path, node] : subtree(pair->first)) {
    Node copy =
        newNode(node.attributes.isDirectory, {node.attributes.owner, node.attributes.group});
    copy.bytes = node.bytes;
    copy.attributes.size = node.bytes.size();
    tree_.emplace(pair->second + path.substr(pair->first.size()), std::move(copy));
  }
  return true;
}

bool FakeFileManager::fileExists(std::string_view path) noexcept {
  trace_.add(TraceQuery, callText("FileManager.fileExists", path));
  return exists(path);
}

bool FakeFileManager::directoryExists(std::string_view path) noexcept {
  trace_.add(TraceQuery, callText("FileManager.directoryExists", path));
  const auto attributes = attributesAt(path);
  return attributes && attributes->isDirectory;
}

std::optional<ItemAttributes> FakeFileManager::attributesOfItem(
    std::string_view path, std::optional<Error>* error) noexcept {
  trace_.add(TraceQuery, callText("FileManager.attributesOfItem", path));
  const std::scoped_lock lock(mutex_);
  const Node* node = itemAt(path, error);
  if (!node) return std::nullopt;
  return node->attributes;
}

bool FakeFileManager::touch(std::string_view path, std::optional<Error>* error) noexcept {
  trace_.add(TraceFile, callText("FileManager.touch", path));
  const std::scoped_lock lock(mutex_);
  std::string resolved;
  if (!itemAt(path, error, &resolved)) return false;
  ItemAttributes& attributes = tree_.find(resolved)->second.attributes;
  attributes.accessTime = attributes.modificationTime = clock_.seconds();
  return true;
}

std::optional<std::string> FakeFileManager::resolve(std::string_view path,
                                                    std::optional<Error>* error) const {
  if (!isUsable(path, error)) return std::nullopt;
  std::string current = "/";
  std::string_view rest = path;
  for (std::string_view name = takeName(rest); !name.empty(); name = takeName(rest)) {
    if (!isDirectory(current)) {
      setError(error, Error::posix(tree_.contains(current) ? ENOTDIR : ENOENT, path));
      return std::nullopt;
    }
    current = joinPath(current, name);
  }
  return current;
}

const FakeFileManager::Node* FakeFileManager::itemAt(std::string_view path,
                                                     std::optional<Error>* error,
                                                     std::string* resolved) const {
  const std::optional<std::string> place = resolve(path, error);
  if (!place) return nullptr;
  const auto found = tree_.find(*place);
  if (found == tree_.end()) {
    setError(error, Error::posix(ENOENT, path));
    return nullptr;
  }
  if (resolved) *resolved = *place;
  return &found->second;
}

bool FakeFileManager::isDirectory(std::string_view path) const {
  const auto found = tree_.find(path);
  return found != tree_.end() && found->second.attributes.isDirectory;
}

FakeFileManager::Tree FakeFileManager::subtree(const std::string& path) const {
  Tree found;
  for (auto at = tree_.lower_bound(path); at != tree_.end(); ++at) {
    if (isBelow(at->first, path)) found.insert(*at);
  }
  return found;
}

void FakeFileManager::eraseTree(const std::string& path) {
  std::erase_if(tree_, [&](const auto& item) { return isBelow(item.first, path); });
}

FakeFileManager::Node FakeFileManager::newNode(bool isDirectory,
                                               const FileAttributes& attributes) const {
  Node node;
  node.attributes.isDirectory = isDirectory;
  node.attributes.owner = attributes.owner.value_or(std::string(defaultOwner));
  node.attributes.group = attributes.group.value_or(std::string(defaultOwner));
  node.attributes.modificationTime = node.attributes.accessTime = clock_.seconds();
  return node;
}

void FakeFileManager::makeDirectories(std::string_view path, const FileAttributes& attributes) {
  std::string current = "/";
  tree_.emplace(current, newNode(true, attributes));
  std::string_view rest = path;
  for (std::string_view name = takeName(rest); !name.empty(); name = takeName(rest)) {
    current = joinPath(current, name);
    tree_.emplace(current, newNode(true, attributes));
  }
}

bool FakeFileManager::write(std::string_view path, ByteView bytes, const FileAttributes& attributes,
                            std::optional<Error>* error) {
  const std::optional<std::string> place = resolve(path, error);
  if (!place) return false;
  if (isDirectory(*place)) {
    setError(error, Error::posix(EISDIR, path));
    return false;
  }
  Node node = newNode(false, attributes);
  node.bytes.assign(bytes.begin(), bytes.end());
  node.attributes.size = bytes.size();
  tree_.insert_or_assign(*place, std::move(node));
  return true;
}

std::optional<std::pair<std::string, std::string>> FakeFileManager::resolvePair(
    std::string_view from, std::string_view to, std::optional<Error>* error) const {
  std::string source;
  if (!itemAt(from, error, &source)) return std::nullopt;
  std::optional<std::string> target = resolve(to, error);
  if (!target) return std::nullopt;
  if (tree_.contains(*target)) {
    setError(error, Error::posix(EEXIST, to));
    return std::nullopt;
  }
  if (isBelow(*target, source)) {
    setError(error, Error::posix(EINVAL, to));
    return std::nullopt;
  }
  return std::pair(std::move(source), std::move(*target));
}

}  // namespace appsync::fakes
