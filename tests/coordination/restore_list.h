#pragma once

#include "tests/coordination/coordination_fixture.h"

namespace appsync::fakes {

inline constexpr const char* RestoreList =
    "/var/mobile/Media/HalvoRestore/RestoreApplications.plist";
inline constexpr const char* KeptCopy = "/var/mobile/Library/Logs/Vellum/RestoreApplications.plist";
inline constexpr const char* DemotedApps =
    "/var/mobile/Library/Preferences/com.corvane.Safekeep.DemotedApps.plist";

/// Metadata that suffice for a placeholder.
inline PropertyList::Dictionary plainMetadata() {
  return {{"bundleVersion", "3"}, {"title", "Rho"}};
}

/// An application's entry in the restore list.
inline PropertyList entryWith(const PropertyList::Dictionary& metadata) {
  return PropertyList::Dictionary{{"HalvoMetadata", plistBytes(metadata)},
                                  {"ApplicationSINF", toBytes("sinf")},
                                  {"PlaceholderIcon", toBytes("icon")}};
}

/// How the list is put aside at the end.
inline Trace listKept() {
  return {"FileManager.removeItem(" + std::string(KeptCopy) + ")",
          "FileManager.moveItem(" + std::string(RestoreList) + ", " + KeptCopy + ")"};
}

/// A phone that was restored from a backup.
class RestoredBackupTest : public CoordinationTest {
 protected:
  explicit RestoredBackupTest(bool coordinated) : CoordinationTest(coordinated) {
    phone.files.putDirectory("/var/mobile/Library/Logs/Vellum");
  }

  void putList(PropertyList::Dictionary entries) {
    phone.files.putPlist(RestoreList, std::move(entries));
  }
  bool process() { return client->_processHalvoRestoreInfo(); }
  bool listIsKept() const {
    return !phone.files.exists(RestoreList) && phone.files.exists(KeptCopy);
  }
};

}  // namespace appsync::fakes
