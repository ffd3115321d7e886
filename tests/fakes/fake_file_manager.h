#pragma once

#include <map>
#include <mutex>
#include <set>

#include "platform/file_manager.h"
#include "platform/property_list_codec.h"
#include "tests/fakes/call_trace.h"
#include "tests/fakes/fake_clock.h"

namespace appsync::fakes {

/// The phone's file system in memory, without links. It begins with the directories that a phone
/// always has. What a test or another fake does to it through the operations below the interface is
/// not traced.
class FakeFileManager : public FileManager {
 public:
  FakeFileManager(CallTrace& trace, const FakeClock& clock);

  // FileManager
  std::optional<Bytes> contentsAtPath(std::string_view path,
                                      std::optional<Error>* error) noexcept override;
  bool writeAtomically(std::string_view path, ByteView bytes,
                       std::optional<Error>* error) noexcept override;
  bool createFile(std::string_view path, ByteView bytes,
                  const FileAttributes& attributes) noexcept override;
  bool createDirectory(std::string_view path, bool withIntermediates,
                       const FileAttributes& attributes,
                       std::optional<Error>* error) noexcept override;
  bool removeItem(std::string_view path, std::optional<Error>* error) noexcept override;
  bool moveItem(std::string_view from, std::string_view to,
                std::optional<Error>* error) noexcept override;
  bool copyItem(std::string_view from, std::string_view to,
                std::optional<Error>* error) noexcept override;
  bool fileExists(std::string_view path) noexcept override;
  bool directoryExists(std::string_view path) noexcept override;
  std::optional<ItemAttributes> attributesOfItem(std::string_view path,
                                                 std::optional<Error>* error) noexcept override;
  bool touch(std::string_view path, std::optional<Error>* error) noexcept override;
  std::string temporaryDirectory() noexcept override { return "/tmp"; }

  // What tests look at.
  std::map<std::string, Bytes> files() const;
  std::set<std::string> directories() const;
  bool exists(std::string_view path) const;
  std::optional<Bytes> bytesAt(std::string_view path) const;
  std::optional<std::string> textAt(std::string_view path) const;
  /// nullopt also when the file is no property list.
  std::optional<PropertyList> plistAt(std::string_view path) const;
  /// Owner and group, times and size.
  std::optional<ItemAttributes> attributesAt(std::string_view path) const;

  // What tests put there; missing parents are made.
  void putFile(std::string_view path, Bytes bytes);
  void putFile(std::string_view path, std::string_view text) { putFile(path, toBytes(text)); }
  /// A null value, or anything else that no file can hold, puts nothing.
  void putPlist(std::string_view path, const PropertyList& value,
                PropertyListFormat format = PropertyListFormat::Xml);
  void putDirectory(std::string_view path);
  /// Removes whatever stands there.
  void erase(std::string_view path);
  /// Copies whatever stands there, over anything at the target.
  void putCopy(std::string_view from, std::string_view to);
  void setModificationTime(std::string_view path, double seconds);

 private:
  struct Node {
    ItemAttributes attributes;
    Bytes bytes;
  };
  using Tree = std::map<std::string, Node, std::less<>>;

  // All below: the lock is held. Paths given to them are absolute, without "." and "..".
  /// The path without ".", ".." and double slashes. Its parent must be a directory.
  std::optional<std::string> resolve(std::string_view path, std::optional<Error>* error) const;
  /// The same, of an item that must be there.
  const Node* itemAt(std::string_view path, std::optional<Error>* error,
                     std::string* resolved = nullptr) const;
  bool isDirectory(std::string_view path) const;
  Tree subtree(const std::string& path) const;
  void eraseTree(const std::string& path);
  Node newNode(bool isDirectory, const FileAttributes& attributes) const;
  void makeDirectories(std::string_view path, const FileAttributes& attributes);
  bool write(std::string_view path, ByteView bytes, const FileAttributes& attributes,
             std::optional<Error>* error);
  /// Source and target of a move or copy, checked.
  std::optional<std::pair<std::string, std::string>> resolvePair(std::string_view from,
                                                                 std::string_view to,
                                                                 std::optional<Error>* error) const;

  CallTrace& trace_;
  const FakeClock& clock_;
  mutable std::mutex mutex_;
  Tree tree_;
};

}  // namespace appsync::fakes
