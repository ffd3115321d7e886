#include "device/apps/app_registry.h"

#include <fmt/format.h>

#include <cerrno>

#include "base/identifiers.h"
#include "device/apps/installs.h"
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

bool DeviceAppRegistry::change(std::string_view bundleId, const Change& change,
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
    return change(core_, identifier, error);
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
    const auto install = [&](DeviceCore& core, const std::string& id, std::optional<Error>* why) {
      return installPlaceholder(core, package.path, id, placeholderDetails(options), why);
    };
    return change(*identifier, install, error);
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
  const auto install = [&](DeviceCore& core, const std::string& id, std::optional<Error>* why) {
    if (!package.isDirectory) return installPackage(core, package.path, id, details, why);
    return failWith(why, invalid("a package is installed from a file"));
  };
  const bool installed = change(identifier, install, &reason);
  core_.watcher.installFinished(identifier, installed ? std::nullopt : reason);
  return installed || failWith(error, *std::move(reason));
}

bool DeviceAppRegistry::buildPlaceholder(const std::string& identifier, const PlaceholderFace& face,
                                         const InstallDetails& details,
                                         std::optional<Error>* error) noexcept {
  const auto build = [&](DeviceCore& core, const std::string& id, std::optional<Error>* why) {
    return device::buildPlaceholder(core, id, face, details, why);
  };
  return change(identifier, build, error);
}

bool DeviceAppRegistry::uninstallApplication(std::string_view bundleId,
                                             const PropertyList::Dictionary& options) noexcept {
  const bool placeholderOnly = findFlag(options, UninstallPlaceholdersOnlyKey);
  const auto remove = [&](DeviceCore& core, const std::string& id, std::optional<Error>* error) {
    return removeForClient(core, id, placeholderOnly, error);
  };
  return change(bundleId, remove, nullptr);
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
