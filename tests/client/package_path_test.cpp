// What is deleted after the install of a received package, wherever the host says that it lies.
#include "tests/client/transfer_results.h"

namespace appsync {
namespace {

const std::string Folder = StagingRootPath + "/folder";

class PackagePath : public TransferResults {
 protected:
  void SetUp() override {
    TransferResults::SetUp();
    putTodo({{"com.a", "install"}});
    phone.files.putFile(Folder + "/inside", "kept");
    phone.files.putDirectory("/var/mobile/Media/Downloads");
  }
};

class NoFile : public PackagePath, public testing::WithParamInterface<const char*> {};

TEST_P(NoFile, IsRefusedByTheRegistryAndNothingThereIsDeleted) {
  phone.appRegistry.failInstall("com.a", Final);
  phone.host.setRecoverable("Final", false);
  const SyncAssetPtr made = received(GetParam());
  auto before = phone.files.files();
  succeed(made);
  settle();
  EXPECT_EQ(todoOperation("com.a"), "FAILED");
  auto after = phone.files.files();
  before.erase(TodoListPath);
  after.erase(TodoListPath);
  EXPECT_EQ(after, before);
}

INSTANTIATE_TEST_SUITE_P(Paths, NoFile,
                         testing::Values("", ".", "/", "folder", "folder/",
                                         "/var/mobile/Media/PublicStaging",
                                         "/var/mobile/Media/PublicStaging/",
                                         "/var/mobile/Media/PublicStaging/folder",
                                         "/var/mobile/Media/Downloads"));

TEST_F(PackagePath, OfWhatCannotBeLookedAtJustNowIsUsedAndNotDeleted) {
  phone.faults.failWhere("FileManager.attributesOfItem", "a.zip", Error::posix(24));
  succeed(received("a.zip"));
  settle();
  EXPECT_TRUE(phone.appRegistry.installed("com.a"));
  EXPECT_TRUE(phone.files.exists(StagingRootPath + "/a.zip"));
}

TEST_F(PackagePath, OfAnAssetThatIsNoDownloadIsLeftAlone) {
  phone.files.putFile("/var/mobile/Media/Photos/1.png", "kept");
  const SyncAssetPtr made = received("/var/mobile/Media/Photos/1.png");
  made->isDownload = false;
  succeed(made);
  EXPECT_EQ(todoOperation("com.a"), "SENT");
  EXPECT_TRUE(phone.files.exists("/var/mobile/Media/Photos/1.png"));
}

}  // namespace
}  // namespace appsync
