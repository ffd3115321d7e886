#include "packages/package_extractor.h"
#include "platform/installer_service.h"
#include "tests/device/device_test.h"

namespace appsync::device {
namespace {

using Lines = std::vector<std::string>;
constexpr std::string_view Id = "com.example.a";
constexpr std::string_view BundleInTmp = "/tmp/com.corvane.twc.Apps/com.example.a.app";

class PlaceholderInstallTest : public DeviceTest {
 protected:
  bool installBundle(std::string_view info) {
    putFile(joinPath(BundleInTmp, "Info.plist"), info);
    error.reset();
    return device->appRegistry().installApplication(
        FileLocation::directory(std::string(BundleInTmp)),
        {{std::string(SWPackageTypeKey), SWPackageTypePlaceholder},
         {std::string(KBBundleIdentifier), Id}},
        &error);
  }
  std::int64_t refusalCode() const {
    return error && error->domain == InstallerServiceErrorDomain ? error->code : -1;
  }
};

TEST_F(PlaceholderInstallTest, ThePlaceholderIsACopyOfItsBundle) {
  ASSERT_TRUE(installPlaceholder(Id, "3.1"));
  const auto placeholder = record(Id, true);
  ASSERT_TRUE(placeholder);
  EXPECT_TRUE(placeholder->isPlaceholder);
  EXPECT_TRUE(placeholder->isInstalled);
  EXPECT_EQ(placeholder->bundleVersion, "3.1");
  EXPECT_EQ(placeholder->displayName, "Sample");
  EXPECT_EQ(placeholder->installType, InstallType::Sync);
  EXPECT_GT(placeholder->staticDiskUsage, 0U);
  EXPECT_EQ(*placeholder->bundlePath, *placeholder->bundleContainerPath + "/com.example.a.app");
  EXPECT_EQ(fakes::snapshot(onDisk(*placeholder->bundlePath)),
            fakes::snapshot(onDisk(BundleInTmp)));
}

TEST_F(PlaceholderInstallTest, ItsStoreMetadataIsKeptAsReceived) {
  const Bytes metadata = toBytes("any bytes \x01");
  ASSERT_TRUE(installPlaceholder(Id, "1.0",
                                 {{std::string(SWInstallTypeKey), 2},
                                  {std::string(SWHalvoMetadataKey), metadata},
                                  {std::string(SWApplicationSINFKey), PropertyList::null()}}));
  EXPECT_EQ(record(Id, true)->installType, InstallType::Restore);
  EXPECT_EQ(textAt(*record(Id, true)->bundleContainerPath + "/HalvoMetadata.plist"),
            asText(metadata));
}

TEST_F(PlaceholderInstallTest, AnUnknownInstallTypeIsPassedThrough) {
  ASSERT_TRUE(installPlaceholder(Id, "1.0", {{std::string(SWInstallTypeKey), 9}}));
  EXPECT_EQ(static_cast<int>(record(Id, true)->installType), 9);
}

TEST_F(PlaceholderInstallTest, ASecondPlaceholderReplacesTheFirstAndBeginsTheInstallAnew) {
  ASSERT_TRUE(installPlaceholder(Id, "1.0"));
  const auto first = device->appRegistry().installProgressSync(*record(Id, true));
  first->setInstallState(InstallState::Active);
  ASSERT_TRUE(installPlaceholder(Id, "2.0"));
  EXPECT_EQ(registry(), Lines{"com.example.a 2.0 (placeholder)"});
  EXPECT_EQ(containerCount(), 1U);
  const auto second = device->appRegistry().installProgressSync(*record(Id, true));
  EXPECT_EQ(second->installState(), InstallState::Waiting);
  EXPECT_EQ(first->installState(), InstallState::Canceled);
  first->setInstallState(InstallState::Active);
  EXPECT_EQ(second->installState(), InstallState::Waiting);
}

TEST_F(PlaceholderInstallTest, ABundleWithoutAUsableInfoPlistIsRefusedByName) {
  EXPECT_FALSE(installBundle("no property list"));
  EXPECT_EQ(refusalCode(), static_cast<std::int64_t>(PackageRefusal::BadInfo));
  EXPECT_FALSE(installBundle(xml(PropertyList::Array{"an array"})));
  EXPECT_EQ(refusalCode(), static_cast<std::int64_t>(PackageRefusal::BadInfo));
  EXPECT_FALSE(installBundle(xml(PropertyList::Dictionary{{"other", "thing"}})));
  EXPECT_EQ(refusalCode(), static_cast<std::int64_t>(PackageRefusal::BadInfo));
  EXPECT_FALSE(installBundle(xml(infoOf("com.example.b", "1.0"))));
  EXPECT_EQ(refusalCode(), static_cast<std::int64_t>(PackageRefusal::WrongIdentifier));
  EXPECT_TRUE(registry().empty());
  EXPECT_EQ(containerCount(), 0U);
}

TEST_F(PlaceholderInstallTest, ARefusedPlaceholderLeavesTheFormerOneWhole) {
  ASSERT_TRUE(installPlaceholder(Id, "1.0"));
  const auto before = fakes::snapshot(onDisk(*record(Id, true)->bundleContainerPath));
  EXPECT_FALSE(installBundle("no property list"));
  EXPECT_EQ(registry(), Lines{"com.example.a 1.0 (placeholder)"});
  EXPECT_EQ(fakes::snapshot(onDisk(*record(Id, true)->bundleContainerPath)), before);
}

}  // namespace
}  // namespace appsync::device
