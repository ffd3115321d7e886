#pragma once

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <filesystem>
#include <map>
#include <string>

#include "base/data_stream.h"
#include "tests/fakes/temporary_folder.h"

namespace appsync::device {

/// Gives the text in pieces of a few bytes.
inline DataSource piecesOf(std::string_view text, std::size_t piece = 1000) {
  return [text, piece](std::uint8_t* bytes, std::size_t size) mutable {
    const std::string_view next = text.substr(0, std::min(piece, size));
    std::copy(next.begin(), next.end(), bytes);
    text.remove_prefix(next.size());
    return static_cast<std::int64_t>(next.size());
  };
}

/// Everything below a folder: relative path to type, permissions, whole seconds, and contents or
/// link target.
inline std::map<std::string, std::string> treeOf(const std::filesystem::path& folder) {
  std::map<std::string, std::string> tree;
  for (const auto& item : std::filesystem::recursive_directory_iterator(folder)) {
    struct stat status {};
    EXPECT_EQ(::lstat(item.path().c_str(), &status), 0);
    std::string text = std::to_string(status.st_mode) + " " + std::to_string(status.st_mtime) + " ";
    if (S_ISREG(status.st_mode)) text += fakes::fileText(item.path());
    if (S_ISLNK(status.st_mode)) text += std::filesystem::read_symlink(item.path()).string();
    tree[item.path().lexically_relative(folder).string()] = text;
  }
  return tree;
}

}  // namespace appsync::device
