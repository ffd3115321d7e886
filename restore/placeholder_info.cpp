#include "restore/placeholder_info.h"

#include "client/paths.h"
#include "platform/bundle.h"
#include "platform/property_list_codec.h"

namespace appsync {
namespace {

PropertyList orNull(const std::optional<std::string>& text) {
  return text ? PropertyList(*text) : PropertyList::null();
}

}  // namespace

PropertyList::Dictionary placeholderInfo(std::string_view bundleId,
                                         const std::optional<std::string>& version,
                                         const std::optional<std::string>& name,
                                         const PropertyList& periodical, bool launchProhibited) {
  PropertyList::Dictionary info;
  info.emplace(KBBundleIdentifier, bundleId);
  info.emplace(KBBundleVersion, orNull(version));
  // A placeholder has nothing to execute: its executable is named like the application.
  info.emplace(KBBundleExecutable, orNull(name));
  info.emplace(KBBundleDisplayName, orNull(name));
  info.emplace(KBBundleIconFile, PlaceholderIconName);
  info.emplace(PeriodicalKey, periodical);
  info.emplace(LaunchProhibitedKey, launchProhibited);
  return info;
}

PropertyList periodicalFlag(const PropertyList::Dictionary& info) {
  const PropertyList* flag = find(info, PeriodicalKey);
  return flag ? *flag : PropertyList(false);
}

bool infoProhibitsLaunch(const PropertyList::Dictionary& info) {
  return findFlag(info, LaunchProhibitedKey);
}

bool writePlaceholderInfo(FileManager& files, std::string_view path,
                          const PropertyList::Dictionary& info) {
  const std::optional<Bytes> bytes = serializePropertyList(info, PropertyListFormat::Xml);
  return bytes && files.writeAtomically(paths::infoIn(path), *bytes);
}

PropertyList::Dictionary placeholderOptions(std::string_view bundleId, InstallType installType) {
  return {{std::string(SWPackageTypeKey), SWPackageTypePlaceholder},
          {std::string(KBBundleIdentifier), bundleId},
          {std::string(SWInstallTypeKey), static_cast<std::int64_t>(installType)}};
}

void logPlaceholderInstall(const ClientLog& log, bool installed, std::string_view path,
                           const PropertyList::Dictionary& info) {
  const auto value = [&info](std::string_view key) { return *find(info, key); };
  const PropertyList name = value(KBBundleDisplayName);
  const PropertyList identifier = value(KBBundleIdentifier);
  const PropertyList version = value(KBBundleVersion);
  const PropertyList periodical = value(PeriodicalKey);
  if (installed) {
    log.normal(
        "Installed Placeholder app from path %{public}@: %{public}@ [%{public}@ %{public}@] "
        "[isPeriodix: %{public}@]",
        path, name, identifier, version, periodical);
  } else {
    log.error(
        "Placeholder app install failed from path %{public}@: %{public}@ [%{public}@ %{public}@] "
        "[isPeriodix: %{public}@]",
        path, name, identifier, version, periodical);
  }
}

}  // namespace appsync
