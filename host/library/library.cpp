#include "host/library/library.h"

#include <fmt/format.h>

#include <algorithm>
#include <compare>
#include <system_error>

#include "base/text.h"
#include "host/library/version.h"

namespace appsync::host {
namespace fs = std::filesystem;
namespace {

/// Packages of one application and version.
using Rivals = std::vector<PackageFacts>;

void add(PackageFacts package, Rivals& rivals) {
  const auto order = rivals.empty() ? std::weak_ordering::equivalent
                                    : compareVersions(package.version, rivals.front().version);
  if (std::is_gt(order)) rivals.clear();
  if (std::is_gteq(order)) rivals.push_back(std::move(package));
}

/// The first that is whole. Only rivals are read to their ends: of a single package the phone
/// judges what lies behind its beginning.
const PackageFacts& choose(const Rivals& rivals, std::vector<UnreadablePackage>& damaged) {
  if (rivals.size() == 1) return rivals.front();
  std::vector<UnreadablePackage> passedOver;
  for (const PackageFacts& package : rivals) {
    const auto damage = damageOf(package.file);
    if (damage) {
      passedOver.push_back({package.file.filename().string(), false, *damage});
      continue;
    }
    for (UnreadablePackage& file : passedOver) {
      file.reason += "; " + printable(package.file.filename().string()) + " is used instead";
      damaged.push_back(std::move(file));
    }
    return package;
  }
  return rivals.front();
}

}  // namespace

const PackageFacts* Library::find(std::string_view identifier) const {
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
  std::map<std::string, Rivals> rivals;
  for (const fs::path& file : files) {
    UnreadablePackage failure;
    auto package = readPackage(file, failure);
    if (package) {
      add(*package, rivals[package->identifier]);
    } else {
      library.unreadable.push_back(std::move(failure));
    }
  }
  for (const auto& [identifier, packages] : rivals) {
    library.packages.emplace(identifier, choose(packages, library.unreadable));
  }
  std::ranges::stable_sort(library.unreadable, {}, &UnreadablePackage::file);
  return library;
}

}  // namespace appsync::host
