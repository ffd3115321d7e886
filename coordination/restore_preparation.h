#pragma once

#include <memory>
#include <optional>
#include <string_view>

#include "client/apps_client.h"

namespace appsync {

/// What a restored backup holds of one application. Borrows everything.
struct RestoredApp {
  std::string_view bundleId;
  ByteView metadata;  ///< a property list with a dictionary
  const std::optional<Bytes>& sinf;
  const std::optional<Bytes>& icon;
};

/// Makes ready the coordinator that brings one application of a restored backup back. Works on one
/// thread, for one run.
class RestorePreparation {
 public:
  RestorePreparation(AppsClient& client, const Platform& platform, const ClientLog& log,
                     const RestoredApp& app)
      : client_(client), platform_(platform), log_(log), app_(app) {}

  /// An application that was on the device: the store brings its package back. Whether all is
  /// ready; if not, what was begun has been cancelled.
  [[nodiscard]] bool runNonDemoted();
  /// An application of which only a placeholder was on the device: it gets that placeholder again.
  [[nodiscard]] bool runDemoted(DemotionStatus demotionStatus);

 private:
  [[nodiscard]] bool prepareNonDemoted();
  [[nodiscard]] bool prepareDemoted(DemotionStatus demotionStatus);

  [[nodiscard]] bool parseMetadata();
  void obtainCoordinator();
  /// The package is the store's business already.
  bool storeBringsPackage() const;
  [[nodiscard]] bool addUserDataPromise();
  [[nodiscard]] bool addInstallOptions();
  [[nodiscard]] bool addPlaceholderPromise(DemotionStatus demotionStatus);
  [[nodiscard]] bool leavePackageToStore();
  void cancel();

  AppsClient& client_;
  const Platform& platform_;
  const ClientLog& log_;
  const RestoredApp app_;

  PropertyList::Dictionary metadata_;
  std::shared_ptr<InstallCoordinator> coordinator_;
  /// The placeholder, when the coordinator did not take it.
  std::shared_ptr<InstallPlaceholder> adrift_;
  /// What the platform gave for the last step that could give a reason.
  std::optional<Error> error_;
};

}  // namespace appsync
