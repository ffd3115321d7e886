#include <SQLiteCpp/SQLiteCpp.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <map>

#include "tests/device/device_test.h"

namespace appsync::device {
namespace {

namespace fs = std::filesystem;

class DeviceFolderTest : public ::testing::Test {
 protected:
  bool initialize() { return EmbeddedDevice::initialize(folder, {}, problem); }

  /// The problem that opening meets; the test fails if it meets none or tells it badly.
  std::optional<DeviceProblem> problemOfOpening(Access access = Access::Write) {
    if (EmbeddedDevice::open(folder, access, problem)) return std::nullopt;
    EXPECT_TRUE(problem.message.starts_with(folder.string() + ": ")) << problem.message;
    EXPECT_NE(problem.message.find("; "), std::string::npos) << problem.message;
    EXPECT_EQ(problem.message.find('\n'), std::string::npos) << problem.message;
    return problem.problem;
  }

  /// Closed properly, the database file has everything; its log files go.
  void removeLogFiles() const {
    for (const char* name : {"device.db-wal", "device.db-shm"}) fs::remove(folder / name);
  }

  void expectProblem(DeviceProblem expected) {
    EXPECT_EQ(problemOfOpening(Access::Write), expected);
    EXPECT_EQ(problemOfOpening(Access::ReadOnly), expected);
  }

  fakes::TemporaryFolder temporary;
  fs::path folder = temporary.path() / "device";
  DeviceError problem;
};

TEST_F(DeviceFolderTest, ANewDeviceHasTheDirectoriesOfAPhone) {
  ASSERT_TRUE(initialize()) << problem.message;
  for (const char* directory :
       {"tmp", "var/mobile/Library", "var/mobile/Media/PublicStaging",
        "var/mobile/Containers/Applications", "var/mobile/Containers/Data"}) {
    EXPECT_TRUE(fs::is_directory(folder / "root" / directory)) << directory;
  }
  EXPECT_TRUE(fs::is_regular_file(folder / "device.db"));
  EXPECT_TRUE(fs::is_directory(folder / "log"));
}

TEST_F(DeviceFolderTest, ADeviceIsMadeInAnEmptyFolderAndRemembersItsOptions) {
  fs::create_directories(folder);
  ASSERT_TRUE(EmbeddedDevice::initialize(folder, {.coordination = true}, problem));
  const auto device = EmbeddedDevice::open(folder, Access::Write, problem);
  ASSERT_TRUE(device) << problem.message;
  EXPECT_TRUE(device->options().coordination);
  EXPECT_TRUE(device->applications().empty());
}

TEST_F(DeviceFolderTest, AFolderThatHoldsSomethingIsRefusedAndLeftAsItIs) {
  fakes::putFile(folder / "letter.txt", "dear");
  EXPECT_FALSE(initialize());
  EXPECT_EQ(problem.problem, DeviceProblem::Exists);
  EXPECT_EQ(std::distance(fs::directory_iterator(folder), fs::directory_iterator()), 1);
  EXPECT_EQ(fakes::fileText(folder / "letter.txt"), "dear");
}

TEST_F(DeviceFolderTest, AnExistingDeviceIsNotMadeAnew) {
  ASSERT_TRUE(initialize());
  fakes::putFile(folder / "root/var/mobile/Media/photo", "kept");
  EXPECT_FALSE(initialize());
  EXPECT_EQ(problem.problem, DeviceProblem::Exists);
  EXPECT_EQ(fakes::fileText(folder / "root/var/mobile/Media/photo"), "kept");
}

TEST_F(DeviceFolderTest, AFileInThePlaceOfTheFolderIsRefused) {
  fakes::putFile(folder, "a file");
  EXPECT_FALSE(initialize());
  EXPECT_EQ(problem.problem, DeviceProblem::Exists);
  expectProblem(DeviceProblem::Foreign);
}

TEST_F(DeviceFolderTest, AMissingOrEmptyFolderIsNoDeviceYet) {
  expectProblem(DeviceProblem::Missing);
  EXPECT_FALSE(fs::exists(folder));
  fs::create_directories(folder);
  expectProblem(DeviceProblem::Missing);
  EXPECT_TRUE(fs::is_empty(folder));
}

TEST_F(DeviceFolderTest, AFolderWithOtherThingsIsForeign) {
  fakes::putFile(folder / "letter.txt", "dear");
  expectProblem(DeviceProblem::Foreign);
  EXPECT_FALSE(fs::exists(folder / "lock")) << "nothing is made in a foreign folder";
}

TEST_F(DeviceFolderTest, ADatabaseOfSomethingElseIsForeign) {
  fs::create_directories(folder);
  {
    SQLite::Database other((folder / "device.db").string(),
                           SQLite::OPEN_READWRITE | SQLite::OPEN_CREATE);
    other.exec("CREATE TABLE letters (text)");
  }
  expectProblem(DeviceProblem::Foreign);
}

TEST_F(DeviceFolderTest, ATextFileCalledLikeTheDatabaseIsForeign) {
  fakes::putFile(folder / "device.db", std::string(4096, 'x'));
  expectProblem(DeviceProblem::Foreign);
}

TEST_F(DeviceFolderTest, ADeviceOfANewerVersionIsForeignAndSaysSo) {
  ASSERT_TRUE(initialize());
  SQLite::Database((folder / "device.db").string(), SQLite::OPEN_READWRITE)
      .exec("PRAGMA user_version=99");
  expectProblem(DeviceProblem::Foreign);
  EXPECT_NE(problem.message.find("newer"), std::string::npos) << problem.message;
}

TEST_F(DeviceFolderTest, OverwrittenDatabasePagesAreDamage) {
  ASSERT_TRUE(initialize());
  removeLogFiles();
  std::string bytes = fakes::fileText(folder / "device.db");
  ASSERT_GT(bytes.size(), 8192U);
  std::fill(bytes.begin() + 4096, bytes.end(), '\x5a');
  fakes::putFile(folder / "device.db", bytes);
  expectProblem(DeviceProblem::Damaged);
}

TEST_F(DeviceFolderTest, AnOverwrittenDatabaseHeaderIsDamage) {
  ASSERT_TRUE(initialize());
  removeLogFiles();
  fakes::putFile(folder / "device.db", std::string(8192, 'x'));
  expectProblem(DeviceProblem::Damaged);
}

TEST_F(DeviceFolderTest, ATruncatedOrMissingDatabaseIsDamage) {
  ASSERT_TRUE(initialize());
  removeLogFiles();
  fakes::putFile(folder / "device.db", "");
  expectProblem(DeviceProblem::Damaged);
  fs::remove(folder / "device.db");
  expectProblem(DeviceProblem::Damaged);
}

TEST_F(DeviceFolderTest, MissingFilesOfThePhoneAreDamage) {
  ASSERT_TRUE(initialize());
  fs::remove_all(folder / "root");
  expectProblem(DeviceProblem::Damaged);
}

TEST_F(DeviceFolderTest, AMakingThatBrokeOffIsNoDeviceAndIsMadeAgain) {
  ASSERT_TRUE(initialize());
  fakes::putFile(folder / "unfinished", "");
  fakes::putFile(folder / "root/half", "");
  fs::resize_file(folder / "device.db", 100);
  expectProblem(DeviceProblem::Missing);
  ASSERT_TRUE(initialize()) << problem.message;
  EXPECT_FALSE(fs::exists(folder / "root/half"));
  EXPECT_TRUE(EmbeddedDevice::open(folder, Access::Write, problem)) << problem.message;
}

TEST_F(DeviceFolderTest, TwoWhoMakeADeviceAtOnceMakeOne) {
  std::vector<int> results;
  const auto make = [&] { return initialize() ? 0 : 1; };
  const pid_t child = fork();
  if (child == 0) _exit(make());
  results.push_back(make());
  int status = 0;
  waitpid(child, &status, 0);
  results.push_back(WEXITSTATUS(status));
  EXPECT_EQ(std::ranges::count(results, 0), 1);
  EXPECT_TRUE(EmbeddedDevice::open(folder, Access::Write, problem)) << problem.message;
}

TEST_F(DeviceFolderTest, AFolderThatMayNotBeWrittenIsUnusable) {
  if (geteuid() == 0) GTEST_SKIP() << "permissions do not bind the superuser";
  ASSERT_TRUE(initialize());
  fs::permissions(folder, fs::perms::owner_read | fs::perms::owner_exec);
  fs::permissions(folder / "lock", fs::perms::owner_read);
  EXPECT_EQ(problemOfOpening(), DeviceProblem::Unusable);
  fs::permissions(folder, fs::perms::owner_all);
}

TEST_F(DeviceFolderTest, AFolderNameWithALineBreakStaysOnOneLine) {
  folder = temporary.path() / "two\nlines";
  EXPECT_FALSE(EmbeddedDevice::open(folder, Access::Write, problem));
  EXPECT_EQ(problem.message.find('\n'), std::string::npos);
}

TEST_F(DeviceFolderTest, AnyFolderNameMayHoldADevice) {
  folder = temporary.path() / "a ?mode=memory#&%41 phone";
  ASSERT_TRUE(initialize()) << problem.message;
  EXPECT_TRUE(EmbeddedDevice::open(folder, Access::ReadOnly, problem)) << problem.message;
}

}  // namespace
}  // namespace appsync::device
