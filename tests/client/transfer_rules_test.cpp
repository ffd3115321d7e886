#include "transfer/transfer_rules.h"

#include "tests/client/client_test.h"

namespace appsync {
namespace {

/// What the rules say of one candidate, without a client around them.
class TransferRules : public ClientTest {
 protected:
  TransferRules() { candidate.identifier = "com.a"; }

  bool wantedNow() {
    const TransferContext context{installationAllowed, coordinated, ignored, systemPlaceholders,
                                  wanted};
    return isWanted(candidate, context, ClientLog(phone.log, "com.corvane.twc.AppsClient"));
  }

  TransferCandidate candidate;
  bool installationAllowed = true;
  bool coordinated = false;
  std::set<std::string> ignored;
  std::set<std::string> systemPlaceholders;
  std::set<std::string> wanted;
};

TEST_F(TransferRules, ApplyInAFixedOrder) {
  Lines names;
  for (const TransferRule& rule : transferRules()) names.emplace_back(rule.name);
  EXPECT_THAT(names, testing::ElementsAre("installation disabled", "restore to be ignored",
                                          "restore driven by the store", "system application",
                                          "system application's placeholder", "demoted"));
}

TEST_F(TransferRules, PlainCandidateIsWantedSilently) {
  EXPECT_TRUE(wantedNow());
  expectTrace({});
}

TEST_F(TransferRules, InstallationDisabledSkipsSyncEntriesButNotRestores) {
  installationAllowed = false;
  EXPECT_FALSE(wantedNow());
  expectTrace(
      {"log default SyncBundle|skipping com.a - its not a restore and app installation is "
       "disabled"});
  candidate.isRestore = true;
  EXPECT_TRUE(wantedNow());
  expectTrace({});
}

TEST_F(TransferRules, RestoreToBeIgnoredIsSkippedAndASyncEntryIsNot) {
  ignored = {"com.a"};
  EXPECT_TRUE(wantedNow());
  candidate.isRestore = true;
  EXPECT_FALSE(wantedNow());
  expectTrace(
      {"log default SyncBundle|com.a is currenlty marked as to be ignored for download - "
       "skipping"});
}

TEST_F(TransferRules, CoordinatedRestoreIsLeftToTheStore) {
  candidate.isRestore = true;
  EXPECT_TRUE(wantedNow());
  coordinated = true;
  EXPECT_FALSE(wantedNow());
  expectTrace(
      {"log default SyncBundle|com.a is currenlty marked to be restored and will be handled "
       "by kioskd - skipping"});
}

TEST_F(TransferRules, IgnoredRestoreIsNamedBeforeTheStore) {
  candidate.isRestore = true;
  coordinated = true;
  ignored = {"com.a"};
  EXPECT_FALSE(wantedNow());
  expectTrace(
      {"log default SyncBundle|com.a is currenlty marked as to be ignored for download - "
       "skipping"});
}

TEST_F(TransferRules, SystemApplicationIsSkippedOnlyWhenCoordinated) {
  candidate.isSystemApp = true;
  candidate.isIntentionallyDemoted = true;
  EXPECT_TRUE(wantedNow());
  coordinated = true;
  EXPECT_FALSE(wantedNow());
  expectTrace(
      {"log default SyncBundle|com.a is auto demoted: 0, manual demoted: 1, system app:1 - "
       "skipping"});
}

TEST_F(TransferRules, SystemApplicationsPlaceholderIsSkippedInBothModes) {
  systemPlaceholders = {"com.a"};
  EXPECT_FALSE(wantedNow());
  expectTrace({"log default SyncBundle|com.a is system app placeholder - skipping"});
  coordinated = true;
  EXPECT_FALSE(wantedNow());
  expectTrace({"log default SyncBundle|com.a is system app placeholder - skipping"});
}

TEST_F(TransferRules, DemotedApplicationIsSkippedUnlessTheDesktopNamesIt) {
  coordinated = true;
  candidate.isAutoDemoted = true;
  EXPECT_FALSE(wantedNow());
  // The automatic flag stands first, whatever the labels say.
  expectTrace({"log default SyncBundle|com.a is currenlty demoted (manual:1, auto:0) - skipping"});
  wanted = {"com.a"};
  EXPECT_TRUE(wantedNow());
  expectTrace(
      {"log default SyncBundle|com.a is currenlty demoted (manual:1, auto:0) - but will be "
       "installed as it's requested by client"});
}

TEST_F(TransferRules, IntentionallyDemotedPrintsItsFlagSecond) {
  coordinated = true;
  candidate.isIntentionallyDemoted = true;
  EXPECT_FALSE(wantedNow());
  expectTrace({"log default SyncBundle|com.a is currenlty demoted (manual:0, auto:1) - skipping"});
}

TEST_F(TransferRules, DemotedApplicationIsWantedWhenInstallsAreNotCoordinated) {
  candidate.isAutoDemoted = true;
  EXPECT_TRUE(wantedNow());
  expectTrace({});
}

}  // namespace
}  // namespace appsync
