#include "device/apps/app_registry.h"

#include <fmt/format.h>

#include <cerrno>

#include "base/identifiers.h"
#include "device/apps/demotion.h"
#include "device/apps/installs.h"
#include "device/apps/person_wishes.h"
#include "device/apps/removal.h"
#include "device/state/application_rows.h"
#include "platform/bundle.h"

namespace appsync::device {
namespace {

bool isOfKind(const AppRecord& record, BundleKind kind) {
  return record.applicationType ==
         (kind == BundleKind::System ? ApplicationTypeSystem : ApplicationTypeUser);
}

/// Of each application the installed version, or its placeholder if that is all there is.
std::vector<AppRecord> onePerApplication(const std::vector<AppRecord>& sorted, BundleKind kind) {
  std::vector<AppRecord> chosen;
  std::string_view last;
  for (const AppRecord& record : sorted) {
    const bool first = record.applicationIdentifier != last;
    last = record.applicationIdentifier;
    if (first && isOfKind(record, kind)) chosen.push_back(record);
  }
  return chosen;
}

Error invalid(std::string_view text) {
  return Error::withDescription(POSIXErrorDomain, EINVAL, text);
}

/// Who brings a package.
HistoryOrigin originOf(const PropertyList::Dictionary& options) {
  const PropertyList* type = find(options, SWInstallTypeKey);
  const auto number = type ? type->asUnsigned() : std::nullopt;
  return number == static_cast<std::uint64_t>(InstallType::StoreDownload) ? HistoryOrigin::Store
                                                                          : HistoryOrigin::Sync;
}

InstallDetails placeholderDetails(const PropertyList::Dictionary& options) {
  const PropertyList* type = find(options, SWInstallTypeKey);
  return {static_cast<InstallType>(type ? type->asUnsigned().value_or(0) : 0),
          findData(options, SWHalvoMetadataKey), findData(options, SWApplicationSINFKey),
          HistoryOrigin::Sync};
}

}  // namespace

void DeviceAppRegistry::addObserver(AppRegistryObserver* observer) noexcept {
  core_.observers.add(observer);
}

void DeviceAppRegistry::removeObserver(AppRegistryObserver* observer) noexcept {
  core_.observers.remove(observer);
}

bool DeviceAppRegistry::isApplicationInstalled(std::string_view bundleId) noexcept {
  return recordForIdentifier(bundleId, false).has_value();
}

std::optional<AppRecord> DeviceAppRegistry::recordForIdentifier(std::string_view bundleId,
                                                                bool placeholder) noexcept {
  const auto rows = readApplication(core_.database, bundleId);
  if (rows && rows->installed && !placeholder) return rows->installed->record();
  if (rows && rows->placeholder) return rows->placeholder->record();
  return std::nullopt;
}

std::vector<AppRecord> DeviceAppRegistry::records(std::optional<Error>* error) noexcept {
  std::vector<AppRecord> records;
  const auto rows = readApplications(core_.database, error);
  if (!rows) return records;
  for (const ApplicationRow& row : *rows) records.push_back(row.record());
  return records;
}

std::optional<Bytes> DeviceAppRegistry::opaqueBlob(std::string_view bundleId,
                                                   std::optional<Error>* error) noexcept {
  const auto rows = readApplication(core_.database, bundleId, error);
  if (!rows || !rows->any()) return std::nullopt;
  return (rows->installed ? rows->installed : rows->placeholder)->sinf;
}

void DeviceAppRegistry::enumerateBundles(BundleKind kind, const Visitor& visitor) noexcept {
  const std::vector<AppRecord> all = records();
  bool stop = false;
  for (const AppRecord& record : kind == BundleKind::All ? all : onePerApplication(all, kind)) {
    visitor(record, stop);
    if (stop) return;
  }
}

bool DeviceAppRegistry::changeApplication(
    std::string_view bundleId,
    const std::function<bool(const std::string&, std::optional<Error>*)>& change,
    std::optional<Error>* error) noexcept {
  try {
    if (!core_.database.writable()) {
      return failWith(error, Error::withDescription(POSIXErrorDomain, EROFS,
                                                    "the phone is open for reading only"));
    }
    if (!isUsableIdentifier(bundleId)) {
      return failWith(error,
                      refusal(PackageRefusal::BadInfo,
                              "the identifier holds characters that no identifier may have"));
    }
    const std::string identifier(bundleId);
    const KeyedMutex::Guard guard(core_.applicationLocks, identifier);
    return change(identifier, error);
  } catch (const std::exception& failure) {
    return failWith(error, Error::withDescription(POSIXErrorDomain, EIO, failure.what()));
  }
}

bool DeviceAppRegistry::installApplication(const FileLocation& package,
                                           const PropertyList::Dictionary& options,
                                           std::optional<Error>* error) noexcept {
  const std::string* type = findString(options, SWPackageTypeKey);
  const std::string* identifier = findString(options, KBBundleIdentifier);
  const bool placeholder = type && *type == SWPackageTypePlaceholder;
  if (!identifier || !type || (!placeholder && *type != SWPackageTypeCustomer)) {
    return failWith(error, invalid("the options lack an identifier or a known package type"));
  }
  if (placeholder && !package.isDirectory) {
    return failWith(error, invalid("a placeholder is installed from its directory"));
  }
  if (placeholder) {
    const auto install = [&](const std::string& id, std::optional<Error>* reason) {
      return installPlaceholder(core_, package.path, id, placeholderDetails(options), reason);
    };
    return changeApplication(*identifier, install, error);
  }
  InstallDetails details;
  details.origin = originOf(options);
  return installPackageWith(package, *identifier, details, error);
}

bool DeviceAppRegistry::installPackageWith(const FileLocation& package,
                                           const std::string& identifier,
                                           const InstallDetails& details,
                                           std::optional<Error>* error) noexcept {
  std::optional<Error> reason;
  const auto install = [&](const std::string& id, std::optional<Error>* why) {
    if (!package.isDirectory) return installPackage(core_, package.path, id, details, why);
    return failWith(why, invalid("a package is installed from a file"));
  };
  const bool installed = changeApplication(identifier, install, &reason);
  core_.watcher.installFinished(identifier, reason);
  if (reason) setError(error, std::move(*reason));
  return installed;
}

bool DeviceAppRegistry::buildPlaceholder(const std::string& identifier, const PlaceholderFace& face,
                                         const InstallDetails& details,
                                         std::optional<Error>* error) noexcept {
  const auto build = [&](const std::string& id, std::optional<Error>* reason) {
    return device::buildPlaceholder(core_, id, face, details, reason);
  };
  return changeApplication(identifier, build, error);
}

bool DeviceAppRegistry::uninstallApplication(std::string_view bundleId,
                                             const PropertyList::Dictionary& options) noexcept {
  const bool placeholderOnly = findFlag(options, UninstallPlaceholdersOnlyKey);
  const auto remove = [&](const std::string& identifier, std::optional<Error>* error) {
    return removeForClient(core_, identifier, placeholderOnly, error);
  };
  return changeApplication(bundleId, remove, nullptr);
}

bool DeviceAppRegistry::removeApplication(std::string_view bundleId,
                                          std::optional<Error>* error) noexcept {
  const auto remove = [&](const std::string& identifier, std::optional<Error>* reason) {
    return mayRemove(core_, reason) && removeForPerson(core_, identifier, reason);
  };
  return changeApplication(bundleId, remove, error);
}

bool DeviceAppRegistry::demote(std::string_view bundleId, std::optional<Error>* error) noexcept {
  const auto demote = [&](const std::string& identifier, std::optional<Error>* reason) {
    return mayRemove(core_, reason) && demoteForPerson(core_, identifier, reason);
  };
  return changeApplication(bundleId, demote, error);
}

bool DeviceAppRegistry::askFor(std::string_view bundleId, std::optional<Error>* error) noexcept {
  return changeApplication(bundleId, std::bind_front(device::askFor, std::ref(core_)), error);
}

bool DeviceAppRegistry::mayCancel(std::string_view bundleId, std::optional<Error>* error) noexcept {
  const auto effect = effectOfCancelling(core_, std::string(bundleId), error);
  return effect && (*effect != Cancelling::Forbidden || mayRemove(core_, error));
}

bool DeviceAppRegistry::cancelWish(std::string_view bundleId,
                                   std::optional<Error>* error) noexcept {
  const auto cancel = [&](const std::string& identifier, std::optional<Error>* why) {
    const auto effect = effectOfCancelling(core_, identifier, why);
    switch (effect.value_or(Cancelling::Nothing)) {
      case Cancelling::Nothing:
        return false;
      case Cancelling::Undoing:
        return device::undoAsking(core_, identifier, why);
      case Cancelling::Forbidden:
        mayRemove(core_, why);
        return false;
      case Cancelling::Forgetting:
        return removeForPerson(core_, identifier, why);
    }
    return false;
  };
  return changeApplication(bundleId, cancel, error);
}

void DeviceAppRegistry::undoAsking(std::string_view bundleId) noexcept {
  changeApplication(bundleId, std::bind_front(device::undoAsking, std::ref(core_)), nullptr);
}

void DeviceAppRegistry::forgetWaitingData(std::string_view bundleId) noexcept {
  const auto forget = [&](const std::string& identifier, std::optional<Error>* error) {
    const auto rows = readApplication(core_.database, identifier, error);
    return rows && !rows->any() && core_.containers.removeWaitingData(identifier);
  };
  changeApplication(bundleId, forget, nullptr);
}

bool DeviceAppRegistry::isDemoted(std::string_view bundleId) noexcept {
  const auto placeholder = recordForIdentifier(bundleId, true);
  return placeholder && isDemotion(placeholder->installType);
}

bool DeviceAppRegistry::isBeingInstalled(std::string_view bundleId) noexcept {
  const auto placeholder = recordForIdentifier(bundleId, true);
  const auto progress = currentProgress(core_.database, core_.observers, bundleId);
  if (!placeholder || !progress) return false;
  const InstallState state = progress->installState();
  return state == InstallState::Active ||
         (state == InstallState::Waiting && placeholder->installType == InstallType::Sync);
}

bool DeviceAppRegistry::addSystemApplication(std::string_view bundleId,
                                             std::string_view displayName, std::string_view version,
                                             std::optional<Error>* error) noexcept {
  const auto install = [&](const std::string& identifier, std::optional<Error>* reason) {
    return installSystemApplication(core_, identifier, std::string(displayName),
                                    std::string(version), reason);
  };
  return changeApplication(bundleId, install, error);
}

std::shared_ptr<InstallProgress> DeviceAppRegistry::installProgress(const AppRecord& record,
                                                                    InstallPhase phase) noexcept {
  // Every install of this device begins at Loading, whatever phase it has come to.
  return phase == InstallPhase::Loading ? installProgressSync(record) : nullptr;
}

std::shared_ptr<InstallProgress> DeviceAppRegistry::installProgressSync(
    const AppRecord& record) noexcept {
  return currentProgress(core_.database, core_.observers, record.applicationIdentifier);
}

void DeviceAppRegistry::installPhaseFinished(InstallProgress& progress) noexcept {
  if (progress.installPhase() != InstallPhase::Loading) return;
  const InstallState state = progress.installState();
  if (state == InstallState::Failed || state == InstallState::Canceled) return;
  progress.setInstallPhase(InstallPhase::Installing);
}

}  // namespace appsync::device
