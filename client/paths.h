#pragma once

#include <string>
#include <string_view>

#include "platform/file_manager.h"

namespace appsync::paths {

/// Root of all sync state.
inline constexpr std::string_view SyncRoot = "/var/mobile/Library/ApplicationSync";
/// Where the desktop delivers its todo list and icon layout.
inline constexpr std::string_view StagingArea = "/var/mobile/Media/PublicStaging/ApplicationSync";
/// Where the desktop delivers packages.
inline constexpr std::string_view StagingRoot = "/var/mobile/Media/PublicStaging";
/// The staging area moves here at the start of a reconcile.
inline constexpr std::string_view WorkArea = "/var/mobile/Library/ApplicationSync/HalvoStuff";
inline constexpr std::string_view TodoList =
    "/var/mobile/Library/ApplicationSync/HalvoStuff/ApplicationsSync.plist";
/// The todo list as it stood when the reconcile finished; kept for diagnosis.
inline constexpr std::string_view TodoDebugCopy =
    "/var/mobile/Library/ApplicationSync/HalvoStuff/ApplicationsSync.plist-debug.plist";
/// The applications that were on the device at the last sync; written by the host.
inline const std::string LastSyncState = joinPath(SyncRoot, "LastSyncAppState.plist");
inline const std::string RestoreState = joinPath(SyncRoot, "RestoreState.plist");
/// The home screen's order as last received; kept for diagnosis.
inline const std::string SortOrder = joinPath(SyncRoot, "AssetSortOrder.plist");
inline constexpr std::string_view IconScratch = "/var/mobile/Library/ApplicationSync/Icons";

/// The icon layout that the desktop wants.
inline constexpr std::string_view IconLayout =
    "/var/mobile/Library/ApplicationSync/HalvoStuff/DashelIconState.plist";

/// The store's metadata in an application's container.
inline constexpr std::string_view MetadataName = "HalvoMetadata.plist";

// Files of a container and of a bundle as an asset names them: without either, in the phone's root.
inline std::string metadataIn(std::string_view container) {
  return std::string(container) + "/HalvoMetadata.plist";
}
inline std::string artworkIn(std::string_view container) {
  return std::string(container) + "/HalvoArtwork";
}
inline std::string infoIn(std::string_view bundle) { return std::string(bundle) + "/Info.plist"; }

}  // namespace appsync::paths
