// Which store accounts the installed applications were bought with.
#include "tests/client/client_test.h"

namespace appsync {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

class AccountIdentifiers : public ClientTest {
 protected:
  static std::string metadataOf(const std::string& identifier) {
    return "/var/mobile/Containers/Applications/" + identifier + "/HalvoMetadata.plist";
  }

  void putApplication(const std::string& identifier, const PropertyList& metadata) {
    phone.appRegistry.seedInstalled(identifier);
    phone.files.putPlist(metadataOf(identifier), metadata);
  }

  static PropertyList nested(const PropertyList& identifier) {
    return Dictionary{{"accountInfo", Dictionary{{"CorvaneID", identifier}}}};
  }

  static inline const std::string DownloadInfo = "com.corvane.HalvoStore.downloadInfo";
  static inline const std::string Start = "log default SyncBundle|getting id's for assets";
  static std::string end(const std::string& set) {
    return "log default SyncBundle|Returning corvane ID set: " + set;
  }
};

TEST_F(AccountIdentifiers, AreNoneWithoutApplications) {
  EXPECT_THAT(client().corvaneIDsForAssets(), IsEmpty());
  expectTrace({Start, "AppRegistry.enumerateBundles(1)", end("()")}, fakes::TraceAll);
}

TEST_F(AccountIdentifiers, ComeFromTheMetadataItself) {
  putApplication("com.a", Dictionary{{"corvaneId", "ann@example.com"}});
  EXPECT_THAT(client().corvaneIDsForAssets(), ElementsAre("ann@example.com"));
  expectTrace({Start, end("(ann@example.com)")});
}

TEST_F(AccountIdentifiers, ComeFromTheDownloadInfoToo) {
  putApplication("com.a", Dictionary{{DownloadInfo, nested("ann@example.com")}});
  EXPECT_THAT(client().corvaneIDsForAssets(), ElementsAre("ann@example.com"));
  expectTrace({Start, end("(ann@example.com)")});
}

TEST_F(AccountIdentifiers, EqualOnesCollapse) {
  putApplication("com.a", Dictionary{{"corvaneId", "ann"}, {DownloadInfo, nested("ann")}});
  putApplication("com.b", Dictionary{{"corvaneId", "ann"}});
  EXPECT_THAT(client().corvaneIDsForAssets(), ElementsAre("ann"));
  expectTrace({Start, end("(ann)")});
}

TEST_F(AccountIdentifiers, TwoDifferentOnesOfOneApplicationBothCount) {
  putApplication("com.a", Dictionary{{"corvaneId", "zoe"}, {DownloadInfo, nested("ann")}});
  EXPECT_THAT(client().corvaneIDsForAssets(), ElementsAre("ann", "zoe"));
  expectTrace({Start, "log default SyncBundle|mismatched CorvaneID keys for com.a: zoe vs ann",
               end("(ann, zoe)")});
}

TEST_F(AccountIdentifiers, AnApplicationWithNeitherIsUnknown) {
  putApplication("com.a", Dictionary{{"title", "Chess"}});
  EXPECT_THAT(client().corvaneIDsForAssets(), IsEmpty());
  expectTrace(
      {Start,
       "log default SyncBundle|unknown CorvaneID for com.a (plist at " + metadataOf("com.a") + ")",
       end("()")});
}

TEST_F(AccountIdentifiers, AnApplicationWithoutReadableMetadataIsUnknown) {
  phone.appRegistry.seedInstalled("com.a");
  phone.appRegistry.seedInstalled("com.b");
  phone.files.putFile(metadataOf("com.b"), "no property list");
  putApplication("com.c", Array{"ann"});
  EXPECT_THAT(client().corvaneIDsForAssets(), IsEmpty());
  const std::string unknown = "log default SyncBundle|unknown CorvaneID for ";
  expectTrace({Start, unknown + "com.a (plist at " + metadataOf("com.a") + ")",
               unknown + "com.b (plist at " + metadataOf("com.b") + ")",
               unknown + "com.c (plist at " + metadataOf("com.c") + ")", end("()")});
}

TEST_F(AccountIdentifiers, AnApplicationWithoutAContainerIsUnknownAndNothingIsReadForIt) {
  phone.appRegistry.seedInstalled("com.a");
  phone.appRegistry.edit("com.a", [](AppRecord& record) { record.bundleContainerPath.reset(); });
  phone.files.putPlist("/HalvoMetadata.plist", Dictionary{{"corvaneId", "nobody"}});
  EXPECT_THAT(client().corvaneIDsForAssets(), IsEmpty());
  expectTrace({Start, "AppRegistry.enumerateBundles(1)",
               "log default SyncBundle|unknown CorvaneID for com.a (plist at (null))", end("()")},
              fakes::TraceAll);
}

TEST_F(AccountIdentifiers, ANumberAsOwnIdentifierIsReportedAndOnlyTheNestedOneCounts) {
  putApplication("com.a", Dictionary{{"corvaneId", 7}, {DownloadInfo, nested("ann")}});
  EXPECT_THAT(client().corvaneIDsForAssets(), ElementsAre("ann"));
  expectTrace({Start, "log error Framework|unexpected type for corvaneID", end("(ann)")});
}

TEST_F(AccountIdentifiers, TheLineOfAnUnexpectedTypeCarriesNoPrefix) {
  putApplication("com.a", Dictionary{{"corvaneId", 7}, {DownloadInfo, nested("ann")}});
  client().corvaneIDsForAssets();
  EXPECT_THAT(
      phone.trace.lines(fakes::TraceLog),
      ElementsAre("log default SyncBundle|com.corvane.twc.AppsClient|getting id's for assets",
                  "log error Framework|unexpected type for corvaneID",
                  "log default SyncBundle|com.corvane.twc.AppsClient|Returning corvane ID "
                  "set: (ann)"));
}

TEST_F(AccountIdentifiers, EveryLevelOfTheDownloadInfoIsChecked) {
  putApplication("com.a", Dictionary{{"corvaneId", "a"}, {DownloadInfo, "text"}});
  putApplication("com.b", Dictionary{{"corvaneId", "b"},
                                     {DownloadInfo, Dictionary{{"accountInfo", Array{}}}}});
  putApplication("com.c", Dictionary{{"corvaneId", "c"}, {DownloadInfo, nested(true)}});
  EXPECT_THAT(client().corvaneIDsForAssets(), ElementsAre("a", "b", "c"));
  expectTrace({Start, "log error Framework|unexpected type for downloadInfo",
               "log error Framework|unexpected type for accountInfo",
               "log error Framework|unexpected type for CorvaneID", end("(a, b, c)")});
}

TEST_F(AccountIdentifiers, AnApplicationWhoseIdentifiersAllHaveUnexpectedTypesIsUnknown) {
  putApplication("com.a", Dictionary{{"corvaneId", Array{}}, {DownloadInfo, nested(1)}});
  EXPECT_THAT(client().corvaneIDsForAssets(), IsEmpty());
  expectTrace(
      {Start, "log error Framework|unexpected type for corvaneID",
       "log error Framework|unexpected type for CorvaneID",
       "log default SyncBundle|unknown CorvaneID for com.a (plist at " + metadataOf("com.a") + ")",
       end("()")});
}

TEST_F(AccountIdentifiers, OneUnknownApplicationDoesNotHideTheOthers) {
  phone.appRegistry.seedInstalled("com.a");
  putApplication("com.b", Dictionary{{"corvaneId", "ann"}});
  EXPECT_THAT(client().corvaneIDsForAssets(), ElementsAre("ann"));
}

}  // namespace
}  // namespace appsync
