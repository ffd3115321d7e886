#include "tests/device/coordination_test.h"

#include <SQLiteCpp/SQLiteCpp.h>

#include <algorithm>
#include <stdexcept>

namespace appsync::device {
namespace {

InstallOptions syncOptions() {
  return {StoreMetadata{{{"itemName", "Store name"}}}, InstallType::Sync, 1, std::nullopt};
}

}  // namespace

void WaitingWatcher::assertionDenied(std::string_view bundleId) noexcept {
  add("denied " + std::string(bundleId));
}
void WaitingWatcher::installFinished(std::string_view bundleId,
                                     const std::optional<Error>& error) noexcept {
  add((error ? "failed " : "installed ") + std::string(bundleId));
}
void WaitingWatcher::add(std::string entry) {
  const std::lock_guard lock(mutex_);
  entries_.push_back(std::move(entry));
  changed_.notify_all();
}
bool WaitingWatcher::waitFor(std::string_view entry) {
  std::unique_lock lock(mutex_);
  return changed_.wait_for(lock, std::chrono::minutes(1),
                           [&] { return std::ranges::find(entries_, entry) != entries_.end(); });
}
std::vector<std::string> WaitingWatcher::entries() {
  const std::lock_guard lock(mutex_);
  return entries_;
}

CoordinationTest::CoordinationTest() {
  device.reset();
  std::filesystem::remove_all(folder);
  DeviceError problem;
  if (!EmbeddedDevice::initialize(folder, {true}, problem)) {
    throw std::runtime_error(problem.message);
  }
  reopen();
}

CoordinationTest::~CoordinationTest() { device.reset(); }

DeviceInstallCoordination& CoordinationTest::service() {
  return dynamic_cast<DeviceInstallCoordination&>(platform().installCoordination);
}

std::shared_ptr<InstallCoordinator> CoordinationTest::coordinatorFor(std::string_view identifier,
                                                                     CoordinatorKind kind,
                                                                     CoordinationClientId client) {
  return service().coordinatorFor(kind, identifier, client, true, nullptr, nullptr);
}

std::shared_ptr<InstallCoordinator> CoordinationTest::observed(std::string_view identifier,
                                                               CoordinatorKind kind) {
  const auto coordinator = coordinatorFor(identifier, kind);
  coordinator->setObserver(&recorder);
  return coordinator;
}

std::shared_ptr<InstallCoordinator> CoordinationTest::live(std::string_view identifier) {
  return service().coordinatorFor(CoordinatorKind::Any, identifier, SyncHostClientID, false,
                                  nullptr, nullptr);
}

std::shared_ptr<PathTransferPromise> CoordinationTest::packagePromise(std::string_view identifier) {
  return service().createPathTransferPromise(std::string(identifier) + "-Asset", SyncHostClientID,
                                             std::nullopt, 0);
}

std::shared_ptr<InstallPlaceholder> CoordinationTest::placeholderOf(std::string_view identifier,
                                                                    InstallType type) {
  const std::string id(identifier);
  const std::string icon = "/tmp/Icons/" + id + ".png";
  putFile(icon, "picture of " + id);
  const auto promise = service().createPathTransferPromise(id + "-Icon", SyncHostClientID,
                                                           FileLocation::file(icon), 1);
  promise->setPercentComplete(1.0);
  promise->setComplete(true);
  const auto placeholder =
      service().createAppPlaceholder("Name of " + id, id, type, SyncHostClientID);
  PlaceholderAttributes attributes;
  attributes.setBundleVersion("2.0");
  const bool configured = placeholder->setIconPromise(promise, nullptr) &&
                          placeholder->setPlaceholderAttributes(attributes, nullptr) &&
                          placeholder->setMetadata({{{"itemName", "Store name"}}}, nullptr);
  if (!configured) throw std::runtime_error("no placeholder");
  return placeholder;
}

std::shared_ptr<InstallPlaceholder> CoordinationTest::completePlaceholder(
    std::string_view identifier, InstallType type) {
  const auto placeholder = placeholderOf(identifier, type);
  placeholder->setConfigurationComplete(nullptr);
  return placeholder;
}

std::shared_ptr<InstallCoordinator> CoordinationTest::prepare(std::string_view identifier,
                                                              CoordinatorKind kind,
                                                              CoordinatorObserver* observer) {
  const auto coordinator = coordinatorFor(identifier, kind);
  coordinator->setObserver(observer);
  const bool ready = coordinator->setInstallOptions(syncOptions(), &error) &&
                     coordinator->setInitialQPKAssetPromises({}, &error) &&
                     coordinator->setAppAssetPromise(packagePromise(identifier), &error) &&
                     coordinator->setPlaceholderPromise(completePlaceholder(identifier), &error);
  if (!ready) throw std::runtime_error(description(*error));
  return coordinator;
}

FileLocation CoordinationTest::stageApplication(std::string_view identifier,
                                                std::string_view version) {
  return stage(PackageArchive().addApplication(identifier, version));
}

void CoordinationTest::deliver(InstallCoordinator& coordinator, std::string_view identifier) {
  deliver(coordinator, stageApplication(identifier));
}

void CoordinationTest::deliver(InstallCoordinator& coordinator, const FileLocation& package) {
  const auto promise = coordinator.appAssetPromise(nullptr);
  promise->setTransferPath(package);
  promise->setPercentComplete(1.0);
  promise->setComplete(true);
}

void CoordinationTest::waitUntilIdle(std::string_view identifier) {
  while (service().isBusy(identifier)) std::this_thread::yield();
}

bool CoordinationTest::launch(std::string_view identifier) {
  DeviceError problem;
  return EmbeddedDevice::launch(folder, identifier, problem, nullptr);
}

void CoordinationTest::quit(std::string_view identifier) {
  DeviceError problem;
  EmbeddedDevice::quit(folder, identifier, problem, nullptr);
}

bool CoordinationTest::logMentions(std::string_view text) {
  return std::ranges::any_of(
      logTexts(), [&](const std::string& line) { return line.find(text) != std::string::npos; });
}

void CoordinationTest::edit(const std::string& sql) {
  SQLite::Database database((folder / "device.db").string(), SQLite::OPEN_READWRITE);
  database.exec(sql);
}

}  // namespace appsync::device
