#include "transfer/package_path.h"

#include <cerrno>

#include "client/identifier_safety.h"
#include "client/paths.h"

namespace appsync {
namespace {

bool liesBelow(std::string_view path, std::string_view directory) {
  return path.starts_with(directory) && path.substr(directory.size()).starts_with('/');
}

bool liesWherePackagesArrive(const std::optional<std::string>& path) {
  return isSafe(path) &&
         (liesBelow(*path, paths::StagingRoot) || liesBelow(*path, paths::Downloads));
}

}  // namespace

bool isPackagePath(FileManager& files, const std::optional<std::string>& path) {
  if (!liesWherePackagesArrive(path)) return false;
  std::optional<Error> reason;
  const std::optional<ItemAttributes> item = files.attributesOfItem(*path, &reason);
  if (item) return !item->isDirectory;
  const bool isNoPath = reason && reason->domain == POSIXErrorDomain && reason->code == EINVAL;
  return !isNoPath;
}

void removePackage(FileManager& files, const std::optional<std::string>& path) {
  if (!liesWherePackagesArrive(path)) return;
  const std::optional<ItemAttributes> item = files.attributesOfItem(*path);
  if (item && !item->isDirectory) files.removeItem(*path);
}

}  // namespace appsync
