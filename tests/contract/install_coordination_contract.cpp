// What every coordination service promises of its coordinators, promises and placeholders.
#include <cerrno>
#include <functional>
#include <future>

#include "tests/contract/coordination_contract.h"

namespace appsync::contract {
namespace {

class InstallCoordinationContract : public CoordinationContract {};

SERVICE_CONTRACT_OF(InstallCoordinationContract);

TEST_P(InstallCoordinationContract, SaysThatInstallsAreCoordinated) {
  EXPECT_TRUE(coordination.coordinationIsEnabled());
}

TEST_P(InstallCoordinationContract, MakesACoordinatorOnlyWhenAskedTo) {
  bool created = true;
  EXPECT_FALSE(coordination.coordinatorFor(CoordinatorKind::Initiating, "com.a", SyncHostClientID,
                                           false, &created, nullptr));
  EXPECT_FALSE(created);
  const auto one = coordination.coordinatorFor(CoordinatorKind::Initiating, "com.a",
                                               SyncHostClientID, true, &created, nullptr);
  ASSERT_TRUE(one);
  EXPECT_TRUE(created);
  EXPECT_EQ(one->bundleIdentifier(), "com.a");
  EXPECT_EQ(one->creatorIdentifier(), SyncHostClientID);
  EXPECT_FALSE(one->error());
  const auto again = coordination.coordinatorFor(CoordinatorKind::Initiating, "com.a",
                                                 SyncHostClientID, true, &created, nullptr);
  EXPECT_EQ(again, one);
  EXPECT_FALSE(created);
}

TEST_P(InstallCoordinationContract, AnyKindFindsAnExistingCoordinatorAndMakesNone) {
  EXPECT_FALSE(coordination.coordinatorFor(CoordinatorKind::Any, "com.a", SyncHostClientID, true,
                                           nullptr, nullptr));
  const auto made = make("com.a", CoordinatorKind::Updating);
  EXPECT_EQ(live("com.a"), made);
}

TEST_P(InstallCoordinationContract, OneCoordinatorOfAnApplicationIsLiveWhateverItsKindAndMaker) {
  const auto stores = make("com.a", CoordinatorKind::Restoring, KQClientKiosk);
  const auto own = make("com.b", CoordinatorKind::Updating);
  for (const auto& [identifier, live] : {std::pair("com.a", stores), std::pair("com.b", own)}) {
    for (const bool create : {true, false}) {
      bool created = true;
      EXPECT_EQ(coordination.coordinatorFor(CoordinatorKind::Initiating, identifier,
                                            SyncHostClientID, create, &created, nullptr),
                live);
      EXPECT_FALSE(created);
    }
  }
  EXPECT_EQ(stores->creatorIdentifier(), KQClientKiosk);
}

TEST_P(InstallCoordinationContract, ACoordinatorHasWhatWasSet) {
  const auto coordinator = make("com.a");
  EXPECT_FALSE(coordinator->hasInstallOptions());
  EXPECT_FALSE(coordinator->hasInitialQPKAssetPromises());
  EXPECT_FALSE(coordinator->hasAppAssetPromise());
  EXPECT_FALSE(coordinator->appAssetPromise(nullptr));
  EXPECT_FALSE(coordinator->hasUserDataPromise());
  EXPECT_FALSE(coordinator->hasPlaceholderPromise());
  EXPECT_EQ(coordinator->appAssetPromiseResponsibleClient(), 0U);

  const auto package = packagePromise("com.a");
  const auto data =
      coordination.createOutOfBandTransferPromise("com.a-UserData", SyncHostClientID, 0);
  ASSERT_TRUE(package && data);
  EXPECT_TRUE(coordinator->setInstallOptions({}, nullptr));
  EXPECT_TRUE(coordinator->setInitialQPKAssetPromises({}, nullptr));
  EXPECT_TRUE(coordinator->setAppAssetPromise(package, nullptr));
  EXPECT_TRUE(coordinator->setUserDataPromise(data, nullptr));
  EXPECT_TRUE(coordinator->setPlaceholderPromise(placeholder("com.a"), nullptr));
  EXPECT_TRUE(coordinator->setAppAssetPromiseResponsibleClient(KQClientKiosk, nullptr));

  EXPECT_TRUE(coordinator->hasInstallOptions());
  EXPECT_TRUE(coordinator->hasInitialQPKAssetPromises());
  EXPECT_TRUE(coordinator->hasAppAssetPromise());
  EXPECT_EQ(coordinator->appAssetPromise(nullptr), package);
  EXPECT_TRUE(coordinator->hasUserDataPromise());
  EXPECT_TRUE(coordinator->hasPlaceholderPromise());
  EXPECT_EQ(coordinator->appAssetPromiseResponsibleClient(), KQClientKiosk);
}

TEST_P(InstallCoordinationContract, APlaceholderThatIsMissingCancelledOrAnothersIsRefused) {
  const auto coordinator = make("com.a");
  const auto cancelled = placeholder("com.a");
  cancelled->cancel(reason, SyncHostClientID);
  for (const auto& wrong :
       {std::shared_ptr<InstallPlaceholder>(), cancelled, placeholder("com.b")}) {
    std::optional<Error> error;
    EXPECT_FALSE(coordinator->setPlaceholderPromise(wrong, &error));
    EXPECT_TRUE(error);
    EXPECT_FALSE(coordinator->setPlaceholderPromise(wrong, nullptr));
    EXPECT_FALSE(coordinator->hasPlaceholderPromise());
  }
}

TEST_P(InstallCoordinationContract, APlaceholderThatMayNeverBeConfiguredIsRefused) {
  const auto coordinator = make("com.a");
  const auto promised = barePlaceholder("com.a");
  std::optional<Error> error;
  EXPECT_FALSE(coordinator->setPlaceholderPromise(promised, &error));
  EXPECT_EQ(error.value_or(Error{}).code, EINVAL);
  EXPECT_FALSE(coordinator->hasPlaceholderPromise());
  ASSERT_TRUE(promised->setConfigurationComplete(nullptr));
  EXPECT_TRUE(coordinator->setPlaceholderPromise(promised, nullptr));
}

TEST_P(InstallCoordinationContract, WhatIsOverRefusesToBeSet) {
  const auto coordinator = make("com.a");
  const auto promised = placeholder("com.a");
  ASSERT_TRUE(coordinator->setPlaceholderPromise(promised, nullptr));
  ASSERT_TRUE(coordinator->cancel(reason, SyncHostClientID));
  const auto data = coordination.createOutOfBandTransferPromise("d", SyncHostClientID, 0);
  using Setter = std::function<bool(std::optional<Error>*)>;
  const std::vector<Setter> setters = {
      [&](auto* error) { return coordinator->setInstallOptions({}, error); },
      [&](auto* error) { return coordinator->setInitialQPKAssetPromises({}, error); },
      [&](auto* error) { return coordinator->setAppAssetPromise(packagePromise("com.a"), error); },
      [&](auto* error) { return coordinator->setAppAssetPromiseResponsibleClient(1, error); },
      [&](auto* error) { return coordinator->setUserDataPromise(data, error); },
      [&](auto* error) { return coordinator->setPlaceholderPromise(placeholder("com.a"), error); },
      [&](auto* error) { return promised->setIconPromise(iconPromise("com.a"), error); },
      [&](auto* error) { return promised->setPlaceholderAttributes({}, error); },
      [&](auto* error) { return promised->setMetadata({}, error); },
      [&](auto* error) { return promised->setSinfData({}, error); },
      [&](auto* error) { return promised->setConfigurationComplete(error); },
  };
  for (std::size_t number = 0; number < setters.size(); ++number) {
    SCOPED_TRACE(number);
    std::optional<Error> error;
    EXPECT_FALSE(setters[number](&error));
    EXPECT_EQ(error.value_or(Error{}).code, ECANCELED);
    EXPECT_FALSE(setters[number](nullptr));
  }
}

TEST_P(InstallCoordinationContract, APromiseIsTakenByOneCoordinatorOnly) {
  const auto first = make("com.a");
  const auto second = make("com.b");
  const auto package = packagePromise("com.a");
  const auto data = coordination.createOutOfBandTransferPromise("d", SyncHostClientID, 0);
  ASSERT_TRUE(first->setAppAssetPromise(package, nullptr));
  ASSERT_TRUE(first->setUserDataPromise(data, nullptr));
  EXPECT_TRUE(first->setUserDataPromise(data, nullptr)) << "it has it already";
  std::optional<Error> error;
  EXPECT_FALSE(second->setAppAssetPromise(package, &error));
  EXPECT_EQ(error.value_or(Error{}).code, EBUSY);
  error.reset();
  EXPECT_FALSE(second->setUserDataPromise(data, &error));
  EXPECT_EQ(error.value_or(Error{}).code, EBUSY);
  EXPECT_FALSE(second->hasUserDataPromise());
  ASSERT_TRUE(first->cancel(reason, SyncHostClientID));
  error.reset();
  EXPECT_FALSE(second->setUserDataPromise(data, &error));
  EXPECT_EQ(error.value_or(Error{}).code, ECANCELED) << "it went with its coordinator";
}

TEST_P(InstallCoordinationContract, ADemotedRestoreAndTheOtherKindsDoNotStandInForOneAnother) {
  using Kind = CoordinatorKind;
  const auto demoted = Kind::RestoringDemoted;
  for (const auto& [before, asked] :
       {std::pair(Kind::Restoring, demoted), std::pair(Kind::Initiating, demoted),
        std::pair(demoted, Kind::Restoring), std::pair(demoted, Kind::Updating)}) {
    const auto first = make("com.a", before);
    EXPECT_EQ(
        coordination.coordinatorFor(asked, "com.a", SyncHostClientID, false, nullptr, nullptr),
        first)
        << "nothing is ended for a look";
    bool created = false;
    const auto second =
        coordination.coordinatorFor(asked, "com.a", SyncHostClientID, true, &created, nullptr);
    ASSERT_TRUE(second);
    EXPECT_NE(second, first);
    EXPECT_TRUE(created);
    EXPECT_TRUE(first->error());
    EXPECT_FALSE(second->error());
    EXPECT_EQ(live("com.a"), second);
    ASSERT_TRUE(second->cancel(reason, SyncHostClientID));
  }
}

TEST_P(InstallCoordinationContract, AnotherClientsCoordinatorOfTheOtherSortIsNotEnded) {
  const auto stores = make("com.a", CoordinatorKind::Restoring, KQClientKiosk);
  bool created = true;
  std::optional<Error> error;
  EXPECT_EQ(coordination.coordinatorFor(CoordinatorKind::RestoringDemoted, "com.a",
                                        SyncHostClientID, true, &created, &error),
            nullptr);
  EXPECT_FALSE(created);
  EXPECT_EQ(error.value_or(Error{}).code, EBUSY);
  EXPECT_EQ(live("com.a"), stores);
  EXPECT_FALSE(stores->error());
}

TEST_P(InstallCoordinationContract, APackagePromiseThatIsMissingOrCancelledIsRefused) {
  const auto coordinator = make("com.a");
  const auto cancelled = packagePromise("com.a");
  cancelled->cancel(reason, SyncHostClientID);
  for (const auto& wrong : {std::shared_ptr<PathTransferPromise>(), cancelled}) {
    std::optional<Error> error;
    EXPECT_FALSE(coordinator->setAppAssetPromise(wrong, &error));
    EXPECT_TRUE(error);
    EXPECT_FALSE(coordinator->hasAppAssetPromise());
  }
}

TEST_P(InstallCoordinationContract, APromiseTellsItsProgressAndItsPlace) {
  const auto promise =
      coordination.createPathTransferPromise("com.a-Asset", SyncHostClientID, std::nullopt, 7);
  const auto other = coordination.createPathTransferPromise("com.a-Icon", SyncHostClientID,
                                                            FileLocation::file("/tmp/Icon.png"), 7);
  ASSERT_TRUE(promise && other);
  EXPECT_EQ(promise->name(), "com.a-Asset");
  EXPECT_NE(promise->identifier(), other->identifier());
  EXPECT_FALSE(promise->transferPath());
  EXPECT_EQ(other->transferPath(), FileLocation::file("/tmp/Icon.png"));
  EXPECT_EQ(promise->percentComplete(), 0);
  EXPECT_FALSE(promise->isComplete());
  promise->setTransferPath(FileLocation::file("/tmp/package"));
  promise->setPercentComplete(0.5);
  EXPECT_EQ(promise->percentComplete(), 0.5);
  promise->setComplete(true);
  EXPECT_TRUE(promise->isComplete());
  EXPECT_EQ(promise->transferPath(), FileLocation::file("/tmp/package"));
}

TEST_P(InstallCoordinationContract, AFractionStaysBetweenNothingAndAll) {
  const auto promise = packagePromise("com.a");
  promise->setPercentComplete(1.5);
  EXPECT_EQ(promise->percentComplete(), 1.0);
  promise->setPercentComplete(-0.5);
  EXPECT_EQ(promise->percentComplete(), 0);
}

TEST_P(InstallCoordinationContract, ACancelledPromiseStaysUsableWithoutEffect) {
  const auto promise = packagePromise("com.a");
  promise->cancel(reason, SyncHostClientID);
  promise->setComplete(true);
  promise->setPercentComplete(1.0);
  EXPECT_FALSE(promise->isComplete());
  EXPECT_EQ(promise->percentComplete(), 0);
}

TEST_P(InstallCoordinationContract, ACancelledCoordinatorKeepsItsFirstReasonAndMakesRoom) {
  const auto coordinator = make("com.a");
  const auto package = packagePromise("com.a");
  ASSERT_TRUE(coordinator->setAppAssetPromise(package, nullptr));
  EXPECT_TRUE(coordinator->cancel(reason, SyncHostClientID));
  EXPECT_TRUE(coordinator->cancel(Error::posix(5), SyncHostClientID)) << "it is cancelled";
  EXPECT_EQ(coordinator->error(), reason);
  std::optional<Error> error;
  EXPECT_FALSE(coordinator->setInstallOptions({}, &error));
  EXPECT_EQ(error.value_or(Error{}).code, ECANCELED);
  EXPECT_FALSE(coordinator->hasInstallOptions());
  package->setComplete(true);
  EXPECT_FALSE(package->isComplete()) << "its promises went with it";
  EXPECT_EQ(coordinator->bundleIdentifier(), "com.a");
  EXPECT_EQ(live("com.a"), nullptr);
  const auto next = make("com.a");
  EXPECT_NE(next, coordinator);
  EXPECT_FALSE(next->error());
  EXPECT_FALSE(next->hasAppAssetPromise());
}

/// Uninstalls, and waits for the outcome.
class CoordinatedUninstallContract : public CoordinationContract {
 protected:
  std::optional<Error> uninstall(std::string_view identifier) {
    std::promise<std::optional<Error>> told;
    coordination.uninstallApp(identifier, false, [&](const std::optional<Error>& error) {
      thread = std::this_thread::get_id();
      told.set_value(error);
    });
    return told.get_future().get();
  }
  std::thread::id thread;
};

SERVICE_CONTRACT_OF(CoordinatedUninstallContract);

TEST_P(CoordinatedUninstallContract, TellsTheOutcomeOnAnotherThread) {
  ASSERT_TRUE(installPackage("com.a"));
  EXPECT_FALSE(uninstall("com.a"));
  EXPECT_NE(thread, std::this_thread::get_id());
  EXPECT_FALSE(platform.appRegistry.isApplicationInstalled("com.a"));
}

TEST_P(CoordinatedUninstallContract, FailsForWhatIsNotThere) {
  EXPECT_TRUE(uninstall("com.a"));
  EXPECT_TRUE(uninstall(""));
}

TEST_P(CoordinatedUninstallContract, EndsAnUpdateAndLeavesTheOldVersion) {
  ASSERT_TRUE(installPackage("com.a", "1.0"));
  const auto coordinator = prepare("com.a", CoordinatorKind::Updating);
  phone->settle("com.a");
  ASSERT_TRUE(hasPlaceholder("com.a"));
  EXPECT_FALSE(uninstall("com.a"));
  phone->settle("com.a");
  EXPECT_EQ(recorder.count("canceled com.a by "), 1U);
  EXPECT_TRUE(coordinator->error());
  EXPECT_EQ(live("com.a"), nullptr);
  EXPECT_FALSE(hasPlaceholder("com.a"));
  EXPECT_EQ(version("com.a"), "1.0");
}

TEST_P(InstallCoordinationContract, AnErrorForThePersonCarriesItsCause) {
  const Error shown = coordination.createUserPresentableError(1, 0, reason);
  EXPECT_EQ(shown.code, 1);
  ASSERT_TRUE(shown.underlying);
  EXPECT_EQ(*shown.underlying, reason);
  EXPECT_FALSE(coordination.createUserPresentableError(1, 0, std::nullopt).underlying);
}

}  // namespace
}  // namespace appsync::contract
