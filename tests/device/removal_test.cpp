#include "tests/device/device_test.h"

namespace appsync::device {
namespace {

using Lines = std::vector<std::string>;
constexpr std::string_view Id = "com.example.a";
constexpr std::string_view Notes = "/var/mobile/Containers/Data/com.example.a/notes";

class RemovalTest : public DeviceTest {
 protected:
  bool uninstall(bool placeholdersOnly = false) {
    PropertyList::Dictionary options;
    if (placeholdersOnly) options.emplace(UninstallPlaceholdersOnlyKey, true);
    return device->appRegistry().uninstallApplication(Id, options);
  }
};

TEST_F(RemovalTest, UninstallingTakesTheApplicationWithItsData) {
  ASSERT_TRUE(installPackage(Id));
  putFile(Notes, "mine");
  EXPECT_TRUE(uninstall());
  EXPECT_TRUE(registry().empty());
  EXPECT_EQ(containerCount(), 0U);
  EXPECT_FALSE(device->files().fileExists("/var/mobile/Containers/Data/com.example.a"));
  EXPECT_EQ(device->uninstalledApplications(), Lines{std::string(Id)});
}

TEST_F(RemovalTest, OfAnUpdateThePlaceholderGoesFirst) {
  ASSERT_TRUE(installPackage(Id, "1.0"));
  putFile(Notes, "mine");
  ASSERT_TRUE(installPlaceholder(Id, "2.0"));
  EXPECT_TRUE(uninstall());
  EXPECT_EQ(registry(), Lines{"com.example.a 1.0"});
  EXPECT_EQ(containerCount(), 1U);
  EXPECT_EQ(textAt(Notes), "mine");
  EXPECT_TRUE(device->uninstalledApplications().empty());
}

TEST_F(RemovalTest, PlaceholdersOnlyNeverTouchesAnInstalledVersion) {
  ASSERT_TRUE(installPackage(Id, "1.0"));
  EXPECT_FALSE(uninstall(true));
  ASSERT_TRUE(installPlaceholder(Id, "2.0"));
  EXPECT_TRUE(uninstall(true));
  EXPECT_FALSE(uninstall(true));
  EXPECT_EQ(registry(), Lines{"com.example.a 1.0"});
}

TEST_F(RemovalTest, APlaceholderThatAClientRemovesIsNotReportedAsUninstalled) {
  ASSERT_TRUE(installPlaceholder(Id));
  EXPECT_TRUE(uninstall());
  EXPECT_FALSE(uninstall());
  EXPECT_TRUE(registry().empty());
  EXPECT_TRUE(device->uninstalledApplications().empty());
}

TEST_F(RemovalTest, APersonRemovesAndDemotesNothingThatThePolicyForbidsToRemove) {
  ASSERT_TRUE(installPackage(Id));
  putFile(Notes, "mine");
  for (const auto removal : {&EmbeddedDevice::uninstall, &EmbeddedDevice::demote}) {
    ASSERT_TRUE(
        device->setPolicy(PolicySetting::AppRemovalAllowed, PolicyValue::ExplicitlyNo, nullptr));
    error.reset();
    EXPECT_FALSE((*device.*removal)(Id, &error));
    ASSERT_TRUE(error);
    EXPECT_EQ(error->localizedDescription(), "removing applications is forbidden on this phone");
    EXPECT_EQ(registry(), Lines{"com.example.a 1.0"});
    EXPECT_EQ(textAt(Notes), "mine");
    ASSERT_TRUE(device->setPolicy(PolicySetting::AppRemovalAllowed, PolicyValue::Yes, nullptr));
    EXPECT_TRUE((*device.*removal)(Id, &error));
    ASSERT_TRUE(installPackage(Id));
    putFile(Notes, "mine");
  }
}

TEST_F(RemovalTest, APersonRemovesApplicationPlaceholderAndAllData) {
  const std::string waiting = "/var/mobile/Media/HalvoRestore/Data/com.example.a";
  ASSERT_TRUE(installPackage(Id, "1.0"));
  putFile(Notes, "mine");
  ASSERT_TRUE(installPlaceholder(Id, "2.0"));
  putFile(waiting + "/notes", "from the backup");
  EXPECT_TRUE(device->uninstall(Id, &error));
  EXPECT_TRUE(registry().empty());
  EXPECT_EQ(containerCount(), 0U);
  EXPECT_FALSE(device->files().fileExists(Notes));
  EXPECT_FALSE(device->files().fileExists(waiting));
  EXPECT_EQ(device->uninstalledApplications(), Lines{std::string(Id)});
  EXPECT_FALSE(device->uninstall(Id, &error));
  EXPECT_EQ(error->code, ENOENT);
}

TEST_F(RemovalTest, APlaceholderThatAPersonRemovesIsReportedAsUninstalled) {
  ASSERT_TRUE(installPlaceholder(Id));
  EXPECT_TRUE(device->uninstall(Id, &error));
  EXPECT_EQ(device->uninstalledApplications(), Lines{std::string(Id)});
}

TEST_F(RemovalTest, OnlyThePackageTakesAnApplicationOffTheUninstalledList) {
  ASSERT_TRUE(installPackage(Id));
  ASSERT_TRUE(device->uninstall(Id, &error));
  ASSERT_TRUE(installPlaceholder(Id));
  EXPECT_EQ(device->uninstalledApplications(), Lines{std::string(Id)});
  ASSERT_TRUE(installPackage(Id));
  EXPECT_TRUE(device->uninstalledApplications().empty());
}

TEST_F(RemovalTest, TheUninstalledListSurvivesClosingUntilItIsCleared) {
  ASSERT_TRUE(installPackage("com.example.a"));
  ASSERT_TRUE(installPackage("com.example.b"));
  ASSERT_TRUE(device->uninstall("com.example.a", &error));
  ASSERT_TRUE(device->uninstall("com.example.b", &error));
  reopen();
  const auto list = platform().installerService.lookupUninstalled();
  ASSERT_TRUE(list);
  EXPECT_EQ(list->size(), 2U);
  EXPECT_TRUE(list->contains("com.example.a"));
  EXPECT_EQ(platform().installerService.clearUninstalled({"com.example.a", "com.example.none"}), 0);
  EXPECT_EQ(device->uninstalledApplications(), Lines{"com.example.b"});
}

TEST_F(RemovalTest, AReinstalledApplicationBeginsWithoutTheOldData) {
  ASSERT_TRUE(installPackage(Id));
  putFile(Notes, "mine");
  ASSERT_TRUE(uninstall());
  ASSERT_TRUE(installPackage(Id));
  EXPECT_FALSE(device->files().fileExists(Notes));
  reopen();
  EXPECT_TRUE(device->files().directoryExists("/var/mobile/Containers/Data/com.example.a"));
}

TEST_F(RemovalTest, WhatWaitsTakesItsDataAlongWhenAClientRemovesIt) {
  const std::string waiting = "/var/mobile/Media/HalvoRestore/Data/com.example.a";
  for (const InstallType type : {InstallType::Restore, InstallType::Downgrade,
                                 InstallType::IntentionalDowngrade, InstallType::StoreDownload}) {
    ASSERT_TRUE(installPlaceholder(
        Id, "1.0", {{std::string(SWInstallTypeKey), static_cast<std::uint64_t>(type)}}));
    putFile(Notes, "mine");
    putFile(waiting + "/notes", "from the backup");
    EXPECT_TRUE(uninstall());
    EXPECT_TRUE(registry().empty());
    EXPECT_FALSE(device->files().fileExists("/var/mobile/Containers/Data/com.example.a"));
    EXPECT_FALSE(device->files().fileExists(waiting));
    EXPECT_EQ(device->homeScreenOrder(), Lines());
    EXPECT_EQ(device->uninstalledApplications(), Lines());
  }
}

TEST_F(RemovalTest, OfWhatWaitsOnlyThePlaceholderGoesWhenJustThatIsToGo) {
  ASSERT_TRUE(installRestorePlaceholder(Id));
  putFile(Notes, "mine");
  EXPECT_TRUE(uninstall(true));
  EXPECT_TRUE(registry().empty());
  EXPECT_EQ(textAt(Notes), "mine");
}

TEST_F(RemovalTest, AnInstallThatComesToNothingLeavesTheDataThatWasThere) {
  ASSERT_TRUE(installPlaceholder(Id));
  putFile(Notes, "mine");
  EXPECT_TRUE(uninstall());
  EXPECT_EQ(textAt(Notes), "mine");
}

}  // namespace
}  // namespace appsync::device
