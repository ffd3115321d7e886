#include "device/files/file_manager.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/stat.h>

#include <atomic>
#include <csignal>
#include <thread>

#include "tests/fakes/temporary_folder.h"

namespace appsync::device::testing {
namespace {

namespace fs = std::filesystem;

class FileManagerTest : public ::testing::Test {
 protected:
  fs::path onDisk(std::string_view path) const { return folder_ / ("root" + std::string(path)); }
  std::int64_t code() const { return error_ ? error_->code : 0; }

  const fakes::TemporaryFolder folder_;
  const bool made_ = fs::create_directory(folder_ / "root");
  ConfinedFileManager files_{folder_ / "root"};
  std::optional<Error> error_;
};

TEST_F(FileManagerTest, MissingRootFailsEveryCallWithTheReason) {
  ConfinedFileManager nowhere(folder_ / "missing");
  EXPECT_FALSE(nowhere.isOpen());
  EXPECT_FALSE(nowhere.writeAtomically("/a", asBytes("x"), &error_));
  EXPECT_EQ(code(), ENOENT);
  EXPECT_FALSE(nowhere.fileExists("/"));
}

TEST_F(FileManagerTest, RefusesPathsThatAreNotThePhones) {
  for (const std::string_view path :
       {std::string_view(), std::string_view("var"), std::string_view("/a\0b", 4)}) {
    error_.reset();
    EXPECT_FALSE(files_.contentsAtPath(path, &error_));
    EXPECT_EQ(code(), EINVAL);
    error_.reset();
    EXPECT_FALSE(files_.writeAtomically(path, {}, &error_));
    EXPECT_EQ(code(), EINVAL);
    EXPECT_FALSE(files_.fileExists(path));
  }
}

TEST_F(FileManagerTest, WriteLeavesExactlyTheFile) {
  EXPECT_TRUE(files_.writeAtomically("/a", asBytes("one")));
  EXPECT_TRUE(files_.writeAtomically("/a", asBytes("two")));
  EXPECT_EQ(fakes::snapshot(folder_ / "root"),
            (std::map<std::string, std::string>{{"a", "file 0644 two"}}));
}

TEST_F(FileManagerTest, FailedWriteLeavesNoTemporaryFileAndTheOldBytes) {
  fs::create_directories(onDisk("/directory/inner"));
  EXPECT_FALSE(files_.writeAtomically("/directory", asBytes("x"), &error_));
  EXPECT_EQ(code(), EISDIR);
  EXPECT_FALSE(files_.writeAtomically("/missing/a", asBytes("x"), &error_));
  EXPECT_EQ(code(), ENOENT);

  fakes::putFile(onDisk("/a"), "old");
  rlimit before{};
  ASSERT_EQ(::getrlimit(RLIMIT_FSIZE, &before), 0);
  const auto handler = std::signal(SIGXFSZ, SIG_IGN);
  const rlimit small{10, before.rlim_max};
  ASSERT_EQ(::setrlimit(RLIMIT_FSIZE, &small), 0);
  const bool written = files_.writeAtomically("/a", asBytes("longer than ten bytes"), &error_);
  ::setrlimit(RLIMIT_FSIZE, &before);
  std::signal(SIGXFSZ, handler);
  EXPECT_FALSE(written);
  EXPECT_EQ(code(), EFBIG);
  EXPECT_EQ(fakes::snapshot(folder_ / "root"),
            (std::map<std::string, std::string>{{"a", "file 0644 old"},
                                                {"directory", "folder 0755"},
                                                {"directory/inner", "folder 0755"}}));
}

TEST_F(FileManagerTest, ReaderSeesOldOrNewBytesWhileAFileIsRewritten) {
  const Bytes old(100'000, std::byte{'a'});
  const Bytes fresh(150'000, std::byte{'b'});
  ASSERT_TRUE(files_.writeAtomically("/a", old));
  std::atomic<bool> stop = false;
  std::thread writer([&] {
    for (int i = 0; i < 20; ++i) EXPECT_TRUE(files_.writeAtomically("/a", i % 2 ? old : fresh));
    stop = true;
  });
  while (!stop) {
    const std::optional<Bytes> seen = files_.contentsAtPath("/a");
    EXPECT_TRUE(seen && (*seen == old || *seen == fresh));
  }
  writer.join();
}

TEST_F(FileManagerTest, OnlyRegularFilesAreReadAndAPipeDoesNotBlock) {
  ASSERT_EQ(::mkfifo(onDisk("/pipe").c_str(), 0644), 0);
  EXPECT_FALSE(files_.contentsAtPath("/pipe", &error_));
  EXPECT_EQ(code(), EINVAL);
  EXPECT_FALSE(files_.contentsAtPath("/", &error_));
  EXPECT_EQ(code(), EISDIR);
}

TEST_F(FileManagerTest, FilesPastTheLimitAreNotRead) {
  fakes::putFile(onDisk("/large"), "");
  fs::resize_file(onDisk("/large"), ConfinedFileManager::MaximumContents + 1);
  EXPECT_FALSE(files_.contentsAtPath("/large", &error_));
  EXPECT_EQ(code(), EFBIG);
}

TEST_F(FileManagerTest, OwnerOfTheFolderIsMobile) {
  ASSERT_TRUE(files_.createFile("/a", asBytes("x"), {"mobile", "mobile"}));
  ASSERT_TRUE(files_.createDirectory("/d/e", true, {"mobile", std::nullopt}));
  for (const std::string_view path : {"/a", "/d", "/d/e", "/"}) {
    const std::optional<ItemAttributes> attributes = files_.attributesOfItem(path);
    ASSERT_TRUE(attributes);
    EXPECT_EQ(attributes->owner, "mobile");
    EXPECT_EQ(attributes->group, "mobile");
  }
}

TEST_F(FileManagerTest, OtherAccountsAreRefusedAndNothingIsMade) {
  EXPECT_FALSE(files_.createFile("/a", asBytes("x"), {"root", std::nullopt}));
  EXPECT_FALSE(files_.createFile("/a", asBytes("x"), {std::nullopt, "wheel"}));
  EXPECT_FALSE(files_.createDirectory("/d", true, {"root", std::nullopt}, &error_));
  EXPECT_EQ(code(), EPERM);
  EXPECT_TRUE(fs::is_empty(folder_ / "root"));
}

TEST_F(FileManagerTest, RootItselfIsNeitherRemovedNorMovedNorReplaced) {
  EXPECT_FALSE(files_.removeItem("/", &error_));
  EXPECT_EQ(code(), EBUSY);
  EXPECT_FALSE(files_.removeItem("/a/..", &error_));
  EXPECT_EQ(code(), EINVAL);
  EXPECT_FALSE(files_.removeItem("/.", &error_));
  EXPECT_FALSE(files_.moveItem("/", "/b", &error_));
  EXPECT_FALSE(files_.writeAtomically("/", asBytes("x"), &error_));
  EXPECT_FALSE(files_.createDirectory("/", false, {}, &error_));
  EXPECT_EQ(code(), EEXIST);
  EXPECT_TRUE(files_.createDirectory("/", true, {}));
  EXPECT_TRUE(files_.directoryExists("/"));
}

TEST_F(FileManagerTest, CopyTakesATreeWithModesAndLinksAsTheyAre) {
  fakes::putFile(onDisk("/from/inner/script"), "run");
  ::chmod(onDisk("/from/inner/script").c_str(), 0755);
  fs::create_symlink("../elsewhere", onDisk("/from/link"));
  ASSERT_TRUE(files_.copyItem("/from", "/to", &error_));
  EXPECT_EQ(fakes::snapshot(onDisk("/to")), fakes::snapshot(onDisk("/from")));
  EXPECT_EQ(fakes::snapshot(onDisk("/to")).at("link"), "link ../elsewhere");
}

TEST_F(FileManagerTest, FailedCopyLeavesNothing) {
  fakes::putFile(onDisk("/from/a"), "x");
  ASSERT_EQ(::mkfifo(onDisk("/from/pipe").c_str(), 0644), 0);
  const auto before = fakes::snapshot(folder_ / "root");
  EXPECT_FALSE(files_.copyItem("/from", "/to", &error_));
  EXPECT_EQ(code(), EINVAL);
  EXPECT_EQ(fakes::snapshot(folder_ / "root"), before);
}

TEST_F(FileManagerTest, CopyIntoItselfIsRefused) {
  fakes::putFile(onDisk("/a/b/c"), "x");
  const auto before = fakes::snapshot(folder_ / "root");
  EXPECT_FALSE(files_.copyItem("/a", "/a/copy", &error_));
  EXPECT_EQ(code(), EINVAL);
  EXPECT_FALSE(files_.copyItem("/a", "/a/b/copy", &error_));
  EXPECT_EQ(code(), EINVAL);
  EXPECT_EQ(fakes::snapshot(folder_ / "root"), before);
}

TEST_F(FileManagerTest, RemovesDeepAndWideTrees) {
  std::string deep = "/d";
  for (int i = 0; i < 200; ++i) deep += "/d";
  ASSERT_TRUE(files_.createDirectory(deep, true, {}));
  for (int i = 0; i < 500; ++i) fakes::putFile(onDisk("/d/f" + std::to_string(i)), "x");
  EXPECT_TRUE(files_.removeItem("/d", &error_));
  EXPECT_TRUE(fs::is_empty(folder_ / "root"));
}

TEST_F(FileManagerTest, TooDeepPathsAreRefused) {
  std::string deep;
  for (int i = 0; i < 257; ++i) deep += "/d";
  EXPECT_FALSE(files_.createDirectory(deep, true, {}, &error_));
  EXPECT_EQ(code(), ENAMETOOLONG);
}

TEST_F(FileManagerTest, ManyThreadsMayMakeTheSameFolders) {
  std::vector<std::thread> threads;
  std::atomic<int> made = 0;
  for (int i = 0; i < 8; ++i)
    threads.emplace_back([&] { made += files_.createDirectory("/a/b/c/d/e/f", true, {}) ? 1 : 0; });
  for (std::thread& thread : threads) thread.join();
  EXPECT_EQ(made, 8);
}

TEST_F(FileManagerTest, TemporaryFilesOfKilledProcessesCanBeSwept) {
  fakes::putFile(onDisk("/box/.appsync-0123456789abcdef"), "left over");
  fakes::putFile(onDisk("/box/inner/.appsync-fedcba9876543210"), "left over");
  fakes::putFile(onDisk("/box/.appsync-notes"), "kept");
  files_.removeTemporaries("/box", Reach::AllBelow);
  EXPECT_EQ(fakes::snapshot(onDisk("/box")),
            (std::map<std::string, std::string>{{".appsync-notes", "file 0644 kept"},
                                                {"inner", "folder 0755"}}));
}

}  // namespace
}  // namespace appsync::device::testing
