#include <signal.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <map>

#include "tests/device/device_test.h"

namespace appsync::device {
namespace {

namespace fs = std::filesystem;

/// Every file of a folder with its contents and the times of its last changes.
std::map<std::string, std::string> pictureOf(const fs::path& folder) {
  std::map<std::string, std::string> picture;
  for (const auto& entry : fs::recursive_directory_iterator(folder)) {
    struct stat status {};
    lstat(entry.path().c_str(), &status);
    picture[entry.path()] = std::to_string(status.st_mtim.tv_sec) + "." +
                            std::to_string(status.st_mtim.tv_nsec) +
                            (entry.is_regular_file() ? fakes::fileText(entry.path()) : "");
  }
  return picture;
}

/// The files that are not as they were.
std::vector<std::string> changesSince(const std::map<std::string, std::string>& before,
                                      const fs::path& folder) {
  std::vector<std::string> changed;
  const auto after = pictureOf(folder);
  for (const auto& [file, state] : after) {
    const auto found = before.find(file);
    if (found == before.end() || found->second != state) changed.push_back(file);
  }
  for (const auto& [file, state] : before) {
    if (!after.contains(file)) changed.push_back(file + " is gone");
  }
  return changed;
}

class DeviceSharingTest : public DeviceTest {
 protected:
  DeviceError problem;
};

TEST_F(DeviceSharingTest, ASecondWriterIsToldWhoHasTheDevice) {
  const int status = inOtherProcess([&] {
    const bool busy =
        !EmbeddedDevice::open(folder, Access::Write, problem) &&
        problem.problem == DeviceProblem::Busy &&
        problem.message.find("process " + std::to_string(getppid())) != std::string::npos;
    return busy ? 0 : 1;
  });
  EXPECT_EQ(status, 0);
  EXPECT_FALSE(EmbeddedDevice::open(folder, Access::Write, problem));
  EXPECT_EQ(problem.problem, DeviceProblem::Busy);
}

TEST_F(DeviceSharingTest, AClosedDeviceCanBeWrittenByAnother) {
  device.reset();
  const int status =
      inOtherProcess([&] { return EmbeddedDevice::open(folder, Access::Write, problem) ? 0 : 1; });
  EXPECT_EQ(status, 0);
}

TEST_F(DeviceSharingTest, AKilledWriterLeavesTheDeviceToTheNext) {
  device.reset();
  const int status = inOtherProcess([&] {
    reopen();
    installPlaceholder("com.example.kept");
    return kill(getpid(), SIGKILL);
  });
  EXPECT_EQ(status, 128 + SIGKILL);
  reopen(Access::ReadOnly);
  EXPECT_EQ(registry(), std::vector<std::string>{"com.example.kept 1.0 (placeholder)"});
  reopen();
  EXPECT_EQ(registry(), std::vector<std::string>{"com.example.kept 1.0 (placeholder)"});
}

TEST_F(DeviceSharingTest, AReaderSeesWhatAWriterDoesMeanwhile) {
  const auto reader = EmbeddedDevice::open(folder, Access::ReadOnly, problem);
  ASSERT_TRUE(reader) << problem.message;
  EXPECT_TRUE(reader->applications().empty());
  ASSERT_TRUE(installPackage("com.example.a"));
  EXPECT_EQ(reader->applications().size(), 1U);
  ASSERT_TRUE(installPlaceholder("com.example.b"));
  device->appRegistry().installProgressSync(*record("com.example.b"))->setCompletedUnitCount(456);
  const auto seen = reader->appRegistry().recordForIdentifier("com.example.b", true);
  ASSERT_TRUE(seen);
  EXPECT_EQ(reader->appRegistry().installProgressSync(*seen)->completedUnitCount(), 456);
}

TEST_F(DeviceSharingTest, AReaderInAnotherProcessSeesTheDeviceAndChangesNoFile) {
  ASSERT_TRUE(installPackage("com.example.a"));
  const auto look = [&] {
    const auto reader = EmbeddedDevice::open(folder, Access::ReadOnly, problem);
    if (!reader) return 1;
    reader->log().write(LogChannel::TWLogCategoryFramework, LogLevel::Error, "not kept");
    return reader->applications().size() == 1 && reader->homeScreenOrder().size() == 1 &&
                   reader->transactions().empty()
               ? 0
               : 2;
  };
  device.reset();
  const auto closed = pictureOf(folder);
  EXPECT_EQ(inOtherProcess(look), 0);
  EXPECT_EQ(changesSince(closed, folder), std::vector<std::string>());

  // A process that shares nothing with the writer: it begins before the writer opens the device.
  std::array<int, 2> writerIsThere{};
  ASSERT_EQ(pipe(writerIsThere.data()), 0);
  const pid_t reader = fork();
  if (reader == 0) {
    char byte = 0;
    _exit(read(writerIsThere[0], &byte, 1) == 1 ? look() : 3);
  }
  reopen();
  ASSERT_TRUE(installPackage("com.example.a", "2.0"));
  const auto open = pictureOf(folder);
  ASSERT_EQ(write(writerIsThere[1], "x", 1), 1);
  int status = 0;
  ASSERT_EQ(waitpid(reader, &status, 0), reader);
  EXPECT_EQ(WEXITSTATUS(status), 0);
  EXPECT_EQ(changesSince(open, folder), std::vector<std::string>());
  for (const int end : writerIsThere) close(end);
}

TEST_F(DeviceSharingTest, ACopyWithoutTheLogFilesOfTheDatabaseCanBeRead) {
  ASSERT_TRUE(installPackage("com.example.a"));
  device.reset();
  for (const char* name : {"device.db-wal", "device.db-shm"}) fs::remove(folder / name);
  const auto before = pictureOf(folder);
  reopen(Access::ReadOnly);
  EXPECT_EQ(registry(), std::vector<std::string>{"com.example.a 1.0"});
  EXPECT_EQ(changesSince(before, folder), std::vector<std::string>());
}

TEST_F(DeviceSharingTest, AReaderRefusesEveryChange) {
  ASSERT_TRUE(installPackage("com.example.a"));
  const FileLocation package = stage(PackageArchive().addApplication("com.example.b", "1"));
  reopen(Access::ReadOnly);
  const auto before = pictureOf(folder);
  EXPECT_FALSE(device->appRegistry().installApplication(
      package,
      {{std::string(SWPackageTypeKey), SWPackageTypeCustomer},
       {std::string(KBBundleIdentifier), "com.example.b"}},
      &error));
  EXPECT_EQ(error->code, EROFS);
  EXPECT_FALSE(device->appRegistry().uninstallApplication("com.example.a", {}));
  EXPECT_FALSE(device->uninstall("com.example.a", &error));
  EXPECT_FALSE(device->setPolicy(PolicySetting::AppInstallationAllowed, PolicyValue::Yes, &error));
  EXPECT_EQ(error->code, EROFS);
  EXPECT_EQ(device->receiveFile("/tmp/a", &error), nullptr);
  EXPECT_NE(platform().installerService.clearUninstalled({"com.example.a"}), 0);
  EXPECT_NE(device->homeScreen().setIconState(device->homeScreen().serverPort(), asBytes("()")), 0);
  platform().transactionLog.logScenario("s", std::nullopt, true, "a", "b");
  platform().backupManager.cancelApplicationRestore("com.example.a");
  EXPECT_EQ(changesSince(before, folder), std::vector<std::string>());
  EXPECT_EQ(registry(), std::vector<std::string>{"com.example.a 1.0"});
}

}  // namespace
}  // namespace appsync::device
