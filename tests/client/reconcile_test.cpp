// What the desktop staged is taken over: deletions and the icon layout at once.
#include "tests/client/client_test.h"

namespace appsync {
namespace {

const std::string StagingPath = StagingRootPath + "/ApplicationSync";
const std::string StagedTodoPath = StagingPath + "/ApplicationsSync.plist";
const std::string StagedLayoutPath = StagingPath + "/DashelIconState.plist";
const std::string DebugCopyPath = TodoListPath + "-debug.plist";

const std::string Start =
    "log default SyncBundle|starting to reconcile sync with new anchor anchor-2";
const std::string End = "log default SyncBundle|finished reconcile sync";
const std::string RemoveWorkArea = "FileManager.removeItem(" + WorkAreaPath + ")";
const std::string MakeSyncRoot = "FileManager.createDirectory(" + SyncRootPath + ", true, -:-)";
const std::string MoveStaging = "FileManager.moveItem(" + StagingPath + ", " + WorkAreaPath + ")";
const std::string WriteDebugCopy = "FileManager.writeAtomically(" + DebugCopyPath + ")";

class Reconcile : public ClientTest {
 protected:
  /// The desktop's todo list: identifier and operation of each entry.
  void stageTodo(std::initializer_list<std::pair<PropertyList, std::string>> entries) {
    Array list;
    for (const auto& [identifier, operation] : entries) {
      list.push_back(Dictionary{{"identifier", identifier}, {"operation", operation}});
    }
    phone.files.putPlist(StagedTodoPath, list);
  }

  bool reconcile(std::optional<Error>* error = nullptr) {
    return client().reconcileSync(Dictionary{{"ignored", true}}, "anchor-2", nullptr, error);
  }

  /// The lines that begin and end a reconcile whose staging area could be moved.
  static Lines takenOver(const Lines& between, const Lines& afterNotification) {
    Lines lines{Start, RemoveWorkArea, MakeSyncRoot, MoveStaging};
    lines.insert(lines.end(), between.begin(), between.end());
    const Lines notified{"SystemNotifier.registerCheck(com.corvane.dashel.twc.wsyncnotify)",
                         "log default SyncBundle|Notifying DS we are starting syncing",
                         "HomeScreenService.serverPort()",
                         "SystemNotifier.setState(com.corvane.dashel.twc.wsyncnotify, 1)",
                         "SystemNotifier.post(com.corvane.dashel.twc.wsyncnotify)"};
    lines.insert(lines.end(), notified.begin(), notified.end());
    lines.insert(lines.end(), afterNotification.begin(), afterNotification.end());
    lines.push_back(End);
    return lines;
  }

  static std::string line(const std::string& text) { return "log default SyncBundle|" + text; }
};

TEST_F(Reconcile, TakesOverDeletionsAndIconLayoutInOrder) {
  phone.appRegistry.seedInstalled("com.a");
  phone.appRegistry.seedInstalled("com.b");
  phone.appRegistry.seedInstalled("com.keep");
  stageTodo({{"com.b", "remove"}, {"com.new", "install"}, {"com.a", "remove"}});
  phone.files.putPlist(StagedLayoutPath, Array{"com.keep", "com.new"});

  std::optional<Error> error;
  EXPECT_TRUE(reconcile(&error));
  EXPECT_EQ(error, std::nullopt);
  expectTrace(
      takenOver({line("com.b targeted for termination"), line("com.a targeted for termination"),
                 line("performing 2 deletions"), "AppRegistry.uninstallApplication(com.b, {})",
                 "transaction scenario \"Halvo Sync\" step 0 ok com.b \"Uninstall succeeded\"",
                 "AppRegistry.uninstallApplication(com.a, {})",
                 "transaction scenario \"Halvo Sync\" step 0 ok com.a \"Uninstall succeeded\""},
                {line("Sending iconlayout to DS"), "HomeScreenService.serverPort()",
                 "HomeScreenService.setIconState(7)", WriteDebugCopy}));
  EXPECT_EQ(phone.appRegistry.installedIdentifiers(), std::vector<std::string>{"com.keep"});
  EXPECT_FALSE(phone.files.exists(StagingPath));
  EXPECT_EQ(phone.homeScreen.iconLayout(),
            phone.files.bytesAt(WorkAreaPath + "/DashelIconState.plist"));
}

TEST_F(Reconcile, AsksAboutRemovalBeforeItReadsTheTodoList) {
  stageTodo({});
  reconcile();
  const Lines all = phone.trace.lines(fakes::TraceQuery);
  EXPECT_THAT(all, testing::ElementsAre(
                       "FileManager.attributesOfItem(" + StagingPath + ")",
                       "DevicePolicy.effectiveBoolValue(AppRemovalAllowed)",
                       "FileManager.contentsAtPath(" + TodoListPath + ")",
                       "FileManager.contentsAtPath(" + WorkAreaPath + "/DashelIconState.plist)"));
}

TEST_F(Reconcile, ReplacesThePreviousWorkArea) {
  phone.files.putFile(WorkAreaPath + "/old", "old");
  stageTodo({});
  EXPECT_TRUE(reconcile());
  EXPECT_FALSE(phone.files.exists(WorkAreaPath + "/old"));
  EXPECT_TRUE(phone.files.exists(TodoListPath));
}

TEST_F(Reconcile, KeepsABinaryCopyOfTheTodoListAsItStands) {
  stageTodo({{"com.a", "install"}, {7, "remove"}});
  EXPECT_TRUE(reconcile());
  EXPECT_EQ(phone.files.plistAt(DebugCopyPath), phone.files.plistAt(TodoListPath));
  EXPECT_TRUE(phone.files.textAt(DebugCopyPath)->starts_with("bplist00"));
  EXPECT_TRUE(phone.files.textAt(TodoListPath)->starts_with("<?xml"));
}

TEST_F(Reconcile, SaysNothingOfDeletionsWhenThereAreNone) {
  stageTodo({{"com.a", "install"}});
  EXPECT_TRUE(reconcile());
  expectTrace(takenOver({}, {WriteDebugCopy}));
}

TEST_F(Reconcile, NeverDeletesWhatHasAnUnsafeIdentifierOrNone) {
  for (const char* identifier : {"a", "com.a", "b"}) phone.appRegistry.seedInstalled(identifier);
  stageTodo({{"a/../b", "remove"}, {"/..", "remove"}, {7, "remove"}, {Array{"com.a"}, "remove"}});
  Array list = *phone.files.plistAt(StagedTodoPath)->asArray();
  list.push_back(Dictionary{{"operation", "remove"}});
  list.push_back("remove");
  phone.files.putPlist(StagedTodoPath, list);
  EXPECT_TRUE(reconcile());
  expectTrace(takenOver({}, {WriteDebugCopy}));
  EXPECT_EQ(phone.appRegistry.installedIdentifiers().size(), 3u);
}

TEST_F(Reconcile, DeletesOnlyWhereTheOperationIsExactlyRemove) {
  phone.appRegistry.seedInstalled("com.a");
  stageTodo({{"com.a", "Remove"}, {"com.a", "REMOVE"}, {"com.a", "remove "}});
  Array list = *phone.files.plistAt(StagedTodoPath)->asArray();
  list.push_back(Dictionary{{"identifier", "com.a"}, {"operation", true}});
  list.push_back(Dictionary{{"identifier", "com.a"}});
  phone.files.putPlist(StagedTodoPath, list);
  EXPECT_TRUE(reconcile());
  EXPECT_TRUE(phone.appRegistry.installed("com.a"));
}

TEST_F(Reconcile, OneFailedUninstallIsRecordedAndDoesNotStopTheOthers) {
  phone.appRegistry.seedInstalled("com.a");
  phone.appRegistry.seedInstalled("com.b");
  phone.appRegistry.failUninstall("com.a");
  stageTodo({{"com.a", "remove"}, {"com.absent", "remove"}, {"com.b", "remove"}});
  EXPECT_TRUE(reconcile());
  expectTrace(takenOver(
      {line("com.a targeted for termination"), line("com.absent targeted for termination"),
       line("com.b targeted for termination"), line("performing 3 deletions"),
       "AppRegistry.uninstallApplication(com.a, {})",
       "log error SyncBundle|Uninstall of com.a failed.",
       "transaction scenario \"Halvo Sync\" step 0 failed com.a \"Uninstall failed\"",
       "AppRegistry.uninstallApplication(com.absent, {})",
       "log error SyncBundle|Uninstall of com.absent failed.",
       "transaction scenario \"Halvo Sync\" step 0 failed com.absent \"Uninstall failed\"",
       "AppRegistry.uninstallApplication(com.b, {})",
       "transaction scenario \"Halvo Sync\" step 0 ok com.b \"Uninstall succeeded\""},
      {WriteDebugCopy}));
}

TEST_F(Reconcile, WithCoordinationOnUninstallsThroughItAndRecordsNoScenario) {
  phone.installCoordination.setEnabled(true);
  phone.appRegistry.seedInstalled("com.a");
  phone.appRegistry.seedInstalled("com.b");
  stageTodo({{"com.b", "remove"}, {"com.a", "remove"}});
  EXPECT_TRUE(reconcile());
  phone.installCoordination.waitForEvents();
  EXPECT_EQ(phone.trace.count("transaction scenario"), 0u);
  expectTrace({"InstallCoordination.uninstallApp(com.b, false)",
               "InstallCoordination.uninstallApp(com.a, false)",
               "SystemNotifier.registerCheck(com.corvane.dashel.twc.wsyncnotify)",
               "HomeScreenService.serverPort()",
               "SystemNotifier.setState(com.corvane.dashel.twc.wsyncnotify, 1)",
               "SystemNotifier.post(com.corvane.dashel.twc.wsyncnotify)"},
              fakes::TraceCall);
  EXPECT_TRUE(phone.appRegistry.installedIdentifiers().empty());
}

TEST_F(Reconcile, WithRemovalRestrictedDeletesNothingButStillSpeaksToTheHomeScreen) {
  phone.policy.forbidRemoving();
  phone.appRegistry.seedInstalled("com.a");
  stageTodo({{"com.a", "remove"}});
  phone.files.putPlist(StagedLayoutPath, Array{"com.a"});
  EXPECT_TRUE(reconcile());
  expectTrace(takenOver({line("Not processing deletes because app removal is restricted")},
                        {line("Sending iconlayout to DS"), "HomeScreenService.serverPort()",
                         "HomeScreenService.setIconState(7)", WriteDebugCopy}));
  EXPECT_TRUE(phone.appRegistry.installed("com.a"));
}

TEST_F(Reconcile, WithoutATodoListStillNotifiesAndSendsTheLayout) {
  phone.files.putPlist(StagedLayoutPath, Array{"com.a"});
  EXPECT_TRUE(reconcile());
  expectTrace(takenOver({line("Nothing to do from Halvo")},
                        {line("Sending iconlayout to DS"), "HomeScreenService.serverPort()",
                         "HomeScreenService.setIconState(7)"}));
}

TEST_F(Reconcile, WithoutATodoListARestrictionOnRemovalIsNotMentioned) {
  phone.policy.forbidRemoving();
  phone.files.putDirectory(StagingPath);
  EXPECT_TRUE(reconcile());
  expectTrace(takenOver({line("Nothing to do from Halvo")}, {}));
}

TEST_F(Reconcile, AnUnreadableTodoListIsSaidAndCountsAsNone) {
  phone.files.putFile(StagedTodoPath, "no property list");
  EXPECT_TRUE(reconcile());
  expectTrace(takenOver(
      {"log error SyncBundle|couldn't parse todo list", line("Nothing to do from Halvo")}, {}));
  EXPECT_FALSE(phone.files.exists(DebugCopyPath));

  phone.files.putPlist(StagedTodoPath, Dictionary{{"com.a", "remove"}});
  EXPECT_TRUE(reconcile());
  expectTrace(takenOver(
      {"log error SyncBundle|todo list is not an array", line("Nothing to do from Halvo")}, {}));
}

TEST_F(Reconcile, AnEmptyIconLayoutIsNotSent) {
  stageTodo({});
  phone.files.putFile(StagedLayoutPath, "");
  EXPECT_TRUE(reconcile());
  expectTrace(takenOver({}, {WriteDebugCopy}));
}

TEST_F(Reconcile, SendsAnIconLayoutThatIsNoPropertyListAsItIs) {
  stageTodo({});
  phone.files.putFile(StagedLayoutPath, "?");
  EXPECT_TRUE(reconcile());
  expectTrace(takenOver({}, {line("Sending iconlayout to DS"), "HomeScreenService.serverPort()",
                             "HomeScreenService.setIconState(7)", WriteDebugCopy}));
}

/// Keeps the bytes of the layout that it was given.
class LayoutKeepingHomeScreen : public fakes::FakeHomeScreen {
 public:
  using FakeHomeScreen::FakeHomeScreen;
  int setIconState(Port, ByteView layout) noexcept override {
    given = std::string(asText(layout));
    return 0;
  }

  std::optional<std::string> given;
};

TEST_F(Reconcile, SendsTheBytesOfTheIconLayoutUnchanged) {
  for (const std::string layout :
       {"<plist version='1.0'>\n\n <array><string>com.a</string> </array></plist>\n", "?",
        "bplist00"}) {
    stageTodo({});
    phone.files.putFile(StagedLayoutPath, layout);
    LayoutKeepingHomeScreen homeScreen(phone.trace);
    AppsClient reconciling(with(phone.platform(), homeScreen));
    EXPECT_TRUE(reconciling.reconcileSync({}, "anchor", nullptr, nullptr));
    EXPECT_EQ(homeScreen.given, layout);
  }
}

TEST_F(Reconcile, ADebugCopyThatCannotBeWrittenDoesNotMatter) {
  stageTodo({});
  phone.faults.failEvery("FileManager.writeAtomically", Error::posix(28));
  std::optional<Error> error;
  EXPECT_TRUE(reconcile(&error));
  EXPECT_EQ(error, std::nullopt);
  expectTrace(takenOver({}, {"fault " + WriteDebugCopy}));
}

TEST_F(Reconcile, WithoutAStagingAreaHasNothingToDoButThePreviousWorkAreaIsGone) {
  phone.files.putFile(WorkAreaPath + "/old", "old");
  std::optional<Error> error;
  EXPECT_TRUE(reconcile(&error));
  EXPECT_EQ(error, std::nullopt);
  expectTrace({Start, RemoveWorkArea, MakeSyncRoot, line("Nothing to do"), End});
  EXPECT_FALSE(phone.files.exists(WorkAreaPath));
  EXPECT_TRUE(phone.files.exists(SyncRootPath));
}

TEST_F(Reconcile, FailsWhenTheSyncRootCannotBeMade) {
  stageTodo({{"com.a", "remove"}});
  const Error failure = Error::posix(28, SyncRootPath);
  phone.faults.failEvery("FileManager.createDirectory", failure);
  std::optional<Error> error;
  EXPECT_FALSE(reconcile(&error));
  EXPECT_EQ(error, failure);
  expectTrace({Start, RemoveWorkArea, "fault FileManager.createDirectory(" + SyncRootPath + ")",
               "log error SyncBundle|can't create work area", End});
  EXPECT_TRUE(phone.files.exists(StagedTodoPath));
}

TEST_F(Reconcile, FailsWhenTheStagingAreaCannotBeMoved) {
  stageTodo({{"com.a", "remove"}});
  phone.appRegistry.seedInstalled("com.a");
  const Error failure = Error::posix(28, StagingPath);
  phone.faults.failEvery("FileManager.moveItem", failure);
  std::optional<Error> error;
  EXPECT_FALSE(reconcile(&error));
  EXPECT_EQ(error, failure);
  expectTrace({Start, RemoveWorkArea, MakeSyncRoot,
               "fault FileManager.moveItem(" + StagingPath + ")",
               "log error SyncBundle|Can't move staging area", End});
  EXPECT_TRUE(phone.files.exists(StagedTodoPath));
  EXPECT_TRUE(phone.appRegistry.installed("com.a"));
}

TEST_F(Reconcile, TakesOverAStagingAreaThatCannotBeLookedAtJustNow) {
  stageTodo({});
  for (const char* look : {"FileManager.fileExists", "FileManager.attributesOfItem"}) {
    phone.faults.failWhere(look, StagingPath, Error::posix(24));
  }
  EXPECT_TRUE(reconcile());
  EXPECT_TRUE(phone.files.exists(TodoListPath));
  EXPECT_FALSE(phone.files.exists(StagingPath));
}

TEST_F(Reconcile, SaysThatTheIconLayoutCannotBeRead) {
  stageTodo({});
  phone.files.putFile(StagedLayoutPath, "layout");
  const std::string path = WorkAreaPath + "/DashelIconState.plist";
  phone.faults.failWhere("FileManager.contentsAtPath", path, Error::posix(24));
  EXPECT_TRUE(reconcile());
  expectTrace(takenOver(
      {}, {"fault FileManager.contentsAtPath(" + path + ")",
           "log error SyncBundle|can't read " + path + ": " + description(Error::posix(24)),
           WriteDebugCopy}));
}

TEST_F(Reconcile, FailsWithoutLossWhenThePreviousWorkAreaCannotBeRemoved) {
  phone.files.putFile(WorkAreaPath + "/old", "old");
  stageTodo({});
  phone.faults.failEvery("FileManager.removeItem", Error::posix(13));
  std::optional<Error> error;
  EXPECT_FALSE(reconcile(&error));
  ASSERT_TRUE(error);
  EXPECT_EQ(error->code, 17);
  EXPECT_TRUE(phone.files.exists(StagedTodoPath));
}

TEST_F(Reconcile, FailuresMayGoUnasked) {
  phone.faults.failEvery("FileManager.createDirectory", Error::posix(28));
  EXPECT_FALSE(reconcile(nullptr));
}

}  // namespace
}  // namespace appsync
