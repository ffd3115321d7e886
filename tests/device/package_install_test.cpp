#include <cerrno>

#include "packages/package_extractor.h"
#include "platform/installer_service.h"
#include "tests/device/device_test.h"

namespace appsync::device {
namespace {

using Lines = std::vector<std::string>;
constexpr std::string_view Id = "com.example.a";
constexpr std::string_view Data = "/var/mobile/Containers/Data/com.example.a";

class PackageInstallTest : public DeviceTest {
 protected:
  std::string inContainer(std::string_view file, bool placeholder = false) {
    return textAt(joinPath(*record(Id, placeholder)->bundleContainerPath, file));
  }
};

class RecordingWatcher final : public PhoneWatcher {
 public:
  void installFinished(std::string_view bundleId,
                       const std::optional<Error>& error) noexcept override {
    finished.push_back(std::string(bundleId) +
                       (error ? " refused " + std::to_string(error->code) : " installed"));
  }
  Lines finished;
};

TEST_F(PackageInstallTest, AnInstalledPackageStandsInAContainerOfItsOwn) {
  ASSERT_TRUE(installPackage(PackageArchive()
                                 .addApplication(Id, "1.2")
                                 .add("HalvoMetadata.plist", "metadata")
                                 .add("HalvoArtwork", "artwork"),
                             Id))
      << error->localizedDescription();
  const auto installed = record(Id);
  ASSERT_TRUE(installed);
  EXPECT_TRUE(installed->bundleContainerPath->starts_with("/var/mobile/Containers/Applications/"));
  EXPECT_EQ(*installed->bundlePath, *installed->bundleContainerPath + "/Sample.app");
  EXPECT_EQ(installed->bundleVersion, "1.2");
  EXPECT_EQ(installed->displayName, "Sample");
  EXPECT_FALSE(installed->isPlaceholder);
  EXPECT_EQ(textAt(*installed->bundlePath + "/run.sh"), "#!/bin/sh\necho hello\n");
  EXPECT_EQ(inContainer("HalvoMetadata.plist"), "metadata");
  EXPECT_EQ(inContainer("HalvoArtwork"), "artwork");
  const auto info = std::filesystem::file_size(onDisk(*installed->bundlePath + "/Info.plist"));
  EXPECT_EQ(installed->staticDiskUsage, info + 21 + 8 + 7) << "all files of the package";
  EXPECT_TRUE(device->files().directoryExists(Data));
}

TEST_F(PackageInstallTest, AnUpdateReplacesTheContainerAndKeepsTheData) {
  ASSERT_TRUE(installPackage(Id, "1.0"));
  const std::string first = *record(Id)->bundleContainerPath;
  putFile(joinPath(Data, "notes"), "mine");
  ASSERT_TRUE(installPackage(Id, "2.0"));
  EXPECT_EQ(registry(), Lines{"com.example.a 2.0"});
  EXPECT_NE(*record(Id)->bundleContainerPath, first);
  EXPECT_FALSE(device->files().fileExists(first));
  EXPECT_EQ(containerCount(), 1U);
  EXPECT_EQ(textAt(joinPath(Data, "notes")), "mine");
}

TEST_F(PackageInstallTest, APackageTakesThePlaceOfItsPlaceholder) {
  ASSERT_TRUE(installPlaceholder(Id, "1.0", {{std::string(SWInstallTypeKey), 4}}));
  ASSERT_TRUE(installPackage(Id, "1.0"));
  EXPECT_EQ(registry(), Lines{"com.example.a 1.0"});
  EXPECT_EQ(record(Id)->installType, InstallType::Sync) << "why it was installed stays known";
  EXPECT_EQ(containerCount(), 1U);
  EXPECT_EQ(device->appRegistry().installProgressSync(*record(Id)), nullptr);
}

TEST_F(PackageInstallTest, ARefusedUpdateLeavesTheOldVersionWhole) {
  ASSERT_TRUE(installPackage(Id, "1.0"));
  putFile(joinPath(Data, "notes"), "mine");
  ASSERT_TRUE(installPlaceholder(Id, "2.0"));
  const auto before = fakes::snapshot(onDisk(*record(Id)->bundleContainerPath));
  const Lines registered = registry();

  EXPECT_FALSE(installPackage(PackageArchive().addApplication("com.example.other", "2.0"), Id));
  EXPECT_EQ(error->domain, InstallerServiceErrorDomain);
  EXPECT_EQ(error->code, static_cast<std::int64_t>(PackageRefusal::WrongIdentifier));
  EXPECT_FALSE(installPackage(PackageArchive().addApplication(Id, "2.0").add("../x", ""), Id));
  EXPECT_FALSE(installPackage(PackageArchive().add("no archive of an application", ""), Id));

  EXPECT_EQ(registry(), registered);
  EXPECT_EQ(fakes::snapshot(onDisk(*record(Id)->bundleContainerPath)), before);
  EXPECT_EQ(textAt(joinPath(Data, "notes")), "mine");
  EXPECT_EQ(containerCount(), 2U) << "nothing of the refused packages stays";
}

TEST_F(PackageInstallTest, AFailedInstallIsOverAndItsProgressSaysSo) {
  ASSERT_TRUE(installPlaceholder(Id));
  const auto progress = device->appRegistry().installProgressSync(*record(Id, true));
  ASSERT_TRUE(progress);
  EXPECT_FALSE(installPackage(PackageArchive(), Id));
  EXPECT_EQ(progress->installState(), InstallState::Failed);
  EXPECT_EQ(device->appRegistry().installProgressSync(*record(Id, true)), nullptr);
  EXPECT_TRUE(record(Id, true)) << "the placeholder is its installer's to take away";
}

TEST_F(PackageInstallTest, StoreFilesThatAPackageLacksAreCarriedOver) {
  ASSERT_TRUE(installPackage(PackageArchive()
                                 .addApplication(Id, "1.0")
                                 .add("HalvoMetadata.plist", "old metadata")
                                 .add("HalvoArtwork", "old artwork"),
                             Id));
  ASSERT_TRUE(installPlaceholder(
      Id, "2.0", {{std::string(SWHalvoMetadataKey), toBytes("placeholder's metadata")}}));
  ASSERT_TRUE(installPackage(Id, "2.0"));
  EXPECT_EQ(inContainer("HalvoMetadata.plist"), "placeholder's metadata");
  EXPECT_EQ(inContainer("HalvoArtwork"), "old artwork");
}

TEST_F(PackageInstallTest, TheMetadataTellsADeviceBasedAssignment) {
  const auto install = [&](bool flag) {
    return installPackage(
        PackageArchive().addApplication(Id, "1.0").add(
            "HalvoMetadata.plist", xml(PropertyList::Dictionary{{"DeviceBasedQLP", flag}})),
        Id);
  };
  ASSERT_TRUE(install(true));
  EXPECT_TRUE(record(Id)->isDeviceBasedAssignment);
  ASSERT_TRUE(install(false));
  EXPECT_FALSE(record(Id)->isDeviceBasedAssignment);
}

TEST_F(PackageInstallTest, TheWatcherHearsOfEveryPackageBeforeTheInstallReturns) {
  RecordingWatcher watcher;
  device->setWatcher(&watcher);
  ASSERT_TRUE(installPlaceholder(Id));
  ASSERT_TRUE(installPackage(Id));
  EXPECT_FALSE(installPackage(PackageArchive().addApplication("com.example.b", "1"), Id));
  device->setWatcher(nullptr);
  ASSERT_TRUE(installPackage(Id));
  const auto code = static_cast<std::int64_t>(PackageRefusal::WrongIdentifier);
  EXPECT_EQ(watcher.finished,
            (Lines{"com.example.a installed", "com.example.a refused " + std::to_string(code)}));
}

TEST_F(PackageInstallTest, RestoredDataIsGivenBackWithThePackage) {
  const std::string waiting = "/var/mobile/Media/HalvoRestore/Data/com.example.a";
  ASSERT_TRUE(installRestorePlaceholder(Id));
  putFile(waiting + "/Documents/notes", "from the backup");
  EXPECT_TRUE(platform().backupManager.restoreDataExists(Id));
  ASSERT_TRUE(installPackage(Id));
  EXPECT_EQ(textAt(joinPath(Data, "Documents/notes")), "from the backup");
  EXPECT_FALSE(device->files().fileExists(waiting));
  EXPECT_FALSE(platform().backupManager.restoreDataExists(Id));
}

TEST_F(PackageInstallTest, WaitingDataIsLeftAloneByAnUpdateThatIsNoRestore) {
  ASSERT_TRUE(installPackage(Id));
  const std::string waiting = "/var/mobile/Media/HalvoRestore/Data/com.example.a/notes";
  putFile(waiting, "from the backup");
  ASSERT_TRUE(installPlaceholder(Id));
  ASSERT_TRUE(installPackage(Id));
  EXPECT_EQ(textAt(waiting), "from the backup");
}

TEST_F(PackageInstallTest, AFirstInstallTakesTheWaitingDataWhateverItsPlaceholderIsFor) {
  putFile("/var/mobile/Media/HalvoRestore/Data/com.example.a/notes", "from the backup");
  ASSERT_TRUE(installPlaceholder(Id));
  ASSERT_TRUE(installPackage(Id));
  EXPECT_EQ(textAt("/var/mobile/Containers/Data/com.example.a/notes"), "from the backup");
  EXPECT_FALSE(platform().backupManager.restoreDataExists(Id));
}

TEST_F(PackageInstallTest, ARefusedPackageLeavesTheRestoredDataWaiting) {
  const std::string waiting = "/var/mobile/Media/HalvoRestore/Data/com.example.a/notes";
  ASSERT_TRUE(installRestorePlaceholder(Id));
  putFile(waiting, "from the backup");
  EXPECT_FALSE(installPackage(PackageArchive(), Id));
  EXPECT_EQ(textAt(waiting), "from the backup");
}

TEST_F(PackageInstallTest, AnInstallThatCannotTellWhetherDataWaitsFailsAndChangesNothing) {
  const std::string waiting = "/var/mobile/Media/HalvoRestore/Data/com.example.a";
  ASSERT_TRUE(installRestorePlaceholder(Id));
  putFile(waiting, "what is no folder cannot be looked into");
  EXPECT_TRUE(platform().backupManager.restoreDataExists(Id));
  EXPECT_FALSE(device->saveData(
      Id, [](ByteView) { return true; }, &error));
  EXPECT_FALSE(installPackage(Id));
  EXPECT_EQ(error->code, ENOTDIR);
  EXPECT_EQ(registry(), Lines{"com.example.a 1.0 (placeholder)"});
  EXPECT_TRUE(device->files().fileExists(waiting));
}

TEST_F(PackageInstallTest, AnUpdateThatCannotLookForTheStoreFilesFails) {
  ASSERT_TRUE(installPackage(Id, "1.0"));
  std::filesystem::create_symlink("HalvoArtwork",
                                  onDisk(*record(Id)->bundleContainerPath + "/HalvoArtwork"));
  EXPECT_FALSE(installPackage(Id, "2.0"));
  EXPECT_EQ(error->code, ELOOP);
  EXPECT_EQ(registry(), Lines{"com.example.a 1.0"});
}

TEST_F(PackageInstallTest, APackageWithoutTheExecutableThatItNamesIsRefused) {
  PackageArchive package;
  package.add("Sample.app/", "").add("Sample.app/Info.plist", xml(infoOf(Id, "1.0")));
  EXPECT_FALSE(installPackage(package, Id));
  EXPECT_EQ(error->localizedDescription(), "bad information: the executable \"run.sh\" is missing");
}

TEST_F(PackageInstallTest, APackageReachedThroughALinkOutOfThePhoneIsNotFound) {
  const auto outside = temporary.path() / "outside.pkg";
  fakes::putFile(outside, asText(PackageArchive().addApplication(Id, "1.0").bytes()));
  const auto link = onDisk("/var/mobile/Media/PublicStaging/link.pkg");
  std::filesystem::create_symlink(outside, link);
  EXPECT_FALSE(device->appRegistry().installApplication(
      FileLocation::file("/var/mobile/Media/PublicStaging/link.pkg"),
      {{std::string(SWPackageTypeKey), SWPackageTypeCustomer},
       {std::string(KBBundleIdentifier), Id}},
      &error));
  EXPECT_TRUE(registry().empty());
}

}  // namespace
}  // namespace appsync::device
