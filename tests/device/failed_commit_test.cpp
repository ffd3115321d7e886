#include <sys/wait.h>
#include <unistd.h>

#include "tests/device/device_test.h"
#include "tests/device/failing_log.h"

namespace appsync::device {
namespace {

using Lines = std::vector<std::string>;

constexpr std::string_view Id = "com.example.a";
constexpr std::string_view Script = "#!/bin/sh\necho hello\n";

/// A commit whose flush failed may be found made by whoever opens the device next.
class FailedCommitTest : public DeviceTest {
 protected:
  FailedCommitTest() {
    FailingLog::prepare();
    reopen();
    EXPECT_TRUE(installPackage(Id, "1.0"));
    putFile(Notes, "mine");
  }

  bool isWhole() { return textAt(*record(Id)->bundlePath + "/run.sh") == Script; }
  /// Does the work while the disk fills up at the first flush, and opens the device anew when there
  /// is space again.
  void whileTheDiskFillsUp(const std::function<void()>& work) {
    {
      const FailingLog failing(FailingLog::Disk::IsFull);
      work();
      device.reset();
    }
    reopen();
    EXPECT_EQ(containerCount(), registry().size());
    EXPECT_EQ(textAt(Notes), "mine");
  }

  const std::string Notes = "/var/mobile/Containers/Data/com.example.a/notes";
};

TEST_F(FailedCommitTest, OfAnUpdateMayComeBackAndFindsItsFiles) {
  whileTheDiskFillsUp([&] {
    EXPECT_FALSE(installPackage(Id, "2.0"));
    EXPECT_EQ(error->localizedDescription(), "the phone's database: it cannot be read or written");
    EXPECT_EQ(version(Id), "1.0") << "undone for now";
    EXPECT_EQ(containerCount(), 2U);
  });
  EXPECT_EQ(registry(), Lines{"com.example.a 2.0"}) << "the log held it";
  EXPECT_TRUE(isWhole());
}

TEST_F(FailedCommitTest, OfADemotionMayComeBackAndFindsItsFiles) {
  whileTheDiskFillsUp([&] { EXPECT_FALSE(device->demote(Id, &error)); });
  EXPECT_EQ(registry(), (Lines{"com.example.a 1.0", "com.example.a 1.0 (placeholder)"}));
  EXPECT_TRUE(isWhole());
  EXPECT_TRUE(device->demote(Id, &error)) << "comes to its end";
}

TEST_F(FailedCommitTest, ThatTheNextFlushWritesOverNeverComesBackAndLeavesNothing) {
  {
    const FailingLog failing(FailingLog::Disk::Falters);
    EXPECT_FALSE(installPackage(Id, "2.0"));
  }
  EXPECT_EQ(containerCount(), 1U);
  reopen();
  EXPECT_EQ(registry(), Lines{"com.example.a 1.0"});
  EXPECT_TRUE(isWhole());
  EXPECT_TRUE(installPackage(Id, "2.0"));
}

/// A process that looks at the device and stays: it keeps the log's index as it is, so that whoever
/// opens the device finds the state before the failed commit. Made while the device is closed,
/// since the database's locks are a process's own.
class Reader {
 public:
  explicit Reader(const std::filesystem::path& folder) {
    EXPECT_EQ(::pipe(orders_), 0);
    EXPECT_EQ(::pipe(answers_), 0);
    child_ = ::fork();
    if (child_ == 0) {
      ::close(orders_[1]);
      await(orders_[0]);
      DeviceError problem;
      const auto device = EmbeddedDevice::open(folder, Access::ReadOnly, problem);
      if (device && !device->applications().empty()) tell(answers_[1]);
      await(orders_[0]);
      ::_exit(0);
    }
    ::close(answers_[1]);
  }
  ~Reader() {
    ::close(orders_[1]);
    ::waitpid(child_, nullptr, 0);
    ::close(orders_[0]);
    ::close(answers_[0]);
  }
  Reader(const Reader&) = delete;
  Reader& operator=(const Reader&) = delete;

  bool look() {
    tell(orders_[1]);
    return await(answers_[0]);
  }

 private:
  static void tell(int pipe) { EXPECT_EQ(::write(pipe, "x", 1), 1); }
  static bool await(int pipe) {
    char byte = 0;
    return ::read(pipe, &byte, 1) == 1;
  }

  int orders_[2] = {};
  int answers_[2] = {};
  pid_t child_ = -1;
};

TEST_F(FailedCommitTest, IsWrittenOverBeforeAnythingIsSweptOnTheWordOfTheRegistry) {
  device.reset();
  {
    Reader reader(folder);
    reopen();
    ASSERT_TRUE(reader.look());
    {
      const FailingLog failing(FailingLog::Disk::IsFull);
      EXPECT_FALSE(installPackage(Id, "2.0"));
      device.reset();
    }
    reopen();
    EXPECT_EQ(version(Id), "1.0");
    EXPECT_EQ(containerCount(), 1U);
    device.reset();
  }
  reopen();
  EXPECT_EQ(registry(), Lines{"com.example.a 1.0"});
  EXPECT_TRUE(isWhole());
}

}  // namespace
}  // namespace appsync::device
