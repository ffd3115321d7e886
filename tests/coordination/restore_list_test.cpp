// The restored backup's list: which applications are processed, and what becomes of the list.

#include "tests/coordination/restore_list.h"

#include <cerrno>

namespace appsync::fakes {
namespace {

using testing::Contains;
using testing::ElementsAre;

class RestoreListTest : public RestoredBackupTest {
 protected:
  RestoreListTest() : RestoredBackupTest(false) {}
};

TEST_F(RestoreListTest, WithoutAListNothingHappens) {
  phone.files.putFile(KeptCopy, "an earlier list");
  EXPECT_TRUE(process());
  EXPECT_THAT(effects(), ElementsAre(said("no halvo restore plist found - skipping processing of "
                                          "halvo restored apps")));
  EXPECT_EQ(phone.files.textAt(KeptCopy), "an earlier list");
}

TEST_F(RestoreListTest, AnUnreadableListIsPutAside) {
  putList({});
  phone.faults.failWhere("FileManager.contentsAtPath", RestoreList, Refused);
  EXPECT_FALSE(process());
  EXPECT_EQ(effects(),
            joined({{"fault FileManager.contentsAtPath(" + std::string(RestoreList) + ")",
                     said("failed to read halvo app restore info. err=Error "
                          "Domain=Fault Code=7")},
                    listKept()}));
  EXPECT_TRUE(listIsKept());
}

TEST_F(RestoreListTest, AListThatCannotBeLookedAtJustNowStaysForTheNextRestore) {
  putList({{"com.r", entryWith(plainMetadata())}});
  for (const char* look : {"FileManager.fileExists", "FileManager.attributesOfItem"}) {
    phone.faults.failWhere(look, RestoreList, Refused);
  }
  EXPECT_FALSE(process());
  EXPECT_EQ(effects(),
            (Trace{"fault FileManager.attributesOfItem(" + std::string(RestoreList) + ")",
                   "log error SyncBundle|can't look at " + std::string(RestoreList) + ": " +
                       description(Refused)}));
  phone.faults.clear();
  EXPECT_TRUE(process());
  EXPECT_TRUE(listIsKept());
}

TEST_F(RestoreListTest, AListThatDoesNotParseIsPutAside) {
  phone.files.putFile(RestoreList, "no property list");
  std::optional<Error> error;
  ASSERT_FALSE(parsePropertyList(asBytes("no property list"), &error));
  EXPECT_FALSE(process());
  EXPECT_EQ(effects(),
            joined({{said("processing halvo restore info"),
                     said("failed to parse halvo app restore info. err=" + description(*error))},
                    listKept()}));
  EXPECT_TRUE(listIsKept());
}

TEST_F(RestoreListTest, AListOfAnotherFormIsPutAside) {
  phone.files.putPlist(RestoreList, PropertyList::Array{"com.r"});
  EXPECT_FALSE(process());
  EXPECT_EQ(effects(),
            joined({{said("processing halvo restore info"),
                     said("failed to parse halvo app restore info. err=Error "
                          "Domain=PropertyListError Code=0 {Description = not a dictionary}")},
                    listKept()}));
}

TEST_F(RestoreListTest, AnEmptyFileIsPutAside) {
  phone.files.putFile(RestoreList, "");
  EXPECT_FALSE(process());
  EXPECT_TRUE(listIsKept());
}

TEST_F(RestoreListTest, AnEmptyListRestoresNothing) {
  putList({});
  EXPECT_FALSE(process());
  EXPECT_EQ(
      effects(),
      joined({{said("processing halvo restore info"), "log default Oversize|Demoted Apps: (null)"},
              listKept()}));
}

TEST_F(RestoreListTest, TheKeptCopyReplacesAnEarlierOne) {
  phone.files.putFile(KeptCopy, "an earlier list");
  putList({});
  process();
  EXPECT_TRUE(listIsKept());
  EXPECT_EQ(phone.files.plistAt(KeptCopy), PropertyList(PropertyList::Dictionary{}));
}

TEST_F(RestoreListTest, AListThatCannotBePutAsideIsReported) {
  putList({{"com.r", entryWith(plainMetadata())}});
  phone.faults.failEvery("FileManager.moveItem", Refused);
  EXPECT_TRUE(process());
  EXPECT_EQ(effects().back(), said("failed to copy halvo metadata. err=Error Domain=Fault Code=7"));
  EXPECT_TRUE(phone.files.exists(RestoreList));
}

TEST_F(RestoreListTest, AKeptCopyThatCannotBeRemovedKeepsTheListWhereItIs) {
  phone.files.putFile(KeptCopy, "an earlier list");
  putList({});
  phone.faults.failCall("FileManager.removeItem", 1, Refused);
  EXPECT_FALSE(process());
  const std::string kept(KeptCopy);
  const std::string list(RestoreList);
  EXPECT_EQ(
      effects(),
      (Trace{
          said("processing halvo restore info"), "log default Oversize|Demoted Apps: (null)",
          "fault FileManager.removeItem(" + kept + ")",
          "FileManager.moveItem(" + list + ", " + kept + ")",
          said("failed to copy halvo metadata. err=" + description(Error::posix(EEXIST, kept)))}));
  EXPECT_EQ(phone.files.textAt(KeptCopy), "an earlier list");
  EXPECT_EQ(phone.files.plistAt(RestoreList), PropertyList(PropertyList::Dictionary{}));
  // The next restore finds it again, and may put it aside.
  process();
  EXPECT_TRUE(listIsKept());
}

TEST_F(RestoreListTest, ASecondRunFindsNoList) {
  putList({{"com.r", entryWith({})}});
  EXPECT_FALSE(process());
  forget();
  EXPECT_TRUE(process());
  EXPECT_EQ(effects().size(), 1u);
}

TEST_F(RestoreListTest, BrokenEntriesAreSkipped) {
  putList({{"com.a", "no dictionary"},
           {"com.b", PropertyList::Dictionary{}},
           {"com.c", PropertyList::Dictionary{{"HalvoMetadata", "no data"}}},
           {"com.d", entryWith(plainMetadata())}});
  phone.appRegistry.seedPlaceholder("com.d");
  EXPECT_FALSE(process());
  EXPECT_EQ(effects(), joined({{said("processing halvo restore info"),
                                "log default Oversize|Demoted Apps: (null)",
                                said("processing halvo restore info for 'com.a' demotionStatus :0"),
                                said("no halvo restore info for 'com.a' - skipping"),
                                said("processing halvo restore info for 'com.b' demotionStatus :0"),
                                said("no HalvoMetadata for 'com.b' - ignoring"),
                                said("processing halvo restore info for 'com.c' demotionStatus :0"),
                                said("no HalvoMetadata for 'com.c' - ignoring"),
                                said("processing halvo restore info for 'com.d' demotionStatus :0"),
                                said("Found placeholder for bundle com.d"),
                                said("placeholder already exists for 'com.d' - skiping'")},
                               listKept()}));
}

constexpr const char* Victim = "/var/mobile/Containers/Applications/1/Victim.app/Info.plist";

PropertyList::Dictionary climbingEntries() {
  const PropertyList entry = entryWith(plainMetadata());
  return {{"../../var/mobile/Containers/Applications/1/Victim", entry},
          {"..", entry},
          {"../x", entry},
          {"a/../../b", entry}};
}

Trace climbersIgnored() {
  Trace trace{said("processing halvo restore info"), "log default Oversize|Demoted Apps: (null)"};
  for (const char* climber :
       {"..", "../../var/mobile/Containers/Applications/1/Victim", "../x", "a/../../b"}) {
    trace.push_back(
        said("processing halvo restore info for '" + std::string(climber) + "' demotionStatus :0"));
    trace.push_back(said("Ignoring invalid path: " + std::string(climber)));
  }
  return joined({trace, listKept()});
}

TEST_F(RestoreListTest, IdentifiersThatClimbAreIgnored) {
  phone.files.putFile(Victim, "untouched");
  putList(climbingEntries());
  EXPECT_FALSE(process());
  EXPECT_EQ(effects(), climbersIgnored());
  EXPECT_EQ(phone.files.textAt(Victim), "untouched");
}

TEST_F(RestoreListTest, TheLastApplicationProcessedDecides) {
  const PropertyList good = entryWith(plainMetadata());
  const PropertyList bad = entryWith({});
  const PropertyList skipped = PropertyList::Dictionary{};
  putList({{"com.a", bad}, {"com.b", good}});
  EXPECT_TRUE(process());
  putList({{"com.c", good}, {"com.d", bad}});
  EXPECT_FALSE(process());
  putList({{"com.e", good}, {"com.f", skipped}});
  EXPECT_TRUE(process());
}

TEST_F(RestoreListTest, WithoutCoordinationDemotionsAreOnlyNamed) {
  phone.files.putPlist(DemotedApps, PropertyList::Dictionary{
                                        {"IntentionalDowngrades", PropertyList::Array{"com.r"}}});
  putList({{"com.r", entryWith(plainMetadata())}});
  EXPECT_TRUE(process());
  const Trace trace = effects();
  EXPECT_THAT(trace, Contains("log default Oversize|Demoted Apps: {IntentionalDowngrades = "
                              "(com.r)}"));
  EXPECT_THAT(trace, Contains(said("processing halvo restore info for 'com.r' demotionStatus :1")));
  EXPECT_EQ(phone.appRegistry.placeholder("com.r")->installType, InstallType::Restore);
}

class CoordinatedRestoreListTest : public RestoredBackupTest {
 protected:
  CoordinatedRestoreListTest() : RestoredBackupTest(true) {}

  void putDemoted(PropertyList::Dictionary lists) {
    phone.files.putPlist(DemotedApps, std::move(lists));
  }
  InstallType placeholderType() const {
    return phone.installCoordination.placeholders().back()->state().installType;
  }
};

TEST_F(CoordinatedRestoreListTest, IdentifiersThatClimbAreIgnored) {
  phone.files.putFile(Victim, "untouched");
  putList(climbingEntries());
  EXPECT_FALSE(process());
  EXPECT_EQ(effects(), climbersIgnored());
  EXPECT_EQ(phone.files.textAt(Victim), "untouched");
}

TEST_F(CoordinatedRestoreListTest, HandsEveryPartOfAnEntryToItsCoordinator) {
  putList({{"com.r", entryWith(plainMetadata())}});
  EXPECT_TRUE(process());
  const auto state = phone.installCoordination.placeholders().front()->state();
  EXPECT_EQ(state.metadata, StoreMetadata{plainMetadata()});
  EXPECT_EQ(state.sinfData, toBytes("sinf"));
  EXPECT_EQ(phone.files.textAt("/tmp/com.corvane.twc.Apps/com.r.app/Icon.png"), "icon");
  EXPECT_EQ(state.installType, InstallType::Restore);
  EXPECT_TRUE(listIsKept());
}

TEST_F(CoordinatedRestoreListTest, BlobAndIconMayBeMissingOrOfAnotherType) {
  putList({{"com.r", PropertyList::Dictionary{{"HalvoMetadata", plistBytes(plainMetadata())},
                                              {"ApplicationSINF", "no data"},
                                              {"PlaceholderIcon", 5}}}});
  EXPECT_TRUE(process());
  const auto state = phone.installCoordination.placeholders().front()->state();
  EXPECT_EQ(state.sinfData, std::nullopt);
  EXPECT_EQ(state.iconPromise, nullptr);
}

TEST_F(CoordinatedRestoreListTest, TheAutomaticListWinsOverTheIntentionalOne) {
  putDemoted({{"AutomaticDowngrades", PropertyList::Array{5, "com.r"}},
              {"IntentionalDowngrades", PropertyList::Array{"com.r"}}});
  putList({{"com.r", entryWith(plainMetadata())}});
  EXPECT_TRUE(process());
  EXPECT_EQ(placeholderType(), InstallType::Downgrade);
  EXPECT_THAT(effects(),
              Contains(said("processing halvo restore info for 'com.r' demotionStatus :2")));
}

TEST_F(CoordinatedRestoreListTest, AnIntentionalDemotionIsKept) {
  putDemoted(
      {{"AutomaticDowngrades", "com.r"}, {"IntentionalDowngrades", PropertyList::Array{"com.r"}}});
  putList({{"com.r", entryWith(plainMetadata())}});
  EXPECT_TRUE(process());
  EXPECT_EQ(placeholderType(), InstallType::IntentionalDowngrade);
}

TEST_F(CoordinatedRestoreListTest, ADamagedListOfDemotionsDemotesNothing) {
  phone.files.putFile(DemotedApps, "no property list");
  putList({{"com.r", entryWith(plainMetadata())}});
  EXPECT_TRUE(process());
  EXPECT_EQ(placeholderType(), InstallType::Restore);
  EXPECT_THAT(effects(), Contains(complained("couldn't parse demoted apps list")));
}

TEST_F(CoordinatedRestoreListTest, AListOfDemotionsThatCannotBeReadIsSaidAndDemotesNothing) {
  putDemoted({{"AutomaticDowngrades", PropertyList::Array{"com.r"}}});
  putList({{"com.r", entryWith(plainMetadata())}});
  phone.faults.failWhere("FileManager.contentsAtPath", DemotedApps, Refused);
  EXPECT_TRUE(process());
  EXPECT_THAT(effects(), Contains("log error SyncBundle|can't read " + std::string(DemotedApps) +
                                  ": " + description(Refused)));
  EXPECT_EQ(placeholderType(), InstallType::Restore);
}

TEST_F(CoordinatedRestoreListTest, APlaceholderThatStandsIsNoReasonToSkip) {
  phone.appRegistry.seedPlaceholder("com.r");
  putList({{"com.r", entryWith(plainMetadata())}});
  EXPECT_TRUE(process());
  EXPECT_EQ(phone.installCoordination.placeholders().size(), 1u);
}

TEST_F(CoordinatedRestoreListTest, TheLastRestoreDecides) {
  const PropertyList good = entryWith(plainMetadata());
  const PropertyList bad = PropertyList::Dictionary{{"HalvoMetadata", toBytes("no list")}};
  putList({{"com.a", good}, {"com.b", bad}});
  EXPECT_FALSE(process());
  putList({{"com.a", bad}, {"com.b", good}});
  EXPECT_TRUE(process());
}

}  // namespace
}  // namespace appsync::fakes
