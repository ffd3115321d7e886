#include "base/program_parts.h"

#include <system_error>

namespace appsync {
namespace fs = std::filesystem;

std::vector<fs::path> programPartFolders() {
  std::error_code error;
  const fs::path folder = fs::read_symlink("/proc/self/exe", error).parent_path();
  return {folder, folder.parent_path() / "lib" / "appsync"};
}

std::optional<fs::path> findProgramPart(std::string_view name) {
  std::error_code error;
  for (const fs::path& folder : programPartFolders()) {
    if (fs::exists(folder / name, error)) return folder / name;
  }
  return std::nullopt;
}

}  // namespace appsync
