#pragma once

#include <filesystem>
#include <map>
#include <string>
#include <string_view>

#include "platform/property_list.h"

namespace appsync::host::testing {

/// A new empty folder that disappears with the object.
class Folder {
 public:
  explicit Folder(const std::filesystem::path& parent = std::filesystem::temp_directory_path());
  ~Folder();
  Folder(const Folder&) = delete;
  Folder& operator=(const Folder&) = delete;
  const std::filesystem::path& path() const { return path_; }
  std::filesystem::path operator/(std::string_view name) const { return path_ / name; }

 private:
  std::filesystem::path path_;
};

/// Where a test that would wait for the disk ten thousand times keeps its folder; what it shows
/// must need no disk.
std::filesystem::path memoryFolder();

/// Makes missing folders on the way.
void putFile(const std::filesystem::path& path, std::string_view contents);
std::string fileText(const std::filesystem::path& path);

/// What an archive holds: entry name to contents.
using Entries = std::map<std::string, std::string>;
/// Packs the entries in the format that the file's ending names. Nothing is checked.
void pack(const std::filesystem::path& file, const Entries& entries);

PropertyList::Dictionary appInfo(std::string_view identifier, std::string_view version,
                                 std::string_view name);
std::string xmlText(const PropertyList& value);
/// "Sample.app" of this application with an icon, a program and both metadata files.
Entries sampleEntries(std::string_view identifier, std::string_view version = "1.0",
                      std::string_view name = "Sample");
/// A package of the sample with a body of so many bytes that do not compress.
void packSample(const std::filesystem::path& file, std::string_view identifier,
                std::string_view version = "1.0", std::size_t bodySize = 0);

}  // namespace appsync::host::testing
