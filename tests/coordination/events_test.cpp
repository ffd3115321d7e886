// What coordinators and the registry report to the client.

#include "client/paths.h"
#include "tests/coordination/coordination_fixture.h"

namespace appsync::fakes {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

class CoordinatorEventTest : public CoordinationTest {
 protected:
  CoordinatorEventTest() {
    client->setupInstallCoordinatorObserver();
    phone.files.putPlist(paths::TodoList,
                         PropertyList::Array{PropertyList::Dictionary{
                             {"identifier", "com.a"}, {"operation", "DOWNLOADED"}}});
    phone.files.putPlist(exchange::RestoreState,
                         PropertyList::Dictionary{{"com.a", PropertyList::Dictionary{}},
                                                  {"com.b", PropertyList::Dictionary{}}});
    forget();
  }

  FakeInstallCoordination& service() { return phone.installCoordination; }
  FakeSyncHostService& hostService() { return phone.host.service(); }

  std::shared_ptr<FakeInstallCoordinator> seed(std::optional<std::string> bundleId = "com.a") {
    return service().seedCoordinator(CoordinatorKind::Initiating, std::move(bundleId),
                                     SyncHostClientID);
  }
  void cancel(FakeInstallCoordinator& cancelled) {
    service().fireCanceled(cancelled, Refused, KQClientKiosk);
  }

  std::shared_ptr<FakeInstallCoordinator> coordinator = seed();
  std::shared_ptr<FakeInstallCoordinator> unknown = seed(std::nullopt);
};

TEST_F(CoordinatorEventTest, OneListenerIsMadeHoweverOftenTheHostStarts) {
  FakePlatform other;
  other.installCoordination.setEnabled(true);
  AppsClient fresh(other.platform());
  other.trace.clear();
  fresh.setupInstallCoordinatorObserver();
  fresh.setupInstallCoordinatorObserver();
  EXPECT_THAT(other.trace.calls(), ElementsAre("InstallCoordination.createEventListener("
                                               "com.corvane.twc.ipx.icappobserverdelegate, (3))"));
  EXPECT_EQ(other.installCoordination.listenerCount(), 1u);
}

TEST_F(CoordinatorEventTest, AServiceWithoutAListenerIsAskedAgainAtTheNextStart) {
  FakePlatform other;
  other.installCoordination.setEnabled(true);
  AppsClient fresh(other.platform());
  const auto kept = other.installCoordination.seedCoordinator(CoordinatorKind::Initiating, "com.a",
                                                              SyncHostClientID);
  other.faults.failCall("InstallCoordination.createEventListener", 1, Refused);
  other.trace.clear();
  fresh.setupInstallCoordinatorObserver();
  other.installCoordination.fireDidBeginFulfillment(*kept, 7);
  EXPECT_THAT(other.trace.readable(TraceEffects),
              ElementsAre("fault InstallCoordination.createEventListener("
                          "com.corvane.twc.ipx.icappobserverdelegate)"));
  other.trace.clear();
  fresh.setupInstallCoordinatorObserver();
  other.installCoordination.waitForEvents();
  EXPECT_THAT(other.trace.readable(TraceEffects),
              ElementsAre("InstallCoordination.createEventListener("
                          "com.corvane.twc.ipx.icappobserverdelegate, (3))",
                          said("promiseDidBeginFulfillmentWithIdentifier 7")));
}

TEST_F(CoordinatorEventTest, TheListenerGoesWithTheClient) {
  client = nullptr;
  EXPECT_EQ(service().listenerCount(), 0u);
}

TEST_F(CoordinatorEventTest, TheBeginOfAFulfilmentIsLogged) {
  service().fireDidBeginFulfillment(*coordinator, 18'446'744'073'709'551'615u);
  EXPECT_THAT(effects(), ElementsAre(said("promiseDidBeginFulfillmentWithIdentifier "
                                          "18446744073709551615")));
}

TEST_F(CoordinatorEventTest, AnInstalledPlaceholderIsLogged) {
  service().fireDidInstallPlaceholder(*coordinator);
  coordinator->edit([](auto& state) { state.error = Refused; });
  service().fireDidInstallPlaceholder(*coordinator);
  EXPECT_THAT(effects(),
              ElementsAre(said("coordinatorDidInstallPlaceholder for com.a with error (null)"),
                          said("coordinatorDidInstallPlaceholder for com.a with error Error "
                               "Domain=Fault Code=7")));
}

TEST_F(CoordinatorEventTest, ACompletedInstallIsSettledInTheStateFiles) {
  service().fireDidComplete(*coordinator);
  EXPECT_THAT(
      effects(),
      ElementsAre(said("coordinatorDidCompleteSuccessfully for com.a with error (null)"),
                  said("Changing com.a from DOWNLOADED to INSTALLED"),
                  "FileManager.writeAtomically(" + std::string(paths::TodoList) + ")",
                  "FileManager.writeAtomically(" + std::string(exchange::RestoreState) + ")"));
  EXPECT_EQ(client->_operationStateForIdentifier("com.a"), "INSTALLED");
  const PropertyList::Dictionary left{{"com.b", PropertyList::Dictionary{}}};
  EXPECT_EQ(phone.files.plistAt(exchange::RestoreState), PropertyList(left));
}

TEST_F(CoordinatorEventTest, ACompletionWithAnErrorIsAFailure) {
  service().fireDidComplete(*coordinator, Refused);
  EXPECT_THAT(phone.trace.log(),
              ElementsAre(said("coordinatorDidCompleteSuccessfully for com.a with error Error "
                               "Domain=Fault Code=7"),
                          said("Changing com.a from DOWNLOADED to FAILED")));
  const PropertyList::Dictionary left{{"com.b", PropertyList::Dictionary{}}};
  EXPECT_EQ(phone.files.plistAt(exchange::RestoreState), PropertyList(left));
}

TEST_F(CoordinatorEventTest, ACompletionOfAnUnknownApplicationSettlesNothing) {
  service().fireDidComplete(*unknown);
  EXPECT_THAT(effects(), ElementsAre(said("coordinatorDidCompleteSuccessfully for (null) with "
                                          "error (null)")));
}

TEST_F(CoordinatorEventTest, APriorityIsPassedOnToTheHost) {
  service().fireShouldPrioritize(*coordinator);
  EXPECT_THAT(effects(),
              ElementsAre(said("Prioritize com.a"), "SyncHostService.prioritizeAsset(com.a)",
                          said("Prioritize com.a finished with error (null)")));
  const SyncAssetPtr asset = hostService().prioritized().front();
  EXPECT_EQ(asset->dataclass, "Application");
  EXPECT_EQ(asset->prettyName, std::nullopt);
}

TEST_F(CoordinatorEventTest, APriorityThatTheHostRefusesIsLogged) {
  hostService().setPrioritizeError(Refused);
  service().fireShouldPrioritize(*coordinator);
  EXPECT_EQ(phone.trace.log().back(),
            said("Prioritize com.a finished with error Error Domain=Fault Code=7"));
}

TEST_F(CoordinatorEventTest, AHostWithoutPrioritiesIsNotAsked) {
  hostService().setSupportsPrioritize(false);
  service().fireShouldPrioritize(*coordinator);
  EXPECT_THAT(effects(), ElementsAre(said("Prioritize com.a"),
                                     complained("Cannot prioritize com.a as it's not supported")));
}

TEST_F(CoordinatorEventTest, ACancelledInstallStopsItsTransfer) {
  cancel(*coordinator);
  EXPECT_THAT(effects(), ElementsAre(said("Cancelling asset sync for com.a"),
                                     "SyncHostService.cancelAssetAsFailed(com.a)"));
  EXPECT_EQ(hostService().canceled().front()->dataclass, "Application");
}

TEST_F(CoordinatorEventTest, ASecondCancellationDoesNotReachTheHost) {
  cancel(*coordinator);
  cancel(*seed("com.b"));
  forget();
  cancel(*coordinator);
  EXPECT_THAT(effects(), ElementsAre(complained("Cannot cancel com.a as it's already cancelled 1 "
                                                "OR the call is not supported")));
}

TEST_F(CoordinatorEventTest, ACancellationAfterTheTransferEndedCountsAnew) {
  cancel(*coordinator);
  client->assetTransferSucceeded(hostService().canceled().front(), false, Refused);
  forget();
  cancel(*coordinator);
  EXPECT_THAT(phone.trace.calls(), ElementsAre("SyncHostService.cancelAssetAsFailed(com.a)"));
}

TEST_F(CoordinatorEventTest, AHostThatCannotCancelIsNotAsked) {
  hostService().setSupportsCancel(false);
  cancel(*coordinator);
  cancel(*coordinator);
  EXPECT_THAT(effects(),
              ElementsAre(complained("Cannot cancel com.a as it's already cancelled 0 OR the call "
                                     "is not supported"),
                          complained("Cannot cancel com.a as it's already cancelled 1 OR the call "
                                     "is not supported")));
}

TEST_F(CoordinatorEventTest, RequestsForAnUnknownApplicationAreIgnored) {
  service().fireShouldPrioritize(*unknown);
  cancel(*unknown);
  EXPECT_THAT(effects(), IsEmpty());
}

AppRecord recordOf(std::string identifier, InstallType type) {
  AppRecord record;
  record.applicationIdentifier = std::move(identifier);
  record.installType = type;
  return record;
}

TEST_F(CoordinatorEventTest, CancelledRegistryInstallsAreTheCoordinatorsBusiness) {
  phone.appRegistry.reportCancellation({recordOf("com.a", InstallType::Restore)});
  EXPECT_THAT(effects(), ElementsAre(said("not handling applicationInstallsDidCancel because "
                                          "install coordination is enabled.")));
}

class RegistryEventTest : public CoordinationTest {
 protected:
  RegistryEventTest() : CoordinationTest(false) {}
};

TEST_F(RegistryEventTest, CancelledRestoresEndTheirTransfersAsFailed) {
  phone.appRegistry.seedPlaceholder(recordOf("com.a", InstallType::Restore));
  phone.appRegistry.reportCancellation({recordOf("com.a", InstallType::Restore),
                                        recordOf("com.b", InstallType::Sync),
                                        recordOf("com.c", InstallType::Restore)});
  const std::string cancelled = "Error Domain=TWError Code=2";
  EXPECT_THAT(
      effects(),
      ElementsAre(said("transfer for asset com.a ended with success n error " + cancelled +
                       " existingApp:0"),
                  complained("Returning <InstallProgress com.a> progress for com.a"),
                  said("failed to transfer asset com.a. err=" + cancelled + ", recoverable=1"),
                  "InstallProgress.setInstallState(com.a, 4)",
                  said("transfer for asset com.c ended with success n error " + cancelled +
                       " existingApp:0"),
                  complained("Returning (null) progress for com.c"),
                  said("failed to transfer asset com.c. err=" + cancelled + ", recoverable=1")));
  ASSERT_EQ(phone.host.made().size(), 2u);
  EXPECT_EQ(phone.host.made().front()->dataclass, "Application");
  EXPECT_EQ(phone.host.made().front()->prettyName, std::nullopt);
}

TEST_F(RegistryEventTest, WithoutCoordinationNothingIsSaidOfIt) {
  phone.appRegistry.reportCancellation({recordOf("com.b", InstallType::Sync)});
  EXPECT_THAT(effects(), IsEmpty());
}

}  // namespace
}  // namespace appsync::fakes
