#include "device/files/file_receiver.h"

#include <gtest/gtest.h>

#include "device/files/file_manager.h"
#include "tests/fakes/temporary_folder.h"

namespace appsync::device::testing {
namespace {

namespace fs = std::filesystem;

class FileReceiverTest : public ::testing::Test {
 protected:
  const fakes::TemporaryFolder folder_;
  const bool made_ = fs::create_directory(folder_ / "root");
  ConfinedFileManager files_{folder_ / "root"};
  std::optional<Error> error_;
};

TEST_F(FileReceiverTest, FileAppearsWholeWhenItIsFinished) {
  const auto receiver = receiveInto(files_, "/staging/deep/package", &error_);
  ASSERT_TRUE(receiver);
  EXPECT_TRUE(receiver->append(asBytes("one "), nullptr));
  EXPECT_TRUE(receiver->append({}, nullptr));
  EXPECT_TRUE(receiver->append(asBytes("two"), nullptr));
  EXPECT_FALSE(files_.fileExists("/staging/deep/package"));
  EXPECT_TRUE(receiver->finish(Durability::Cached, nullptr));
  EXPECT_EQ(fakes::snapshot(folder_ / "root/staging/deep"),
            (std::map<std::string, std::string>{{"package", "file 0644 one two"}}));
}

TEST_F(FileReceiverTest, BrokenOffTransferLeavesWhatStoodThere) {
  fakes::putFile(folder_ / "root/staging/package", "old");
  auto receiver = receiveInto(files_, "/staging/package", &error_);
  ASSERT_TRUE(receiver);
  EXPECT_TRUE(receiver->append(asBytes("new"), nullptr));
  receiver.reset();
  EXPECT_EQ(fakes::snapshot(folder_ / "root/staging"),
            (std::map<std::string, std::string>{{"package", "file 0644 old"}}));
}

TEST_F(FileReceiverTest, ReplacesAnOlderFile) {
  fakes::putFile(folder_ / "root/package", "old");
  const auto receiver = receiveInto(files_, "/package", &error_);
  EXPECT_TRUE(receiver->append(asBytes("new"), nullptr));
  EXPECT_TRUE(receiver->finish(Durability::Cached, nullptr));
  EXPECT_EQ(fakes::fileText(folder_ / "root/package"), "new");
}

TEST_F(FileReceiverTest, NothingComesAfterTheEnd) {
  const auto receiver = receiveInto(files_, "/package", &error_);
  EXPECT_TRUE(receiver->finish(Durability::Cached, nullptr));
  EXPECT_FALSE(receiver->append(asBytes("late"), &error_));
  EXPECT_FALSE(receiver->finish(Durability::Cached, &error_));
  EXPECT_EQ(error_->code, EBADF);
  EXPECT_EQ(fakes::fileText(folder_ / "root/package"), "");
}

TEST_F(FileReceiverTest, CannotBeginWhereNoFileCanBe) {
  fakes::putFile(folder_ / "root/file", "x");
  fs::create_directory(folder_ / "root/folder");
  for (const auto& [path, code] :
       {std::pair("", EINVAL), std::pair("relative", EINVAL), std::pair("/", EINVAL),
        std::pair("/a/..", EINVAL), std::pair("/folder", EISDIR), std::pair("/folder/", EINVAL)}) {
    error_.reset();
    EXPECT_FALSE(receiveInto(files_, path, &error_)) << path;
    ASSERT_TRUE(error_) << path;
    EXPECT_EQ(error_->code, code) << path;
  }
  EXPECT_FALSE(receiveInto(files_, "/file/inner", &error_));
  EXPECT_EQ(fakes::fileText(folder_ / "root/file"), "x");
}

TEST_F(FileReceiverTest, OutlivesTheFileManager) {
  auto files = std::make_unique<ConfinedFileManager>(folder_ / "root");
  const auto receiver = receiveInto(*files, "/package", &error_);
  files.reset();
  EXPECT_TRUE(receiver->append(asBytes("x"), nullptr));
  EXPECT_TRUE(receiver->finish(Durability::Cached, nullptr));
}

}  // namespace
}  // namespace appsync::device::testing
