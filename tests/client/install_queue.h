#pragma once

#include <algorithm>
#include <string>

#include "tests/client/client_test.h"

namespace appsync {

inline const std::string PackagePath = StagingRootPath + "/a.zip";
inline const Error Refused{std::string(InstallerServiceErrorDomain), 2, {}, nullptr};
inline const Error Passing{"Passing", 8, {}, nullptr};

/// A phone on which one package waits to be installed.
class InstallQueue : public ClientTest {
 protected:
  void SetUp() override {
    phone.files.putFile(PackagePath, "package");
    putTodo({{"com.a", "DOWNLOADED"}});
  }

  SyncAssetPtr asset(std::string_view identifier = "com.a", const std::string& path = PackagePath) {
    const SyncAssetPtr made = phone.host.makeDownload(identifier, "Application", std::nullopt);
    made->path = path;
    return made;
  }
  void prepare() {
    client();
    forgetTrace();
  }
  /// One whole install, on the install queue.
  void install(const SyncAssetPtr& made) {
    prepare();
    client()._enqueueAssetInstall(made);
    client().assetTransferEndedWithSuccess(false);
  }
  /// The trace up to the end of the install, without the end of the transfers.
  Lines installTrace() {
    Lines trace = phone.trace.readable();
    const auto end =
        std::ranges::find(trace, "log default SyncBundle|asset transfer ended withsuccess: n");
    // The end is announced before the wait, at any point of the install.
    if (end != trace.end()) trace.erase(end);
    std::erase_if(trace, [](const std::string& line) {
      return line.find("SystemNotifier.") == 0 || line.find("serverPort") != std::string::npos ||
             line.find("Notifying DS") != std::string::npos;
    });
    return trace;
  }
  static Lines begun() {
    return {"log default SyncBundle|Enqueue install request for com.a",
            "log default SyncBundle|Performing install for com.a",
            "log default SyncBundle|Grabbing assertion for com.a",
            "HomeScreenService.createTerminationAssertion(com.a, 0)"};
  }
  static Lines ended() {
    return {"FileManager.removeItem(" + PackagePath + ")",
            "log default SyncBundle|Finished install for com.a"};
  }
  static Lines joined(Lines first, const Lines& second) {
    first.insert(first.end(), second.begin(), second.end());
    return first;
  }
  /// Compares the trace of one whole install but for how it begins and ends, which is always alike.
  void expectInstall(const Lines& between) {
    EXPECT_THAT(installTrace(),
                testing::ElementsAreArray(joined(joined(begun(), between), ended())));
  }
};

inline const std::string InstallCall = "AppRegistry.installApplication(" + PackagePath +
                                       ", {KBBundleIdentifier = com.a; SWPackageTypeKey = "
                                       "SWPackageTypeCustomer})";

}  // namespace appsync
