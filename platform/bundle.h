#pragma once

#include <optional>
#include <string>

#include "platform/file_manager.h"
#include "platform/property_list.h"

namespace appsync {

// Keys of a bundle's information dictionary.
inline constexpr std::string_view KBBundleIdentifier = "KBBundleIdentifier";
inline constexpr std::string_view KBBundleVersion = "KBBundleVersion";
inline constexpr std::string_view KBBundleDisplayName = "KBBundleDisplayName";
inline constexpr std::string_view KBBundleExecutable = "KBBundleExecutable";
inline constexpr std::string_view KBBundleIconFile = "KBBundleIconFile";

/// A directory that holds an application's files and, in "Info.plist", its information dictionary.
class Bundle {
 public:
  /// nullopt when there is no directory at the location. A missing or unreadable Info.plist gives
  /// an empty information dictionary.
  static std::optional<Bundle> open(FileManager& files, const FileLocation& location);

  const std::string& path() const { return path_; }
  const PropertyList::Dictionary& infoDictionary() const { return info_; }

 private:
  Bundle(std::string path, PropertyList::Dictionary info)
      : path_(std::move(path)), info_(std::move(info)) {}

  std::string path_;
  PropertyList::Dictionary info_;
};

/// The dictionary in the property-list file at `path`; nullopt when there is none to be had.
[[nodiscard]] std::optional<PropertyList::Dictionary> loadDictionary(
    FileManager& files, std::string_view path, std::optional<Error>* error = nullptr);

}  // namespace appsync
