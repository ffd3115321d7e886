// The test's side of FakeAppRegistry: what it seeds, looks at and steers.
#include <algorithm>
#include <chrono>

#include "tests/fakes/fake_app_registry.h"

namespace appsync::fakes {

namespace {

void fillIn(AppRecord& record, std::string_view folder) {
  if (!record.bundleIdentifier) record.bundleIdentifier = record.applicationIdentifier;
  if (!record.bundleContainerPath) {
    record.bundleContainerPath =
        joinPath(joinPath("/var/mobile/Containers", folder), record.applicationIdentifier);
  }
  if (!record.bundlePath) {
    record.bundlePath =
        joinPath(*record.bundleContainerPath, record.applicationIdentifier + ".app");
  }
}

AppRecord simpleRecord(std::string_view identifier, std::string_view version) {
  AppRecord record;
  record.applicationIdentifier = identifier;
  record.bundleVersion = version;
  return record;
}

}  // namespace

FakeAppRegistry::~FakeAppRegistry() {
  releaseInstalls();
  const std::scoped_lock lock(mutex_);
  for (auto& [identifier, application] : applications_) {
    if (application.progress) application.progress->end(application.progress->installState());
  }
}

void FakeAppRegistry::placePlaceholder(AppRecord record) {
  fillIn(record, "Placeholders");
  record.isPlaceholder = true;
  const std::string identifier = record.applicationIdentifier;
  Application& application = applications_[identifier];
  if (application.progress) application.progress->end(application.progress->installState());
  application.progress = std::make_shared<FakeInstallProgress>(
      trace_, identifier,
      [this, identifier](bool canceled) { progressChanged(identifier, canceled); });
  application.placeholder = std::move(record);
  application.order = nextOrder_++;
  postReport();
}

void FakeAppRegistry::placeInstalled(AppRecord record) {
  fillIn(record, "Applications");
  record.isPlaceholder = false;
  files_.putDirectory(*record.bundlePath);
  const std::string identifier = record.applicationIdentifier;
  applications_[identifier].installed = std::move(record);
}

void FakeAppRegistry::eraseContainer(const AppRecord& record) {
  if (record.bundleContainerPath) files_.erase(*record.bundleContainerPath);
}

void FakeAppRegistry::seedInstalled(AppRecord record) {
  const std::scoped_lock lock(mutex_);
  placeInstalled(std::move(record));
}

void FakeAppRegistry::seedInstalled(std::string_view identifier, std::string_view version) {
  seedInstalled(simpleRecord(identifier, version));
}

void FakeAppRegistry::seedPlaceholder(AppRecord record) {
  const std::scoped_lock lock(mutex_);
  placePlaceholder(std::move(record));
}

void FakeAppRegistry::seedPlaceholder(std::string_view identifier, InstallType installType,
                                      std::string_view version) {
  AppRecord record = simpleRecord(identifier, version);
  record.installType = installType;
  seedPlaceholder(std::move(record));
}

void FakeAppRegistry::edit(std::string_view identifier,
                           const std::function<void(AppRecord&)>& change) {
  const std::scoped_lock lock(mutex_);
  const auto found = applications_.find(identifier);
  if (found == applications_.end()) return;
  for (std::optional<AppRecord>* record : {&found->second.installed, &found->second.placeholder}) {
    if (*record) change(**record);
  }
}

void FakeAppRegistry::removeAll(std::string_view identifier) {
  const std::scoped_lock lock(mutex_);
  const auto found = applications_.find(identifier);
  if (found == applications_.end()) return;
  Application& application = found->second;
  for (const auto& record : {application.installed, application.placeholder}) {
    if (record) eraseContainer(*record);
  }
  if (application.installed) installerService_.addUninstalled(identifier);
  if (application.progress) application.progress->end(application.progress->installState());
  application.installed.reset();
  application.placeholder.reset();
  postReport();
}

bool FakeAppRegistry::remove(std::string_view identifier, bool placeholderOnly) {
  const std::scoped_lock lock(mutex_);
  const auto found = applications_.find(identifier);
  if (found == applications_.end() || uninstallFailures_.contains(identifier)) return false;
  Application& application = found->second;
  const bool hadPlaceholder = application.placeholder.has_value();
  if (!hadPlaceholder && (placeholderOnly || !application.installed)) return false;
  const AppRecord& gone = hadPlaceholder ? *application.placeholder : *application.installed;
  eraseContainer(gone);
  if (hadPlaceholder) {
    application.placeholder.reset();
    if (application.progress) application.progress->end(application.progress->installState());
  } else {
    application.installed.reset();
    installerService_.addUninstalled(identifier);
  }
  postReport();
  return true;
}

void FakeAppRegistry::seedOther(AppRecord record) {
  const std::scoped_lock lock(mutex_);
  fillIn(record, "Plugins");
  others_.push_back(std::move(record));
}

std::optional<AppRecord> FakeAppRegistry::installed(std::string_view identifier) const {
  const std::scoped_lock lock(mutex_);
  const auto found = applications_.find(identifier);
  return found == applications_.end() ? std::nullopt : found->second.installed;
}

std::optional<AppRecord> FakeAppRegistry::placeholder(std::string_view identifier) const {
  const std::scoped_lock lock(mutex_);
  const auto found = applications_.find(identifier);
  return found == applications_.end() ? std::nullopt : found->second.placeholder;
}

std::vector<std::string> FakeAppRegistry::installedIdentifiers() const {
  const std::scoped_lock lock(mutex_);
  std::vector<std::string> found;
  for (const auto& [identifier, application] : applications_) {
    if (application.installed) found.push_back(identifier);
  }
  return found;
}

std::vector<std::string> FakeAppRegistry::placeholderIdentifiers() const {
  const std::scoped_lock lock(mutex_);
  std::vector<std::string> found;
  for (const auto& [identifier, application] : applications_) {
    if (application.placeholder) found.push_back(identifier);
  }
  return found;
}

std::shared_ptr<FakeInstallProgress> FakeAppRegistry::progress(std::string_view identifier) const {
  const std::scoped_lock lock(mutex_);
  const auto found = applications_.find(identifier);
  return found == applications_.end() ? nullptr : found->second.progress;
}

void FakeAppRegistry::dropProgress(std::string_view identifier) {
  const std::scoped_lock lock(mutex_);
  const auto found = applications_.find(identifier);
  if (found == applications_.end() || !found->second.progress) return;
  found->second.progress->end(found->second.progress->installState());
  found->second.progress.reset();
}

void FakeAppRegistry::whenPackageInstalled(std::string_view path, Package package) {
  const std::scoped_lock lock(mutex_);
  packages_.insert_or_assign(std::string(path), std::move(package));
}

void FakeAppRegistry::failInstall(std::string_view identifier, Error error) {
  const std::scoped_lock lock(mutex_);
  installFailures_.insert_or_assign(std::string(identifier), std::move(error));
}

void FakeAppRegistry::failPlaceholder(std::string_view identifier, Error error) {
  const std::scoped_lock lock(mutex_);
  placeholderFailures_.insert_or_assign(std::string(identifier), std::move(error));
}

void FakeAppRegistry::failUninstall(std::string_view identifier) {
  const std::scoped_lock lock(mutex_);
  uninstallFailures_.emplace(identifier);
}

void FakeAppRegistry::waitWhileBlocked() {
  std::unique_lock lock(mutex_);
  ++installsStarted_;
  mostInstallsAtOnce_ = std::max(mostInstallsAtOnce_, ++installsRunning_);
  installsChanged_.notify_all();
  installsChanged_.wait(lock, [this] { return !blocked_; });
  --installsRunning_;
  installsChanged_.notify_all();
}

void FakeAppRegistry::blockInstalls() {
  const std::scoped_lock lock(mutex_);
  blocked_ = true;
}

void FakeAppRegistry::releaseInstalls() {
  const std::scoped_lock lock(mutex_);
  blocked_ = false;
  installsChanged_.notify_all();
}

bool FakeAppRegistry::waitForInstalls(std::size_t count) {
  std::unique_lock lock(mutex_);
  return installsChanged_.wait_for(lock, std::chrono::minutes(1),
                                   [&] { return installsRunning_ >= count; });
}

std::size_t FakeAppRegistry::installsStarted() const {
  const std::scoped_lock lock(mutex_);
  return installsStarted_;
}

std::size_t FakeAppRegistry::mostInstallsAtOnce() const {
  const std::scoped_lock lock(mutex_);
  return mostInstallsAtOnce_;
}

}  // namespace appsync::fakes
