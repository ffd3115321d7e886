#include <sys/stat.h>

#include <cerrno>

#include "host/backup/backup.h"
#include "tests/host/session_fixture.h"
#include "tests/test_pch.h"

namespace appsync::host {
namespace {

namespace fs = std::filesystem;
using Dictionary = PropertyList::Dictionary;
using Lines = std::vector<std::string>;
using testing::appInfo;
using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::EndsWith;
using testing::Folder;
using testing::RecordingClient;
using testing::RecordingReporter;

/// A client whose preparation a test can give something to do.
class PreparingClient : public RecordingClient {
 public:
  using RecordingClient::RecordingClient;
  void prepareForBackup() noexcept override {
    if (onPrepare) onPrepare();
  }
  std::function<void()> onPrepare;
};

/// Backups of a fake phone in a real folder.
class BackupRunTest : public ::testing::Test {
 protected:
  BackupRunTest() { phone_.homeScreen.setOrder({"com.b", "com.a"}); }

  BackupSummary backUp(const BackupOptions& options = {}) {
    BackupProblem problem;
    const auto writer = BackupWriter::open(target_, problem);
    EXPECT_TRUE(writer) << problem.text;
    const Phone phone = hostsView_.phone();
    return BackupRun(client_, phone, *writer, reporter_, interruption_).run(options);
  }

  void expectMade(const BackupSummary& summary) {
    EXPECT_TRUE(summary.made);
    EXPECT_EQ(summary.failed.size(), 0u);
  }

  Backup saved() {
    std::string problem;
    auto backup = readBackup(target_, problem);
    EXPECT_TRUE(backup) << problem;
    return backup ? std::move(*backup) : Backup();
  }

  static Dictionary dictionaryOf(ByteView bytes) {
    const auto list = parsePropertyList(bytes);
    EXPECT_TRUE(list && list->asDictionary());
    return list && list->asDictionary() ? *list->asDictionary() : Dictionary();
  }

  Dictionary entries() { return dictionaryOf(saved().applications); }

  /// A value of an application's entry as text; "none" when there is none.
  std::string valueOf(const char* identifier, const char* key) {
    const Dictionary list = entries();
    const PropertyList* entry = find(list, identifier);
    const PropertyList* value = entry ? entry->find(key) : nullptr;
    return value && value->asData() ? std::string(asText(*value->asData())) : "none";
  }

  Dictionary metadataOf(const char* identifier) {
    return dictionaryOf(asBytes(valueOf(identifier, "HalvoMetadata")));
  }

  Dictionary demotions() { return dictionaryOf(saved().demotions); }

  std::string containerOf(const char* identifier) {
    const auto record = phone_.appRegistry.recordForIdentifier(identifier, false);
    return record ? *record->bundleContainerPath : "";
  }

  void putMetadata(const char* identifier, std::string_view text) {
    phone_.files.putFile(containerOf(identifier) + "/HalvoMetadata.plist", text);
  }

  static std::string xml(const Dictionary& dictionary) { return testing::xmlText(dictionary); }

  fakes::FakePlatform phone_;
  Interruption interruption_;
  HostProcess host_{SyncHostBundleIdentifier, "com.corvane.twc.AppsClient", interruption_};
  PreparingClient client_{phone_, host_};
  RecordingReporter reporter_;
  Folder folder_;
  const fs::path target_ = folder_ / "backup";
  testing::FakePhone hostsView_{phone_};
  testing::FakePhone::Texts& data_ = hostsView_.owned;
};

TEST_F(BackupRunTest, SavesEveryApplicationOfTheUserAndTheHomeScreen) {
  phone_.appRegistry.seedInstalled("com.b");
  phone_.appRegistry.seedPlaceholder("com.a", InstallType::Restore);
  AppRecord system;
  system.applicationIdentifier = "com.system";
  system.applicationType = ApplicationTypeSystem;
  phone_.appRegistry.seedInstalled(system);
  data_["com.b"] = std::string(2500, 'd');

  const BackupSummary summary = backUp();
  expectMade(summary);
  EXPECT_EQ(summary.saved, (Lines{"com.a", "com.b"}));
  EXPECT_EQ(reporter_.lines(),
            (Lines{"saving com.a 1/2 0", "saved com.a", "saving com.b 2/2 0", "saved com.b"}));
  const Backup backup = saved();
  EXPECT_EQ(entries().size(), 2u);
  ASSERT_EQ(backup.data.size(), 1u) << "empty data has no archive";
  EXPECT_EQ(testing::fileText(backup.data.at("com.b").path), data_["com.b"]);
  EXPECT_EQ(parsePropertyList(backup.iconLayout),
            PropertyList(PropertyList::Array{"com.b", "com.a"}));
}

TEST_F(BackupRunTest, APhoneWithoutApplicationsGivesAnEmptyBackup) {
  expectMade(backUp());
  EXPECT_EQ(entries().size(), 0u);
}

TEST_F(BackupRunTest, TellsProgressOfLargeData) {
  phone_.appRegistry.seedInstalled("com.a");
  data_["com.a"] = std::string(2'500'000, 'd');
  expectMade(backUp());
  EXPECT_EQ(reporter_.lines("saving"),
            (Lines{"saving com.a 1/1 0", "saving com.a 1/1 1049000", "saving com.a 1/1 2098000"}));
}

TEST_F(BackupRunTest, PreparesTheClientBeforeAnythingIsRead) {
  phone_.appRegistry.seedInstalled("com.a");
  const Dictionary prepared{{"bundleVersion", "7"}, {"title", "Prepared"}};
  client_.onPrepare = [&] { putMetadata("com.a", xml(prepared)); };
  expectMade(backUp());
  EXPECT_EQ(metadataOf("com.a"), prepared);
}

TEST_F(BackupRunTest, MetadataThatTellsVersionAndNameIsSavedWhateverItsFormatWas) {
  for (const char* name : {"title", "itemName"}) {
    phone_.appRegistry.seedInstalled("com.a", "2.0");
    const Dictionary stored{{"bundleVersion", "1.0"}, {name, "Name"}, {"x", 1}};
    std::set<std::string> saved;
    for (const auto format : {PropertyListFormat::Xml, PropertyListFormat::Binary}) {
      putMetadata("com.a", asText(serializePropertyList(stored, format).value()));
      expectMade(backUp());
      EXPECT_EQ(metadataOf("com.a"), stored);
      saved.insert(valueOf("com.a", "HalvoMetadata"));
    }
    EXPECT_EQ(saved.size(), 1U);
  }
}

TEST_F(BackupRunTest, MetadataThatLacksThemIsCompletedFromTheRegistry) {
  AppRecord record;
  record.applicationIdentifier = "com.a";
  record.bundleVersion = "2.0";
  record.displayName = "Shown";
  const Dictionary whole{{"bundleVersion", "2.0"}, {"title", "Shown"}};
  const std::pair<const char*, Dictionary> cases[] = {
      {"", whole},
      {"no property list", whole},
      {"<plist version=\"1.0\"><array/></plist>", whole},
      {"<plist version=\"1.0\"><dict><key>x</key><true/></dict></plist>",
       {{"bundleVersion", "2.0"}, {"title", "Shown"}, {"x", true}}},
      {"<plist version=\"1.0\"><dict><key>bundleVersion</key><string>1.0</string></dict></plist>",
       {{"bundleVersion", "1.0"}, {"title", "Shown"}}},
      {"<plist version=\"1.0\"><dict><key>itemName</key><string>Item</string></dict></plist>",
       {{"bundleVersion", "2.0"}, {"itemName", "Item"}}},
      {"<plist version=\"1.0\"><dict><key>bundleVersion</key><array/>"
       "<key>title</key><integer>5</integer></dict></plist>",
       whole},
  };
  for (const auto& [stored, expected] : cases) {
    phone_.appRegistry.seedInstalled(record);
    putMetadata("com.a", stored);
    expectMade(backUp());
    EXPECT_EQ(metadataOf("com.a"), expected) << stored;
  }
  phone_.files.erase(containerOf("com.a") + "/HalvoMetadata.plist");
  expectMade(backUp());
  EXPECT_EQ(metadataOf("com.a"), whole);
}

TEST_F(BackupRunTest, AnApplicationThatTellsNothingOfItselfStillComesBack) {
  AppRecord record;
  record.applicationIdentifier = "com.a";
  phone_.appRegistry.seedInstalled(record);
  expectMade(backUp());
  EXPECT_EQ(metadataOf("com.a"), (Dictionary{{"bundleVersion", "0"}, {"title", "com.a"}}));
}

TEST_F(BackupRunTest, SavesTheOpaqueBlobWhereThereIsOne) {
  phone_.appRegistry.seedInstalled("com.a");
  phone_.appRegistry.seedInstalled("com.b");
  hostsView_.blobs["com.a"] = "blob";
  expectMade(backUp());
  EXPECT_EQ(valueOf("com.a", "ApplicationSINF"), "blob");
  EXPECT_EQ(valueOf("com.b", "ApplicationSINF"), "none");
}

TEST_F(BackupRunTest, SavesThePlaceholdersIconAsItIsAndDrawsThatOfAnInstalledApplication) {
  for (const char* identifier : {"com.drawn", "com.bare"}) {
    phone_.appRegistry.seedInstalled(identifier);
  }
  for (const char* identifier : {"com.placeholder", "com.iconless"}) {
    phone_.appRegistry.seedPlaceholder(identifier, InstallType::Restore);
  }
  const auto bundleOf = [&](const char* identifier) {
    return *phone_.appRegistry.recordForIdentifier(identifier, false)->bundlePath;
  };
  Dictionary info = appInfo("com.drawn", "1.0", "Drawn");
  info["KBBundleIconFile"] = "icon.png";
  phone_.files.putPlist(bundleOf("com.drawn") + "/Info.plist", info);
  phone_.files.putFile(bundleOf("com.drawn") + "/icon.png", "source");
  phone_.files.putFile(bundleOf("com.placeholder") + "/Icon.png", "any bytes");
  expectMade(backUp());
  EXPECT_EQ(valueOf("com.drawn", "PlaceholderIcon"), "public.png 2x2");
  EXPECT_EQ(valueOf("com.bare", "PlaceholderIcon"), "none");
  EXPECT_EQ(valueOf("com.placeholder", "PlaceholderIcon"), "any bytes");
  EXPECT_EQ(valueOf("com.iconless", "PlaceholderIcon"), "none");

  phone_.imageEncoders.failFinalize(true);
  expectMade(backUp());
  EXPECT_EQ(valueOf("com.drawn", "PlaceholderIcon"), "none");
  phone_.imageEncoders.failCreate(true);
  expectMade(backUp());
}

TEST_F(BackupRunTest, AnUpdateUnderWaySavesTheInstalledVersion) {
  for (const auto type : {InstallType::Sync, InstallType::AutomaticUpdate}) {
    phone_.appRegistry.seedInstalled("com.a", "1.0");
    phone_.appRegistry.seedPlaceholder("com.a", type, "2.0");
    const BackupSummary summary = backUp();
    expectMade(summary);
    EXPECT_EQ(summary.saved, Lines{"com.a"});
    EXPECT_EQ(metadataOf("com.a").at("bundleVersion"), PropertyList("1.0"));
  }
}

TEST_F(BackupRunTest, NeitherWhatABrokenOffSyncLeftNorAnExtensionIsSaved) {
  AppRecord extension;
  extension.applicationIdentifier = "com.extension";
  extension.isApplication = false;
  phone_.appRegistry.seedOther(extension);
  phone_.appRegistry.seedPlaceholder("com.left-over", InstallType::Sync);
  phone_.appRegistry.seedPlaceholder("com.store", InstallType::StoreDownload);
  const BackupSummary summary = backUp();
  expectMade(summary);
  EXPECT_EQ(summary.saved, Lines{"com.store"});
}

TEST_F(BackupRunTest, SavesWhichApplicationsAreDemotedAndByWhat) {
  auto& registry = phone_.appRegistry;
  registry.seedPlaceholder("com.automatic", InstallType::Downgrade);
  registry.seedPlaceholder("com.intentional", InstallType::IntentionalDowngrade);
  registry.seedPlaceholder("com.listed", InstallType::Restore);
  registry.seedPlaceholder("com.asked-for", InstallType::StoreDownload);
  registry.seedPlaceholder("com.coming", InstallType::Restore);
  registry.seedInstalled("com.back");
  phone_.files.putPlist(
      exchange::DemotedApplications,
      Dictionary{{"AutomaticDowngrades", PropertyList::Array{"com.gone", "com.listed", 5}},
                 {"IntentionalDowngrades",
                  PropertyList::Array{"com.listed", "com.back", "com.asked-for"}}});
  expectMade(backUp());
  EXPECT_EQ(demotions(),
            (Dictionary{
                {"AutomaticDowngrades", PropertyList::Array{"com.automatic", "com.listed"}},
                {"IntentionalDowngrades", PropertyList::Array{"com.intentional", "com.listed"}}}));
}

TEST_F(BackupRunTest, ADemotedApplicationsFileOfAnyOtherFormIsNone) {
  phone_.appRegistry.seedPlaceholder("com.a", InstallType::Downgrade);
  const Dictionary expected{{"AutomaticDowngrades", PropertyList::Array{"com.a"}},
                            {"IntentionalDowngrades", PropertyList::Array{}}};
  phone_.files.putFile(exchange::DemotedApplications, "nonsense");
  expectMade(backUp());
  EXPECT_EQ(demotions(), expected);
  phone_.files.putPlist(exchange::DemotedApplications,
                        Dictionary{{"AutomaticDowngrades", "com.a"}, {"Other", 1}});
  expectMade(backUp());
  EXPECT_EQ(demotions(), expected);
}

TEST_F(BackupRunTest, AnApplicationWhoseDataCannotBeReadFailsAlone) {
  for (const char* identifier : {"com.a", "com.b", "com.c"}) {
    phone_.appRegistry.seedInstalled(identifier);
    data_[identifier] = std::string(5000, 'd');
  }
  hostsView_.dataFailures["com.b"] = Error::posix(EACCES, "notes.txt");
  const BackupSummary summary = backUp();
  EXPECT_TRUE(summary.made);
  EXPECT_EQ(summary.saved, (Lines{"com.a", "com.c"}));
  ASSERT_EQ(summary.failed.size(), 1u);
  EXPECT_EQ(summary.failed[0].identifier, "com.b");
  EXPECT_EQ(summary.failed[0].reason, "its data cannot be saved: notes.txt: Permission denied");
  EXPECT_FALSE(entries().contains("com.b"));
  EXPECT_FALSE(fs::exists(target_ / "Data/com.b.tar"));
  EXPECT_THAT(reporter_.lines(), Contains("saved com.b failed: " + summary.failed[0].reason));
}

TEST_F(BackupRunTest, AnApplicationWhoseMetadataCannotBeReadFailsAlone) {
  phone_.appRegistry.seedPlaceholder("com.a", InstallType::Downgrade);
  phone_.appRegistry.seedInstalled("com.b");
  phone_.faults.failWhere("FileManager.contentsAtPath", "com.a/HalvoMetadata.plist",
                          Error::posix(EIO));
  const BackupSummary summary = backUp();
  EXPECT_TRUE(summary.made);
  EXPECT_EQ(summary.saved, (Lines{"com.b"}));
  ASSERT_EQ(summary.failed.size(), 1u);
  EXPECT_EQ(summary.failed[0].reason, "its metadata cannot be read: Input/output error");
  EXPECT_EQ(demotions().at("AutomaticDowngrades"), PropertyList(PropertyList::Array{}));
}

TEST_F(BackupRunTest, NothingThatCannotBeReadIsTakenForMissing) {
  phone_.appRegistry.seedInstalled("com.installed");
  phone_.appRegistry.seedPlaceholder("com.placeholder", InstallType::Restore);
  const auto bundle = *phone_.appRegistry.recordForIdentifier("com.installed", false)->bundlePath;
  Dictionary info = appInfo("com.installed", "1.0", "Installed");
  info["KBBundleIconFile"] = "drawn.png";
  phone_.files.putPlist(bundle + "/Info.plist", info);

  const auto reasonFor = [&](const char* operation, const char* path) {
    if (operation) phone_.faults.failWhere(operation, path, Error::posix(EIO));
    const BackupSummary summary = backUp({.allowMissing = true});
    phone_.faults.clear();
    EXPECT_EQ(summary.failed.size(), 1U) << path;
    return summary.failed.empty() ? ""
                                  : summary.failed[0].identifier + ": " + summary.failed[0].reason;
  };
  const std::string icon = ": its icon cannot be read: Input/output error";
  EXPECT_EQ(reasonFor("FileManager.contentsAtPath", "Icon.png"), "com.placeholder" + icon);
  EXPECT_EQ(reasonFor("FileManager.contentsAtPath", "Info.plist"), "com.installed" + icon);
  EXPECT_EQ(reasonFor("FileManager.attributesOfItem", "drawn.png"), "com.installed" + icon);
  hostsView_.unreadableBlob = "com.installed";
  EXPECT_EQ(reasonFor(nullptr, "blob"),
            "com.installed: its opaque blob cannot be read: Input/output error");
  hostsView_.unreadableBlob.clear();
  expectMade(backUp());
}

TEST_F(BackupRunTest, AListThatCannotBeReadEndsTheBackup) {
  phone_.appRegistry.seedInstalled("com.a");
  expectMade(backUp());
  phone_.faults.failWhere("FileManager.contentsAtPath", "DemotedApps.plist", Error::posix(EIO));
  EXPECT_FALSE(backUp().made);
  phone_.faults.clear();
  phone_.faults.failEvery("phone.applications", Error::posix(EMFILE));
  EXPECT_FALSE(backUp({.allowMissing = true}).made);
  EXPECT_EQ(reporter_.lines("broken"),
            (Lines{"broken the list of demoted applications cannot be read: Input/output error",
                   "broken the applications cannot be told: Too many open files"}));
  EXPECT_EQ(entries().size(), 1U);
}

TEST_F(BackupRunTest, AnOlderBackupStaysWhenTheNewOneWouldLackAnApplicationOfIt) {
  for (const char* identifier : {"com.a", "com.b", "com.c"}) {
    phone_.appRegistry.seedInstalled(identifier);
  }
  expectMade(backUp());
  phone_.appRegistry.seedInstalled("com.new");
  for (const char* identifier : {"com.a", "com.c", "com.new"}) {
    hostsView_.dataFailures.emplace(identifier, Error::posix(EACCES));
  }
  const BackupSummary summary = backUp();
  EXPECT_FALSE(summary.made);
  EXPECT_EQ(summary.saved, Lines());
  EXPECT_EQ(summary.failed.size(), 3U);
  EXPECT_EQ(reporter_.lines("broken"),
            Lines{"broken the older backup stays, since com.a, com.c cannot be saved now; "
                  "--allow-missing replaces it all the same"});
  EXPECT_EQ(entries().size(), 3U);

  EXPECT_EQ(backUp({.allowMissing = true}).saved, Lines{"com.b"});
  EXPECT_EQ(entries().size(), 1U);
  EXPECT_EQ(backUp().saved, Lines{"com.b"}) << "nothing more is lost";
}

TEST_F(BackupRunTest, AHomeScreenThatDoesNotAnswerEndsTheBackup) {
  phone_.appRegistry.seedInstalled("com.a");
  phone_.homeScreen.setFlattenedIconState(std::nullopt);
  const BackupSummary summary = backUp();
  EXPECT_FALSE(summary.made);
  EXPECT_EQ(summary.saved, Lines());
  EXPECT_THAT(reporter_.lines(), Contains("broken the home screen does not tell its layout"));
  EXPECT_FALSE(fs::exists(target_));
}

TEST_F(BackupRunTest, AnUnwritableTargetEndsTheBackupAndLeavesTheOlderOne) {
  phone_.appRegistry.seedInstalled("com.a");
  expectMade(backUp());
  phone_.appRegistry.seedInstalled("com.b");
  data_["com.a"] = std::string(5000, 'd');
  hostsView_.onPiece = [&](std::size_t) {  // somebody takes the folder away
    for (const auto& item : fs::directory_iterator(folder_.path())) {
      if (item.path().filename() != "backup") fs::remove_all(item);
    }
  };
  const BackupSummary summary = backUp();
  EXPECT_FALSE(summary.made);
  EXPECT_EQ(summary.saved, Lines());
  EXPECT_THAT(reporter_.lines("broken"), ElementsAre(EndsWith("No such file or directory")));
  EXPECT_EQ(entries().size(), 1u);
}

TEST_F(BackupRunTest, AnInterruptionLeavesTheOlderBackup) {
  phone_.appRegistry.seedInstalled("com.a");
  expectMade(backUp());
  phone_.appRegistry.seedInstalled("com.b");
  data_["com.a"] = std::string(5000, 'd');
  hostsView_.onPiece = [&](std::size_t offset) {
    if (offset == 2000) interruption_.request();
  };
  const BackupSummary summary = backUp();
  EXPECT_FALSE(summary.made);
  EXPECT_EQ(summary.saved, Lines());
  EXPECT_EQ(summary.failed.size(), 0u);
  EXPECT_THAT(reporter_.lines(), Contains("interrupted"));
  EXPECT_EQ(entries().size(), 1u);
}

TEST_F(BackupRunTest, WaitsForWhatThePhoneIsBusyWith) {
  phone_.appRegistry.seedPlaceholder("com.a", InstallType::Sync);
  phone_.appRegistry.seedInstalled("com.b");
  int asked = 0;
  hostsView_.isBusyWith = [&](std::string_view identifier) {
    if (identifier != "com.b" || ++asked < 3) return identifier == "com.b";
    phone_.appRegistry.seedInstalled("com.a");
    return false;
  };
  EXPECT_EQ(backUp().saved, (Lines{"com.a", "com.b"}));
  EXPECT_EQ(asked, 3);
}

TEST_F(BackupRunTest, AnInterruptionEndsTheWaiting) {
  phone_.appRegistry.seedInstalled("com.a");
  hostsView_.isBusyWith = [&](std::string_view) {
    interruption_.request();
    return true;
  };
  EXPECT_FALSE(backUp().made);
}

}  // namespace
}  // namespace appsync::host
