// What the coordination service says when it cannot write or read what it must.

#include <future>

#include "device/recovery.h"
#include "tests/device/coordination_faults.h"

namespace appsync::device {
namespace {

/// A coordinator, and a database that fails from now on.
class CoordinationRefusalsTest : public CoordinationTest {
 protected:
  /// From the given step on, or only then.
  void strike(const Mode& mode, int step = 1) {
    EXPECT_TRUE(installPackage(Id, "1.0"));
    device.reset();
    faults_.emplace(mode, step);
    parts_.emplace(folder);
    service_.emplace(parts_->core(), parts_->registry());
    coordinator = service_->coordinatorFor(CoordinatorKind::Updating, Id, SyncHostClientID, true,
                                           nullptr, nullptr);
    package = service_->createPathTransferPromise("a", SyncHostClientID, std::nullopt, 0);
    EXPECT_TRUE(coordinator->setAppAssetPromise(package, nullptr));
    faults_->strike(parts_->database());
  }
  DeviceInstallCoordination& failing() { return *service_; }
  DeviceParts& parts() { return *parts_; }
  void comeToRest() {
    while (failing().isBusy(Id)) std::this_thread::yield();
  }
  std::shared_ptr<InstallPlaceholder> configured() {
    const auto made = failing().createAppPlaceholder("A", Id, InstallType::Sync, SyncHostClientID);
    EXPECT_TRUE(made->setConfigurationComplete(nullptr));
    return made;
  }

  std::shared_ptr<InstallCoordinator> coordinator;
  std::shared_ptr<PathTransferPromise> package;

 private:
  std::optional<DatabaseFaults> faults_;
  std::optional<DeviceParts> parts_;
  std::optional<DeviceInstallCoordination> service_;
};

TEST_F(CoordinationRefusalsTest, WhatCannotBeWrittenIsRefused) {
  strike(Modes[3]);
  EXPECT_EQ(failing().createPathTransferPromise("a", SyncHostClientID, std::nullopt, 0), nullptr);
  EXPECT_EQ(failing().createOutOfBandTransferPromise("a", SyncHostClientID, 0), nullptr);
  EXPECT_EQ(failing().createAppPlaceholder("A", Id, InstallType::Sync, SyncHostClientID), nullptr);
  EXPECT_EQ(failing().coordinatorFor(CoordinatorKind::Initiating, "com.example.b", SyncHostClientID,
                                     true, nullptr, &error),
            nullptr);
  EXPECT_TRUE(error);
  error.reset();
  EXPECT_FALSE(coordinator->setInstallOptions({}, &error));
  EXPECT_TRUE(error);
  EXPECT_FALSE(coordinator->hasInstallOptions());
  EXPECT_FALSE(coordinator->cancel(reason, SyncHostClientID));
  EXPECT_FALSE(coordinator->error());
  EXPECT_FALSE(failing().tap(Id));
  EXPECT_FALSE(failing().cancelInstall(Id));
}

TEST_F(CoordinationRefusalsTest, WhatCannotBeReadIsAnErrorAndNotTakenForWell) {
  strike(Modes[1]);
  EXPECT_TRUE(coordinator->error());
  EXPECT_EQ(coordinator->appAssetPromise(&error), nullptr);
  EXPECT_TRUE(error);
  error.reset();
  EXPECT_EQ(
      failing().coordinatorFor(CoordinatorKind::Any, Id, SyncHostClientID, false, nullptr, &error),
      nullptr);
  EXPECT_TRUE(error);
}

TEST_F(CoordinationRefusalsTest, AnUninstallThatCannotBeWrittenSaysSoAndRemovesNothing) {
  strike(Modes[3]);
  std::promise<std::optional<Error>> told;
  failing().uninstallApp(Id, false, [&](const auto& outcome) { told.set_value(outcome); });
  EXPECT_TRUE(told.get_future().get());
  EXPECT_EQ(find(failing()), coordinator);
}

TEST_F(CoordinationRefusalsTest, APackageThatCannotBeNotedIsAnErrorUntilItsClientAsksAnew) {
  strike(Modes[2]);
  package->setComplete(true);
  EXPECT_FALSE(package->isComplete());
  EXPECT_TRUE(coordinator->error());
  bool created = false;
  const auto again = failing().coordinatorFor(CoordinatorKind::Updating, Id, SyncHostClientID, true,
                                              &created, nullptr);
  EXPECT_TRUE(created);
  ASSERT_TRUE(again);
  EXPECT_FALSE(again->error());
  EXPECT_EQ(find(failing()), again);
}

TEST_F(CoordinationRefusalsTest, ProgressThatCannotBeNotedIsNoError) {
  strike(Modes[2]);
  package->setPercentComplete(0.5);
  EXPECT_EQ(package->percentComplete(), 0);
  EXPECT_FALSE(coordinator->error());
}

TEST_F(CoordinationRefusalsTest, APlaceholderThatCannotBeNotedIsAnErrorOfItsCoordinator) {
  strike(Modes[3], 4);  // after making, configuring and promising it
  ASSERT_TRUE(coordinator->setPlaceholderPromise(configured(), nullptr));
  comeToRest();
  EXPECT_TRUE(coordinator->error());
}

/// A new device on which the package of an install lies, for each step.
class CoordinationSweepTest : public CoordinationTest {
 protected:
  CoordinationSweepTest() {
    device.reset();
    folder = memory_.path() / "device";
  }

  /// Runs a step with the service of a new device. True when the database failed meanwhile.
  using Step = std::function<void(DeviceInstallCoordination&, DeviceParts&, DatabaseFaults&)>;
  bool fails(const Mode& mode, int step, const Step& run) {
    SCOPED_TRACE(std::string(mode.name) + " step " + std::to_string(step));
    std::filesystem::remove_all(folder);
    DeviceError problem;
    if (!EmbeddedDevice::initialize(folder, {true}, problem)) {
      throw std::runtime_error(problem.message);
    }
    fakes::putFile(onDisk(Package.path), archive_);
    fakes::putFile(onDisk(Icon), "picture");
    DatabaseFaults faults(mode, step);
    DeviceParts there(folder);
    DeviceInstallCoordination service(there.core(), there.registry());
    run(service, there, faults);
    return faults.struck();
  }
  static void comeToRest(DeviceInstallCoordination& service) {
    while (service.isBusy(Id)) std::this_thread::yield();
  }

 private:
  const fakes::TemporaryFolder memory_{fakes::memoryFolder()};
  const std::string archive_{asText(PackageArchive().addApplication(Id, "2.0").bytes())};
};

TEST_F(CoordinationSweepTest, WhateverFailsTheClientIsRefusedOrFindsAnError) {
  for (const Mode& mode : Modes) {
    const auto run = [&](auto& service, auto& there, auto& faults) {
      faults.strike(there.database());
      EventRecorder observer;
      const auto given = install(service, observer);
      const DatabaseFaults::Uncounted uncounted;  // what the test asks
      comeToRest(service);
      const auto record = there.registry().recordForIdentifier(Id, false);
      const bool isInstalled = record && !record->isPlaceholder;
      const bool isUnreadable = faults.struck() && mode.reads && !mode.once;
      const bool isTold = observer.count("complete") == 1 && (isInstalled || isUnreadable);
      EXPECT_TRUE(!given || isTold || given->error());
      EXPECT_TRUE(faults.struck() || isTold) << testing::PrintToString(observer.events());
      service.removeObserver(&observer);
    };
    for (int step = 1; fails(mode, step, run) && !HasFailure();) ++step;
  }
}

TEST_F(CoordinationSweepTest, AnInstallWhosePackageHasComeEndsThoughAReadFails) {
  int step = 1;
  const auto run = [&](auto& service, auto& there, auto& faults) {
    EventRecorder observer;
    const BegunInstall begun = beginInstall(service, observer);
    ASSERT_TRUE(begun.coordinator);
    comeToRest(service);
    faults.strike(there.database());
    begun.bringPackage();
    const DatabaseFaults::Uncounted uncounted;  // what the test asks
    comeToRest(service);
    EXPECT_EQ(observer.count("complete") + observer.count("failed"), 1U);
    service.removeObserver(&observer);
  };
  while (fails(Modes[0], step, run) && !HasFailure()) ++step;
  EXPECT_GT(step, 2) << "nothing was tried";
}

TEST_F(CoordinationRefusalsTest, AnUninstallWaitsForOtherWorkOnTheApplication) {
  strike(Modes[3], 1'000'000);
  std::atomic<bool> told = false;
  {
    const KeyedMutex::Guard work(parts().core().applicationLocks, std::string(Id));
    failing().uninstallApp(Id, false, [&](const auto&) { told = true; });
    while (!coordinator->error()) std::this_thread::yield();
    // It has begun, and has time enough to be wrong.
    for (int look = 0; look < 2000 && !told; ++look) {
      EXPECT_TRUE(parts().registry().recordForIdentifier(Id, false));
    }
    EXPECT_FALSE(told);
  }
  comeToRest();
  EXPECT_TRUE(told);
  EXPECT_FALSE(parts().registry().recordForIdentifier(Id, false));
}

}  // namespace
}  // namespace appsync::device
