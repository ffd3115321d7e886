#include "packages/archive_writer.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <functional>

#include "tests/host/host_files.h"

namespace appsync::host {
namespace {

namespace fs = std::filesystem;

class ArchiveWriterTest : public ::testing::Test {
 protected:
  /// What is wrong with an archive that this item is added to.
  std::string problemWith(const fs::path& item) {
    const int fd = ::open((folder_ / "out.tar").c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0600);
    std::string problem;
    {
      ArchiveWriter writer(fd, ".tar");
      writer.addFile("item", item, false);
      EXPECT_FALSE(writer.finish());
      problem = writer.problem();
    }
    ::close(fd);
    return problem;
  }

  testing::Folder folder_;
};

TEST_F(ArchiveWriterTest, TellsWhyAFileCannotBeRead) {
  EXPECT_EQ(problemWith(folder_ / "missing"),
            (folder_ / "missing").string() + ": No such file or directory");
  EXPECT_EQ(problemWith(folder_.path()), folder_.path().string() + ": Is a directory");
}

}  // namespace
}  // namespace appsync::host
