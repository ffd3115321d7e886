// What a phone gets of a backup before its client is called.
#include <cerrno>

#include "tests/host/restore_fixture.h"

namespace appsync::host {
namespace {

using namespace testing;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::Pair;
using ::testing::UnorderedElementsAre;

class HandoverTest : public RestoreTest {
 protected:
  Handover handOver() {
    std::string problem;
    const Backup read = backup();
    phone.trace.clear();
    return host::handOver(hostsView.phone(), read, RestoreList::of(read, problem).value(),
                          overwriteData, reporter, interruption);
  }
  std::string demotionsOnPhone() {
    return phone.files.textAt(exchange::DemotedApplications).value_or("none");
  }
};

TEST_F(HandoverTest, GivesDataFirstAndTheListLast) {
  backUp("com.a", "data of a");
  backUp("com.b", {}, true);
  backUp("com.c", "data of c");
  const Handover given = handOver();
  EXPECT_THAT(
      trace(),
      ElementsAre(
          "phone.restoreData(com.a, data of a)", "phone.restoreData(com.c, data of c)",
          "HomeScreenService.serverPort()", "HomeScreenService.setIconState(7)",
          "FileManager.createDirectory(/var/mobile/Library/Preferences, true, -:-)",
          "FileManager.writeAtomically(/var/mobile/Library/Preferences/"
          "com.corvane.Safekeep.DemotedApps.plist)",
          "FileManager.createDirectory(/var/mobile/Media/HalvoRestore, true, -:-)",
          "FileManager.writeAtomically(/var/mobile/Media/HalvoRestore/RestoreApplications.plist)"));
  EXPECT_THAT(given.listed, UnorderedElementsAre("com.a", "com.b", "com.c"));
  EXPECT_THAT(namesOnList(), ElementsAre("com.a", "com.b", "com.c"));
  EXPECT_THAT(demotionsOnPhone(), HasSubstr("com.b"));
  EXPECT_THAT(given.failures, IsEmpty());
  EXPECT_FALSE(given.broken);
}

TEST_F(HandoverTest, LeavesInstalledApplicationsAndTheirDataAlone) {
  backUp("com.a", "data of a");
  backUp("com.b", "data of b");
  phone.appRegistry.seedInstalled("com.a");
  const Handover given = handOver();
  EXPECT_THAT(waiting, ElementsAre(Pair("com.b", "data of b")));
  EXPECT_THAT(namesOnList(), ElementsAre("com.b"));
  EXPECT_THAT(given.installed, ElementsAre("com.a"));
}

TEST_F(HandoverTest, ChangesNothingWhenAllIsThere) {
  backUp("com.a", "data of a");
  backUp("com.b", "data of b");
  backUp("com.c");
  phone.appRegistry.seedInstalled("com.a");
  seedRestoring("com.b");
  seedRestoring("com.c", InstallType::IntentionalDowngrade);
  waiting["com.b"] = "data of b";
  const Handover given = handOver();
  EXPECT_THAT(trace(), IsEmpty());
  EXPECT_THAT(given.listed, IsEmpty());
}

TEST_F(HandoverTest, TakesAwayAnOlderListWhenNothingIsMissing) {
  backUp("com.a");
  seedRestoring("com.a");
  phone.files.putPlist(exchange::RestoreList, PropertyList::Dictionary{{"com.old", "entry"}});
  handOver();
  EXPECT_FALSE(phone.files.exists(exchange::RestoreList));
}

TEST_F(HandoverTest, LaysOutDataAnewThatIsOfAnotherBackup) {
  backUp("com.a", "data of a");
  backUp("com.b", "data of b");
  backUp("com.c");
  waiting = {{"com.a", "data"}, {"com.b", "data of B"}, {"com.c", "data that is not wanted"}};
  for (const auto& item : waiting) {
    phone.files.putFile(joinPath(joinPath(exchange::WaitingData, item.first), "file"), "");
  }
  handOver();
  EXPECT_THAT(waiting, ElementsAre(Pair("com.a", "data of a"), Pair("com.b", "data of b")));
}

TEST_F(HandoverTest, LeavesTheDataOfADemotedApplicationAlone) {
  backUp("com.a", "data of a");
  seedRestoring("com.a", InstallType::IntentionalDowngrade);
  owned["com.a"] = "made since";
  handOver();
  EXPECT_THAT(waiting, IsEmpty());
  owned.clear();
  handOver();
  EXPECT_THAT(waiting, ElementsAre(Pair("com.a", "data of a")));
}

TEST_F(HandoverTest, LeavesDataAloneOfWhichNothingStands) {
  backUp("com.a", "data of a");
  owned["com.a"] = "made once";
  const Handover given = handOver();
  EXPECT_THAT(waiting, IsEmpty());
  EXPECT_THAT(given.listed, ElementsAre("com.a"));
}

TEST_F(HandoverTest, OverwritesTheDataOfADemotedApplicationWhenAsked) {
  overwriteData = true;
  backUp("com.a", "data of a");
  backUp("com.b", "data of b");
  backUp("com.c");
  for (const char* identifier : {"com.a", "com.b", "com.c"}) {
    seedRestoring(identifier, InstallType::IntentionalDowngrade);
    owned[identifier] = "made since";
  }
  owned["com.b"] = "data of b";
  EXPECT_THAT(handOver().overwritten, ElementsAre("com.a"));
  EXPECT_THAT(waiting, ElementsAre(Pair("com.a", "data of a")));
}

TEST_F(HandoverTest, GivesNothingWhenTheApplicationsCannotBeTold) {
  backUp("com.a", "data of a");
  phone.faults.failEvery("phone.applications", Error::posix(EMFILE));
  const Handover given = handOver();
  EXPECT_EQ(given.broken, "the phone's applications cannot be told: Too many open files");
  EXPECT_THAT(trace(), ElementsAre("fault phone.applications()"));
}

TEST_F(HandoverTest, LeavesOutAnApplicationWhoseDataCannotBeLookedAt) {
  backUp("com.a", "data of a");
  seedRestoring("com.a", InstallType::IntentionalDowngrade);
  owned["com.a"] = "made since";
  phone.faults.failWhere("phone.saveData", "com.a", Error::posix(EMFILE));
  EXPECT_THAT(handOver().failures,
              ElementsAre(Pair("com.a",
                               "its data on the phone could not be looked at: Too many open "
                               "files")));
  EXPECT_THAT(waiting, IsEmpty());
}

TEST_F(HandoverTest, TellsHowFarDataHasCome) {
  backUp("com.a", std::string(2500, 'x'));
  handOver();
  EXPECT_THAT(reporter.lines("data"),
              ElementsAre("data com.a", "data com.a", "data com.a", "data-ended com.a"));
}

TEST_F(HandoverTest, LeavesOutAnApplicationWhoseDataIsDamaged) {
  backUp("com.a", "data of a");
  backUp("com.b", "data of b");
  backUp("com.c", "data of c");
  backup();
  putFile(backups / "backup/Data/com.b.tar", "data of X");
  std::string problem;
  const Backup read = readBackup(backups / "backup", problem).value();
  const Handover given =
      host::handOver(hostsView.phone(), read, RestoreList::of(read, problem).value(), overwriteData,
                     reporter, interruption);
  EXPECT_THAT(given.failures,
              ElementsAre(Pair("com.b",
                               "its data in the backup is damaged: com.b.tar does not "
                               "match its digest")));
  EXPECT_THAT(namesOnList(), ElementsAre("com.a", "com.c"));
  EXPECT_THAT(waiting, ElementsAre(Pair("com.a", "data of a"), Pair("com.c", "data of c")));
}

TEST_F(HandoverTest, LeavesOutWhatNoApplicationCanBeCalled) {
  backUp("com.a");
  backUp("com.a/../../b");
  EXPECT_THAT(handOver().failures,
              ElementsAre(Pair("com.a/../../b", "no application can have this identifier")));
  EXPECT_THAT(namesOnList(), ElementsAre("com.a"));
}

TEST_F(HandoverTest, LeavesOutAnApplicationWhoseDataThePhoneRefuses) {
  backUp("com.a", "data of a");
  backUp("com.b");
  phone.faults.failEvery("phone.restoreData", Error::posix(ENOSPC));
  const Handover given = handOver();
  EXPECT_THAT(given.failures,
              ElementsAre(Pair("com.a", HasSubstr("its data could not be given back: "))));
  EXPECT_THAT(namesOnList(), ElementsAre("com.b"));
}

TEST_F(HandoverTest, StopsBeforeTheListWhenInterrupted) {
  backUp("com.a", "data of a");
  backUp("com.b", "data of b");
  interruption.request();
  const Handover given = handOver();
  EXPECT_THAT(trace(), IsEmpty());
  EXPECT_THAT(waiting, IsEmpty());
  EXPECT_FALSE(given.broken);
}

TEST_F(HandoverTest, SweepsThePlaceholderOfABrokenOffSync) {
  backUp("com.a");
  phone.appRegistry.seedPlaceholder("com.a", InstallType::Sync);
  handOver();
  EXPECT_THAT(reporter.lines("swept"), ElementsAre("swept com.a"));
  EXPECT_THAT(namesOnList(), ElementsAre("com.a"));
}

TEST_F(HandoverTest, ListsWhatStandsButIsNotYetLeftToTheStore) {
  coordination = true;
  backUp("com.a");
  backUp("com.b");
  seedRestoring("com.a");
  seedRestoring("com.b");
  phone.installCoordination.coordinator("com.b")->edit(
      [](auto& state) { state.responsibleClient = 0; });
  handOver();
  EXPECT_THAT(namesOnList(), ElementsAre("com.b"));
}

TEST_F(HandoverTest, ListsWhatABrokenOffSyncLeftAmongCoordinatedInstalls) {
  coordination = true;
  backUp("com.a");
  seedRestoring("com.a", InstallType::Sync);
  handOver();
  EXPECT_THAT(reporter.lines("swept"), IsEmpty());
  EXPECT_THAT(namesOnList(), ElementsAre("com.a"));
}

TEST_F(HandoverTest, WaitsForWhatThePhoneStillDoesByItself) {
  backUp("com.a");
  seedRestoring("com.a");
  bool busy = true;
  isBusyWith = [&](std::string_view identifier) {
    EXPECT_EQ(identifier, "com.a");
    if (!busy) return false;
    busy = false;
    phone.appRegistry.removeAll("com.a");
    phone.appRegistry.seedInstalled("com.a");
    return true;
  };
  EXPECT_THAT(handOver().installed, ElementsAre("com.a"));
}

TEST_F(HandoverTest, GoesOnWithoutALayoutThatTheHomeScreenRefuses) {
  backUp("com.a");
  Backup damaged = backup();
  damaged.iconLayout = toBytes("damaged");
  std::string problem;
  const RestoreList list = RestoreList::of(damaged, problem).value();
  const Handover given =
      host::handOver(hostsView.phone(), damaged, list, overwriteData, reporter, interruption);
  EXPECT_FALSE(given.broken);
  EXPECT_THAT(namesOnList(), ElementsAre("com.a"));
  EXPECT_THAT(given.layoutRefused.value_or(""),
              HasSubstr("the home screen does not take its layout: "));
}

TEST_F(HandoverTest, TellsWhenThePhoneTakesNoFile) {
  backUp("com.a");
  for (const auto path : {exchange::DemotedApplications, exchange::RestoreList}) {
    phone.faults.failWhere("FileManager.writeAtomically", path, Error::posix(EIO));
    const Handover given = handOver();
    ASSERT_TRUE(given.broken);
    EXPECT_THAT(*given.broken, HasSubstr("the phone does not take the backup: "));
    EXPECT_THAT(namesOnList(), IsEmpty());
    phone.faults.clear();
  }
}

}  // namespace
}  // namespace appsync::host
