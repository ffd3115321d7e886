#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <atomic>
#include <thread>

#include "device/files/file_manager.h"
#include "device/files/file_receiver.h"
#include "tests/fakes/temporary_folder.h"

namespace appsync::device::testing {
namespace {

namespace fs = std::filesystem;

/// A phone in whose file system links stand that point out of it, beside a folder that must stay
/// as it is.
class PlantedLinks : public ::testing::Test {
 protected:
  PlantedLinks() {
    fakes::putFile(folder_ / "outside/secret", "secret");
    fakes::putFile(folder_ / "root/inside/a", "a");
    const fs::path root = folder_ / "root";
    const std::string up = "../../../../../../../../../../..";
    fs::create_symlink(folder_ / "outside", root / "absolute");
    fs::create_symlink("../outside", root / "relative");
    fs::create_symlink(up + (folder_ / "outside").string(), root / "climbing");
    fs::create_symlink("/proc/self/root" + (folder_ / "outside").string(), root / "magic");
    fs::create_symlink(folder_ / "outside/secret", root / "file");
    fs::create_symlink("relative", root / "chain");
    fs::create_symlink("loop", root / "loop");
    before_ = fakes::snapshot(folder_ / "outside");
  }

  void expectOutsideUntouched() const { EXPECT_EQ(fakes::snapshot(folder_ / "outside"), before_); }

  const std::vector<std::string> directoryLinks_{
      "/absolute", "/relative", "/climbing", "/magic", "/chain", "/loop", "/inside/../relative"};
  const fakes::TemporaryFolder folder_;
  std::map<std::string, std::string> before_;
  const bool made_ = fs::create_directory(folder_ / "root");
  ConfinedFileManager files_{folder_ / "root"};
};

TEST_F(PlantedLinks, AreNeverReadThrough) {
  for (const std::string& link : directoryLinks_) {
    EXPECT_FALSE(files_.contentsAtPath(link + "/secret")) << link;
    EXPECT_FALSE(files_.fileExists(link + "/secret")) << link;
    EXPECT_FALSE(files_.attributesOfItem(link + "/secret")) << link;
    EXPECT_FALSE(files_.openDirectory(link)) << link;
    EXPECT_FALSE(files_.copyItem(link + "/secret", "/stolen")) << link;
  }
  EXPECT_FALSE(files_.contentsAtPath("/file"));
  EXPECT_FALSE(files_.contentsAtPath("/.." + (folder_ / "outside/secret").string()));
}

TEST_F(PlantedLinks, AreNeverWrittenThrough) {
  for (const std::string& link : directoryLinks_) {
    const std::string path = link + "/new";
    EXPECT_FALSE(files_.writeAtomically(path, asBytes("x"))) << link;
    EXPECT_FALSE(files_.createFile(path, asBytes("x"), {})) << link;
    EXPECT_FALSE(files_.createDirectory(path, true, {})) << link;
    EXPECT_FALSE(files_.createDirectory(path, false, {})) << link;
    EXPECT_FALSE(files_.touch(link + "/secret")) << link;
    EXPECT_FALSE(files_.removeItem(link + "/secret")) << link;
    EXPECT_FALSE(files_.moveItem("/inside", path)) << link;
    EXPECT_FALSE(files_.moveItem(link + "/secret", "/stolen")) << link;
    EXPECT_FALSE(files_.copyItem("/inside", path)) << link;
    EXPECT_FALSE(receiveInto(files_, path, nullptr)) << link;
    files_.removeTemporaries(link, Reach::AllBelow);
  }
  expectOutsideUntouched();
}

TEST_F(PlantedLinks, StandingInTheTargetsPlaceAreReplacedThemselves) {
  EXPECT_TRUE(files_.writeAtomically("/file", asBytes("mine")));
  EXPECT_EQ(asText(*files_.contentsAtPath("/file")), "mine");
  EXPECT_TRUE(files_.createFile("/relative", asBytes("mine"), {}));
  EXPECT_EQ(asText(*files_.contentsAtPath("/relative")), "mine");
  expectOutsideUntouched();
}

TEST_F(PlantedLinks, AreRemovedMovedAndCopiedThemselves) {
  EXPECT_TRUE(files_.copyItem("/absolute", "/inside/copied"));
  EXPECT_TRUE(files_.moveItem("/relative", "/inside/moved"));
  EXPECT_TRUE(fs::is_symlink(folder_ / "root/inside/copied"));
  EXPECT_TRUE(files_.removeItem("/loop"));
  EXPECT_TRUE(files_.removeItem("/inside"));
  EXPECT_FALSE(files_.fileExists("/inside"));
  expectOutsideUntouched();
}

TEST_F(PlantedLinks, ThatStayInsideAreFollowed) {
  fs::create_symlink("/inside", folder_ / "root/inner");
  fs::create_symlink("../../../inside", folder_ / "root/inside/around");
  EXPECT_EQ(asText(*files_.contentsAtPath("/inner/a")), "a");
  EXPECT_EQ(asText(*files_.contentsAtPath("/inside/around/around/a")), "a");
  EXPECT_TRUE(files_.writeAtomically("/inner/b", asBytes("b")));
  EXPECT_EQ(fakes::fileText(folder_ / "root/inside/b"), "b");
}

TEST_F(PlantedLinks, ParentStepsEndAtTheRoot) {
  fs::create_symlink("../../../inside", folder_ / "root/up");
  EXPECT_EQ(asText(*files_.contentsAtPath("/up/a")), "a");
  EXPECT_TRUE(files_.writeAtomically("/up/here", asBytes("x")));
  EXPECT_TRUE(fs::exists(folder_ / "root/inside/here"));
}

TEST_F(PlantedLinks, ExchangedUnderAWalkNeverLeadItOut) {
  // While one thread removes and copies a tree, another keeps turning a folder of it into a link.
  std::atomic<bool> stop = false;
  const fs::path place = folder_ / "root/tree/place";
  std::thread attacker([&] {
    std::error_code ignored;
    while (!stop) {
      fs::create_directories(place, ignored);
      fs::rename(place, folder_ / "root/aside", ignored);
      fs::create_symlink(folder_ / "outside", place, ignored);
      fs::remove(place, ignored);
      fs::remove_all(folder_ / "root/aside", ignored);
    }
  });
  for (int i = 0; i < 300; ++i) {
    files_.copyItem("/tree", "/copy");
    files_.createFile("/tree/place/new", asBytes("x"), {});
    files_.removeItem("/tree");
    EXPECT_FALSE(files_.fileExists("/copy/place/secret"));
    files_.removeItem("/copy");
  }
  stop = true;
  attacker.join();
  expectOutsideUntouched();
}

TEST(ConfinementBeneath, RefusesLinksAndParentStepsAltogether) {
  const fakes::TemporaryFolder folder;
  fakes::putFile(folder / "target/inner/a", "a");
  fakes::putFile(folder / "witness", "w");
  fs::create_symlink("inner", folder / "target/link");
  const ConfinedDirectory target = ConfinedDirectory::open(folder / "target", Confinement::Beneath);
  EXPECT_TRUE(target.openAt("inner/a", O_RDONLY));
  EXPECT_FALSE(target.openAt("link/a", O_RDONLY));
  EXPECT_EQ(errno, ELOOP);
  EXPECT_FALSE(target.openAt("../witness", O_RDONLY));
  EXPECT_EQ(errno, EXDEV);
  EXPECT_FALSE(target.openAt("inner/../../witness", O_RDONLY));
  EXPECT_FALSE(target.openAt((folder / "witness").string(), O_RDONLY));
  EXPECT_EQ(errno, EXDEV);
}

}  // namespace
}  // namespace appsync::device::testing
