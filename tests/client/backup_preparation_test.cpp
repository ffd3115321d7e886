// Metadata of installed applications is tidied before a backup.
#include "tests/client/client_test.h"

namespace appsync {
namespace {

std::string metadataOf(const std::string& identifier) {
  return "/var/mobile/Containers/Applications/" + identifier + "/HalvoMetadata.plist";
}

const std::string Begin = "log default SyncBundle|preparing for backup";
const std::string End = "log default SyncBundle|finished preparing for backup";
const std::string Flag = "DeviceBasedQLP";
const std::string Automatic = "is-auto-download";

class BackupPreparation : public ClientTest {
 protected:
  void putApplication(const std::string& identifier, bool deviceBased,
                      const std::optional<PropertyList>& metadata) {
    AppRecord record;
    record.applicationIdentifier = identifier;
    record.isDeviceBasedAssignment = deviceBased;
    phone.appRegistry.seedInstalled(record);
    if (metadata) phone.files.putPlist(metadataOf(identifier), *metadata);
  }
};

struct MetadataCase {
  std::string name;
  PropertyList::Dictionary before;
  bool deviceBased;
  PropertyList::Dictionary after;
  std::vector<std::string> lines;  ///< none: the file is not rewritten
};

void PrintTo(const MetadataCase& given, std::ostream* out) { *out << given.name; }

class BackedUpMetadata : public BackupPreparation,
                         public testing::WithParamInterface<MetadataCase> {};

TEST_P(BackedUpMetadata, IsBroughtUpToDateAndRewrittenOnlyWhenItChanged) {
  const MetadataCase& given = GetParam();
  putApplication("com.a", given.deviceBased, given.before);
  client().prepareForBackup();
  Lines expected{Begin};
  for (const std::string& line : given.lines) {
    expected.push_back("log default SyncBundle|" + line);
  }
  if (!given.lines.empty()) {
    expected.push_back("FileManager.writeAtomically(" + metadataOf("com.a") + ")");
  }
  expected.push_back(End);
  expectTrace(expected);
  EXPECT_EQ(phone.files.plistAt(metadataOf("com.a")), PropertyList(given.after));
}

const std::string On = "Updated DeviceBasedQLP state for : com.a to 1";
const std::string Off = "Updated DeviceBasedQLP state for : com.a to 0";
const std::string Cleared = "clearing is-auto-download value for com.a";

INSTANTIATE_TEST_SUITE_P(
    Flags, BackedUpMetadata,
    testing::Values(
        MetadataCase{"NothingToDo", {{"title", "A"}}, false, {{"title", "A"}}, {}},
        MetadataCase{
            "FlagAbsentAndSet", {{"title", "A"}}, true, {{"title", "A"}, {Flag, true}}, {On}},
        MetadataCase{"FlagPresentAndSet", {{Flag, false}}, true, {{Flag, true}}, {On}},
        MetadataCase{"FlagPresentAndNotSet", {{Flag, true}}, false, {{Flag, false}}, {Off}},
        MetadataCase{"FlagPresentAndTheSame", {{Flag, true}}, true, {{Flag, true}}, {On}},
        MetadataCase{"FlagOfAnotherType", {{Flag, "yes"}}, false, {{Flag, false}}, {Off}},
        MetadataCase{"AutomaticTrue", {{Automatic, true}, {"k", 1}}, false, {{"k", 1}}, {Cleared}},
        MetadataCase{"AutomaticAsNumber", {{Automatic, 1}}, false, {}, {Cleared}},
        MetadataCase{"AutomaticFalse", {{Automatic, false}}, false, {{Automatic, false}}, {}},
        MetadataCase{"AutomaticZero", {{Automatic, 0}}, false, {{Automatic, 0}}, {}},
        MetadataCase{"AutomaticFalseAndFlagSet",
                     {{Automatic, false}},
                     true,
                     {{Automatic, false}, {Flag, true}},
                     {On}},
        MetadataCase{
            "Both", {{Automatic, true}, {Flag, true}}, false, {{Flag, false}}, {Off, Cleared}}),
    [](const auto& instance) { return instance.param.name; });

TEST_F(BackupPreparation, WritesXmlWhateverTheFileWas) {
  putApplication("com.a", true, std::nullopt);
  phone.files.putPlist(metadataOf("com.a"), Dictionary{{"title", "A"}}, PropertyListFormat::Binary);
  client().prepareForBackup();
  EXPECT_TRUE(phone.files.textAt(metadataOf("com.a"))->starts_with("<?xml"));
}

TEST_F(BackupPreparation, SkipsAnApplicationWithoutMetadataSilently) {
  putApplication("com.a", true, std::nullopt);
  client().prepareForBackup();
  expectTrace({Begin, "AppRegistry.enumerateBundles(1)",
               "FileManager.contentsAtPath(" + metadataOf("com.a") + ")", End},
              fakes::TraceAll);
  EXPECT_FALSE(phone.files.exists(metadataOf("com.a")));
}

TEST_F(BackupPreparation, SkipsAnApplicationWithoutAContainerAndReadsNothingForIt) {
  putApplication("com.a", true, Dictionary{});
  phone.appRegistry.edit("com.a", [](AppRecord& record) { record.bundleContainerPath.reset(); });
  phone.files.putPlist("/HalvoMetadata.plist", Dictionary{{Automatic, true}});
  putApplication("com.b", false, Dictionary{});
  client().prepareForBackup();
  expectTrace({Begin, "AppRegistry.enumerateBundles(1)",
               "FileManager.contentsAtPath(" + metadataOf("com.b") + ")", End},
              fakes::TraceAll);
}

TEST_F(BackupPreparation, NamesAnApplicationWithoutABundleIdentifierAsTheRegistryDoes) {
  putApplication("com.a", true, Dictionary{{Automatic, true}});
  phone.appRegistry.edit("com.a", [](AppRecord& record) { record.bundleIdentifier.reset(); });
  client().prepareForBackup();
  expectTrace({Begin, "log default SyncBundle|" + On, "log default SyncBundle|" + Cleared,
               "FileManager.writeAtomically(" + metadataOf("com.a") + ")", End});
}

TEST_F(BackupPreparation, SkipsMetadataThatIsNoDictionarySilently) {
  putApplication("com.a", true, Array{"title"});
  putApplication("com.b", true, std::nullopt);
  phone.files.putFile(metadataOf("com.b"), "no property list");
  client().prepareForBackup();
  expectTrace({Begin, End});
  EXPECT_EQ(phone.files.textAt(metadataOf("com.b")), "no property list");
}

TEST_F(BackupPreparation, GoesOnToTheNextApplicationAfterAFailedWrite) {
  putApplication("com.a", true, Dictionary{});
  putApplication("com.b", true, Dictionary{});
  phone.faults.failWhere("FileManager.writeAtomically", "com.a", Error::posix(28));
  client().prepareForBackup();
  expectTrace({Begin, "log default SyncBundle|Updated DeviceBasedQLP state for : com.a to 1",
               "fault FileManager.writeAtomically(" + metadataOf("com.a") + ")",
               "log default SyncBundle|Updated DeviceBasedQLP state for : com.b to 1",
               "FileManager.writeAtomically(" + metadataOf("com.b") + ")", End});
  EXPECT_EQ(phone.files.plistAt(metadataOf("com.a")), PropertyList(Dictionary{}));
}

TEST_F(BackupPreparation, LeavesSystemApplicationsAlone) {
  AppRecord record;
  record.applicationIdentifier = "com.system";
  record.applicationType = ApplicationTypeSystem;
  record.isDeviceBasedAssignment = true;
  phone.appRegistry.seedInstalled(record);
  phone.files.putPlist(metadataOf("com.system"), Dictionary{{Automatic, true}});
  client().prepareForBackup();
  expectTrace({Begin, End});
}

}  // namespace
}  // namespace appsync
