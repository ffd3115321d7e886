// The test's side of FakeFileManager: what it finds there and puts there.
#include "tests/fakes/fake_file_manager.h"

namespace appsync::fakes {

std::map<std::string, Bytes> FakeFileManager::files() const {
  const std::scoped_lock lock(mutex_);
  std::map<std::string, Bytes> found;
  for (const auto& [path, node] : tree_) {
    if (!node.attributes.isDirectory) found.emplace(path, node.bytes);
  }
  return found;
}

std::set<std::string> FakeFileManager::directories() const {
  const std::scoped_lock lock(mutex_);
  std::set<std::string> found;
  for (const auto& [path, node] : tree_) {
    if (node.attributes.isDirectory) found.insert(path);
  }
  return found;
}

bool FakeFileManager::exists(std::string_view path) const { return attributesAt(path).has_value(); }

std::optional<Bytes> FakeFileManager::bytesAt(std::string_view path) const {
  const std::scoped_lock lock(mutex_);
  const Node* node = itemAt(path, nullptr);
  if (!node || node->attributes.isDirectory) return std::nullopt;
  return node->bytes;
}

std::optional<std::string> FakeFileManager::textAt(std::string_view path) const {
  const std::optional<Bytes> bytes = bytesAt(path);
  if (!bytes) return std::nullopt;
  return std::string(asText(*bytes));
}

std::optional<PropertyList> FakeFileManager::plistAt(std::string_view path) const {
  const std::optional<Bytes> bytes = bytesAt(path);
  if (!bytes) return std::nullopt;
  return parsePropertyList(*bytes);
}

std::optional<ItemAttributes> FakeFileManager::attributesAt(std::string_view path) const {
  const std::scoped_lock lock(mutex_);
  const Node* node = itemAt(path, nullptr);
  if (!node) return std::nullopt;
  return node->attributes;
}

void FakeFileManager::putFile(std::string_view path, Bytes bytes) {
  const std::scoped_lock lock(mutex_);
  makeDirectories(path.substr(0, path.rfind('/')), {});
  write(path, bytes, {}, nullptr);
}

void FakeFileManager::putPlist(std::string_view path, const PropertyList& value,
                               PropertyListFormat format) {
  if (const auto bytes = serializePropertyList(value, format)) putFile(path, *bytes);
}

void FakeFileManager::putDirectory(std::string_view path) {
  const std::scoped_lock lock(mutex_);
  makeDirectories(path, {});
}

void FakeFileManager::erase(std::string_view path) {
  const std::scoped_lock lock(mutex_);
  std::string resolved;
  if (itemAt(path, nullptr, &resolved)) eraseTree(resolved);
}

void FakeFileManager::putCopy(std::string_view from, std::string_view to) {
  const std::scoped_lock lock(mutex_);
  std::string source;
  if (!itemAt(from, nullptr, &source)) return;
  const Tree copied = subtree(source);
  makeDirectories(to.substr(0, to.rfind('/')), {});
  eraseTree(std::string(to));
  for (const auto& [path, node] : copied) {
    tree_.insert_or_assign(std::string(to) + path.substr(source.size()), node);
  }
}

void FakeFileManager::setModificationTime(std::string_view path, double seconds) {
  const std::scoped_lock lock(mutex_);
  std::string resolved;
  if (!itemAt(path, nullptr, &resolved)) return;
  ItemAttributes& attributes = tree_.find(resolved)->second.attributes;
  attributes.modificationTime = attributes.accessTime = seconds;
}

}  // namespace appsync::fakes
