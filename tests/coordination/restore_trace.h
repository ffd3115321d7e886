#pragma once

#include "tests/coordination/coordination_fixture.h"

namespace appsync::fakes {

/// The store metadata of the restored application "com.r".
inline PropertyList::Dictionary restoredMetadata() {
  return {{"bundleVersion", "3"}, {"title", "Rho"}};
}

/// Icon and placeholder of "com.r" as a restore makes them; `type` is the install type.
inline Trace restoredPlaceholder(const std::string& type) {
  return {
      "FileManager.createDirectory(/tmp/com.corvane.twc.Apps/com.r.app, true, mobile:mobile)",
      said("Created app directory for 'com.r' at /tmp/com.corvane.twc.Apps/com.r.app with "
           "err=(null)"),
      "FileManager.createFile(/tmp/com.corvane.twc.Apps/com.r.app/Icon.png, mobile:mobile)",
      said("icon data for 'com.r' was writen to /tmp/com.corvane.twc.Apps/com.r.app/Icon.png with "
           "status:1 fileSize:4"),
      R"(transaction step 4 party 1 phase 1 ok com.r "Create placeholder")",
      "InstallCoordination.createAppPlaceholder(com.r, Rho, " + type + ", 3)",
      said("Created placeholder <Placeholder com.r> for 'com.r' of type " + type),
      R"(transaction step 4 party 1 phase 2 ok com.r "Finished creating placeholder")",
      "InstallCoordination.createPathTransferPromise(com.r-Icon, 3, "
      "/tmp/com.corvane.twc.Apps/com.r.app/Icon.png, 4)",
      "DataPromise.setPercentComplete(com.r-Icon, 1)",
      "DataPromise.setComplete(com.r-Icon, true)",
      "InstallPlaceholder.setIconPromise(com.r, com.r-Icon)",
      said("Added icon promise to placeholder for 'com.r'"),
      "InstallPlaceholder.setPlaceholderAttributes(com.r, {bundleVersion = 3; launchProhibited = "
      "0})",
      said("set {bundleVersion = 3; launchProhibited = 0} placeholder attributes for com.r"),
      "InstallPlaceholder.setMetadata(com.r, {bundleVersion = 3; title = Rho})",
      said("set store metadata on placeholder for com.r"),
      "InstallPlaceholder.setSinfData(com.r, <73696e66>)",
      said("set SINF data on placeholder for com.r"),
      "InstallPlaceholder.setConfigurationComplete(com.r)",
      said("set placeholder configuration complete for com.r"),
      "InstallCoordinator.setPlaceholderPromise(com.r, <Placeholder com.r>)",
      said("added placeholder promise for com.r"),
  };
}

inline Trace promisedUserData() {
  return {"InstallCoordination.createOutOfBandTransferPromise(com.r-UserData, 3, 0)",
          "DataPromise.setPercentComplete(com.r-UserData, 1)",
          "DataPromise.setComplete(com.r-UserData, true)",
          "InstallCoordinator.setUserDataPromise(com.r, com.r-UserData)",
          said("Added out of band user data promise for for com.r")};
}

inline Trace restoreBegun() {
  return {said("processing app restore for non demoted bundle 'com.r' with install coordination"),
          R"(transaction step 2 party 1 phase 1 ok com.r "Restore app")"};
}

inline Trace restoreEnded(bool status, const std::string& error) {
  return {said("processing app restore for com.r finished with status " +
               std::string(status ? "1" : "0") + " error " + error),
          "transaction step 2 party 1 phase 2 " + std::string(status ? "ok" : "failed") +
              R"( com.r "Restore app")"};
}

inline Trace demotedRestoreBegun() {
  return {said("processing app restore for demoted bundle 'com.r' with install coordination"),
          R"(transaction step 2 party 1 phase 1 ok com.r "Restore demoted app")"};
}

inline Trace demotedRestoreEnded(bool status, const std::string& error) {
  return {said("processing app restore for demoted app com.r finished with status " +
               std::string(status ? "1" : "0") + " error " + error),
          "transaction step 2 party 1 phase 2 " + std::string(status ? "ok" : "failed") +
              R"( com.r "Restore demoted app")"};
}

inline Trace restoreOptionsSet() {
  return {
      "InstallCoordinator.setInstallOptions(com.r, type 2 target 1 metadata {bundleVersion = "
      "3; title = Rho} sinf <73696e66>)",
      said("added install options for com.r")};
}

inline Trace packageLeftToStore() {
  return {"InstallCoordinator.setAppAssetPromiseResponsibleClient(com.r, 1)",
          said("set KQClientKiosk to satisfy app asset promise for com.r")};
}

inline Trace restoreCoordinatorCancelled() {
  return {said("Cancelling coordinator for appBundleIdentifier:com.r"),
          "InstallCoordinator.cancel(com.r, Error Domain=TWError Code=29, 3)"};
}

inline Trace restorePlaceholderCancelled() {
  return {said("Cancelling placeholder for appBundleIdentifier:com.r"),
          "InstallPlaceholder.cancel(com.r, Error Domain=TWError Code=29, 3)"};
}

/// What restoring "com.r" does when nothing fails.
inline Trace restored() {
  return joined({restoreBegun(),
                 {"InstallCoordination.coordinatorFor(com.r, restoring, 3, create)"},
                 promisedUserData(),
                 restoreOptionsSet(),
                 restoredPlaceholder("2"),
                 packageLeftToStore(),
                 restoreEnded(true, "(null)")});
}

/// The same when "com.r" was demoted by the system.
inline Trace restoredDemoted() {
  return joined({demotedRestoreBegun(),
                 {"InstallCoordination.coordinatorFor(com.r, restoring demoted, 3, create)"},
                 promisedUserData(),
                 restoredPlaceholder("7"),
                 demotedRestoreEnded(true, "(null)")});
}

class RestoreTest : public CoordinationTest {
 protected:
  bool restore(DemotionStatus status = DemotionStatus::NotDemoted) {
    return client->prepareAppForRestoreUsingCoordination("com.r", metadata, sinf, icon, status);
  }
  std::shared_ptr<FakeInstallCoordinator> seed(CoordinatorKind kind = CoordinatorKind::Restoring) {
    return phone.installCoordination.seedCoordinator(kind, "com.r", SyncHostClientID);
  }
  FakeInstallPlaceholder::State placeholder() const {
    return phone.installCoordination.placeholders().front()->state();
  }

  Bytes metadata = plistBytes(restoredMetadata());
  std::optional<Bytes> sinf = toBytes("sinf");
  std::optional<Bytes> icon = toBytes("icon");
};

}  // namespace appsync::fakes
