#pragma once

#include "tests/coordination/coordination_fixture.h"

namespace appsync::fakes {

/// What preparing the first install of "com.a" does when nothing fails.
inline Trace preparedInstall() {
  return {
      "log default Oversize|processing app install for bundle 'com.a', title Alpha assetplist "
      "{SWApplicationLaunchProhibited = 1}, version 2.0 with install coordination",
      R"(transaction step 1 party 1 phase 1 ok com.a "Install App")",
      R"(transaction step 3 party 1 phase 1 ok com.a "Create coordinator")",
      "InstallCoordination.coordinatorFor(com.a, initiating, 3, create)",
      said("Created initiating coordinator <Coordinator com.a> (createIfNotExisting:1, "
           "existingApp:0) for com.a with error (null)"),
      R"(transaction step 3 party 1 phase 2 ok com.a "Finished creating coordinator")",
      "InstallCoordinator.setObserver(com.a)",
      "InstallCoordinator.setInstallOptions(com.a, type 4 target 1 metadata {itemId = 42})",
      said("set install options on coordinator for com.a"),
      "InstallCoordinator.setInitialQPKAssetPromises(com.a, 0)",
      said("set QPK asset promise to install coordinator for com.a"),
      "InstallCoordination.createPathTransferPromise(com.a-Asset, 3, none, 0)",
      "InstallCoordinator.setAppAssetPromise(com.a, com.a-Asset)",
      said("Added app asset promise to coordinator for 'com.a'"),
      "FileManager.createDirectory(/tmp/com.corvane.twc.Apps/com.a.app, true, mobile:mobile)",
      said("Created app directory for 'com.a' at /tmp/com.corvane.twc.Apps/com.a.app with "
           "err=(null)"),
      R"(transaction step 5 party 1 phase 1 ok com.a "Copying icon")",
      "FileManager.removeItem(/tmp/com.corvane.twc.Apps/com.a.app/Icon.png)",
      "FileManager.copyItem(/icons/com.a.png, /tmp/com.corvane.twc.Apps/com.a.app/Icon.png)",
      said("icon for com.a at /tmp/com.corvane.twc.Apps/com.a.app/Icon.png has a size of 5"),
      said("Copied icon from /icons/com.a.png to /tmp/com.corvane.twc.Apps/com.a.app/Icon.png "
           "with error (null) for 'com.a', sizeOnDisk:5"),
      R"(transaction step 5 party 1 phase 2 ok com.a "Copying icon")",
      R"(transaction step 4 party 1 phase 1 ok com.a "Create placeholder")",
      "InstallCoordination.createAppPlaceholder(com.a, Alpha, 4, 3)",
      said("Created placeholder <Placeholder com.a> for 'com.a' of type 4"),
      R"(transaction step 4 party 1 phase 2 ok com.a "Finished creating placeholder")",
      "InstallCoordination.createPathTransferPromise(com.a-Icon, 3, "
      "/tmp/com.corvane.twc.Apps/com.a.app/Icon.png, 5)",
      "DataPromise.setPercentComplete(com.a-Icon, 1)",
      "DataPromise.setComplete(com.a-Icon, true)",
      "InstallPlaceholder.setIconPromise(com.a, com.a-Icon)",
      said("Added icon promise to placeholder for 'com.a'"),
      "InstallPlaceholder.setPlaceholderAttributes(com.a, {SWApplicationLaunchProhibited = 1; "
      "bundleVersion = 2.0; launchProhibited = 1})",
      said("set {SWApplicationLaunchProhibited = 1; bundleVersion = 2.0; launchProhibited = 1} "
           "attributes on placeholder for com.a"),
      "InstallPlaceholder.setMetadata(com.a, {itemId = 42})",
      said("set store metadata on placeholder for com.a"),
      "InstallPlaceholder.setConfigurationComplete(com.a)",
      said("set placeholder configuration as complete for com.a"),
      "InstallCoordinator.setPlaceholderPromise(com.a, <Placeholder com.a>)",
      said("added placeholder promise to coordinator for com.a"),
      said("processing app install for bundle com.a finished with status 1 error (null)"),
      R"(transaction step 1 party 1 phase 2 ok com.a "Install app")",
  };
}

/// The same lines when an installed "com.a" is updated.
inline Trace asUpdate(Trace lines) {
  const std::pair<std::string_view, std::string_view> changes[] = {
      {"\"Install App\"", "\"Update app\""},  // its end is recorded as an install all the same
      {"initiating", "updating"},
      {"existingApp:0", "existingApp:1"}};
  for (std::string& line : lines) {
    for (const auto& [install, update] : changes) {
      const std::size_t at = line.find(install);
      if (at != std::string::npos) line.replace(at, install.size(), update);
    }
  }
  return lines;
}

/// How preparing ends when it fails.
inline Trace installGivenUp(const std::string& error) {
  return {said("processing app install for bundle com.a finished with status 0 error " + error),
          R"(transaction step 1 party 1 phase 2 failed com.a "Install app")"};
}

inline Trace installCoordinatorCancelled() {
  return {said("Cancelling coordinator for appBundleIdentifier:com.a"),
          "InstallCoordinator.cancel(com.a, Error Domain=TWError Code=1, 3)"};
}

}  // namespace appsync::fakes
