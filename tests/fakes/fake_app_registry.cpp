#include "tests/fakes/fake_app_registry.h"

#include <algorithm>
#include <cerrno>

#include "platform/bundle.h"
#include "platform/installer_service.h"

namespace appsync::fakes {

namespace {

bool isOfKind(const AppRecord& record, BundleKind kind) {
  const std::string_view type =
      kind == BundleKind::System ? ApplicationTypeSystem : ApplicationTypeUser;
  return kind == BundleKind::All || record.applicationType == type;
}

Error refusal(std::string_view text) {
  return Error::withDescription(InstallerServiceErrorDomain, 1, text);
}

std::optional<std::string> stringAt(const PropertyList::Dictionary& values, std::string_view key) {
  const std::string* text = findString(values, key);
  return text ? std::optional(*text) : std::nullopt;
}

}  // namespace

bool FakeAppRegistry::isApplicationInstalled(std::string_view bundleId) noexcept {
  trace_.add(TraceQuery, callText("AppRegistry.isApplicationInstalled", bundleId));
  return installed(bundleId) || placeholder(bundleId);
}

std::optional<AppRecord> FakeAppRegistry::recordForIdentifier(std::string_view bundleId,
                                                              bool wantsPlaceholder) noexcept {
  trace_.add(TraceQuery, callText("AppRegistry.recordForIdentifier", bundleId, wantsPlaceholder));
  std::optional<AppRecord> record;
  if (!wantsPlaceholder) record = installed(bundleId);
  return record ? record : placeholder(bundleId);
}

void FakeAppRegistry::enumerateBundles(BundleKind kind, const Visitor& visitor) noexcept {
  trace_.add(TraceQuery,
             callText("AppRegistry.enumerateBundles", static_cast<std::uint32_t>(kind)));
  std::vector<AppRecord> records;
  {
    const std::scoped_lock lock(mutex_);
    for (const auto& [identifier, application] : applications_) {
      const auto& [installed, placeholder, progress, order] = application;
      if (installed && isOfKind(*installed, kind)) records.push_back(*installed);
      const bool shown = kind == BundleKind::All || !installed;
      if (placeholder && shown && isOfKind(*placeholder, kind)) records.push_back(*placeholder);
    }
    if (kind == BundleKind::All) records.insert(records.end(), others_.begin(), others_.end());
  }
  bool stop = false;
  for (const AppRecord& record : records) {
    visitor(record, stop);
    if (stop) return;
  }
}

bool FakeAppRegistry::installApplication(const FileLocation& package,
                                         const PropertyList::Dictionary& options,
                                         std::optional<Error>* error) noexcept {
  trace_.add(TraceCall, callText("AppRegistry.installApplication", package, options));
  const std::string* type = findString(options, SWPackageTypeKey);
  const std::string* identifier = findString(options, KBBundleIdentifier);
  if (!type || !identifier) {
    setError(error, refusal("options without a package type or an identifier"));
    return false;
  }
  if (*type == SWPackageTypePlaceholder) {
    return installPlaceholder(*identifier, package, options, error);
  }
  if (*type == SWPackageTypeCustomer) return installPackage(*identifier, package, error);
  setError(error, refusal("unknown package type"));
  return false;
}

bool FakeAppRegistry::installPlaceholder(const std::string& identifier, const FileLocation& package,
                                         const PropertyList::Dictionary& options,
                                         std::optional<Error>* error) {
  const std::optional<PropertyList> info = files_.plistAt(joinPath(package.path, "Info.plist"));
  const std::scoped_lock lock(mutex_);
  const auto failure = placeholderFailures_.find(identifier);
  if (failure != placeholderFailures_.end()) {
    setError(error, failure->second);
    return false;
  }
  const PropertyList::Dictionary* values = info ? info->asDictionary() : nullptr;
  if (!package.isDirectory || !values || stringAt(*values, KBBundleIdentifier) != identifier) {
    setError(error, refusal("no placeholder bundle of " + identifier + " at " + package.path));
    return false;
  }
  AppRecord record;
  record.applicationIdentifier = identifier;
  record.bundleVersion = stringAt(*values, KBBundleVersion);
  record.displayName = stringAt(*values, KBBundleDisplayName).value_or("");
  const PropertyList* installType = find(options, SWInstallTypeKey);
  const auto number = installType ? installType->asUnsigned() : std::nullopt;
  record.installType = static_cast<InstallType>(number.value_or(0));
  if (const auto found = applications_.find(identifier);
      found != applications_.end() && found->second.installed) {
    record.applicationType = found->second.installed->applicationType;
  }
  placePlaceholder(std::move(record));
  const AppRecord& placed = *applications_.find(identifier)->second.placeholder;
  files_.putCopy(package.path, *placed.bundlePath);
  if (const PropertyList* metadata = find(options, SWHalvoMetadataKey);
      metadata && metadata->asData()) {
    files_.putFile(joinPath(*placed.bundleContainerPath, "HalvoMetadata.plist"),
                   *metadata->asData());
  }
  return true;
}

bool FakeAppRegistry::installPackage(const std::string& identifier, const FileLocation& package,
                                     std::optional<Error>* error) {
  std::shared_ptr<FakeInstallProgress> installing = progress(identifier);
  if (installing && !installing->isOver()) {
    installing->begin(InstallState::Active, InstallPhase::Installing);
    postReport();
  }
  waitWhileBlocked();
  const std::scoped_lock lock(mutex_);
  std::optional<AppRecord> record = packageRecord(identifier, package.path, error);
  installing = applications_[identifier].progress;
  if (installing) installing->end(record ? InstallState::Finished : InstallState::Failed);
  postReport();
  if (!record) return false;
  applications_[identifier].placeholder.reset();
  files_.erase("/var/mobile/Containers/Placeholders/" + identifier);
  placeInstalled(std::move(*record));
  installerService_.removeUninstalled(identifier);
  return true;
}

std::optional<AppRecord> FakeAppRegistry::packageRecord(const std::string& identifier,
                                                        std::string_view path,
                                                        std::optional<Error>* error) const {
  const auto failure = installFailures_.find(identifier);
  const auto package = packages_.find(path);
  if (failure != installFailures_.end()) {
    setError(error, failure->second);
    return std::nullopt;
  }
  if (!files_.bytesAt(path)) {
    setError(error, Error::posix(ENOENT, path));
    return std::nullopt;
  }
  AppRecord record;
  record.applicationIdentifier = identifier;
  record.bundleVersion = "1.0";
  const auto known = applications_.find(identifier);
  if (known != applications_.end() && known->second.installed) {
    record.applicationType = known->second.installed->applicationType;
  }
  if (known != applications_.end() && known->second.placeholder) {
    record.bundleVersion = known->second.placeholder->bundleVersion;
    record.displayName = known->second.placeholder->displayName;
    record.installType = known->second.placeholder->installType;
    record.applicationType = known->second.placeholder->applicationType;
  }
  if (package == packages_.end()) return record;
  if (package->second.identifier != identifier) {
    setError(error, refusal("the package holds " + package->second.identifier));
    return std::nullopt;
  }
  record.bundleVersion = package->second.version;
  record.displayName = package->second.displayName;
  return record;
}

bool FakeAppRegistry::uninstallApplication(std::string_view bundleId,
                                           const PropertyList::Dictionary& options) noexcept {
  trace_.add(TraceCall, callText("AppRegistry.uninstallApplication", bundleId, options));
  const PropertyList* only = find(options, UninstallPlaceholdersOnlyKey);
  return remove(bundleId, only && only->booleanValue());
}

std::shared_ptr<InstallProgress> FakeAppRegistry::installProgress(const AppRecord& record,
                                                                  InstallPhase phase) noexcept {
  trace_.add(TraceQuery, callText("AppRegistry.installProgress", record.applicationIdentifier,
                                  static_cast<std::uint64_t>(phase)));
  auto found = progress(record.applicationIdentifier);
  return found && !found->isOver() ? found : nullptr;
}

std::shared_ptr<InstallProgress> FakeAppRegistry::installProgressSync(
    const AppRecord& record) noexcept {
  trace_.add(TraceQuery, callText("AppRegistry.installProgressSync", record.applicationIdentifier));
  auto found = progress(record.applicationIdentifier);
  return found && !found->isOver() ? found : nullptr;
}

void FakeAppRegistry::installPhaseFinished(InstallProgress& progress) noexcept {
  auto* fake = dynamic_cast<FakeInstallProgress*>(&progress);
  trace_.add(TraceCall, callText("AppRegistry.installPhaseFinished",
                                 fake ? fake->identifier() : progress.description()));
  if (!fake) return;
  fake->finishPhase();
  postReport();
}

}  // namespace appsync::fakes
