#include <cerrno>

#include "platform/bundle.h"
#include "tests/device/device_test.h"

namespace appsync::device {
namespace {

using Lines = std::vector<std::string>;
constexpr std::string_view Id = "com.example.a";
constexpr std::string_view Notes = "/var/mobile/Containers/Data/com.example.a/notes";

class DemotionTest : public DeviceTest {
 protected:
  bool demote() {
    error.reset();
    return device->demote(Id, &error);
  }
  /// Of a refused demotion.
  std::string reason() { return demote() ? "none" : error->localizedDescription(); }
  void putIntoBundle(std::string_view name, std::string_view text) {
    putFile(joinPath(*record(Id)->bundlePath, name), text);
  }
};

TEST_F(DemotionTest, LeavesPlaceholderAndData) {
  ASSERT_TRUE(installPackage(Id, "1.0"));
  putFile(Notes, "mine");
  putFile(joinPath(*record(Id)->bundleContainerPath, "HalvoMetadata.plist"), "metadata");
  EXPECT_TRUE(demote());
  EXPECT_EQ(registry(), Lines{"com.example.a 1.0 (placeholder)"});
  EXPECT_EQ(containerCount(), 1U);
  const auto placeholder = record(Id, true);
  EXPECT_EQ(placeholder->installType, InstallType::IntentionalDowngrade);
  EXPECT_EQ(textAt(joinPath(*placeholder->bundleContainerPath, "HalvoMetadata.plist")), "metadata");
  EXPECT_EQ(textAt(Notes), "mine");
  EXPECT_TRUE(device->uninstalledApplications().empty());
}

TEST_F(DemotionTest, KeepsTheIconAndTheNameUnderIt) {
  ASSERT_TRUE(installPackage(Id, "1.0"));
  const std::string name = record(Id)->displayName;
  putIntoBundle("Info.plist", xml([&] {
                  auto info = infoOf(Id, "1.0");
                  info.insert_or_assign(std::string(KBBundleIconFile), "picture.png");
                  return info;
                }()));
  putIntoBundle("picture.png", "the picture");
  ASSERT_TRUE(demote());
  EXPECT_EQ(record(Id)->displayName, name);
  EXPECT_EQ(textAt(joinPath(*record(Id)->bundlePath, "Icon.png")), "the picture");
}

TEST_F(DemotionTest, ThatCannotReadTheMetadataLeavesTheApplication) {
  ASSERT_TRUE(installPackage(Id, "1.0"));
  std::filesystem::create_directory(
      onDisk(joinPath(*record(Id)->bundleContainerPath, "HalvoMetadata.plist")));
  EXPECT_FALSE(demote());
  EXPECT_EQ(error->code, EISDIR);
  EXPECT_EQ(registry(), Lines{"com.example.a 1.0"});
}

TEST_F(DemotionTest, GoesWithoutAnIconThatIsNotThere) {
  ASSERT_TRUE(installPackage(Id, "1.0"));
  ASSERT_TRUE(demote());
  EXPECT_FALSE(device->files().fileExists(joinPath(*record(Id)->bundlePath, "Icon.png")));
}

TEST_F(DemotionTest, ThePackageFindsItsDataAgain) {
  ASSERT_TRUE(installPackage(Id, "1.0"));
  putFile(Notes, "mine");
  ASSERT_TRUE(demote());
  ASSERT_TRUE(installPackage(Id, "2.0"));
  EXPECT_EQ(registry(), Lines{"com.example.a 2.0"});
  EXPECT_EQ(textAt(Notes), "mine");
}

TEST_F(DemotionTest, WhatIsNotInstalledOrOpenOrBeingUpdatedStaysAsItIs) {
  EXPECT_EQ(reason(), "com.example.a is not installed");
  ASSERT_TRUE(installPackage(Id, "1.0"));
  DeviceError problem;
  ASSERT_TRUE(EmbeddedDevice::launch(folder, Id, problem, &error));
  EXPECT_EQ(reason(), "com.example.a is open; close it first");
  ASSERT_TRUE(EmbeddedDevice::quit(folder, Id, problem, &error));
  ASSERT_TRUE(installPlaceholder(Id, "2.0"));
  EXPECT_EQ(reason(), "com.example.a is just being updated");
  EXPECT_EQ(registry(), (Lines{"com.example.a 1.0", "com.example.a 2.0 (placeholder)"}));
}

TEST_F(DemotionTest, TheSystemsApplicationsCannotBeDemoted) {
  ASSERT_TRUE(device->addSystemApplication(Id, "Clock", "1", &error));
  EXPECT_EQ(reason(), "com.example.a belongs to the system");
}

TEST_F(DemotionTest, ThatACrashBrokeOffIsDoneByTheNext) {
  ASSERT_TRUE(installPackage(Id, "1.0"));
  ASSERT_TRUE(installPlaceholder(Id, "1.0", {{std::string(SWInstallTypeKey), 8}}));
  reopen();
  EXPECT_TRUE(demote());
  EXPECT_EQ(registry(), Lines{"com.example.a 1.0 (placeholder)"});
  EXPECT_FALSE(demote());
}

}  // namespace
}  // namespace appsync::device
