// Which applications disappeared since the last sync, and how much room the others take.
#include "tests/client/client_test.h"

namespace appsync {
namespace {

constexpr std::uint64_t MaximumBytes = std::uint64_t{1} << 40;

class Inventory : public ClientTest {
 protected:
  static PropertyList::Dictionary deleted(const std::vector<std::string>& identifiers) {
    Array list;
    for (const std::string& identifier : identifiers) {
      list.push_back(Dictionary{{"KBBundleIdentifier", identifier}});
    }
    return {{"_Deleted", list}};
  }

  void putLastSync(const Array& identifiers) {
    phone.files.putPlist(LastSyncStatePath, identifiers);
  }

  static inline const std::string Start = "log default SyncBundle|getting installed assets";
};

TEST_F(Inventory, OfANewPhoneReportsNothingDeleted) {
  EXPECT_EQ(client().installedAssets(), deleted({}));
  expectTrace(
      {Start, "FileManager.contentsAtPath(" + TodoListPath + ")",
       "FileManager.contentsAtPath(" + LastSyncStatePath + ")",
       "InstallerService.lookupUninstalled()",
       "log default Oversize|finished getting installed assets toDoList:(null), uninstalled "
       "apps (), last synced apps(null)"},
      fakes::TraceAll);
}

TEST_F(Inventory, ReportsWhatTheInstallerUninstalledAndWhatIsMissingSinceTheLastSync) {
  putTodo({{"com.pending", "install"}});
  putLastSync({"com.here", "com.gone"});
  phone.appRegistry.seedInstalled("com.here");
  phone.installerService.addUninstalled("com.removed");
  EXPECT_EQ(client().installedAssets(), deleted({"com.gone", "com.removed"}));
  expectTrace(
      {Start,
       "log default SyncBundle|com.gone not installed, and no todo (found=0 pi=0 failed=0) Marking "
       "as deleted",
       "log default SyncBundle|com.removed not installed, and no todo (found=0 pi=0 failed=0) "
       "Marking as deleted",
       "log default Oversize|finished getting installed assets toDoList:({identifier = "
       "com.pending; "
       "operation = install}), uninstalled apps (com.removed), last synced apps(com.here, "
       "com.gone)"});
}

TEST_F(Inventory, ReportsAnApplicationOnceThatBothListsName) {
  putLastSync({"com.a", "com.a"});
  phone.installerService.addUninstalled("com.a");
  EXPECT_EQ(client().installedAssets(), deleted({"com.a"}));
}

TEST_F(Inventory, AnInstalledApplicationOfTheLastSyncIsNoCandidate) {
  putLastSync({"com.a"});
  phone.appRegistry.seedInstalled("com.a");
  EXPECT_EQ(client().installedAssets(), deleted({}));
}

TEST_F(Inventory, APlaceholderCountsAsInstalled) {
  putLastSync({"com.a"});
  phone.appRegistry.seedPlaceholder("com.a");
  EXPECT_EQ(client().installedAssets(), deleted({}));
}

TEST_F(Inventory, WhatTheInstallerListsIsReportedWithoutAskingTheRegistry) {
  phone.appRegistry.seedInstalled("com.a");
  phone.installerService.addUninstalled("com.a");
  EXPECT_EQ(client().installedAssets(), deleted({"com.a"}));
  EXPECT_EQ(phone.trace.count("AppRegistry.isApplicationInstalled"), 0u);
}

TEST_F(Inventory, EntriesOfTheLastSyncThatAreNoTextsAreSkipped) {
  putLastSync({7, Dictionary{{"identifier", "com.b"}}, "com.a"});
  EXPECT_EQ(client().installedAssets(), deleted({"com.a"}));
}

// What the todo list says of an application that is gone decides.

struct GoneApplication {
  std::string name;
  PropertyList::Array todoList;
  std::string flags;  ///< empty: still to be done, so not deleted
};

void PrintTo(const GoneApplication& gone, std::ostream* out) { *out << gone.name; }

PropertyList entry(const PropertyList& identifier, const PropertyList& operation) {
  return PropertyList::Dictionary{{"identifier", identifier}, {"operation", operation}};
}

class GoneApplicationTest : public ClientTest,
                            public testing::WithParamInterface<GoneApplication> {};

TEST_P(GoneApplicationTest, IsDeletedUnlessItsTodoIsPending) {
  const GoneApplication& gone = GetParam();
  phone.installerService.addUninstalled("com.a");
  phone.files.putPlist(TodoListPath, gone.todoList);
  const PropertyList::Dictionary result = client().installedAssets();

  const bool pending = gone.flags.empty();
  const Array expected = pending ? Array{} : Array{Dictionary{{"KBBundleIdentifier", "com.a"}}};
  EXPECT_EQ(result, (Dictionary{{"_Deleted", expected}}));
  const std::string verdict =
      pending ? "com.a not installed, but is in our todo list. Not marking deleted"
              : "com.a not installed, and no todo (" + gone.flags + ") Marking as deleted";
  expectTrace(
      {"log default SyncBundle|getting installed assets", "log default SyncBundle|" + verdict,
       "log default Oversize|finished getting installed assets toDoList:" +
           description(gone.todoList) + ", uninstalled apps (com.a), last synced apps(null)"});
}

INSTANTIATE_TEST_SUITE_P(
    Todo, GoneApplicationTest,
    testing::Values(
        GoneApplication{"NoEntry", {entry("com.b", "install")}, "found=0 pi=0 failed=0"},
        GoneApplication{"Install", {entry("com.a", "install")}, ""},
        GoneApplication{"Remove", {entry("com.a", "remove")}, ""},
        GoneApplication{"Downloaded", {entry("com.a", "DOWNLOADED")}, ""},
        GoneApplication{"Sent", {entry("com.a", "SENT")}, ""},
        GoneApplication{"Installed", {entry("com.a", "INSTALLED")}, "found=1 pi=1 failed=0"},
        GoneApplication{"Failed", {entry("com.a", "FAILED")}, "found=1 pi=0 failed=1"},
        GoneApplication{"OtherCase", {entry("com.a", "installed")}, ""},
        GoneApplication{"NoOperation", {PropertyList::Dictionary{{"identifier", "com.a"}}}, ""},
        GoneApplication{"OperationIsANumber", {entry("com.a", 7)}, ""},
        GoneApplication{
            "FirstEntryPending", {entry("com.a", "install"), entry("com.a", "FAILED")}, ""},
        GoneApplication{"FirstEntryFailed",
                        {entry("com.a", "FAILED"), entry("com.a", "install")},
                        "found=1 pi=0 failed=1"},
        GoneApplication{"EntriesOfOtherTypes",
                        {"com.a", 7, entry(7, "install"), entry("com.a", "INSTALLED")},
                        "found=1 pi=1 failed=0"}),
    [](const auto& instance) { return instance.param.name; });

// Failures contribute nothing and are never reported to the host.

TEST_F(Inventory, GoesOnWithoutTheInstallersList) {
  phone.installerService.setAnswers(false);
  putLastSync({"com.a"});
  EXPECT_EQ(client().installedAssets(), deleted({"com.a"}));
  expectTrace(
      {Start, "log error SyncBundle|DeployaLookupUninstalled returned NULL",
       "log default SyncBundle|com.a not installed, and no todo (found=0 pi=0 failed=0) "
       "Marking as deleted",
       "log default Oversize|finished getting installed assets toDoList:(null), uninstalled "
       "apps (null), last synced apps(com.a)"});
}

TEST_F(Inventory, AMissingAnswerKeepsTheListOfAnEarlierInventory) {
  phone.installerService.addUninstalled("com.a");
  client().installedAssets();
  phone.installerService.setAnswers(false);
  forgetTrace();
  EXPECT_EQ(client().installedAssets(), deleted({}));
  EXPECT_THAT(phone.log.texts(),
              testing::Contains(testing::HasSubstr("uninstalled apps (com.a), last")));
}

TEST_F(Inventory, ANewListReplacesThatOfAnEarlierInventory) {
  phone.installerService.addUninstalled("com.a");
  client().installedAssets();
  phone.installerService.removeUninstalled("com.a");
  phone.installerService.addUninstalled("com.b");
  client().installedAssets();
  forgetTrace();
  client().syncEndedWithSuccess(true);
  EXPECT_EQ(phone.trace.count("InstallerService.clearUninstalled((com.b))"), 1u);
}

TEST_F(Inventory, ADamagedTodoListCountsAsEmpty) {
  phone.files.putFile(TodoListPath, "no property list");
  phone.files.putPlist(LastSyncStatePath, Dictionary{{"com.a", true}});
  phone.installerService.addUninstalled("com.b");
  EXPECT_EQ(client().installedAssets(), deleted({"com.b"}));
  expectTrace(
      {Start, "log error SyncBundle|couldn't parse todo list",
       "log error SyncBundle|todo list is not an array",
       "log default SyncBundle|com.b not installed, and no todo (found=0 pi=0 failed=0) "
       "Marking as deleted",
       "log default Oversize|finished getting installed assets toDoList:(null), uninstalled "
       "apps (com.b), last synced apps(null)"});
}

TEST_F(Inventory, AListThatCannotBeReadJustNowIsSaidAndCountsAsEmpty) {
  putTodo({{"com.a", "install"}});
  phone.files.putPlist(LastSyncStatePath, Array{"com.a"});
  const Error failure = Error::posix(24);
  phone.faults.failEvery("FileManager.contentsAtPath", failure);
  client().installedAssets();
  const Lines log = phone.trace.log();
  for (const std::string& path : {TodoListPath, LastSyncStatePath}) {
    EXPECT_THAT(log, testing::Contains("log error SyncBundle|can't read " + path + ": " +
                                       description(failure)));
  }
}

TEST_F(Inventory, ChangesNoFile) {
  putTodo({{"com.a", "install"}});
  putLastSync({"com.a", "com.b"});
  phone.installerService.addUninstalled("com.c");
  const auto before = phone.files.files();
  client().installedAssets();
  client().installedAssetMetrics();
  client().corvaneIDsForAssets();
  EXPECT_EQ(phone.files.files(), before);
  EXPECT_EQ(phone.installerService.uninstalled(), std::set<std::string>{"com.c"});
}

class Metrics : public ClientTest {
 protected:
  static AppRecord application(std::string identifier, std::uint64_t bytes) {
    AppRecord record;
    record.applicationIdentifier = std::move(identifier);
    record.staticDiskUsage = bytes;
    return record;
  }
};

TEST_F(Metrics, AreZeroWithoutUserApplications) {
  AppRecord system = application("com.system", 5000);
  system.applicationType = ApplicationTypeSystem;
  phone.appRegistry.seedInstalled(system);
  EXPECT_EQ(client().installedAssetMetrics(),
            (Dictionary{{"_Count", 0}, {"_PhysicalSize", 0}, {"_PurgeableSize", 0}}));
  expectTrace({"AppRegistry.enumerateBundles(1)",
               "log default SyncBundle|found 0 apps using 0 bytes (0 purgeable)"},
              fakes::TraceAll);
}

TEST_F(Metrics, SumUpTheUsersApplicationsAndNothingIsPurgeable) {
  phone.appRegistry.seedInstalled(application("com.a", 1000));
  phone.appRegistry.seedInstalled(application("com.b", MaximumBytes));
  phone.appRegistry.seedPlaceholder(application("com.c", 24));
  EXPECT_EQ(
      client().installedAssetMetrics(),
      (Dictionary{
          {"_Count", 3}, {"_PhysicalSize", std::int64_t{1099511628800}}, {"_PurgeableSize", 0}}));
  expectTrace({"log default SyncBundle|found 3 apps using 1099511628800 bytes (0 purgeable)"});
}

/// A registry whose enumerations visit every record, whatever the kind.
class GenerousRegistry : public fakes::FaultyAppRegistry {
 public:
  using FaultyAppRegistry::FaultyAppRegistry;
  void enumerateBundles(BundleKind, const Visitor& visitor) noexcept override {
    FaultyAppRegistry::enumerateBundles(BundleKind::All, visitor);
  }
};

TEST_F(Metrics, CountRecordsOfTypeUserOnlyWhateverTheRegistryVisits) {
  AppRecord system = application("com.system", 5000);
  system.applicationType = ApplicationTypeSystem;
  phone.appRegistry.seedInstalled(system);
  phone.appRegistry.seedInstalled(application("com.a", 1000));
  GenerousRegistry registry(phone.appRegistry, phone.faults);
  AppsClient counting(with(phone.platform(), registry));
  EXPECT_EQ(counting.installedAssetMetrics(),
            (Dictionary{{"_Count", 1}, {"_PhysicalSize", 1000}, {"_PurgeableSize", 0}}));
}

}  // namespace
}  // namespace appsync
