#include "tests/contract/coordination_contract.h"

namespace appsync::contract {

std::shared_ptr<InstallCoordinator> CoordinationContract::make(std::string_view identifier,
                                                               CoordinatorKind kind,
                                                               CoordinationClientId client) {
  return coordination.coordinatorFor(kind, identifier, client, true, nullptr, nullptr);
}

std::shared_ptr<InstallCoordinator> CoordinationContract::live(std::string_view identifier) {
  return coordination.coordinatorFor(CoordinatorKind::Any, identifier, SyncHostClientID, false,
                                     nullptr, nullptr);
}

std::shared_ptr<PathTransferPromise> CoordinationContract::packagePromise(
    std::string_view identifier) {
  return coordination.createPathTransferPromise(std::string(identifier) + "-Asset",
                                                SyncHostClientID, std::nullopt, 0);
}

std::shared_ptr<PathTransferPromise> CoordinationContract::iconPromise(
    std::string_view identifier) {
  const std::string path = joinPath(platform.files.temporaryDirectory(), "Icon.png");
  putFile(path, "picture");
  const auto promise = coordination.createPathTransferPromise(
      std::string(identifier) + "-Icon", SyncHostClientID, FileLocation::file(path), 7);
  promise->setPercentComplete(1.0);
  promise->setComplete(true);
  return promise;
}

std::shared_ptr<InstallPlaceholder> CoordinationContract::barePlaceholder(
    std::string_view identifier) {
  return coordination.createAppPlaceholder("Name of " + std::string(identifier), identifier,
                                           InstallType::Sync, SyncHostClientID);
}

std::shared_ptr<InstallPlaceholder> CoordinationContract::placeholder(std::string_view identifier) {
  PlaceholderAttributes attributes;
  attributes.setBundleVersion("2.0");
  const auto made = barePlaceholder(identifier);
  EXPECT_TRUE(made->setPlaceholderAttributes(attributes, nullptr));
  EXPECT_TRUE(made->setMetadata({.values = {{"itemName", "Store name"}}}, nullptr));
  EXPECT_TRUE(made->setConfigurationComplete(nullptr));
  return made;
}

std::shared_ptr<InstallCoordinator> CoordinationContract::prepare(std::string_view identifier,
                                                                  CoordinatorKind kind,
                                                                  CoordinatorObserver* observer) {
  const auto coordinator = make(identifier, kind);
  coordinator->setObserver(observer);
  const InstallOptions options{std::nullopt, InstallType::Sync, 1, std::nullopt};
  EXPECT_TRUE(coordinator->setInstallOptions(options, nullptr));
  EXPECT_TRUE(coordinator->setInitialQPKAssetPromises({}, nullptr));
  EXPECT_TRUE(coordinator->setAppAssetPromise(packagePromise(identifier), nullptr));
  EXPECT_TRUE(coordinator->setPlaceholderPromise(placeholder(identifier), nullptr));
  return coordinator;
}

void CoordinationContract::deliver(InstallCoordinator& coordinator, std::string_view content) {
  const std::string path =
      joinPath(platform.files.temporaryDirectory(), std::string(content) + ".package");
  phone->putPackage(path, content, "2.0");
  const auto promise = coordinator.appAssetPromise(nullptr);
  promise->setTransferPath(FileLocation::file(path));
  promise->setPercentComplete(1.0);
  promise->setComplete(true);
  phone->settle(*coordinator.bundleIdentifier());
}

std::string CoordinationContract::version(std::string_view identifier) {
  const auto record = platform.appRegistry.recordForIdentifier(identifier, false);
  if (!record || record->isPlaceholder) return "none";
  return record->bundleVersion.value_or("unknown");
}

bool CoordinationContract::hasPlaceholder(std::string_view identifier) {
  return platform.appRegistry.recordForIdentifier(identifier, true).has_value();
}

}  // namespace appsync::contract
