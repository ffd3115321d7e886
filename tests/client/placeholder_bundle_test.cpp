// The small bundle that stands for an application until its package arrives.
#include "platform/bundle.h"
#include "tests/client/client_test.h"

namespace appsync {
namespace {

const std::string BundlePath = "/tmp/com.corvane.twc.Apps/com.a.app";
const std::string StagedInfoPath = "/var/mobile/Media/PublicStaging/com.a/Info.plist";
const std::string StagedIconPath = "/var/mobile/Library/ApplicationSync/Icons/com.a.png";

const std::string PlistLine = "log default SyncBundle|plist " + StagedInfoPath;
const std::string MakeDirectory =
    "FileManager.createDirectory(" + BundlePath + ", true, mobile:mobile)";
const std::string CreatedLine =
    "log default SyncBundle|Created app directory for 'com.a' at " + BundlePath + " with err=";
const std::string WriteInfo = "FileManager.writeAtomically(" + BundlePath + "/Info.plist)";
const std::string Install = "AppRegistry.installApplication(" + BundlePath +
                            "/, {KBBundleIdentifier = com.a; SWInstallType = 4; SWPackageTypeKey = "
                            "SWPackageTypePlaceholder})";

class PlaceholderBundle : public ClientTest {
 protected:
  PlaceholderBundle() {
    asset->identifier = "com.a";
    asset->prettyName = "Chess";
    asset->variantOptions = {{"Version", "1.2"}};
    asset->infoPlist = StagedInfoPath;
    phone.files.putPlist(StagedInfoPath, Dictionary{{"KBBundleIdentifier", "com.a"}});
  }

  /// What the placeholder of com.a says of itself.
  static Dictionary info(const PropertyList& periodical = false, bool launchProhibited = false) {
    return {{"KBBundleIdentifier", "com.a"},
            {"KBBundleVersion", "1.2"},
            {"KBBundleExecutable", "Chess"},
            {"KBBundleDisplayName", "Chess"},
            {"KBBundleIconFile", "Icon.png"},
            {"UIPeriodixApp", periodical},
            {"SWApplicationLaunchProhibited", launchProhibited}};
  }

  std::optional<PropertyList> writtenInfo() {
    return phone.files.plistAt(BundlePath + "/Info.plist");
  }

  static std::string creating(const Dictionary& dictionary) {
    return "log default SyncBundle|creating placeholder for 'com.a'. info.plist=" +
           description(dictionary);
  }

  const SyncAssetPtr asset = std::make_shared<SyncAsset>();
};

TEST_F(PlaceholderBundle, LivesInTheTemporaryDirectoryUnderItsIdentifier) {
  EXPECT_EQ(client().placeholderAppPathForBundleIdentifier("a.b"),
            "/tmp/com.corvane.twc.Apps/a.b.app");
  expectTrace({}, fakes::TraceAll);
}

TEST_F(PlaceholderBundle, IsWrittenAndInstalled) {
  phone.files.putFile(StagedIconPath, "icon");
  asset->icon = FileLocation::file(StagedIconPath);
  client()._createPlaceHolderApplication(asset);
  const std::string icon = BundlePath + "/Icon.png";
  expectTrace({PlistLine, MakeDirectory, CreatedLine + "(null)",
               "FileManager.removeItem(" + icon + ")",
               "FileManager.copyItem(" + StagedIconPath + ", " + icon + ")", WriteInfo,
               creating(info()), Install,
               "log default SyncBundle|Installed Placeholder app from path " + BundlePath +
                   ": Chess [com.a 1.2] [isPeriodix: 0]",
               "transaction scenario \"Install placeholder\" ok com.a \"Installed placeholder\""});
  EXPECT_EQ(writtenInfo(), PropertyList(info()));
  EXPECT_EQ(phone.files.textAt(icon), "icon");
  EXPECT_EQ(phone.appRegistry.placeholder("com.a")->installType, InstallType::Sync);
}

TEST_F(PlaceholderBundle, AndItsFoldersBelongToTheUser) {
  client()._createPlaceHolderApplication(asset);
  for (const std::string& path : {std::string("/tmp/com.corvane.twc.Apps"), BundlePath}) {
    ASSERT_TRUE(phone.files.attributesAt(path)) << path;
    EXPECT_EQ(phone.files.attributesAt(path)->owner, "mobile");
    EXPECT_EQ(phone.files.attributesAt(path)->group, "mobile");
  }
}

TEST_F(PlaceholderBundle, WithoutAnIconIsCreatedWithoutAWord) {
  asset->icon = FileLocation::file("");
  client()._createPlaceHolderApplication(asset);
  EXPECT_EQ(phone.trace.count("FileManager.copyItem"), 0u);
  EXPECT_FALSE(phone.files.exists(BundlePath + "/Icon.png"));
  EXPECT_TRUE(phone.appRegistry.placeholder("com.a"));
  EXPECT_THAT(phone.log.texts(LogLevel::Error), testing::IsEmpty());
}

TEST_F(PlaceholderBundle, WhoseIconCannotBeCopiedIsCreatedWithoutIt) {
  asset->icon = FileLocation::file(StagedIconPath);
  client()._createPlaceHolderApplication(asset);
  EXPECT_THAT(
      phone.log.texts(LogLevel::Error),
      testing::ElementsAre("Copying icon from " + StagedIconPath + " to " + BundlePath +
                           "/Icon.png failed: " + description(Error::posix(2, StagedIconPath))));
  EXPECT_TRUE(phone.appRegistry.placeholder("com.a"));
}

TEST_F(PlaceholderBundle, OfAnEarlierAttemptHasItsFilesReplaced) {
  phone.files.putFile(BundlePath + "/Icon.png", "old");
  phone.files.putFile(BundlePath + "/Info.plist", "old");
  phone.files.putFile(StagedIconPath, "new");
  asset->icon = FileLocation::file(StagedIconPath);
  client()._createPlaceHolderApplication(asset);
  EXPECT_EQ(phone.files.textAt(BundlePath + "/Icon.png"), "new");
  EXPECT_EQ(writtenInfo(), PropertyList(info()));
}

TEST_F(PlaceholderBundle, KeepsThePeriodicalFlagUnchanged) {
  for (const PropertyList& flag :
       {PropertyList(true), PropertyList("weekly"), PropertyList(Dictionary{{"k", 1}})}) {
    phone.files.putPlist(StagedInfoPath, Dictionary{{"UIPeriodixApp", flag}});
    client()._createPlaceHolderApplication(asset);
    EXPECT_EQ(writtenInfo(), PropertyList(info(flag)));
    EXPECT_THAT(phone.log.texts(),
                testing::Contains(testing::EndsWith("[isPeriodix: " + description(flag) + "]")));
  }
}

TEST_F(PlaceholderBundle, ReadsWhetherLaunchingIsProhibitedAsABoolean) {
  for (const auto& [value, expected] :
       std::vector<std::pair<PropertyList, bool>>{{true, true},
                                                  {false, false},
                                                  {1, true},
                                                  {"YES", true},
                                                  {"no", false},
                                                  {Array{}, false}}) {
    phone.files.putPlist(StagedInfoPath, Dictionary{{"SWApplicationLaunchProhibited", value}});
    client()._createPlaceHolderApplication(asset);
    EXPECT_EQ(writtenInfo(), PropertyList(info(false, expected))) << description(value);
  }
}

TEST_F(PlaceholderBundle, OfAPackageWithoutReadableInfoHasTheFlagsOff) {
  phone.files.putFile(StagedInfoPath, "no property list");
  client()._createPlaceHolderApplication(asset);
  EXPECT_EQ(writtenInfo(), PropertyList(info()));
  asset->infoPlist.reset();
  forgetTrace();
  client()._createPlaceHolderApplication(asset);
  EXPECT_EQ(writtenInfo(), PropertyList(info()));
  EXPECT_EQ(phone.log.texts().front(), "plist (null)");
}

TEST_F(PlaceholderBundle, OfAnAssetWithoutAVersionHasAnEmptyOne) {
  asset->variantOptions = {};
  client()._createPlaceHolderApplication(asset);
  EXPECT_EQ(*writtenInfo()->find("KBBundleVersion"), PropertyList(""));
  EXPECT_TRUE(phone.appRegistry.placeholder("com.a"));
}

TEST_F(PlaceholderBundle, OfAnAssetWithANameButNoIdentifierIsNotCreated) {
  asset->identifier = "";
  client()._createPlaceHolderApplication(asset);
  expectTrace({PlistLine});
}

TEST_F(PlaceholderBundle, OfAnAssetWithoutANameIsNotCreated) {
  asset->prettyName = "";
  client()._createPlaceHolderApplication(asset);
  expectTrace({PlistLine});
  asset->prettyName.reset();
  client()._createPlaceHolderApplication(asset);
  expectTrace({PlistLine});
}

TEST_F(PlaceholderBundle, IsGivenUpWhenItsDirectoryCannotBeMade) {
  const Error failure = Error::posix(28, BundlePath);
  phone.faults.failEvery("FileManager.createDirectory", failure);
  client()._createPlaceHolderApplication(asset);
  expectTrace({PlistLine, "fault FileManager.createDirectory(" + BundlePath + ")",
               "transaction scenario \"Halvo App Restore\" failed com.a \"Failed to create app "
               "directory\"",
               CreatedLine + description(failure)});
}

TEST_F(PlaceholderBundle, IsGivenUpSilentlyWhenItsInfoCannotBeWritten) {
  phone.faults.failEvery("FileManager.writeAtomically", Error::posix(28));
  client()._createPlaceHolderApplication(asset);
  expectTrace({PlistLine, MakeDirectory, CreatedLine + "(null)", "fault " + WriteInfo});
}

TEST_F(PlaceholderBundle, ThatTheRegistryRefusesIsRecordedAndItsBundleStays) {
  phone.appRegistry.failPlaceholder("com.a", Error::posix(28));
  client()._createPlaceHolderApplication(asset);
  expectTrace({PlistLine, MakeDirectory, CreatedLine + "(null)", WriteInfo, creating(info()),
               Install,
               "log error SyncBundle|Placeholder app install failed from path " + BundlePath +
                   ": Chess [com.a 1.2] [isPeriodix: 0]",
               "transaction scenario \"Install placeholder\" failed com.a \"Failed to install "
               "placeholder\""});
  EXPECT_EQ(writtenInfo(), PropertyList(info()));
}

class PlaceholderDirectory : public ClientTest {
 protected:
  bool create() { return client().createPlaceHolderPath(BundlePath, "com.a", {"ann", "staff"}); }
};

TEST_F(PlaceholderDirectory, IsMadeWithTheGivenAttributes) {
  EXPECT_TRUE(create());
  expectTrace(
      {"FileManager.createDirectory(" + BundlePath + ", true, ann:staff)", CreatedLine + "(null)"});
  EXPECT_EQ(phone.files.attributesAt(BundlePath)->owner, "ann");
  EXPECT_EQ(phone.files.attributesAt(BundlePath)->group, "staff");
}

TEST_F(PlaceholderDirectory, ThatExistsAlreadyIsASuccess) {
  phone.files.putFile(BundlePath + "/kept", "kept");
  EXPECT_TRUE(create());
  EXPECT_TRUE(phone.files.exists(BundlePath + "/kept"));
  EXPECT_EQ(phone.trace.count("transaction"), 0u);
}

TEST_F(PlaceholderDirectory, ThatCannotBeMadeIsRecordedAsARestoreWhoeverAsked) {
  phone.files.putFile("/tmp/com.corvane.twc.Apps", "in the way");
  EXPECT_FALSE(create());
  expectTrace({"FileManager.createDirectory(" + BundlePath + ", true, ann:staff)",
               "transaction scenario \"Halvo App Restore\" failed com.a \"Failed to create app "
               "directory\"",
               CreatedLine + description(Error::posix(20, BundlePath))});
}

const Error Afterthought{"Afterthought", 3, {}, nullptr};

/// Makes directories, but not without a complaint.
class ComplainingFileManager : public fakes::FaultyFileManager {
 public:
  using FaultyFileManager::FaultyFileManager;
  bool createDirectory(std::string_view path, bool withIntermediates,
                       const FileAttributes& attributes,
                       std::optional<Error>* error) noexcept override {
    const bool made =
        FaultyFileManager::createDirectory(path, withIntermediates, attributes, error);
    setError(error, Afterthought);
    return made;
  }
};

TEST_F(PlaceholderDirectory, ThatIsMadeWithAnErrorIsRecordedAsAFailureButUsed) {
  ComplainingFileManager files(phone.files, phone.faults);
  AppsClient making(with(phone.platform(), files));
  forgetTrace();
  EXPECT_TRUE(making.createPlaceHolderPath(BundlePath, "com.a", {"ann", "staff"}));
  expectTrace({"FileManager.createDirectory(" + BundlePath + ", true, ann:staff)",
               "transaction scenario \"Halvo App Restore\" failed com.a \"Failed to create app "
               "directory\"",
               CreatedLine + description(Afterthought)});
  EXPECT_TRUE(phone.files.exists(BundlePath));
}

class IconData : public ClientTest {
 protected:
  bool write(const std::optional<Bytes>& data, std::uint64_t* size) {
    return client().writeIconData(data, IconPath, size, "com.a", {"mobile", "mobile"});
  }
  static std::string line(const std::string& status, const std::string& size) {
    return "log default SyncBundle|icon data for 'com.a' was writen to " + IconPath +
           " with status:" + status + " fileSize:" + size;
  }

  static inline const std::string IconPath = "/tmp/Icon.png";
  static inline const std::string Create =
      "FileManager.createFile(" + IconPath + ", mobile:mobile)";
};

TEST_F(IconData, IsWrittenWithItsAttributesAndItsSizeIsTold) {
  std::uint64_t size = 77;
  EXPECT_TRUE(write(toBytes("icon"), &size));
  EXPECT_EQ(size, 4u);
  expectTrace({Create, line("1", "4")});
  EXPECT_EQ(phone.files.textAt(IconPath), "icon");
  EXPECT_EQ(phone.files.attributesAt(IconPath)->owner, "mobile");
  EXPECT_EQ(phone.files.attributesAt(IconPath)->group, "mobile");
}

TEST_F(IconData, NeedsNoPlaceForItsSize) {
  EXPECT_TRUE(write(toBytes("icon"), nullptr));
  expectTrace({Create, line("1", "4")});
}

TEST_F(IconData, ReplacesAnExistingFile) {
  phone.files.putFile(IconPath, "a much longer old icon");
  std::uint64_t size = 0;
  EXPECT_TRUE(write(toBytes("new"), &size));
  EXPECT_EQ(phone.files.textAt(IconPath), "new");
  EXPECT_EQ(size, 3u);
}

TEST_F(IconData, WithoutBytesIsNotWrittenAndTheSizeIsLeftUntouched) {
  std::uint64_t size = 77;
  EXPECT_FALSE(write(std::nullopt, &size));
  EXPECT_EQ(size, 77u);
  expectTrace({"log error SyncBundle|no icon data for 'com.a'"}, fakes::TraceAll);
}

TEST_F(IconData, OfNoLengthIsWrittenAllTheSame) {
  std::uint64_t size = 77;
  EXPECT_TRUE(write(Bytes{}, &size));
  EXPECT_EQ(size, 0u);
  expectTrace({Create, line("1", "0")});
  EXPECT_EQ(phone.files.textAt(IconPath), "");
}

TEST_F(IconData, ThatCannotBeWrittenLeavesTheSizeUntouched) {
  phone.faults.failEvery("FileManager.createFile", Error::posix(28));
  std::uint64_t size = 77;
  EXPECT_FALSE(write(toBytes("icon"), &size));
  EXPECT_EQ(size, 77u);
  expectTrace({"fault FileManager.createFile(" + IconPath + ")", line("0", "0")}, fakes::TraceAll);
}

TEST_F(IconData, WhoseSizeCannotBeReadIsWrittenAllTheSame) {
  phone.faults.failEvery("FileManager.attributesOfItem", Error::posix(5));
  std::uint64_t size = 77;
  EXPECT_TRUE(write(toBytes("icon"), &size));
  EXPECT_EQ(size, 77u);
  expectTrace({Create, "fault FileManager.attributesOfItem(" + IconPath + ")", line("1", "0")});
}

}  // namespace
}  // namespace appsync
