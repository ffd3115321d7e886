// Packages of restored applications that the host itself brings.
#include <cerrno>

#include "host/phone/demotions.h"
#include "host/restore/restore.h"
#include "host/transfer/shipments.h"
#include "platform/bundle.h"

namespace appsync::host {
namespace {

/// The packages that the client keeps in mind until the data of their applications is delivered.
class Remembered {
 public:
  explicit Remembered(FileManager& files) : files_(files) {
    std::optional<Error> error;
    state_ = readDictionary(files, exchange::RestoreState, &error);
    if (error) note(*error);
  }

  /// False also when the package is gone, or when a problem keeps it from being looked at.
  bool holds(const AppRecord& record) {
    const PropertyList* versions = state_ ? find(*state_, record.applicationIdentifier) : nullptr;
    const PropertyList* properties =
        versions && record.bundleVersion ? versions->find(*record.bundleVersion) : nullptr;
    const PropertyList* path = properties ? properties->find(exchange::RestorePathKey) : nullptr;
    if (!path || !path->asString()) return false;
    std::optional<Error> error;
    const auto there = isThere(files_, *path->asString(), &error);
    if (!there) note(*error);
    return there.value_or(false);
  }

  /// Why something could not be looked at, for people.
  const std::optional<std::string>& problem() const { return problem_; }

 private:
  void note(const Error& error) {
    problem_ = withReason("what the phone remembers of it could not be looked at", error);
  }

  FileManager& files_;
  std::optional<PropertyList::Dictionary> state_;
  std::optional<std::string> problem_;
};

std::vector<AppRecord> restoredPlaceholders(const Phone& phone, const ApplicationsPresent& present,
                                            const std::set<std::string>& except) {
  const Demotions demotions(phone.files);
  std::vector<AppRecord> records;
  for (const auto& [identifier, record] : present.placeholders) {
    if (record.installType == InstallType::Restore && !demotions.holdBack(record) &&
        !except.contains(identifier)) {
      records.push_back(record);
    }
  }
  return records;
}

SyncAssetPtr makeAsset(HostProcess& host, const AppRecord& record, std::uint32_t parts) {
  const std::string& name =
      record.displayName.empty() ? record.applicationIdentifier : record.displayName;
  SyncAssetPtr asset = host.makeDownload(record.applicationIdentifier, ApplicationDataclass, name);
  asset->isRestore = true;
  asset->variantOptions.emplace(AssetPartsKey, static_cast<std::int64_t>(parts));
  if (record.bundleVersion) asset->variantOptions.emplace(AssetVersionKey, *record.bundleVersion);
  return asset;
}

}  // namespace

void Restore::bringPackages(const RestoreList& list, const Library& library) {
  const auto present = applicationsNow();
  if (!present) return;
  const std::vector<AppRecord> records =
      restoredPlaceholders(phone_, *present, leftOut(list, *present));
  // What comes after all counts in spite of it.
  const auto failAll = [&](const std::string& reason) {
    for (const AppRecord& record : records) failures_.emplace(record.applicationIdentifier, reason);
  };
  Remembered before(phone_.files);
  std::vector<SyncAssetPtr> assets;
  for (const AppRecord& record : records) {
    if (before.holds(record) || !library.find(record.applicationIdentifier)) continue;
    assets.push_back(
        makeAsset(host_, record, kTWAssetPartApplication | kTWAssetPartApplicationData));
  }
  if (before.problem()) return failAll(*before.problem());
  PackageSender sender = makeSender();
  sender.send(shipmentsTo(client_, assets, library), InterruptedTransfer);
  note(sender.outcome().failures);
  Remembered after(phone_.files);
  for (const AppRecord& record : records) {
    if (interruption_.requested()) return;
    if (!after.holds(record)) continue;
    // The data itself lies on the phone already.
    const SyncAssetPtr asset = makeAsset(host_, record, kTWAssetPartApplicationData);
    asset->completedAssetParts = kTWAssetPartApplicationData;
    client_.assetTransferSucceeded(asset, true, std::nullopt);
  }
  if (after.problem()) failAll(*after.problem());
}

}  // namespace appsync::host
