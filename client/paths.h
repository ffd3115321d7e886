#pragma once

#include <string>
#include <string_view>

#include "platform/sync_files.h"

/// The client's own files, and those it shares with the host where they lie once it has taken them.
namespace appsync::paths {

using namespace exchange;

inline const std::string TodoList = joinPath(WorkArea, TodoListName);
/// The todo list as it stood when the reconcile finished; kept for diagnosis.
inline const std::string TodoDebugCopy = TodoList + "-debug.plist";
inline const std::string IconLayout = joinPath(WorkArea, IconLayoutName);
/// The home screen's order as last received; kept for diagnosis.
inline const std::string SortOrder = joinPath(SyncRoot, "AssetSortOrder.plist");
inline constexpr std::string_view IconScratch = "/var/mobile/Library/ApplicationSync/Icons";

// Files of a container and of a bundle, as an asset names them.
inline std::string metadataIn(std::string_view container) {
  return std::string(container) + "/HalvoMetadata.plist";
}
inline std::string artworkIn(std::string_view container) {
  return std::string(container) + "/HalvoArtwork";
}
inline std::string infoIn(std::string_view bundle) { return std::string(bundle) + "/Info.plist"; }

}  // namespace appsync::paths
