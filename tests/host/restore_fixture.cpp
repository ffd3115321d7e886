#include "tests/host/restore_fixture.h"

#include <fmt/format.h>

#include "platform/bundle.h"
#include "platform/property_list_codec.h"

namespace appsync::host::testing {
namespace {

Bytes serialized(const PropertyList& value) {
  return serializePropertyList(value, PropertyListFormat::Xml).value();
}

AppRecord placeholderRecord(const std::string& identifier, InstallType installType) {
  AppRecord record;
  record.applicationIdentifier = identifier;
  record.bundleVersion = "1.0";
  record.displayName = "Name of " + identifier;
  record.installType = installType;
  record.isPlaceholder = true;
  return record;
}

}  // namespace

PropertyList::Dictionary metadataOf(std::string_view identifier, std::string_view version) {
  return {{"title", "Name of " + std::string(identifier)}, {"bundleVersion", version}};
}

bool RestoringClient::reconcileRestoreOfType(std::int32_t type, std::optional<Error>*) noexcept {
  fake_.trace.add(fakes::TraceCall, fmt::format("client.reconcileRestoreOfType({})", type));
  if (onReconcile) onReconcile();
  if (const auto list = fake_.files.plistAt(exchange::RestoreList)) {
    for (const auto& [identifier, entry] : *list->asDictionary()) {
      if (!unwilling.contains(identifier)) makePlaceholder(identifier, entry);
    }
    fake_.files.erase(exchange::RestoreList);
  }
  return true;
}

void RestoringClient::makePlaceholder(const std::string& identifier, const PropertyList& entry) {
  EXPECT_TRUE(entry.find("HalvoMetadata"));
  fake_.appRegistry.seedPlaceholder(placeholderRecord(identifier, InstallType::Restore));
  if (!coordination_) return;
  fake_.installCoordination
      .coordinatorFor(CoordinatorKind::Restoring, identifier, SyncHostClientID, true, nullptr,
                      nullptr)
      ->setAppAssetPromiseResponsibleClient(KQClientKiosk, nullptr);
}

void RestoringClient::assetTransferSucceeded(const SyncAssetPtr& asset, bool succeeded,
                                             const std::optional<Error>& error) noexcept {
  if (succeeded && asset->isRestore) {
    const std::string& identifier = asset->identifier;
    const std::string version = *findString(asset->variantOptions, AssetVersionKey);
    fake_.trace.add(
        fakes::TraceCall,
        fmt::format("client.restoreParts({}, {}, asked {}, came {})", identifier, version,
                    find(asset->variantOptions, AssetPartsKey)->asInteger().value_or(-1),
                    asset->completedAssetParts));
    auto state = fake_.files.plistAt(exchange::RestoreState).value_or(PropertyList::Dictionary{});
    PropertyList::Dictionary& remembered = *state.asDictionary();
    if (asset->completedAssetParts == kTWAssetPartApplicationData) {
      EXPECT_FALSE(asset->path);
      const PropertyList* path = remembered.at(identifier).find(version)->find("path");
      asset->path = path->asString()->substr(exchange::StagingRoot.size() + 1);
      remembered.erase(identifier);
    } else if (waiting_.contains(identifier)) {
      const PropertyList::Dictionary properties{
          {"path", joinPath(exchange::StagingRoot, *asset->path)}};
      remembered[identifier] = PropertyList::Dictionary{{version, properties}};
    }
    fake_.files.putPlist(exchange::RestoreState, state);
    if (remembered.contains(identifier)) return;
  }
  RecordingClient::assetTransferSucceeded(asset, succeeded, error);
}

RestoreTest::RestoreTest() {
  hostsView.onWatcher = [this](PhoneWatcher* watcher) { client.watcher = watcher; };
  isBusyWith = [this](std::string_view identifier) {
    settleCoordinated(std::string(identifier));
    return false;
  };
}

void RestoreTest::backUp(const std::string& identifier, const std::string& bytes, bool demoted) {
  entries[identifier] =
      PropertyList::Dictionary{{"HalvoMetadata", serialized(metadataOf(identifier))}};
  if (!bytes.empty()) data[identifier] = bytes;
  if (demoted) intentional.emplace_back(identifier);
}

Backup RestoreTest::backup() {
  BackupProblem unusable;
  const auto writer = BackupWriter::open(backups / "backup", unusable);
  EXPECT_TRUE(writer) << unusable.text;
  const PropertyList::Dictionary demotions{{"IntentionalDowngrades", intentional}};
  bool written = writer->addFile(BackupApplicationsFile, serialized(entries)) &&
                 writer->addFile(BackupDemotionsFile, serialized(demotions)) &&
                 writer->addFile(BackupIconLayoutFile, serialized(PropertyList::Array{"com.a"}));
  for (const auto& [identifier, bytes] : data) {
    written = written && writer->beginData(identifier) && writer->append(toBytes(bytes)) &&
              writer->endData();
  }
  EXPECT_TRUE(written && writer->finish()) << writer->problem();
  std::string problem;
  return readBackup(backups / "backup", problem).value();
}

/// A device installs a package that is complete by itself.
void RestoreTest::settleCoordinated(const std::string& identifier) {
  const auto coordinator = phone.installCoordination.coordinator(identifier);
  const auto promise = coordinator ? coordinator->state().appAssetPromise : nullptr;
  if (!promise || !promise->isComplete() || coordinator->error() || !promise->transferPath())
    return;
  const std::string path = promise->transferPath()->path;
  if (!phone.files.exists(path)) return;
  phone.files.erase(path);
  std::optional<Error> error;
  if (refusedByPhone.contains(identifier)) error = refusedByPhone.at(identifier);
  phone.appRegistry.removeAll(identifier);
  if (error) {
    coordinator->edit([&](auto& state) { state.error = error; });
  } else {
    phone.appRegistry.seedInstalled(identifier, "new");
  }
  if (client.watcher) client.watcher->installFinished(identifier, error);
}

std::string RestoreTest::restore() {
  std::string problem;
  Backup read = backup();
  RestoreList list = RestoreList::of(read, problem).value();
  RestoreInput input{std::move(read), std::move(list), {}, {}, overwriteData};
  if (!only.empty()) {
    EXPECT_TRUE(input.list.keepOnly(only, problem)) << problem;
  }
  if (packages) input.packages = readLibrary(folder.path(), problem).value();
  if (store) input.catalogue = readLibrary(folder.path(), problem).value();
  Restore session(client, host, hostsView.phone(), reporter, interruption);
  return text(session.run(input).summary);
}

void RestoreTest::seedRestoring(const std::string& identifier, InstallType installType) {
  phone.appRegistry.seedPlaceholder(placeholderRecord(identifier, installType));
  if (!coordination || installType != InstallType::Restore) return;
  phone.installCoordination
      .seedCoordinator(CoordinatorKind::Restoring, identifier, SyncHostClientID)
      ->edit([](auto& state) { state.responsibleClient = KQClientKiosk; });
}

void RestoreTest::putRemembered(const std::string& identifier, const std::string& path) {
  const PropertyList::Dictionary properties{{"path", path}};
  phone.files.putPlist(
      exchange::RestoreState,
      PropertyList::Dictionary{{identifier, PropertyList::Dictionary{{"1.0", properties}}}});
}

std::vector<std::string> RestoreTest::namesOnList() const {
  std::vector<std::string> names;
  const auto list = phone.files.plistAt(exchange::RestoreList);
  if (!list) return names;
  for (const auto& entry : *list->asDictionary()) names.push_back(entry.first);
  return names;
}

}  // namespace appsync::host::testing
