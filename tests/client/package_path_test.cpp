// Where a received package may lie, and what is deleted after its install.
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
    phone.files.putFile("/var/mobile/Media/PublicStagingToo/a.zip", "kept");
    phone.files.putFile("/var/mobile/Media/Photos/1.png", "kept");
    phone.files.putFile(SyncRootPath + "/LastSyncAppState.plist", "kept");
  }
};

class OtherPath : public PackagePath, public testing::WithParamInterface<const char*> {};

TEST_P(OtherPath, IsIgnoredAndNothingThereIsDeleted) {
  client();
  const auto before = phone.files.files();
  const SyncAssetPtr made = received(GetParam());
  succeed(made);
  settle();
  Lines trace = phone.trace.readable();
  trace.resize(5);
  EXPECT_THAT(trace,
              testing::ElementsAre(
                  "log default SyncBundle|transfer for asset com.a ended with success y error "
                  "(null) existingApp:0",
                  "log error SyncBundle|Returning (null) progress for com.a",
                  "log default SyncBundle|asset transfer succeeded for com.a",
                  "log default SyncBundle|Ignoring invalid path: " + *made->path,
                  "log default SyncBundle|asset transfer ended withsuccess: y"));
  EXPECT_EQ(phone.files.files(), before);
}

TEST_P(OtherPath, IsNotDeletedWhateverSetOffTheInstall) {
  phone.appRegistry.failInstall("com.a", Final);
  phone.host.setRecoverable("Final", false);
  const SyncAssetPtr made = received(GetParam());
  putTodo({});
  const auto before = phone.files.files();
  client()._performAssetInstall(made);
  EXPECT_EQ(phone.files.files(), before);
}

INSTANTIATE_TEST_SUITE_P(
    Paths, OtherPath,
    testing::Values("", ".", "/", "folder", "folder/", "/var/mobile/Media/PublicStaging",
                    "/var/mobile/Media/PublicStaging/", "/var/mobile/Media/PublicStaging/folder",
                    "/var/mobile/Media/Downloads", "/var/mobile/Media/PublicStagingToo/a.zip",
                    "/var/mobile/Media/Photos/1.png",
                    "/var/mobile/Library/ApplicationSync/"
                    "LastSyncAppState.plist"));

TEST_F(PackagePath, OfWhatCannotBeLookedAtJustNowIsUsedAndNotDeleted) {
  phone.faults.failWhere("FileManager.attributesOfItem", "a.zip", Error::posix(24));
  succeed(received("a.zip"));
  settle();
  EXPECT_TRUE(phone.appRegistry.installed("com.a"));
  EXPECT_TRUE(phone.files.exists(StagingRootPath + "/a.zip"));
}

TEST_F(PackagePath, OfAnAssetThatIsNoDownloadMayBeAnywhere) {
  const SyncAssetPtr made = received("/var/mobile/Media/Photos/1.png");
  made->isDownload = false;
  succeed(made);
  EXPECT_EQ(todoOperation("com.a"), "SENT");
  EXPECT_TRUE(phone.files.exists("/var/mobile/Media/Photos/1.png"));
}

}  // namespace
}  // namespace appsync
