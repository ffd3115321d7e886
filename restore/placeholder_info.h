#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "client/log_message.h"
#include "platform/app_registry.h"
#include "platform/file_manager.h"
#include "platform/property_list.h"

namespace appsync {

/// Name of the icon file in a placeholder bundle.
inline constexpr std::string_view PlaceholderIconName = "Icon.png";

// Keys of an information dictionary that placeholders carry on.
inline constexpr std::string_view PeriodicalKey = "UIPeriodixApp";
inline constexpr std::string_view LaunchProhibitedKey = "SWApplicationLaunchProhibited";

/// What everything in a placeholder bundle belongs to.
inline FileAttributes placeholderFileAttributes() { return {"mobile", "mobile"}; }

/// The Info.plist of a placeholder bundle. A missing version or name stands in it as null, so that
/// writing it fails: an application that cannot be described gets no placeholder.
PropertyList::Dictionary placeholderInfo(std::string_view bundleId,
                                         const std::optional<std::string>& version,
                                         const std::optional<std::string>& name,
                                         const PropertyList& periodical, bool launchProhibited);

/// The dictionary's periodical flag as it stands; false when it has none.
PropertyList periodicalFlag(const PropertyList::Dictionary& info);

/// Whether the dictionary's LaunchProhibitedKey reads as true.
bool infoProhibitsLaunch(const PropertyList::Dictionary& info);

/// Writes the Info.plist of the placeholder bundle at `path` atomically. False also when an entry
/// is null.
[[nodiscard]] bool writePlaceholderInfo(FileManager& files, std::string_view path,
                                        const PropertyList::Dictionary& info);

/// The options with which every placeholder bundle is handed to the registry.
PropertyList::Dictionary placeholderOptions(std::string_view bundleId, InstallType installType);

/// Logs the registry's answer for the bundle at `path` with this Info.plist.
void logPlaceholderInstall(const ClientLog& log, bool installed, std::string_view path,
                           const PropertyList::Dictionary& info);

}  // namespace appsync
