#include "base/directory_tree.h"

#include <fcntl.h>
#include <grp.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>

#include "base/file_descriptor.h"
#include "tests/fakes/other_process.h"
#include "tests/fakes/temporary_folder.h"

namespace appsync {
namespace {

constexpr uid_t Nobody = 65534;

/// For root every directory is open.
bool becomeOrdinaryUser() {
  return geteuid() != 0 ||
         (setgroups(0, nullptr) == 0 && setgid(Nobody) == 0 && setuid(Nobody) == 0);
}

TEST(DirectoryTree, WithClosedDirectoriesInItIsRemovedByItsOwner) {
  const fakes::TemporaryFolder temporary;
  if (geteuid() == 0) {
    ASSERT_EQ(chown(temporary.path().c_str(), Nobody, Nobody), 0);
  }
  const int status = fakes::inOtherProcess([&] {
    if (!becomeOrdinaryUser()) return 2;
    for (const mode_t mode : {0000U, 0100U, 0400U, 0500U}) {
      const auto closed = temporary / "tree" / std::to_string(mode);
      std::filesystem::create_directories(closed / "inner");
      fakes::putFile(closed / "inner" / "file", "text");
      chmod((closed / "inner").c_str(), mode);
      chmod(closed.c_str(), mode);
    }
    const FileDescriptor folder(open(temporary.path().c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    return removeTree(folder.get(), "tree") && !std::filesystem::exists(temporary / "tree") ? 0 : 1;
  });
  EXPECT_EQ(status, 0);
}

TEST(DirectoryTree, ALinkInItIsRemovedAndWhatItLeadsToIsNot) {
  const fakes::TemporaryFolder temporary;
  const auto outside = temporary / "outside";
  fakes::putFile(outside / "file", "text");
  std::filesystem::permissions(outside, std::filesystem::perms(0500));
  std::filesystem::create_directories(temporary / "tree");
  std::filesystem::create_directory_symlink(outside, temporary / "tree/link");
  const FileDescriptor folder(open(temporary.path().c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  EXPECT_TRUE(removeTree(folder.get(), "tree"));
  EXPECT_TRUE(std::filesystem::exists(outside / "file"));
  EXPECT_EQ(std::filesystem::status(outside).permissions(), std::filesystem::perms(0500));
  std::filesystem::permissions(outside, std::filesystem::perms(0700));
}

}  // namespace
}  // namespace appsync
