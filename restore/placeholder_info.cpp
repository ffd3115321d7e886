#include "restore/placeholder_info.h"

#include "platform/bundle.h"

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
  const PropertyList* flag = find(info, LaunchProhibitedKey);
  return flag && flag->booleanValue();
}

}  // namespace appsync
