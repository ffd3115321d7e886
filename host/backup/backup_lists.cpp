#include "host/backup/backup_lists.h"

#include <fmt/format.h>

#include <algorithm>
#include <cerrno>
#include <map>
#include <set>

#include "host/phone/phone.h"
#include "platform/bundle.h"
#include "platform/property_list_codec.h"

namespace appsync::host {
namespace {

constexpr const char* AutomaticKey = "AutomaticDowngrades";
constexpr const char* IntentionalKey = "IntentionalDowngrades";
/// Of an application that tells none itself: without any it could not come back.
constexpr const char* UnknownVersion = "0";

void complete(PropertyList::Dictionary& metadata, const AppRecord& record) {
  if (!findString(metadata, "bundleVersion")) {
    metadata["bundleVersion"] = record.bundleVersion.value_or(UnknownVersion);
  }
  if (!findString(metadata, "title") && !findString(metadata, "itemName")) {
    metadata["title"] =
        record.displayName.empty() ? record.applicationIdentifier : record.displayName;
  }
}

/// Completed, if need be, so that a phone can make a placeholder of it; and always written in the
/// same way, since a phone that coordinates installs does not keep the file's own bytes.
std::optional<Bytes> metadataOf(FileManager& files, const AppRecord& record, std::string& problem) {
  std::optional<Error> error = Error::posix(ENOENT);
  std::optional<Bytes> bytes;
  if (record.bundleContainerPath) {
    bytes =
        files.contentsAtPath(joinPath(*record.bundleContainerPath, "HalvoMetadata.plist"), &error);
  }
  if (!bytes && (error->domain != POSIXErrorDomain || error->code != ENOENT)) {
    problem = "its metadata cannot be read: " + error->localizedDescription();
    return std::nullopt;
  }
  const auto parsed = bytes ? parsePropertyList(*bytes) : std::nullopt;
  const PropertyList::Dictionary* stored = parsed ? parsed->asDictionary() : nullptr;
  PropertyList::Dictionary metadata = stored ? *stored : PropertyList::Dictionary();
  complete(metadata, record);
  bytes = serializePropertyList(std::move(metadata), PropertyListFormat::Binary, &error);
  if (!bytes) problem = "its metadata cannot be written: " + error->localizedDescription();
  return bytes;
}

std::optional<Bytes> renderedIcon(const Platform& services, const std::string& bundlePath) {
  const auto bundle = Bundle::open(services.files, FileLocation::directory(bundlePath));
  const auto icon = bundle ? services.iconRenderer.renderHomeScreenIcon(*bundle) : std::nullopt;
  if (!icon) return std::nullopt;
  Bytes png;
  const auto encoder = services.imageEncoders.create(png, "public.png", 1);
  if (!encoder) return std::nullopt;
  encoder->addImage(*icon);
  return encoder->finalize() ? std::optional(std::move(png)) : std::nullopt;
}

std::optional<Bytes> iconOf(const Platform& services, const AppRecord& record) {
  if (!record.bundlePath) return std::nullopt;
  // A placeholder's icon is a home-screen icon already.
  return record.isPlaceholder
             ? services.files.contentsAtPath(joinPath(*record.bundlePath, "Icon.png"))
             : renderedIcon(services, *record.bundlePath);
}

/// A placeholder that a person has asked for since is of another type.
bool mayBeDemoted(const AppRecord& record) {
  return record.isPlaceholder && (record.installType == InstallType::Restore ||
                                  record.installType == InstallType::Downgrade ||
                                  record.installType == InstallType::IntentionalDowngrade);
}

PropertyList::Array arrayOf(const std::set<std::string>& identifiers) {
  return {identifiers.begin(), identifiers.end()};
}

}  // namespace

BackupPhone backupPhoneOf(device::EmbeddedDevice& device, SyncHost& host) {
  return {device.platform(host),
          [&device](std::string_view bundleId, const device::DataSink& sink,
                    std::optional<Error>* error) { return device.saveData(bundleId, sink, error); },
          [&device](std::string_view bundleId) { return device.opaqueBlob(bundleId); },
          [&device](std::string_view bundleId) { return device.isBusyWith(bundleId); }};
}

std::vector<AppRecord> applicationsToSave(AppRegistry& registry) {
  std::vector<AppRecord> applications;
  registry.enumerateBundles(BundleKind::User, [&](const AppRecord& record, bool&) {
    const bool leftOver = record.isPlaceholder && record.installType == InstallType::Sync;
    if (record.isApplication && !leftOver) applications.push_back(record);
  });
  std::ranges::sort(applications, {}, &AppRecord::applicationIdentifier);
  return applications;
}

std::optional<PropertyList::Dictionary> restoreEntry(const BackupPhone& phone,
                                                     const AppRecord& record,
                                                     std::string& problem) {
  auto metadata = metadataOf(phone.services.files, record, problem);
  if (!metadata) return std::nullopt;
  PropertyList::Dictionary entry{{"HalvoMetadata", std::move(*metadata)}};
  if (auto blob = phone.opaqueBlob(record.applicationIdentifier)) {
    entry.emplace("ApplicationSINF", std::move(*blob));
  }
  if (auto icon = iconOf(phone.services, record)) {
    entry.emplace("PlaceholderIcon", std::move(*icon));
  }
  return entry;
}

PropertyList::Dictionary demotionsAmong(FileManager& files,
                                        const std::vector<AppRecord>& applications) {
  std::map<std::string, std::set<std::string>> demoted{{AutomaticKey, {}}, {IntentionalKey, {}}};
  std::set<std::string, std::less<>> candidates;
  for (const AppRecord& record : applications) {
    if (!mayBeDemoted(record)) continue;
    candidates.insert(record.applicationIdentifier);
    if (record.installType == InstallType::Restore) continue;
    const bool automatic = record.installType == InstallType::Downgrade;
    demoted[automatic ? AutomaticKey : IntentionalKey].insert(record.applicationIdentifier);
  }
  // Without coordination, a placeholder does not show that it is demoted.
  const auto stored = loadDictionary(files, exchange::DemotedApplications);
  for (auto& [key, identifiers] : demoted) {
    const PropertyList* list = stored ? find(*stored, key) : nullptr;
    if (!list || !list->asArray()) continue;
    for (const PropertyList& item : *list->asArray()) {
      const std::string* identifier = item.asString();
      if (identifier && candidates.contains(*identifier)) identifiers.insert(*identifier);
    }
  }
  return {{AutomaticKey, arrayOf(demoted[AutomaticKey])},
          {IntentionalKey, arrayOf(demoted[IntentionalKey])}};
}

}  // namespace appsync::host
