// Services that call back more than once, when a sync is over, in the next one, or when the client
// has gone. The client takes each call at its word; none may do harm.

#include "client/paths.h"
#include "tests/coordination/coordination_fixture.h"

namespace appsync::fakes {
namespace {

using testing::IsEmpty;

const std::string Failure = description(Refused);
const std::string WriteTodo = "FileManager.writeAtomically(" + std::string(paths::TodoList) + ")";
const std::string WriteRestoreState =
    "FileManager.writeAtomically(" + std::string(exchange::RestoreState) + ")";

Trace uninstallTold(const std::string& error) {
  return {said("Uninstall of com.a with install coordinator succeeded wiht error " + error + "."),
          std::string("transaction step 7 party 1 phase 2 ") +
              (error == "(null)" ? "ok" : "failed") + R"( com.a "Uninstall app")"};
}

Trace completionTold(const std::string& from, const std::string& to,
                     const std::string& error = "(null)") {
  return {said("coordinatorDidCompleteSuccessfully for com.a with error " + error),
          said("Changing com.a from " + from + " to " + to), WriteTodo, WriteRestoreState};
}

Trace cancelTold() {
  return {said("Cancelling asset sync for com.a"), "SyncHostService.cancelAssetAsFailed(com.a)"};
}

Trace cancelKnown() {
  return {
      complained("Cannot cancel com.a as it's already cancelled 1 OR the call is not supported")};
}

PropertyList::Array todoOf(std::string_view operation) {
  return {PropertyList::Dictionary{{"identifier", "com.a"}, {"operation", operation}},
          PropertyList::Dictionary{{"identifier", "com.b"}, {"operation", "install"}}};
}

class RepeatedCallbackTest : public CoordinationTest {
 protected:
  RepeatedCallbackTest() {
    phone.notifier.post(TWStartupCompleteNotification);
    putTodo("DOWNLOADED");
    phone.files.putPlist(exchange::RestoreState,
                         PropertyList::Dictionary{{"com.z", PropertyList::Dictionary{}}});
    forget();
  }

  FakeInstallCoordination& service() { return phone.installCoordination; }

  void putTodo(std::string_view operation) {
    phone.files.putPlist(paths::TodoList, todoOf(operation));
  }
  /// The todo list, whose first entry has this operation.
  void expectTodo(std::string_view operation) {
    EXPECT_EQ(phone.files.plistAt(paths::TodoList), PropertyList(todoOf(operation)));
  }
  /// Compares all effects since the last comparison, and forgets them.
  void expectEffects(std::initializer_list<Trace> parts) {
    EXPECT_EQ(effects(), joined(parts));
    forget();
  }

  void endSync() {
    client->assetTransferEndedWithSuccess(true);
    client->syncEndedWithSuccess(true);
    forget();
  }
  /// The desktop asks for both applications once more.
  void beginNextSync() {
    const std::string staged = std::string(exchange::StagingArea) + "/ApplicationsSync.plist";
    phone.files.putPlist(staged, todoOf("install"));
    EXPECT_TRUE(client->prepareForSyncWithHostAnchor("", {}, nullptr));
    EXPECT_TRUE(client->reconcileSync({}, "anchor", {}, nullptr));
    forget();
  }
  void letClientGo() {
    client = nullptr;
    forget();
  }

  std::shared_ptr<FakeInstallCoordinator> coordinator = phone.installCoordination.seedCoordinator(
      CoordinatorKind::Initiating, "com.a", SyncHostClientID);
};

/// The service keeps the outcome of an uninstall to itself until it is told to complete.
class HeldUninstallTest : public RepeatedCallbackTest {
 protected:
  HeldUninstallTest() {
    service().holdUninstalls();
    client->uninstallAppUsingCoordination("com.a");
    expectEffects({{R"(transaction step 7 party 1 phase 1 ok com.a "Uninstall app")",
                    "InstallCoordination.uninstallApp(com.a, false)"}});
  }
};

TEST_F(HeldUninstallTest, ToldTwiceIsLoggedAndRecordedTwice) {
  service().completeUninstalls(std::nullopt);
  service().completeUninstalls(Refused);
  expectEffects({uninstallTold("(null)"), uninstallTold(Failure)});
  expectTodo("DOWNLOADED");
}

TEST_F(HeldUninstallTest, ToldAfterTheSyncOrInTheNextOneLeavesTheTodoListAlone) {
  endSync();
  service().completeUninstalls(std::nullopt);
  expectEffects({uninstallTold("(null)")});
  beginNextSync();
  service().completeUninstalls(std::nullopt);
  expectEffects({uninstallTold("(null)")});
  expectTodo("install");
}

TEST_F(HeldUninstallTest, ToldAfterTheClientIsGoneIsStillLoggedAndRecorded) {
  letClientGo();
  service().completeUninstalls(std::nullopt);
  service().completeUninstalls(Refused);
  expectEffects({uninstallTold("(null)"), uninstallTold(Failure)});
}

TEST_F(HeldUninstallTest, NeverToldKeepsNobodyWaiting) {
  endSync();
  beginNextSync();
  letClientGo();
  expectTodo("install");
}

TEST_F(RepeatedCallbackTest, ASecondCompletionIsTakenLikeTheFirst) {
  service().fireDidComplete(*coordinator);
  service().fireDidComplete(*coordinator);
  expectEffects(
      {completionTold("DOWNLOADED", "INSTALLED"), completionTold("INSTALLED", "INSTALLED")});
  expectTodo("INSTALLED");
}

TEST_F(RepeatedCallbackTest, TheLastOfTwoCompletionsThatDifferCounts) {
  service().fireDidComplete(*coordinator);
  service().fireDidComplete(*coordinator, Refused);
  expectEffects(
      {completionTold("DOWNLOADED", "INSTALLED"), completionTold("INSTALLED", "FAILED", Failure)});
  expectTodo("FAILED");
}

TEST_F(RepeatedCallbackTest, ACompletionAfterTheSyncStillReachesTheTodoList) {
  endSync();
  service().fireDidComplete(*coordinator);
  expectEffects({completionTold("DOWNLOADED", "INSTALLED")});
  expectTodo("INSTALLED");
}

TEST_F(RepeatedCallbackTest, ACompletionInTheNextSyncCountsForItsEntry) {
  endSync();
  beginNextSync();
  service().fireDidComplete(*coordinator);
  expectEffects({completionTold("install", "INSTALLED")});
  expectTodo("INSTALLED");
}

TEST_F(RepeatedCallbackTest, ACompletionWithoutATodoListOrEntryChangesNoList) {
  endSync();
  phone.files.putPlist(paths::TodoList, PropertyList::Array{});
  service().fireDidComplete(*coordinator);
  phone.files.erase(paths::TodoList);
  service().fireDidComplete(*coordinator);
  const std::string line = said("coordinatorDidCompleteSuccessfully for com.a with error (null)");
  expectEffects({{line, WriteRestoreState, line, WriteRestoreState}});
  EXPECT_FALSE(phone.files.exists(paths::TodoList));
}

TEST_F(RepeatedCallbackTest, ACompletionAfterACancelIsSettledAllTheSame) {
  service().fireCanceled(*coordinator, Refused, KQClientKiosk);
  service().fireDidComplete(*coordinator, Refused);
  service().fireCanceled(*coordinator, Refused, KQClientKiosk);
  expectEffects({cancelTold(), completionTold("DOWNLOADED", "FAILED", Failure), cancelKnown()});
  expectTodo("FAILED");
}

TEST_F(RepeatedCallbackTest, ACancelAfterTheSyncIsReportedOnceUntilATransferEnds) {
  endSync();
  service().fireCanceled(*coordinator, Refused, KQClientKiosk);
  expectEffects({cancelTold()});
  beginNextSync();
  service().fireCanceled(*coordinator, Refused, KQClientKiosk);
  expectEffects({cancelKnown()});
  expectTodo("install");

  // The person did not want it: when its transfer fails, its coordinator is left alone.
  phone.appRegistry.seedPlaceholder("com.a");
  const SyncAssetPtr asset = syncedAsset(phone);
  client->assetTransferSucceeded(asset, false, Refused);
  EXPECT_EQ(coordinator->state().cancellation, std::nullopt);
  forget();
  service().fireCanceled(*coordinator, Refused, KQClientKiosk);
  expectEffects({cancelTold()});
}

TEST_F(RepeatedCallbackTest, LateWordsThatChangeNothingAreOnlyLogged) {
  endSync();
  beginNextSync();
  service().fireDidBeginFulfillment(*coordinator, 7);
  service().fireDidBeginFulfillment(*coordinator, 7);
  service().fireDidInstallPlaceholder(*coordinator);
  service().fireDidInstallPlaceholder(*coordinator);
  const std::string begun = said("promiseDidBeginFulfillmentWithIdentifier 7");
  const std::string stands = said("coordinatorDidInstallPlaceholder for com.a with error (null)");
  expectEffects({{begun, begun, stands, stands}});
  expectTodo("install");
}

TEST_F(RepeatedCallbackTest, APriorityAnsweredTwiceLateOrToNobodyIsOnlyLogged) {
  phone.host.service().holdCompletions();
  service().fireShouldPrioritize(*coordinator);
  expectEffects({{said("Prioritize com.a"), "SyncHostService.prioritizeAsset(com.a)"}});
  phone.host.service().completePrioritize(std::nullopt);
  endSync();
  beginNextSync();
  phone.host.service().completePrioritize(Refused);
  expectEffects({{said("Prioritize com.a finished with error " + Failure)}});
  letClientGo();
  phone.host.service().completePrioritize(std::nullopt);
  expectEffects({{said("Prioritize com.a finished with error (null)")}});
  EXPECT_EQ(phone.host.service().prioritized().size(), 1u);
}

TEST_F(RepeatedCallbackTest, EventsForAClientThatIsGoneReachNobodyButTheNextClient) {
  coordinator->setObserver(client.get());
  letClientGo();
  service().fireDidInstallPlaceholder(*coordinator);
  service().fireShouldPrioritize(*coordinator);
  service().fireCanceled(*coordinator, Refused, KQClientKiosk);
  service().fireDidComplete(*coordinator);
  EXPECT_THAT(effects(), IsEmpty());
  expectTodo("DOWNLOADED");

  client = std::make_unique<AppsClient>(phone.platform());
  phone.notifier.post(TWStartupCompleteNotification);
  forget();
  service().waitForEvents();
  EXPECT_THAT(phone.log.texts(), testing::Contains("Cancelling asset sync for com.a").Times(1));
  expectTodo("INSTALLED");
}

}  // namespace
}  // namespace appsync::fakes
