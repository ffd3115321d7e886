#include "tests/fakes/temporary_folder.h"

#include <stdlib.h>
#include <unistd.h>

#include <cstdio>
#include <fstream>
#include <iterator>
#include <stdexcept>

namespace appsync::fakes {

namespace fs = std::filesystem;

TemporaryFolder::TemporaryFolder(const fs::path& parent) {
  std::string pattern = (parent / "appsync-test-XXXXXX").string();
  if (!::mkdtemp(pattern.data())) throw std::runtime_error("cannot make " + pattern);
  path_ = pattern;
}

TemporaryFolder::~TemporaryFolder() {
  std::error_code ignored;
  fs::remove_all(path_, ignored);
}

fs::path memoryFolder() {
  constexpr char Memory[] = "/dev/shm";
  return ::access(Memory, W_OK) == 0 ? fs::path(Memory) : fs::temp_directory_path();
}

void putFile(const fs::path& path, std::string_view contents) {
  fs::create_directories(path.parent_path());
  std::ofstream(path, std::ios::binary) << contents;
}

std::string fileText(const fs::path& path) {
  std::ifstream file(path, std::ios::binary);
  return {std::istreambuf_iterator<char>(file), {}};
}

std::map<std::string, std::string> snapshot(const fs::path& folder) {
  std::map<std::string, std::string> items;
  for (const fs::directory_entry& entry : fs::recursive_directory_iterator(folder)) {
    const fs::file_status status = entry.symlink_status();
    char permissions[8];
    std::snprintf(permissions, sizeof permissions, "%04o",
                  static_cast<unsigned>(status.permissions()));
    std::string& item = items[fs::relative(entry.path(), folder).string()];
    if (fs::is_symlink(status)) {
      item = "link " + fs::read_symlink(entry.path()).string();
    } else if (fs::is_directory(status)) {
      item = std::string("folder ") + permissions;
    } else if (fs::is_regular_file(status)) {
      item = std::string("file ") + permissions + " " + fileText(entry.path());
    } else {
      item = "special";
    }
  }
  return items;
}

}  // namespace appsync::fakes
