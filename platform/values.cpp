#include <cstring>

#include "platform/bundle.h"
#include "platform/install_coordination.h"
#include "platform/log.h"
#include "platform/property_list_codec.h"
#include "platform/sync_asset.h"

namespace appsync {

std::string_view name(LogChannel channel) {
  switch (channel) {
    case LogChannel::TWLogCategorySyncBundle:
      return "TWLogCategorySyncBundle";
    case LogChannel::TWLogCategorySyncBundle_Oversize:
      return "TWLogCategorySyncBundle_Oversize";
    case LogChannel::TWLogCategoryFramework:
      return "TWLogCategoryFramework";
  }
  return "unknown";
}

std::string_view name(LogLevel level) {
  switch (level) {
    case LogLevel::Default:
      return "default";
    case LogLevel::Info:
      return "info";
    case LogLevel::Debug:
      return "debug";
    case LogLevel::Error:
      return "error";
    case LogLevel::Fault:
      return "fault";
  }
  return "unknown";
}

Error Error::withDescription(std::string_view domain, std::int64_t code, std::string_view text) {
  Error error{std::string(domain), code, {}, nullptr};
  error.userInfo.emplace(ErrorDescriptionKey, text);
  return error;
}

Error Error::posix(int errnoValue, std::string_view path) {
  std::string text = path.empty() ? std::string() : std::string(path) + ": ";
  text += std::strerror(errnoValue);  // NOLINT(concurrency-mt-unsafe): safe in glibc
  return withDescription(POSIXErrorDomain, errnoValue, text);
}

std::string Error::localizedDescription() const {
  if (const std::string* text = findString(userInfo, ErrorDescriptionKey)) return *text;
  return domain + " error " + std::to_string(code);
}

bool Error::operator==(const Error& other) const {
  const bool sameCause = underlying && other.underlying ? *underlying == *other.underlying
                                                        : underlying == other.underlying;
  return domain == other.domain && code == other.code && userInfo == other.userInfo && sameCause;
}

std::string description(const Error& error) {
  std::string text = "Error Domain=" + error.domain + " Code=" + std::to_string(error.code);
  if (!error.userInfo.empty()) text += " " + description(error.userInfo);
  if (error.underlying) text += " (" + description(*error.underlying) + ")";
  return text;
}

std::string joinPath(std::string_view directory, std::string_view name) {
  std::string path(directory);
  if (path.empty() || path.back() != '/') path += '/';
  return path.append(name);
}

std::optional<PropertyList::Dictionary> loadDictionary(FileManager& files, std::string_view path,
                                                       std::optional<Error>* error) {
  const std::optional<Bytes> bytes = files.contentsAtPath(path, error);
  return bytes ? parseDictionary(*bytes, error) : std::nullopt;
}

std::optional<Bundle> Bundle::open(FileManager& files, const FileLocation& location) {
  if (!files.directoryExists(location.path)) return std::nullopt;
  return Bundle(location.path, loadDictionary(files, joinPath(location.path, "Info.plist"))
                                   .value_or(PropertyList::Dictionary{}));
}

std::string description(const AppRecord& record) {
  return record.applicationIdentifier + (record.isPlaceholder ? " (placeholder)" : "");
}

std::optional<std::string> versionOf(const SyncAsset& asset) {
  const std::string* version = findString(asset.variantOptions, AssetVersionKey);
  return version ? std::optional(*version) : std::nullopt;
}

std::string description(const SyncAsset& asset) {
  return asset.shortDescription.empty() ? asset.identifier : asset.shortDescription;
}

std::string description(const PlaceholderAttributes& attributes) {
  PropertyList::Dictionary shown = attributes.infoDictionary;
  shown.insert_or_assign("launchProhibited", attributes.launchProhibited);
  if (attributes.bundleVersion) shown.insert_or_assign("bundleVersion", *attributes.bundleVersion);
  return description(shown);
}

}  // namespace appsync
