#pragma once

#include <string>
#include <string_view>

#include "base/durability.h"
#include "base/file_descriptor.h"

namespace appsync {

/// A name that nothing in any directory has by chance.
std::string makeTemporaryName();
bool isTemporaryName(std::string_view name) noexcept;

/// A file being written under a temporary name; it takes its place in one step, or disappears with
/// the object.
class TemporaryFile {
 public:
  /// Borrows an open directory for as long as it lives. Check isOpen (errno says why not).
  explicit TemporaryFile(int directory) noexcept;
  ~TemporaryFile();
  TemporaryFile(const TemporaryFile&) = delete;
  TemporaryFile& operator=(const TemporaryFile&) = delete;

  bool isOpen() const noexcept { return static_cast<bool>(file_); }
  int fd() const noexcept { return file_.get(); }

  /// Replaces what has this name in the directory, except a directory. False with errno set; the
  /// name then still has what it had, unless only putting the directory on disk failed.
  [[nodiscard]] bool takePlaceOf(const std::string& name, Durability durability) noexcept;

 private:
  int directory_;
  std::string name_;
  FileDescriptor file_;
};

}  // namespace appsync
