#pragma once

#include <memory>
#include <string>

#include "tests/client/client_test.h"

namespace appsync {

inline const Error Final{"Final", 7, {}, nullptr};
inline const Error Passing{"Passing", 8, {}, nullptr};

/// A phone to which packages come.
class TransferResults : public ClientTest {
 protected:
  void SetUp() override {
    phone.files.putDirectory(WorkAreaPath);
    phone.files.putFile(StagingRootPath + "/a.zip", "package");
    phone.files.putFile("/var/mobile/Media/Downloads/a.zip", "package");
  }

  SyncAssetPtr asset(std::string_view identifier = "com.a") {
    const SyncAssetPtr made = phone.host.makeDownload(identifier, "Application", "Alpha");
    made->variantOptions = {{"Version", "1.0"}};
    made->shortDescription = std::string(identifier);
    return made;
  }
  SyncAssetPtr received(const std::string& path, std::string_view identifier = "com.a") {
    const SyncAssetPtr made = asset(identifier);
    made->path = path;
    return made;
  }
  SyncAssetPtr restored(const std::optional<std::string>& path) {
    const SyncAssetPtr made = asset();
    made->isRestore = true;
    made->path = path;
    made->completedAssetParts = kTWAssetPartApplication;
    return made;
  }

  void succeed(const SyncAssetPtr& made) {
    client();
    forgetTrace();
    client().assetTransferSucceeded(made, true, std::nullopt);
  }
  void fail(const SyncAssetPtr& made, const std::optional<Error>& error) {
    client();
    forgetTrace();
    client().assetTransferSucceeded(made, false, error);
  }
  /// Ends the transfers, and with them the installs that run on other threads.
  void settle() { client().assetTransferEndedWithSuccess(true); }
};

/// The same with a coordinator for "com.a".
class CoordinatedResults : public TransferResults {
 protected:
  void SetUp() override {
    TransferResults::SetUp();
    phone.installCoordination.setEnabled(true);
    coordinator = phone.installCoordination.seedCoordinator(CoordinatorKind::Initiating, "com.a",
                                                            SyncHostClientID);
  }
  std::shared_ptr<fakes::FakeInstallCoordinator> coordinator;
};

}  // namespace appsync
