#include "host/restore/restore_packages.h"

#include "host/phone/demotions.h"
#include "platform/bundle.h"

namespace appsync::host {
namespace {

/// The packages that the client keeps in mind until the data of their applications is delivered.
class Remembered {
 public:
  explicit Remembered(FileManager& files)
      : files_(files), state_(loadDictionary(files, exchange::RestoreState)) {}

  /// False also when the package is gone.
  bool holds(const AppRecord& record) const {
    const PropertyList* versions = state_ ? find(*state_, record.applicationIdentifier) : nullptr;
    const PropertyList* properties =
        versions && record.bundleVersion ? versions->find(*record.bundleVersion) : nullptr;
    const PropertyList* path = properties ? properties->find("path") : nullptr;
    return path && path->asString() && files_.fileExists(*path->asString());
  }

 private:
  FileManager& files_;
  const std::optional<PropertyList::Dictionary> state_;
};

}  // namespace

void RestorePackages::deliver(const std::set<std::string>& except) {
  const std::vector<AppRecord> records = wanted(except);
  const Remembered before(phone_.files);
  std::vector<SyncAssetPtr> assets;
  for (const AppRecord& record : records) {
    if (before.holds(record) || !library_.find(record.applicationIdentifier)) continue;
    assets.push_back(makeAsset(record, kTWAssetPartApplication | kTWAssetPartApplicationData));
  }
  sender_.send(assets);
  const Remembered after(phone_.files);
  for (const AppRecord& record : records) {
    if (interruption_.requested()) return;
    if (!after.holds(record)) continue;
    // The data itself lies on the phone already.
    const SyncAssetPtr asset = makeAsset(record, kTWAssetPartApplicationData);
    asset->completedAssetParts = kTWAssetPartApplicationData;
    client_.assetTransferSucceeded(asset, true, std::nullopt);
  }
}

std::vector<AppRecord> RestorePackages::wanted(const std::set<std::string>& except) const {
  const Demotions demotions(phone_.files);
  std::vector<AppRecord> records;
  for (const auto& [identifier, record] : applicationsPresent(phone_.apps).placeholders) {
    if (record.installType == InstallType::Restore && !demotions.holdBack(record) &&
        !except.contains(identifier)) {
      records.push_back(record);
    }
  }
  return records;
}

SyncAssetPtr RestorePackages::makeAsset(const AppRecord& record, std::uint32_t parts) const {
  const std::string& name =
      record.displayName.empty() ? record.applicationIdentifier : record.displayName;
  SyncAssetPtr asset = host_.makeDownload(record.applicationIdentifier, ApplicationDataclass, name);
  asset->isRestore = true;
  asset->variantOptions.emplace(AssetPartsKey, static_cast<std::int64_t>(parts));
  if (record.bundleVersion) asset->variantOptions.emplace(AssetVersionKey, *record.bundleVersion);
  return asset;
}

}  // namespace appsync::host
