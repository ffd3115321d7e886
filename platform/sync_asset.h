#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "platform/app_registry.h"
#include "platform/file_manager.h"
#include "platform/property_list.h"

namespace appsync {

/// What SyncAsset::dataclass and SyncClient::supportedDataclasses call applications.
inline constexpr std::string_view ApplicationDataclass = "Application";

// Bits of the "AssetParts" asked for and of SyncAsset::completedAssetParts.
inline constexpr std::uint32_t kTWAssetPartApplication = 1;      ///< the application package
inline constexpr std::uint32_t kTWAssetPartApplicationData = 2;  ///< the application's data
// Keys of SyncAsset::variantOptions.
inline constexpr std::string_view AssetPartsKey = "AssetParts";  ///< number
inline constexpr std::string_view AssetVersionKey = "Version";   ///< string

/// The sync host's record of one application package, shared between host and client. The host
/// makes it (SyncHost::makeDownload), the client fills it in and returns it from
/// outstandingAssetTransfers; afterwards the host changes it only between its calls about this
/// asset.
struct SyncAsset {
  std::string identifier;  ///< bundle identifier
  std::string dataclass;
  std::optional<std::string> prettyName;
  std::optional<FileLocation> icon;  ///< picture that the host may show
  bool isRestore = false;            ///< belongs to a device restore, not to a desktop sync
  PropertyList::Dictionary variantOptions;
  std::optional<std::string> storePlist;  ///< path of the store metadata file
  std::optional<std::string> infoPlist;   ///< path of the bundle's Info.plist
  std::int64_t storePID = 0;              ///< store item identifier; 0 when the host knows none
  /// Where the received package lies, absolute or relative to the staging root; none when no
  /// package was sent.
  std::optional<std::string> path;
  bool isDownload = false;
  std::uint32_t completedAssetParts = 0;  ///< bits of the parts that the host delivered
  double downloadProgress = 0;            ///< fraction: 1.0 is all
  InstallState installState = InstallState::Waiting;
  InstallPhase installPhase = InstallPhase::Loading;
  std::string shortDescription;  ///< short text for log lines
};

using SyncAssetPtr = std::shared_ptr<SyncAsset>;

/// The version among the variant options; nullopt for none.
std::optional<std::string> versionOf(const SyncAsset& asset);

/// The short description, or the identifier when there is none.
std::string description(const SyncAsset& asset);

}  // namespace appsync
