#include "host/home_screen/home_screen_icons.h"

#include <gtest/gtest.h>

#include "device/embedded_device.h"
#include "icons/image_encoder.h"
#include "platform/property_list_codec.h"
#include "platform/sync_files.h"
#include "tests/host/host_files.h"

namespace appsync::host {
namespace {

using State = ScreenIcon::State;
using testing::Entries;
constexpr std::uint32_t Side = 8;

/// A PNG file of one colour.
std::string pictureFile(int red) {
  Image image{16, 16, {}};
  for (int i = 0; i < 16 * 16; ++i) {
    for (const int channel : {red, 0, 0, 255}) {
      image.pixels.push_back(static_cast<std::byte>(channel));
    }
  }
  Bytes file;
  const auto encoder = PngEncoderService().create(file, "public.png", 1);
  encoder->addImage(image);
  EXPECT_TRUE(encoder->finalize());
  return std::string(asText(file));
}

/// Red in the middle of the icon's picture; -1 without one.
int redOf(const std::optional<ScreenIcon>& icon) {
  if (!icon || !icon->picture) return -1;
  EXPECT_EQ(icon->picture->width, Side);
  return std::to_integer<int>(icon->picture->pixels.at((Side * Side / 2 + Side / 2) * 4));
}

class HomeScreenIconsTest : public ::testing::Test {
 protected:
  HomeScreenIconsTest() {
    device::DeviceError problem;
    EXPECT_TRUE(device::EmbeddedDevice::initialize(folder / "phone", {}, problem));
    open(device::Access::Write);
  }

  void open(device::Access access) {
    device::DeviceError problem;
    phone.reset();
    phone = device::EmbeddedDevice::open(folder / "phone", access, problem);
    if (!phone) throw std::runtime_error(problem.message);
  }

  void install(const std::string& identifier, const Entries& entries) {
    testing::pack(folder / "package.zip", entries);
    const std::string path = "/tmp/package.zip";
    const std::string package = testing::fileText(folder / "package.zip");
    ASSERT_TRUE(phone->files().writeAtomically(path, asBytes(package)));
    finish(FileLocation::file(path), {{std::string(SWPackageTypeKey), SWPackageTypeCustomer},
                                      {std::string(KBBundleIdentifier), identifier}});
  }

  /// An application with a red icon and a redder artwork.
  Entries application(const std::string& name = "Sample") {
    Entries entries = testing::sampleEntries("com.a", "1.0", name);
    entries["Sample.app/Icon.png"] = pictureFile(100);
    entries["HalvoArtwork"] = pictureFile(200);
    return entries;
  }

  void addPlaceholder(const std::string& identifier, const std::string& icon = pictureFile(50),
                      InstallType type = InstallType::Sync, const std::string& name = "Coming") {
    const std::string bundle = "/tmp/" + identifier + ".app";
    const std::string info = testing::xmlText(testing::appInfo(identifier, "1.0", name));
    ASSERT_TRUE(phone->files().createDirectory(bundle, true, {}));
    ASSERT_TRUE(phone->files().writeAtomically(bundle + "/Info.plist", asBytes(info)));
    if (!icon.empty()) {
      ASSERT_TRUE(phone->files().writeAtomically(bundle + "/Icon.png", asBytes(icon)));
    }
    finish(FileLocation::directory(bundle),
           {{std::string(SWPackageTypeKey), SWPackageTypePlaceholder},
            {std::string(KBBundleIdentifier), identifier},
            {std::string(SWInstallTypeKey), static_cast<std::int64_t>(type)}});
  }

  std::shared_ptr<InstallProgress> progress(const std::string& identifier) {
    return phone->appRegistry().installProgressSync(
        *phone->appRegistry().recordForIdentifier(identifier, true));
  }

  std::optional<ScreenIcon> shown(const std::string& identifier) {
    return HomeScreenIcons(phone->phone(), Side).iconOf(identifier);
  }

  testing::Folder folder;
  std::unique_ptr<device::EmbeddedDevice> phone;

 private:
  void finish(const FileLocation& location, const PropertyList::Dictionary& options) {
    std::optional<Error> error;
    EXPECT_TRUE(phone->appRegistry().installApplication(location, options, &error))
        << error->localizedDescription();
  }
};

TEST_F(HomeScreenIconsTest, AnInstalledApplicationShowsItsNameAndIcon) {
  install("com.a", application("Tally"));
  const auto icon = shown("com.a");
  ASSERT_TRUE(icon);
  EXPECT_EQ(icon->name, "Tally");
  EXPECT_EQ(icon->state, State::Installed);
  EXPECT_EQ(redOf(icon), 100);
}

TEST_F(HomeScreenIconsTest, TheArtworkStandsInForABrokenOrMissingIcon) {
  Entries broken = application();
  broken["Sample.app/Icon.png"] = pictureFile(100).substr(0, 60);
  install("com.a", broken);
  EXPECT_EQ(redOf(shown("com.a")), 200);
  broken.erase("Sample.app/Icon.png");
  install("com.a", broken);
  EXPECT_EQ(redOf(shown("com.a")), 200);
}

TEST_F(HomeScreenIconsTest, WithoutAnyPictureThereIsNone) {
  Entries broken = application();
  broken["Sample.app/Icon.png"] = "no picture";
  broken["HalvoArtwork"] = "none either";
  install("com.a", broken);
  EXPECT_EQ(redOf(shown("com.a")), -1);
  broken.erase("HalvoArtwork");
  install("com.a", broken);
  EXPECT_EQ(redOf(shown("com.a")), -1);
}

TEST_F(HomeScreenIconsTest, ALinkOutOfThePhoneIsNotFollowed) {
  install("com.a", application());
  testing::putFile(folder / "outside.png", pictureFile(77));
  const auto record = phone->appRegistry().recordForIdentifier("com.a", false);
  for (const std::string& path :
       {*record->bundlePath + "/Icon.png", *record->bundleContainerPath + "/HalvoArtwork"}) {
    const auto file = folder / "phone" / "root" / path.substr(1);
    std::filesystem::remove(file);
    std::filesystem::create_symlink(folder / "outside.png", file);
  }
  EXPECT_EQ(redOf(shown("com.a")), -1);
}

TEST_F(HomeScreenIconsTest, AnApplicationWithoutANameShowsItsIdentifier) {
  install("com.a", application(""));
  EXPECT_EQ(shown("com.a")->name, "com.a");
}

TEST_F(HomeScreenIconsTest, WhatIsNotOnThePhoneHasNoIcon) {
  EXPECT_FALSE(shown("com.a"));
  EXPECT_FALSE(shown("../.."));
}

TEST_F(HomeScreenIconsTest, APlaceholderShowsTheProgressOfItsInstall) {
  addPlaceholder("com.new");
  EXPECT_EQ(shown("com.new")->state, State::Waiting);
  EXPECT_EQ(shown("com.new")->name, "Coming");
  EXPECT_EQ(redOf(shown("com.new")), 50);

  const auto install = progress("com.new");
  install->setInstallState(InstallState::Active);
  EXPECT_EQ(shown("com.new")->state, State::Loading);
  EXPECT_EQ(shown("com.new")->progress, 0);
  install->setTotalUnitCount(1000);
  install->setCompletedUnitCount(250);
  EXPECT_EQ(shown("com.new")->progress, 0.25);
  install->setInstallState(InstallState::Paused);
  EXPECT_EQ(shown("com.new")->state, State::Paused);
  install->setInstallState(InstallState::Active);
  install->setInstallPhase(InstallPhase::Installing);
  EXPECT_EQ(shown("com.new")->progress, 1);
  install->setInstallState(InstallState::Failed);
  EXPECT_EQ(shown("com.new")->state, State::Away);
}

TEST_F(HomeScreenIconsTest, ProgressIsSeenByAnotherProcessThatOnlyReads) {
  addPlaceholder("com.new");
  progress("com.new")->setInstallState(InstallState::Active);
  device::DeviceError problem;
  const auto reader =
      device::EmbeddedDevice::open(folder / "phone", device::Access::ReadOnly, problem);
  ASSERT_TRUE(reader) << problem.message;
  EXPECT_EQ(HomeScreenIcons(reader->phone(), Side).iconOf("com.new")->state, State::Loading);
}

TEST_F(HomeScreenIconsTest, AnInstallThatWasBrokenOffIsPaused) {
  addPlaceholder("com.new");
  progress("com.new")->setInstallState(InstallState::Active);
  open(device::Access::Write);
  EXPECT_EQ(shown("com.new")->state, State::Paused);
}

TEST_F(HomeScreenIconsTest, ADemotedApplicationIsAwayUntilItsPackageComes) {
  for (const InstallType type : {InstallType::Downgrade, InstallType::IntentionalDowngrade}) {
    addPlaceholder("com.new", pictureFile(50), type);
    EXPECT_EQ(shown("com.new")->state, State::Away);
    open(device::Access::Write);
    EXPECT_EQ(shown("com.new")->state, State::Away);
    progress("com.new")->setInstallState(InstallState::Active);
    EXPECT_EQ(shown("com.new")->state, State::Loading);
  }
}

TEST_F(HomeScreenIconsTest, APlaceholderOfARestoreIsAwayIfItsApplicationIsDemoted) {
  addPlaceholder("com.a", pictureFile(50), InstallType::Restore);
  addPlaceholder("com.b", pictureFile(50), InstallType::Restore);
  const auto list = serializePropertyList(
      PropertyList::Dictionary{{"IntentionalDowngrades", PropertyList::Array{"com.b"}}},
      PropertyListFormat::Binary);
  ASSERT_TRUE(phone->files().createDirectory(exchange::SyncRoot, true, {}));
  ASSERT_TRUE(phone->files().writeAtomically(exchange::DemotedApplications, *list));
  EXPECT_EQ(shown("com.a")->state, State::Waiting);
  EXPECT_EQ(shown("com.b")->state, State::Away);
}

TEST_F(HomeScreenIconsTest, AnUpdateIsShownAsItsPlaceholderWithWhatThatLacks) {
  install("com.a", application("Tally"));
  addPlaceholder("com.a", "", InstallType::Sync, "");
  const auto icon = shown("com.a");
  EXPECT_EQ(icon->state, State::Waiting);
  EXPECT_EQ(icon->name, "Tally");
  EXPECT_EQ(redOf(icon), 100);
}

}  // namespace
}  // namespace appsync::host
