#include "host/library/sync_plan.h"

#include "tests/test_pch.h"

namespace appsync::host {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;

class Planning : public ::testing::Test {
 protected:
  void offer(const std::string& identifier, const std::string& version) {
    library.packages[identifier] = {"x.zip", identifier, version, "Name of " + identifier};
  }
  void have(const std::string& identifier, const std::string& version, bool system = false,
            bool placeholder = false) {
    installed.push_back({identifier, version, "Name of " + identifier, system, placeholder});
  }

  void plan() {
    problem.clear();
    entries.clear();
    skipped.clear();
    failed.clear();
    const auto made = makePlan(library, installed, options, problem);
    if (!made) return;
    for (const PlannedEntry& entry : made->entries) {
      const std::string from =
          entry.installedVersion.empty() ? "" : " over " + entry.installedVersion;
      entries.push_back(std::string(name(entry.action)) + " " + entry.identifier + " " +
                        entry.version + from + (entry.byHost ? " by host" : ""));
    }
    for (const SkippedEntry& entry : made->skipped) {
      skipped.push_back(entry.identifier + ": " + entry.reason + (entry.upToDate ? " (fine)" : ""));
    }
    for (const FailedEntry& entry : made->failed) {
      failed.push_back(entry.identifier + ": " + entry.reason);
    }
  }

  Library library{"lib", {}, {}};
  std::vector<InstalledApplication> installed;
  PlanOptions options;
  std::string problem;
  std::vector<std::string> entries;
  std::vector<std::string> skipped;
  std::vector<std::string> failed;
};

TEST_F(Planning, TakesWhatIsNewOrNewer) {
  offer("com.new", "1.0");
  offer("com.newer", "1.10");
  offer("com.older", "1.0");
  offer("com.same", "2.0");
  have("com.newer", "1.9");
  have("com.older", "1.1");
  have("com.same", "2.0");
  have("com.other", "1.0");
  plan();
  EXPECT_THAT(entries, ElementsAre("install com.new 1.0", "update com.newer 1.10 over 1.9"));
  EXPECT_THAT(skipped, ElementsAre("com.older: version 1.1 is installed (fine)",
                                   "com.same: version 2.0 is installed (fine)"));
}

TEST_F(Planning, TakesOnlyWhatIsNamedAlsoAnewAndBackwards) {
  offer("com.new", "1.0");
  offer("com.older", "1.0");
  offer("com.same", "2.0");
  have("com.older", "1.1");
  have("com.same", "2.0");
  options.install = {"com.same", "com.older", "com.same"};
  plan();
  EXPECT_THAT(entries,
              ElementsAre("downgrade com.older 1.0 over 1.1", "reinstall com.same 2.0 over 2.0"));
  EXPECT_THAT(skipped, IsEmpty());
}

TEST_F(Planning, MendsWhatLostItsExecutableWithAPackageThatIsNotOlder) {
  offer("com.older", "1.0");
  offer("com.same", "2.0");
  have("com.older", "1.1");
  have("com.same", "2.0");
  for (InstalledApplication& application : installed) application.isDamaged = true;
  plan();
  EXPECT_THAT(entries, ElementsAre("reinstall com.same 2.0 over 2.0"));
  EXPECT_THAT(skipped, ElementsAre("com.older: version 1.1 is installed without its executable, "
                                   "and the library has only an older one"));
}

TEST_F(Planning, TellsOfAnInstallThatNobodyToldOfWhateverIsNamed) {
  offer("com.other", "1.0");
  offer("com.untold", "2.0");
  have("com.untold", "2.0");
  installed.back().isUntold = true;
  options.install = {"com.other"};
  plan();
  EXPECT_THAT(entries, ElementsAre("install com.other 1.0", "install com.untold 2.0"));
  options.install = {"com.untold"};
  plan();
  EXPECT_THAT(entries, ElementsAre("reinstall com.untold 2.0 over 2.0"));
  options.install = {};
  installed.back().isDamaged = true;
  plan();
  EXPECT_THAT(entries, ElementsAre("install com.other 1.0", "reinstall com.untold 2.0 over 2.0"));
}

TEST_F(Planning, RefusesAnIdentifierWithoutPackage) {
  options.install = {"com.unknown"};
  plan();
  EXPECT_EQ(problem, "no package for com.unknown in lib");
  library.unreadable.push_back({"broken.zip", true, "damaged"});
  plan();
  EXPECT_EQ(problem, "no package for com.unknown in lib (unreadable files: 1)");
}

TEST_F(Planning, RefusesToInstallAndRemoveTheSame) {
  offer("com.a", "1");
  options.install = options.remove = {"com.a"};
  plan();
  EXPECT_EQ(problem, "com.a is to be both installed and removed");
}

TEST_F(Planning, RemovesWhatIsNamedAndDoesNotInstallItAgain) {
  offer("com.a", "2.0");
  have("com.a", "1.0");
  options.remove = {"com.a"};
  plan();
  EXPECT_THAT(entries, ElementsAre("remove com.a 1.0 over 1.0"));
}

TEST_F(Planning, RemovesOnlyWhatIsThereAndTheUsers) {
  have("com.system", "1.0", true);
  offer("com.absent", "1.0");
  options.remove = {"com.absent", "com.system"};
  plan();
  EXPECT_THAT(entries, IsEmpty());
  EXPECT_THAT(skipped, ElementsAre("com.absent: it is not installed"));
  EXPECT_THAT(failed, ElementsAre("com.system: it is a system application"));
}

TEST_F(Planning, RefusesToRemoveWhatNobodyKnows) {
  options.remove = {"com.unknown"};
  plan();
  EXPECT_EQ(problem, "com.unknown is neither on the phone nor in lib");
}

TEST_F(Planning, MirrorsTheLibrary) {
  offer("com.kept", "1.0");
  have("com.kept", "1.0");
  have("com.extra", "1.0");
  have("com.restoring", "1.0", false, true);
  have("com.system", "1.0", true);
  options.mirror = true;
  plan();
  EXPECT_THAT(entries, ElementsAre("remove com.extra 1.0 over 1.0"));
  EXPECT_THAT(skipped, ElementsAre("com.restoring: not removed: it waits as a placeholder "
                                   "(--remove takes it away with its data)",
                                   "com.kept: version 1.0 is installed (fine)"));
}

TEST_F(Planning, DoesNotMirrorAnEmptyLibrary) {
  have("com.a", "1.0");
  options.mirror = true;
  plan();
  EXPECT_EQ(problem, "lib holds no packages: --mirror would remove every application");
}

TEST_F(Planning, DoesNotMirrorAwayWhatAnUnreadablePackageMayHold) {
  offer("com.kept", "1.0");
  have("com.extra", "1.0");
  library.unreadable.push_back({"notes.txt", false, "not an archive"});
  options.mirror = true;
  plan();
  EXPECT_THAT(entries, ElementsAre("remove com.extra 1.0 over 1.0", "install com.kept 1.0"));
  library.unreadable.push_back({"extra.zip", true, "damaged"});
  plan();
  EXPECT_THAT(entries, ElementsAre("install com.kept 1.0"));
  EXPECT_THAT(
      skipped,
      ElementsAre("com.extra: not removed: its package may be extra.zip, which cannot be read"));
}

TEST_F(Planning, ObeysThePhonesRestrictions) {
  offer("com.new", "1.0");
  offer("com.same", "1.0");
  have("com.same", "1.0");
  have("com.old", "1.0");
  options.mirror = true;
  options.installingAllowed = options.removingAllowed = false;
  plan();
  EXPECT_THAT(entries, IsEmpty());
  EXPECT_THAT(failed, IsEmpty());
  EXPECT_THAT(skipped, ElementsAre(HasSubstr("com.old: removing applications is forbidden"),
                                   HasSubstr("com.new: installing applications is forbidden"),
                                   "com.same: version 1.0 is installed (fine)"));
}

TEST_F(Planning, FailsWhatWasNamedAndIsForbidden) {
  offer("com.new", "1.0");
  offer("com.system", "2.0");
  have("com.old", "1.0");
  have("com.system", "1.0", true);
  options.install = {"com.new", "com.system"};
  options.remove = {"com.old"};
  options.installingAllowed = options.removingAllowed = false;
  plan();
  EXPECT_THAT(entries, IsEmpty());
  EXPECT_THAT(skipped, IsEmpty());
  EXPECT_THAT(failed, ElementsAre(HasSubstr("com.old: removing applications is forbidden"),
                                  HasSubstr("com.new: installing applications is forbidden"),
                                  "com.system: it is a system application"));
}

TEST_F(Planning, LeavesSystemApplicationsAlone) {
  offer("com.system", "2.0");
  have("com.system", "1.0", true);
  plan();
  EXPECT_THAT(entries, IsEmpty());
  EXPECT_THAT(skipped, ElementsAre("com.system: it is a system application"));
}

TEST_F(Planning, InstallsWhatIsOnlyAPlaceholder) {
  offer("com.a", "1.0");
  have("com.a", "1.0", false, true);
  plan();
  EXPECT_THAT(entries, ElementsAre("install com.a 1.0"));
}

TEST_F(Planning, BringsByItselfWhatTheClientDoesNotAskFor) {
  offer("com.a", "1.0");
  offer("com.b", "2.0");
  have("com.a", "1.0", false, true);
  have("com.b", "1.0");
  installed[0].waits = installed[1].waits = true;
  plan();
  EXPECT_THAT(entries,
              ElementsAre("install com.a 1.0 by host", "update com.b 2.0 over 1.0 by host"));
}

TEST_F(Planning, LeavesADemotedApplicationUnlessItIsNamed) {
  offer("com.a", "1.0");
  have("com.a", "1.0", false, true);
  installed[0].isDemoted = true;
  plan();
  EXPECT_THAT(entries, IsEmpty());
  EXPECT_THAT(skipped, ElementsAre("com.a: stays a placeholder until it is asked for"));
  options.install = {"com.a"};
  plan();
  EXPECT_THAT(entries, ElementsAre("install com.a 1.0"));
  EXPECT_THAT(skipped, IsEmpty());
}

}  // namespace
}  // namespace appsync::host
