#pragma once

#include <string>
#include <string_view>

#include "platform/sync_files.h"

/// The client's own files, and what the host staged where it lies once the client has taken it
/// over.
namespace appsync::paths {

inline const std::string TodoList = joinPath(exchange::WorkArea, exchange::TodoListName);
/// The todo list as it stood when the reconcile finished; kept for diagnosis.
inline const std::string TodoDebugCopy = TodoList + "-debug.plist";
inline const std::string IconLayout = joinPath(exchange::WorkArea, exchange::IconLayoutName);
/// The home screen's order as last received; kept for diagnosis.
inline const std::string SortOrder = joinPath(exchange::SyncRoot, "AssetSortOrder.plist");
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
