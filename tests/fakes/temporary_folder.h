#pragma once

#include <filesystem>
#include <map>
#include <string>
#include <string_view>

namespace appsync::fakes {

/// A new empty folder that disappears with the object.
class TemporaryFolder {
 public:
  explicit TemporaryFolder(
      const std::filesystem::path& parent = std::filesystem::temp_directory_path());
  ~TemporaryFolder();
  TemporaryFolder(const TemporaryFolder&) = delete;
  TemporaryFolder& operator=(const TemporaryFolder&) = delete;

  const std::filesystem::path& path() const { return path_; }
  std::filesystem::path operator/(std::string_view name) const { return path_ / name; }

 private:
  std::filesystem::path path_;
};

/// For what would wait for the disk thousands of times and shows nothing that needs one.
std::filesystem::path memoryFolder();

/// Makes missing folders on the way.
void putFile(const std::filesystem::path& path, std::string_view contents);
std::string fileText(const std::filesystem::path& path);

/// Everything below a folder: relative path to "<type><permissions> <contents or link target>".
std::map<std::string, std::string> snapshot(const std::filesystem::path& folder);

}  // namespace appsync::fakes
