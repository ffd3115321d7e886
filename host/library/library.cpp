#include "host/library/library.h"

#include <fmt/format.h>

#include <algorithm>
#include <compare>
#include <system_error>

#include "host/base/text.h"
#include "host/base/version.h"

namespace appsync::host {
namespace fs = std::filesystem;
namespace {

void add(Library& library, const fs::path& file) {
  UnreadablePackage failure;
  auto package = readPackage(file, failure);
  if (!package) {
    library.unreadable.push_back(std::move(failure));
    return;
  }
  const auto [place, isNew] = library.packages.try_emplace(package->identifier, *package);
  if (!isNew && std::is_gt(compareVersions(package->version, place->second.version))) {
    place->second = std::move(*package);
  }
}

}  // namespace

const LibraryPackage* Library::find(std::string_view identifier) const {
  const auto found = packages.find(identifier);
  return found == packages.end() ? nullptr : &found->second;
}

std::optional<Library> readLibrary(const fs::path& folder, std::string& problem) {
  Library library{folder, {}, {}};
  std::error_code error;
  std::vector<fs::path> files;
  for (fs::directory_iterator item(folder, error), end; !error && item != end;
       item.increment(error)) {
    std::error_code ignored;
    const bool hidden = item->path().filename().string().starts_with('.');
    if (!hidden && item->is_regular_file(ignored)) files.push_back(item->path());
  }
  if (error) {
    problem =
        fmt::format("cannot read the library {}: {}", printable(folder.string()), error.message());
    return std::nullopt;
  }
  std::sort(files.begin(), files.end());
  for (const fs::path& file : files) add(library, file);
  return library;
}

}  // namespace appsync::host
