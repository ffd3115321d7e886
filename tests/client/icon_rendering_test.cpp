// A bundle's icon, drawn as this device shows it and saved as a picture.
#include "tests/client/client_test.h"

namespace appsync {
namespace {

const std::string BundlePath = "/var/mobile/Media/PublicStaging/com.a/Chess.app";
const std::string TargetPath = "/tmp/com.a.png";
const std::string Write = "FileManager.writeAtomically(" + TargetPath + ")";

class IconRendering : public ClientTest {
 protected:
  void putBundle() {
    phone.files.putPlist(BundlePath + "/Info.plist", Dictionary{{"KBBundleIconFile", "Icon.png"}});
    phone.files.putFile(BundlePath + "/Icon.png", "picture");
  }

  bool render(const std::optional<std::string>& bundlePath = BundlePath) {
    return client()._makeIconFromBundlePath(bundlePath, TargetPath);
  }

  /// No line but this, and no file.
  void expectFailure(const Lines& expected, const char* file = __builtin_FILE(),
                     int line = __builtin_LINE()) {
    expectTrace(expected, fakes::TraceEffects, file, line);
    EXPECT_FALSE(phone.files.exists(TargetPath));
  }
};

TEST_F(IconRendering, SavesTheIconInOneStepWithoutAWord) {
  putBundle();
  EXPECT_TRUE(render());
  EXPECT_THAT(phone.trace.lines(fakes::TraceQuery),
              testing::IsSupersetOf({"IconRenderer.renderHomeScreenIcon(" + BundlePath + ")",
                                     std::string("ImageEncoder.create(public.png, 1)")}));
  expectTrace({Write});
  EXPECT_EQ(phone.files.textAt(TargetPath), "public.png 2x2");
}

TEST_F(IconRendering, ReplacesAnEarlierIcon) {
  putBundle();
  phone.files.putFile(TargetPath, "a much longer earlier picture");
  EXPECT_TRUE(render());
  EXPECT_EQ(phone.files.textAt(TargetPath), "public.png 2x2");
}

TEST_F(IconRendering, FailsWithoutABundlePath) {
  EXPECT_FALSE(render(std::nullopt));
  expectFailure({"log error SyncBundle|missing bundlePath"});
}

TEST_F(IconRendering, FailsForAPathThatIsNoLocation) {
  EXPECT_FALSE(render(""));
  expectFailure({"log error SyncBundle|couldn't create URL"});
  EXPECT_FALSE(render(std::string("/tmp/a\0b", 8)));
  expectFailure({"log error SyncBundle|couldn't create URL"});
}

TEST_F(IconRendering, FailsWhenThereIsNoBundle) {
  EXPECT_FALSE(render());
  expectFailure({"log error SyncBundle|couldn't create bundle from URL"});
  phone.files.putFile(BundlePath, "a file");
  EXPECT_FALSE(render());
  expectFailure({"log error SyncBundle|couldn't create bundle from URL"});
}

TEST_F(IconRendering, FailsForADirectoryThatHasNoIcon) {
  phone.files.putDirectory(BundlePath);
  EXPECT_FALSE(render());
  expectFailure({"log error SyncBundle|couldn't create DS icon from bundle"});
}

TEST_F(IconRendering, FailsForABundleWhoseInfoIsDamaged) {
  putBundle();
  phone.files.putFile(BundlePath + "/Info.plist", "no property list");
  EXPECT_FALSE(render());
  expectFailure({"log error SyncBundle|couldn't create DS icon from bundle"});
}

TEST_F(IconRendering, FailsWithoutAnEncoder) {
  putBundle();
  phone.imageEncoders.failCreate(true);
  EXPECT_FALSE(render());
  expectFailure({"log error SyncBundle|couldn't create image"});
}

TEST_F(IconRendering, FailsWhenThePictureCannotBeEncoded) {
  putBundle();
  phone.imageEncoders.failFinalize(true);
  EXPECT_FALSE(render());
  expectFailure({"log error SyncBundle|Couldn't finalize image"});
}

TEST_F(IconRendering, FailsAfterASuccessfulRenderWhenTheTargetCannotBeWritten) {
  putBundle();
  phone.faults.failEvery("FileManager.writeAtomically", Error::posix(28));
  EXPECT_FALSE(render());
  expectFailure(
      {"fault " + Write, "log error SyncBundle|Couldn't save image file to " + TargetPath});
}

TEST_F(IconRendering, AFailureLeavesAnEarlierIconAsItWas) {
  putBundle();
  phone.files.putFile(TargetPath, "earlier");
  phone.imageEncoders.failFinalize(true);
  EXPECT_FALSE(render());
  EXPECT_EQ(phone.files.textAt(TargetPath), "earlier");
}

}  // namespace
}  // namespace appsync
