// What the history tells of coordinated installs.

#include "platform/bundle.h"
#include "tests/device/coordination_test.h"

namespace appsync::device {
namespace {

using Lines = std::vector<std::string>;
constexpr std::string_view Id = "com.example.a";
const std::string WaitingData = "/var/mobile/Media/HalvoRestore/Data/com.example.a";

class CoordinationHistoryTest : public CoordinationTest {
 protected:
  /// A restored application, version 2.0, that waits for its package.
  void restore() {
    putFile(WaitingData + "/saved", "kept");
    const auto coordinator = observed(Id, CoordinatorKind::Restoring);
    ASSERT_TRUE(
        coordinator->setPlaceholderPromise(completePlaceholder(Id, InstallType::Restore), nullptr));
    ASSERT_TRUE(recorder.waitFor("placeholder"));
    waitUntilIdle(Id);
  }
  void expectRemovedByPerson() {
    waitUntilIdle(Id);
    EXPECT_EQ(history(),
              (Lines{"restored sync com.example.a 2.0", "removed person com.example.a 2.0"}));
    EXPECT_EQ(registry(), Lines{});
    EXPECT_EQ(device->uninstalledApplications(), Lines{std::string(Id)});
    EXPECT_EQ(device->homeScreenOrder(), Lines{});
    EXPECT_FALSE(device->files().fileExists(WaitingData));
  }
};

TEST_F(CoordinationHistoryTest, ARestoredApplicationThatAPersonCancelsIsRemovedByThePerson) {
  restore();
  DeviceError problem;
  ASSERT_TRUE(EmbeddedDevice::cancel(folder, Id, problem, &error));
  expectRemovedByPerson();
}

TEST_F(CoordinationHistoryTest, APersonsCancelThatWasBrokenOffIsEndedAsThePersons) {
  restore();
  device.reset();
  edit(
      "UPDATE install_placeholders SET over = 1, presence = 4; "
      "UPDATE install_coordinators SET stage = 3, error = x'00'");
  reopen();
  expectRemovedByPerson();
}

TEST_F(CoordinationHistoryTest, ARestoredApplicationThatItsClientCancelsIsRemovedByTheSync) {
  restore();
  ASSERT_TRUE(live(Id)->cancel(reason, SyncHostClientID));
  waitUntilIdle(Id);
  EXPECT_EQ(history(),
            (Lines{"restored sync com.example.a 2.0", "removed sync com.example.a 2.0"}));
}

TEST_F(CoordinationHistoryTest, TellsOfAnInstallThatWaitedForItsApplicationInVain) {
  ASSERT_TRUE(installPackage(Id, "1.0"));
  ASSERT_TRUE(launch(Id));
  WaitingWatcher watcher;
  device->setWatcher(&watcher);
  deliver(*prepare(Id, CoordinatorKind::Updating), Id);
  ASSERT_TRUE(watcher.waitFor("denied com.example.a"));
  device->expedite();
  ASSERT_TRUE(recorder.waitFor("failed"));
  device->setWatcher(nullptr);
  EXPECT_EQ(history(), (Lines{"installed sync com.example.a 1.0",
                              "failed sync com.example.a 2.0: com.example.a is in the foreground "
                              "and was not closed in time"}));
}

TEST_F(CoordinationHistoryTest, TellsOfAPlaceholderThatCouldNotBeLaid) {
  std::filesystem::remove_all(onDisk("/var/mobile/Containers/Applications"));
  putFile("/var/mobile/Containers/Applications", "no directory");
  const auto coordinator = prepare(Id);
  ASSERT_TRUE(recorder.waitFor("failed"));
  EXPECT_EQ(history(), Lines{"failed sync com.example.a 2.0: " +
                             coordinator->error()->localizedDescription()});
}

TEST_F(CoordinationHistoryTest, TellsOnceOfAPackageThatIsRefusedAndOfWhoBroughtIt) {
  const auto coordinator = observed(Id, CoordinatorKind::Restoring);
  const auto package =
      service().createPathTransferPromise("com.example.a-Asset", KQClientKiosk, std::nullopt, 0);
  ASSERT_TRUE(coordinator->setInstallOptions({}, nullptr));
  ASSERT_TRUE(coordinator->setAppAssetPromise(package, nullptr));
  ASSERT_TRUE(
      coordinator->setPlaceholderPromise(completePlaceholder(Id, InstallType::Restore), nullptr));
  deliver(*coordinator, stageApplication("com.example.b"));
  ASSERT_TRUE(recorder.waitFor("failed"));
  EXPECT_EQ(history(), (Lines{"restored sync com.example.a 2.0",
                              "failed store com.example.a 2.0: " +
                                  coordinator->error()->localizedDescription()}));
}

}  // namespace
}  // namespace appsync::device
