#pragma once

#include <string>
#include <vector>

#include "tests/client/client_test.h"

namespace appsync {

inline const std::string IconsPath = SyncRootPath + "/Icons";

/// A phone with a work area, into which a test stages what the desktop wants.
class OutstandingTransfers : public ClientTest {
 protected:
  void SetUp() override {
    phone.files.putDirectory(WorkAreaPath);
    phone.homeScreen.setOrder({});
  }

  static Dictionary install(const PropertyList& identifier) {
    return {{"operation", "install"}, {"identifier", identifier}, {"version", "2.0"}};
  }
  void putEntries(const Array& entries) { phone.files.putPlist(TodoListPath, entries); }

  /// What the desktop staged for an application.
  void stage(const std::string& identifier, const std::string& displayName) {
    const std::string path = WorkAreaPath + "/" + identifier;
    phone.files.putPlist(path + "/Info.plist", Dictionary{{"KBBundleDisplayName", displayName},
                                                          {"KBBundleIconFile", "Icon.png"}});
    phone.files.putFile(path + "/Icon.png", "picture");
    phone.files.putFile(path + "/HalvoArtwork", "artwork");
  }

  Lines identifiersOf(const std::vector<SyncAssetPtr>& assets) {
    Lines identifiers;
    for (const SyncAssetPtr& asset : assets) identifiers.push_back(asset->identifier);
    return identifiers;
  }
  Lines requested() { return identifiersOf(client().outstandingAssetTransfers()); }

  /// Requests, and begins the trace anew.
  SyncAssetPtr requestOne() {
    const std::vector<SyncAssetPtr> assets = client().outstandingAssetTransfers();
    EXPECT_EQ(assets.size(), 1u);
    phone.appRegistry.waitForEvents();
    forgetTrace();
    return assets.empty() ? nullptr : assets.front();
  }

  void seedRestore(const std::string& identifier) {
    phone.appRegistry.seedPlaceholder(identifier, InstallType::Restore);
  }
  void rememberPath(const std::string& identifier, const std::string& path,
                    const std::string& version = "1.0") {
    const Dictionary versions{{version, Dictionary{{"path", path}}}};
    phone.files.putPlist(RestoreStatePath, Dictionary{{identifier, versions}});
  }
  bool logged(const std::string& line) { return phone.trace.count(line) > 0; }
  bool loggedMessage(const std::string& message) {
    return logged("log default SyncBundle|com.corvane.twc.AppsClient|" + message);
  }
};

class CoordinatedTransfers : public OutstandingTransfers {
 protected:
  void SetUp() override {
    OutstandingTransfers::SetUp();
    phone.installCoordination.setEnabled(true);
  }
};

}  // namespace appsync
