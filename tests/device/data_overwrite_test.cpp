#include <gmock/gmock.h>
#include <unistd.h>

#include "device/files/containers.h"
#include "tests/device/data_trees.h"
#include "tests/device/device_test.h"
#include "tests/packages/package_builder.h"

namespace appsync::device {
namespace {

namespace fs = std::filesystem;
using Lines = std::vector<std::string>;

constexpr const char* App = "com.example.app";
const std::string Data = Containers::dataPath(App);
const std::string Archive = package_tests::buildArchive(package_tests::ArchiveForm::Tar,
                                                        {package_tests::RawEntry::folder("kept/"),
                                                         {"kept/notes", "from the backup"},
                                                         {"more", "more"}});

/// An installed application with data of its own.
class DataOverwriteTest : public DeviceTest {
 protected:
  DataOverwriteTest() {
    EXPECT_TRUE(installPackage(App));
    putFile(Data + "/notes", "mine");
    putFile(Data + "/folder/more", "mine too");
  }

  bool overwrite(std::string_view archive, std::string_view identifier = App) {
    error.reset();
    return device->overwriteData(identifier, piecesOf(archive), &error);
  }
  /// Of a refused call, which must leave everything as it was.
  std::string refusal(std::string_view archive, std::string_view identifier = App) {
    const auto before = contents();
    EXPECT_FALSE(overwrite(archive, identifier));
    EXPECT_EQ(contents(), before);
    return error ? error->localizedDescription() : "no reason";
  }
  std::map<std::string, std::string> contents() { return fakes::snapshot(onDisk("/var")); }
  std::map<std::string, std::string> data() { return fakes::snapshot(onDisk(Data)); }
  Lines namesBesideData() {
    Lines names;
    for (const auto& item : fs::directory_iterator(onDisk(Containers::DataDirectory))) {
      names.push_back(item.path().filename());
    }
    return names;
  }

  const std::map<std::string, std::string> given_ = {{"kept", "folder 0755"},
                                                     {"kept/notes", "file 0644 from the backup"},
                                                     {"more", "file 0644 more"}};
  const std::map<std::string, std::string> own_ = {{"folder", "folder 0755"},
                                                   {"folder/more", "file 0644 mine too"},
                                                   {"notes", "file 0644 mine"}};
};

TEST_F(DataOverwriteTest, AnInstalledApplicationGetsTheDataInThePlaceOfItsOwn) {
  ASSERT_TRUE(overwrite(Archive)) << error->localizedDescription();
  EXPECT_EQ(data(), given_);
  EXPECT_EQ(namesBesideData(), Lines{App}) << "the old data is gone";
  EXPECT_FALSE(platform().backupManager.restoreDataExists(App));
  EXPECT_EQ(version(App), "1.0");
}

TEST_F(DataOverwriteTest, TheHistoryTellsOfIt) {
  ASSERT_TRUE(overwrite(Archive));
  EXPECT_FALSE(overwrite("no archive"));
  EXPECT_EQ(history(), (Lines{"installed sync com.example.app 1.0",
                              "data-overwritten sync com.example.app 1.0"}));
}

TEST_F(DataOverwriteTest, AnApplicationWithoutADataFolderGetsOne) {
  fs::remove_all(onDisk(Data));
  ASSERT_TRUE(overwrite(Archive));
  EXPECT_EQ(data(), given_);
}

TEST_F(DataOverwriteTest, NoBytesLeaveItWithoutData) {
  ASSERT_TRUE(overwrite(""));
  EXPECT_TRUE(fs::is_empty(onDisk(Data)));
}

TEST_F(DataOverwriteTest, WhatIsNotInstalledOrOpenOrBeingUpdatedKeepsItsData) {
  EXPECT_EQ(refusal(Archive, "com.example.other"), "com.example.other is not installed");
  EXPECT_EQ(error->code, ENOENT);
  ASSERT_TRUE(installRestorePlaceholder("com.example.coming"));
  EXPECT_EQ(refusal(Archive, "com.example.coming"), "com.example.coming is not installed");
  DeviceError problem;
  ASSERT_TRUE(EmbeddedDevice::launch(folder, App, problem, &error));
  EXPECT_EQ(refusal(Archive), "com.example.app is open; close it first");
  EXPECT_EQ(error->code, EBUSY);
  ASSERT_TRUE(EmbeddedDevice::quit(folder, App, problem, &error));
  ASSERT_TRUE(installPlaceholder(App, "2.0"));
  EXPECT_EQ(refusal(Archive), "com.example.app is just being updated");
}

TEST_F(DataOverwriteTest, IdentifiersAndDevicesThatTakeNoDataRefuseIt) {
  for (const char* identifier : {"", "..", "a/b", "../x"}) {
    EXPECT_FALSE(overwrite(Archive, identifier));
    EXPECT_EQ(error->code, EINVAL);
  }
  reopen(Access::ReadOnly);
  EXPECT_FALSE(overwrite(Archive));
  EXPECT_EQ(error->code, EROFS);
}

TEST_F(DataOverwriteTest, ADamagedArchiveOrAFailingSourceChangesNothing) {
  EXPECT_THAT(refusal("nonsense"), ::testing::HasSubstr("damaged"));
  EXPECT_THAT(refusal(Archive.substr(0, 700)), ::testing::HasSubstr("damaged"));
  EXPECT_FALSE(device->overwriteData(
      App, [](std::uint8_t*, std::size_t) { return -1; }, &error));
  EXPECT_EQ(error->code, ECANCELED);
  EXPECT_EQ(data(), own_);
}

TEST_F(DataOverwriteTest, TheApplicationCannotBeOpenedMeanwhile) {
  auto pieces = piecesOf(Archive);
  std::optional<Error> reason;
  const auto source = [&](std::uint8_t* bytes, std::size_t size) {
    DeviceError problem;
    EXPECT_FALSE(EmbeddedDevice::launch(folder, App, problem, &reason));
    return pieces(bytes, size);
  };
  ASSERT_TRUE(device->overwriteData(App, source, &error));
  EXPECT_EQ(reason->localizedDescription(), "com.example.app is being installed; try again later");
  DeviceError problem;
  EXPECT_TRUE(EmbeddedDevice::launch(folder, App, problem, &reason));
}

TEST_F(DataOverwriteTest, AKillOnTheWayLeavesTheOldDataAndNothingElse) {
  device.reset();
  const int status = inOtherProcess([&] {
    reopen();
    auto pieces = piecesOf(Archive, 512);
    int left = 2;
    const auto deadly = [&](std::uint8_t* bytes, std::size_t size) {
      if (left-- == 0) ::_exit(77);
      return pieces(bytes, size);
    };
    device->overwriteData(App, deadly, nullptr);
    return 0;
  });
  EXPECT_EQ(status, 77);
  EXPECT_EQ(namesBesideData().size(), 2U) << "half of the new data must lie there";
  reopen();
  EXPECT_EQ(namesBesideData(), Lines{App});
  EXPECT_EQ(data(), own_);
}

}  // namespace
}  // namespace appsync::device
