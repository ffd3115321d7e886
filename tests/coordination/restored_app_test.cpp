// One application of a restored backup becomes a placeholder in the registry.

#include "tests/coordination/restore_list.h"

namespace appsync::fakes {
namespace {

const std::string BundlePath = "/tmp/com.corvane.twc.Apps/com.r.app";

class RestoredAppTest : public RestoredBackupTest {
 protected:
  RestoredAppTest() : RestoredBackupTest(false) {}

  bool process(const PropertyList::Dictionary& from) {
    metadata = plistBytes(from);
    return client->_processHalvoRestoreInfoForApp("com.r", metadata, sinf, icon);
  }
  std::optional<PropertyList> infoValue(std::string_view key) const {
    const std::optional<PropertyList> info = phone.files.plistAt(BundlePath + "/Info.plist");
    const PropertyList* value = info ? info->find(key) : nullptr;
    return value ? std::optional(*value) : std::nullopt;
  }

  Bytes metadata;
  std::optional<Bytes> sinf = toBytes("sinf");
  std::optional<Bytes> icon = toBytes("icon");
};

constexpr const char* Info =
    "{KBBundleDisplayName = Rho; KBBundleExecutable = Rho; KBBundleIconFile = Icon.png; "
    "KBBundleIdentifier = com.r; KBBundleVersion = 3; SWApplicationLaunchProhibited = 0; "
    "UIPeriodixApp = 0}";

Trace recorded(bool success, const std::string& text) {
  return {"transaction scenario \"Halvo App Restore\" " + std::string(success ? "ok" : "failed") +
          " com.r \"" + text + "\""};
}

Trace iconWritten() {
  return {"FileManager.createFile(" + BundlePath + "/Icon.png, mobile:mobile)",
          said("icon data for 'com.r' was writen to " + BundlePath +
               "/Icon.png with status:1 fileSize:4")};
}

Trace begun(const std::string& info = Info, const Trace& icon = iconWritten()) {
  return joined({{said("processing app restore info for 'com.r'"),
                  "FileManager.createDirectory(" + BundlePath + ", true, mobile:mobile)",
                  said("Created app directory for 'com.r' at " + BundlePath + " with err=(null)")},
                 icon,
                 {said("creating placeholder for 'com.r'. info.plist=" + info)}});
}

Trace infoWritten() { return {"FileManager.writeAtomically(" + BundlePath + "/Info.plist)"}; }

Trace gaveUp(const std::string& metadata = "{bundleVersion = 3; title = Rho}") {
  return {
      said("failed to process app restore info for 'com.r'. halvoMetadataDictionary=" + metadata)};
}

Trace installed(const Bytes& metadata) {
  const PropertyList::Dictionary options{{"SWPackageTypeKey", SWPackageTypePlaceholder},
                                         {"KBBundleIdentifier", "com.r"},
                                         {"SWInstallType", 2},
                                         {"SWHalvoMetadataKey", metadata},
                                         {"SWApplicationSINFKey", toBytes("sinf")}};
  return joined(
      {{callText("AppRegistry.installApplication", FileLocation::directory(BundlePath), options),
        said("Installed Placeholder app from path " + BundlePath +
             ": Rho [com.r 3] [isPeriodix: 0]")},
       recorded(true, "Installed placeholder")});
}

TEST_F(RestoredAppTest, IsInstalledAsAPlaceholderWithBlobAndMetadata) {
  EXPECT_TRUE(process(plainMetadata()));
  EXPECT_EQ(effects(), joined({begun(), infoWritten(), installed(metadata)}));
  EXPECT_EQ(phone.appRegistry.placeholder("com.r")->installType, InstallType::Restore);
}

TEST_F(RestoredAppTest, AMissingBlobIsHandedOverAsNull) {
  sinf = std::nullopt;
  EXPECT_TRUE(process(plainMetadata()));
  EXPECT_EQ(phone.trace.count("AppRegistry.installApplication"), 1u);
  EXPECT_THAT(phone.trace.calls(),
              testing::Contains(testing::HasSubstr("SWApplicationSINFKey = (null)")));
}

TEST_F(RestoredAppTest, MetadataThatDoNotParseCountAsHandled) {
  std::optional<Error> error;
  const Bytes damaged = toBytes("no property list");
  ASSERT_FALSE(parsePropertyList(damaged, &error));
  EXPECT_TRUE(client->_processHalvoRestoreInfoForApp("com.r", damaged, sinf, icon));
  EXPECT_EQ(
      effects(),
      joined({{said("processing app restore info for 'com.r'"),
               said("failed to parse halvo metadata for 'com.r'. err=" + description(*error))},
              recorded(false, "Failed to parse halvo metadata")}));
}

TEST_F(RestoredAppTest, MetadataThatAreNoDictionaryCountAsHandled) {
  EXPECT_TRUE(client->_processHalvoRestoreInfoForApp(
      "com.r", plistBytes(PropertyList::Array{"title"}), sinf, icon));
  EXPECT_EQ(phone.trace.transactions(), recorded(false, "Failed to parse halvo metadata"));
}

TEST_F(RestoredAppTest, WithoutADirectoryItFails) {
  phone.faults.failEvery("FileManager.createDirectory", Refused);
  EXPECT_FALSE(process(plainMetadata()));
  EXPECT_EQ(effects(), joined({{said("processing app restore info for 'com.r'"),
                                "fault FileManager.createDirectory(" + BundlePath + ")"},
                               recorded(false, "Failed to create app directory"),
                               {said("Created app directory for 'com.r' at " + BundlePath +
                                     " with err=Error Domain=Fault Code=7"),
                                said("failed to create app directory for 'com.r'. err=(null)")},
                               recorded(false, "Failed to create app directory"),
                               gaveUp()}));
}

TEST_F(RestoredAppTest, AnInfoThatCannotBeWrittenMakesItFail) {
  phone.faults.failEvery("FileManager.writeAtomically", Refused);
  EXPECT_FALSE(process(plainMetadata()));
  EXPECT_EQ(effects(), joined({begun(),
                               {"fault FileManager.writeAtomically(" + BundlePath + "/Info.plist)",
                                said("failed to create placeholder info at " + BundlePath +
                                     "/Info.plist with info " + Info)},
                               recorded(false, "Failed to create placeholder info"),
                               gaveUp()}));
}

TEST_F(RestoredAppTest, ARegistryThatRefusesMakesItFail) {
  phone.faults.failEvery("AppRegistry.installApplication", Refused);
  EXPECT_FALSE(process(plainMetadata()));
  const Trace trace = effects();
  EXPECT_EQ(upTo(trace, "fault "), joined({begun(), infoWritten()}));
  const Trace end = {complained("Placeholder app install failed from path " + BundlePath +
                                ": Rho [com.r 3] [isPeriodix: 0]")};
  const Trace expected = joined({end, recorded(false, "Failed to install placeholder"), gaveUp()});
  EXPECT_EQ(Trace(trace.end() - 3, trace.end()), expected);
}

TEST_F(RestoredAppTest, AnIconIsNotNeeded) {
  icon = std::nullopt;
  EXPECT_TRUE(process(plainMetadata()));
  EXPECT_FALSE(phone.files.exists(BundlePath + "/Icon.png"));
}

TEST_F(RestoredAppTest, AnIconThatCannotBeWrittenIsDoneWithout) {
  const std::string path = BundlePath + "/Icon.png";
  phone.faults.failEvery("FileManager.createFile", Refused);
  EXPECT_TRUE(process(plainMetadata()));
  const Trace lines = {
      "fault FileManager.createFile(" + path + ")",
      said("icon data for 'com.r' was writen to " + path + " with status:0 fileSize:0")};
  EXPECT_EQ(effects(), joined({begun(Info, lines), infoWritten(), installed(metadata)}));
}

TEST_F(RestoredAppTest, AnIconOfUnknownSizeIsUsed) {
  const std::string path = BundlePath + "/Icon.png";
  phone.faults.failEvery("FileManager.attributesOfItem", Refused);
  EXPECT_TRUE(process(plainMetadata()));
  const Trace lines = {
      "FileManager.createFile(" + path + ", mobile:mobile)",
      "fault FileManager.attributesOfItem(" + path + ")",
      said("icon data for 'com.r' was writen to " + path + " with status:1 fileSize:0")};
  EXPECT_EQ(effects(), joined({begun(Info, lines), infoWritten(), installed(metadata)}));
  EXPECT_EQ(phone.files.textAt(path), "icon");
}

struct MissingCase {
  const char* name;
  PropertyList::Dictionary metadata;
  const char* shown;
  const char* info;
};

void PrintTo(const MissingCase& missing, std::ostream* out) { *out << missing.shown; }

const MissingCase MissingCases[] = {
    {"Version",
     {{"title", "Rho"}},
     "{title = Rho}",
     "{KBBundleDisplayName = Rho; KBBundleExecutable = Rho; KBBundleIconFile = Icon.png; "
     "KBBundleIdentifier = com.r; KBBundleVersion = (null); SWApplicationLaunchProhibited = 0; "
     "UIPeriodixApp = 0}"},
    {"BothNames",
     {{"bundleVersion", "3"}},
     "{bundleVersion = 3}",
     "{KBBundleDisplayName = (null); KBBundleExecutable = (null); KBBundleIconFile = Icon.png; "
     "KBBundleIdentifier = com.r; KBBundleVersion = 3; SWApplicationLaunchProhibited = 0; "
     "UIPeriodixApp = 0}"},
};

class MissingMetadataTest : public RestoredAppTest,
                            public testing::WithParamInterface<MissingCase> {};

TEST_P(MissingMetadataTest, IsPutInAsNullWhichNoFileCanHold) {
  const MissingCase& missing = GetParam();
  EXPECT_FALSE(process(missing.metadata));
  EXPECT_EQ(effects(), joined({begun(missing.info),
                               {said("failed to create placeholder info at " + BundlePath +
                                     "/Info.plist with info " + missing.info)},
                               recorded(false, "Failed to create placeholder info"),
                               gaveUp(missing.shown)}));
  EXPECT_FALSE(phone.files.exists(BundlePath + "/Info.plist"));
}

INSTANTIATE_TEST_SUITE_P(Without, MissingMetadataTest, testing::ValuesIn(MissingCases),
                         [](const auto& given) { return std::string(given.param.name); });

TEST_F(RestoredAppTest, TheItemNameServesAsBothNames) {
  EXPECT_TRUE(process({{"bundleVersion", "3"}, {"itemName", "Item"}}));
  EXPECT_EQ(infoValue(KBBundleExecutable), PropertyList("Item"));
  EXPECT_EQ(infoValue(KBBundleDisplayName), PropertyList("Item"));
}

TEST_F(RestoredAppTest, AVersionAndANameThatAreNumbersAreTakenInDigitsAndSaid) {
  EXPECT_TRUE(process({{"bundleVersion", 3}, {"title", 2048}}));
  EXPECT_EQ(infoValue(KBBundleVersion), PropertyList("3"));
  EXPECT_EQ(infoValue(KBBundleDisplayName), PropertyList("2048"));
  EXPECT_THAT(effects(),
              testing::IsSupersetOf({complained("unexpected type for bundleVersion of com.r: 3"),
                                     complained("unexpected type for title of com.r: 2048")}));
}

TEST_F(RestoredAppTest, ATitleOfAnUnusableTypeGivesWayToTheItemName) {
  EXPECT_TRUE(process(
      {{"bundleVersion", "3"}, {"title", PropertyList::Array{"Rho"}}, {"itemName", "Item"}}));
  EXPECT_EQ(infoValue(KBBundleDisplayName), PropertyList("Item"));
  EXPECT_THAT(effects(),
              testing::Contains(complained("unexpected type for title of com.r: (Rho)")));
}

TEST_F(RestoredAppTest, LaunchingIsProhibitedByEitherKeyTheFirstOneWinning) {
  struct {
    PropertyList::Dictionary flags;
    bool prohibited;
  } const cases[] = {
      {{}, false},
      {{{"SWApplicationLaunchProhibited", true}}, true},
      {{{"launchProhibited", "yes"}}, true},
      {{{"SWApplicationLaunchProhibited", false}, {"launchProhibited", true}}, false},
      {{{"SWApplicationLaunchProhibited", true}, {"launchProhibited", false}}, true},
  };
  for (const auto& given : cases) {
    PropertyList::Dictionary from = plainMetadata();
    from.insert(given.flags.begin(), given.flags.end());
    EXPECT_TRUE(process(from));
    EXPECT_EQ(infoValue("SWApplicationLaunchProhibited"), PropertyList(given.prohibited));
  }
}

TEST_F(RestoredAppTest, PeriodicalFlagAndLaunchProhibitionAreCarriedOn) {
  EXPECT_TRUE(process({{"bundleVersion", "3"},
                       {"title", "Rho"},
                       {"UIPeriodixApp", "weekly"},
                       {"launchProhibited", 1}}));
  EXPECT_EQ(infoValue("UIPeriodixApp"), PropertyList("weekly"));
  EXPECT_EQ(infoValue("SWApplicationLaunchProhibited"), PropertyList(true));
}

}  // namespace
}  // namespace appsync::fakes
