#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "client/apps_client.h"

namespace appsync {

/// Makes ready the coordinator that installs or updates one application: its options, its promises
/// and the placeholder that stands for it. Works on one thread, for one run.
class InstallPreparation {
 public:
  InstallPreparation(AppsClient& client, const Platform& platform, const ClientLog& log,
                     const SyncAsset& asset, bool existingApp);

  /// Whether the package may be sent. If not, what was begun has been cancelled.
  [[nodiscard]] bool run();

 private:
  [[nodiscard]] bool prepare();
  [[nodiscard]] bool addInstallOptions();
  [[nodiscard]] bool addInitialAssetPromises();
  [[nodiscard]] bool addAppAssetPromise();
  [[nodiscard]] bool addPlaceholder();

  /// Copies the asset's icon into the placeholder bundle.
  void copyIcon(const std::string& bundlePath);
  [[nodiscard]] bool addIconPromise(const std::string& bundlePath);
  /// Fills in the placeholder up to the first failure.
  void configurePlaceholder();
  [[nodiscard]] bool setAttributes();
  [[nodiscard]] bool setStoreMetadata();
  void setConfigurationComplete();

  void cancel();

  AppsClient& client_;
  const Platform& platform_;
  const ClientLog& log_;
  const SyncAsset& asset_;
  const bool existingApp_;
  const std::string& bundleId_;
  /// none when there is no such file or it holds no dictionary.
  const std::optional<PropertyList::Dictionary> info_;
  const std::optional<PropertyList::Dictionary> store_;
  const std::optional<std::string> version_;

  std::shared_ptr<InstallCoordinator> coordinator_;
  std::shared_ptr<InstallPlaceholder> placeholder_;
  /// The placeholder, when the coordinator did not take it.
  std::shared_ptr<InstallPlaceholder> adrift_;
  /// Empty when the coordinator had its options already.
  StoreMetadata storeMetadata_;
  std::uint64_t iconSize_ = 0;  ///< bytes
  /// What the platform gave for the last step that could give a reason.
  std::optional<Error> error_;
};

}  // namespace appsync
