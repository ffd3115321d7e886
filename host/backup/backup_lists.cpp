#include "host/backup/backup_lists.h"

#include <fmt/format.h>

#include <algorithm>
#include <map>
#include <set>

#include "host/phone/phone_state.h"
#include "platform/bundle.h"
#include "platform/property_list_codec.h"

namespace appsync::host {
namespace {

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
std::optional<Bytes> metadataOf(FileManager& files, const AppRecord& record,
                                std::optional<Error>* error) {
  std::optional metadata = PropertyList::Dictionary();
  if (const auto& container = record.bundleContainerPath) {
    metadata = readDictionary(files, joinPath(*container, exchange::MetadataName), error);
  }
  if (!metadata) return std::nullopt;
  complete(*metadata, record);
  return serializePropertyList(std::move(*metadata), PropertyListFormat::Binary, error);
}

std::optional<Bytes> renderedIcon(const Phone& phone, const std::string& bundlePath) {
  const auto bundle = Bundle::open(phone.files, FileLocation::directory(bundlePath));
  const auto icon = bundle ? phone.iconRenderer.renderHomeScreenIcon(*bundle) : std::nullopt;
  if (!icon) return std::nullopt;
  Bytes png;
  const auto encoder = phone.imageEncoders.create(png, "public.png", 1);
  if (!encoder) return std::nullopt;
  encoder->addImage(*icon);
  return encoder->finalize() ? std::optional(std::move(png)) : std::nullopt;
}

/// False when an icon may be there though none could be drawn.
bool canTellIcon(FileManager& files, const std::string& bundlePath, std::optional<Error>* error) {
  const auto info = readDictionary(files, joinPath(bundlePath, "Info.plist"), error);
  if (!info) return false;
  const std::string* name = findString(*info, KBBundleIconFile);
  return !name || isThere(files, joinPath(bundlePath, *name), error).has_value();
}

/// None for an application without an icon that can be drawn. False when that cannot be told.
bool takeIcon(const Phone& phone, const AppRecord& record, std::optional<Bytes>& icon,
              std::optional<Error>* error) {
  if (!record.bundlePath) return true;
  // A placeholder's icon is a home-screen icon already.
  if (record.isPlaceholder) {
    return readIfThere(phone.files, joinPath(*record.bundlePath, "Icon.png"), icon, error);
  }
  icon = renderedIcon(phone, *record.bundlePath);
  return icon || canTellIcon(phone.files, *record.bundlePath, error);
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

std::vector<AppRecord> applicationsToSave(const Phone& phone, std::optional<Error>* error) {
  std::vector<AppRecord> applications;
  std::set<std::string_view> taken;
  const std::vector<AppRecord> all = phone.data.applications(error);
  // Of an update under way the installed version, whose record comes first.
  for (const AppRecord& record : all) {
    const bool leftOver = record.isPlaceholder && record.installType == InstallType::Sync;
    const bool isUsers = record.isApplication && record.applicationType == ApplicationTypeUser;
    if (!taken.insert(record.applicationIdentifier).second) continue;
    if (isUsers && !leftOver) applications.push_back(record);
  }
  std::ranges::sort(applications, {}, &AppRecord::applicationIdentifier);
  return applications;
}

std::optional<PropertyList::Dictionary> restoreEntry(const Phone& phone, const AppRecord& record,
                                                     std::string& problem) {
  std::optional<Error> error;
  const auto refuse = [&](std::string_view what) {
    problem = withReason(fmt::format("its {} cannot be read", what), error);
    return std::nullopt;
  };
  auto metadata = metadataOf(phone.files, record, &error);
  if (!metadata) return refuse("metadata");
  PropertyList::Dictionary entry;
  entry.emplace(exchange::RestoreMetadataKey, std::move(*metadata));
  auto blob = phone.data.opaqueBlob(record.applicationIdentifier, &error);
  if (error) return refuse("opaque blob");
  if (blob) entry.emplace(exchange::RestoreSinfKey, std::move(*blob));
  std::optional<Bytes> icon;
  if (!takeIcon(phone, record, icon, &error)) return refuse("icon");
  if (icon) entry.emplace(exchange::RestoreIconKey, std::move(*icon));
  return entry;
}

std::optional<PropertyList::Dictionary> demotionsAmong(FileManager& files,
                                                       const std::vector<AppRecord>& applications,
                                                       std::optional<Error>* error) {
  const auto stored = readDictionary(files, exchange::DemotedApplications, error);
  if (!stored) return std::nullopt;
  std::map<std::string_view, std::set<std::string>> demoted{
      {exchange::AutomaticDowngradesKey, {}}, {exchange::IntentionalDowngradesKey, {}}};
  std::set<std::string, std::less<>> candidates;
  for (const AppRecord& record : applications) {
    if (!mayBeDemoted(record)) continue;
    candidates.insert(record.applicationIdentifier);
    if (record.installType == InstallType::Restore) continue;
    const bool automatic = record.installType == InstallType::Downgrade;
    demoted[automatic ? exchange::AutomaticDowngradesKey : exchange::IntentionalDowngradesKey]
        .insert(record.applicationIdentifier);
  }
  // Without coordination, a placeholder does not show that it is demoted.
  for (auto& [key, identifiers] : demoted) {
    for (const std::string& identifier : findStrings(*stored, key)) {
      if (candidates.contains(identifier)) identifiers.insert(identifier);
    }
  }
  PropertyList::Dictionary lists;
  for (const auto& [key, identifiers] : demoted) lists.emplace(key, arrayOf(identifiers));
  return lists;
}

}  // namespace appsync::host
