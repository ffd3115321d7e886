#include "platform/existence.h"

#include <cerrno>

#include "platform/bundle.h"
#include "platform/property_list_codec.h"

namespace appsync {

bool isMissing(const std::optional<Error>& reason) {
  return reason && reason->domain == POSIXErrorDomain && reason->code == ENOENT;
}

std::optional<bool> isThere(FileManager& files, std::string_view path,
                            std::optional<Error>* error) {
  std::optional<Error> reason;
  if (files.attributesOfItem(path, &reason)) return true;
  if (isMissing(reason)) return false;
  setError(error, *std::move(reason));
  return std::nullopt;
}

bool readIfThere(FileManager& files, std::string_view path, std::optional<Bytes>& contents,
                 std::optional<Error>* error) {
  std::optional<Error> reason;
  contents = files.contentsAtPath(path, &reason);
  if (contents || isMissing(reason)) return true;
  return failWith(error, *std::move(reason));
}

std::optional<PropertyList::Dictionary> readDictionary(FileManager& files, std::string_view path,
                                                       std::optional<Error>* error) {
  std::optional<Bytes> bytes;
  if (!readIfThere(files, path, bytes, error)) return std::nullopt;
  auto dictionary = bytes ? parseDictionary(*bytes) : std::nullopt;
  return dictionary ? dictionary : PropertyList::Dictionary{};
}

std::optional<bool> isExecutableThere(FileManager& files, std::string_view bundlePath,
                                      std::optional<Error>* error) {
  const auto info = loadDictionary(files, joinPath(bundlePath, "Info.plist"), error);
  if (!info) return std::nullopt;
  const std::string* name = findString(*info, KBBundleExecutable);
  return name ? isThere(files, joinPath(bundlePath, *name), error) : true;
}

bool isFile(FileManager& files, std::string_view path) {
  const auto attributes = files.attributesOfItem(path);
  return attributes && !attributes->isDirectory;
}

}  // namespace appsync
