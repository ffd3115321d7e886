// Which packages the host must still send, and what is made ready for each of them.

#include <cerrno>
#include <tuple>

#include "client/apps_client.h"
#include "client/identifier_safety.h"
#include "client/paths.h"
#include "platform/existence.h"
#include "transfer/in_progress_query.h"
#include "transfer/transfer_candidates.h"
#include "transfer/transfer_rules.h"

namespace appsync {
namespace {

void dropInProgress(AppRegistry& registry, PropertyList::Dictionary& entries,
                    const ClientLog& log) {
  const InProgressAssetQuery::Answer answer =
      InProgressAssetQuery::currentInProgressAssetIDs(registry, log);
  if (answer.inProgress) {
    log.normal("Assets already in progress (not returning these): %{public}@", *answer.inProgress);
    for (const std::string& identifier : *answer.inProgress) entries.erase(identifier);
  } else {
    log.error("Failed to get list of assets already in progress!");
  }
  if (answer.restoring) {
    log.normal("Assets currently restoring: %{public}@", *answer.restoring);
  } else {
    log.error("Failed to get list of assets currently restoring!");
  }
}

void renewIconScratch(FileManager& files, const ClientLog& log) {
  // One that stays is in the way of the new one, which is told below.
  std::ignore = files.removeItem(paths::IconScratch);
  std::optional<Error> error;
  if (!files.createDirectory(paths::IconScratch, false, {}, &error)) {
    log.error("Can't create icon scratch dir! %{public}@", error);
  }
}

/// 1: the package; 2: its data, since the package is here already; 3: both.
std::uint32_t assetParts(bool isRestore, bool packageIsHere) {
  if (!isRestore) return kTWAssetPartApplication;
  if (packageIsHere) return kTWAssetPartApplicationData;
  return kTWAssetPartApplication | kTWAssetPartApplicationData;
}

/// Whether the package that an earlier, interrupted restore received is still there.
bool packageIsHere(FileManager& files, const std::string& identifier,
                   const std::optional<PropertyList>& rememberedPath, const ClientLog& log) {
  const std::string* path = rememberedPath ? rememberedPath->asString() : nullptr;
  if (!path) return false;
  std::optional<Error> error;
  if (files.attributesOfItem(*path, &error)) {
    log.normal("Recovered download path for %{public}@ at %{public}@", identifier, *path);
    return true;
  }
  const bool isNoPath = error && error->domain == POSIXErrorDomain && error->code == EINVAL;
  if (isMissing(error) || isNoPath) {
    log.normal("Download path recovered for %{public}@ but the file is missing: %{public}@",
               identifier, *path);
  } else {
    // Asked for anew, which does no harm if it is there.
    log.error("Download path recovered for %{public}@ but can't look at %{public}@: %{public}@",
              identifier, *path, error);
  }
  return false;
}

/// Whether a file can be named after the candidate.
bool hasUsableName(const TransferCandidate& app, const ClientLog& log) {
  if (isSafe(app.iconPath)) return true;
  log.normal("Ignoring invalid path: %{public}@", app.identifier);
  return false;
}

/// The icon that goes with the asset: the rendered one, else the artwork, if there is a place for
/// it.
std::optional<FileLocation> iconOf(const TransferCandidate& app, bool rendered) {
  if (rendered) return FileLocation::file(app.iconPath);
  if (!app.container) return std::nullopt;
  return FileLocation::file(paths::artworkIn(*app.container));
}

}  // namespace

std::vector<SyncAssetPtr> AppsClient::outstandingAssetTransfers() noexcept {
  std::vector<SyncAssetPtr> result;
  result.reserve(16);
  const bool installationAllowed = _appInstallationAllowed();
  const std::optional<PropertyList::Array> todoList = _loadListOrSay(paths::TodoList);
  _log.oversize("outstandingAssetTransfers starting with todoList %{public}@", todoList);

  CandidateEntries entries;
  const std::set<std::string> systemAppPlaceholders = _getSystemAppPlaceholders();
  _enumeratePlaceholdersWithBlock([&entries](const AppRecord& record, bool&) {
    entries.existingPlaceholders.insert_or_assign(record.applicationIdentifier,
                                                  placeholderEntry(record));
  });
  entries.all = entries.existingPlaceholders;
  _log.oversize(
      "outstandingAssetTransfers preExistingPlaceHolders %{public}@, idsWeWant %{public}@",
      entries.existingPlaceholders, entries.all);
  if (todoList) addTodoEntries(*todoList, entries, _log);
  dropInProgress(_platform.appRegistry, entries.all, _log);
  const std::vector<PropertyList> ordered = _orderTheItems(entries.all);
  renewIconScratch(_platform.files, _log);

  const TransferContext context{installationAllowed, _useInstallCoordinator, _qlpAppsToIgnore,
                                systemAppPlaceholders, entries.wanted};
  for (const PropertyList& entry : ordered) {
    const std::optional<TransferCandidate> candidate = readCandidate(entry, _platform.files);
    if (!candidate || !isWanted(*candidate, context, _log)) continue;
    if (!hasUsableName(*candidate, _log)) continue;
    const SyncAssetPtr asset = _prepareAsset(*candidate);
    const bool handedOff =
        _useInstallCoordinator
            ? _handOffCoordinated(asset)
            : _handOffUncoordinated(asset,
                                    entries.existingPlaceholders.contains(asset->identifier));
    if (handedOff) result.push_back(asset);
  }
  return result;
}

SyncAssetPtr AppsClient::_prepareAsset(const TransferCandidate& app) {
  const std::string prettyName =
      app.displayName ? *app.displayName : app.nameFromHalvo.value_or(app.identifier);
  const bool rendered = _makeIconFromBundlePath(app.bundlePath, app.iconPath);

  SyncAssetPtr asset =
      _platform.syncHost.makeDownload(app.identifier, ApplicationDataclass, prettyName);
  asset->icon = iconOf(app, rendered);
  asset->isRestore = app.isRestore;

  const bool here = packageIsHere(
      _platform.files, app.identifier,
      _restoreStatePropertyForKey(exchange::RestorePathKey, app.identifier, app.version), _log);
  PropertyList::Dictionary options;
  options.emplace(AssetPartsKey, static_cast<std::int64_t>(assetParts(app.isRestore, here)));
  if (app.version) options.emplace(AssetVersionKey, *app.version);
  asset->variantOptions = std::move(options);
  if (app.container) asset->storePlist = paths::metadataIn(*app.container);
  if (app.bundlePath) asset->infoPlist = paths::infoIn(*app.bundlePath);
  _log.normal(
      "Asset %{public}@ (pretty=%{public}@, version=%{public}@) prepped with icon %{public}@, at "
      "%{public}@, meta at %{public}@, info at %{public}@, storePid=%lld, isRestore=%c",
      app.identifier, prettyName, app.version, asset->icon, app.bundlePath, asset->storePlist,
      asset->infoPlist, asset->storePID, asset->isRestore);
  return asset;
}

/// An application whose placeholder stood before this call is not asked for again.
bool AppsClient::_handOffUncoordinated(const SyncAssetPtr& asset, bool hadPlaceholder) {
  if (hadPlaceholder) {
    _log.normal("Not creating a placeholder app for %{public}@ because we already have one",
                asset->identifier);
    return false;
  }
  _createPlaceHolderApplication(asset);
  return true;
}

bool AppsClient::_handOffCoordinated(const SyncAssetPtr& asset) {
  const std::string& identifier = asset->identifier;
  const std::optional<AppRecord> record =
      _platform.appRegistry.recordForIdentifier(identifier, false);
  const bool existing = record && record->isInstalled && !record->isPlaceholder;
  if (existing) {
    _log.normal("App %{public}@ is already installed and will be updated.", identifier);
  }
  if (!prepareAppForInstallUsingCoordination(asset, existing)) {
    _log.error("Not requesting app asset for %{public}@", identifier);
    changeAssetID(identifier, exchange::TodoFailed);
    return false;
  }
  if (existing)
    _accessQueue.sync([&]() APPSYNC_REQUIRES(_accessQueue) { _updatingApps.insert(identifier); });
  return true;
}

}  // namespace appsync
