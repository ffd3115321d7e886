#include "device/journal/log_files.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <chrono>
#include <fstream>
#include <thread>

#include "device/journal/log_format.h"
#include "tests/fakes/temporary_folder.h"

namespace appsync::device::testing {
namespace {

namespace fs = std::filesystem;
using ::testing::ElementsAre;
using ::testing::MatchesRegex;

class LogFilesTest : public ::testing::Test {
 protected:
  std::vector<std::string> texts() const {
    std::vector<std::string> result;
    LogFiles(folder_ / "log", false).read([&](const LogLine& line) {
      result.push_back(line.text);
    });
    return result;
  }
  static void say(LogFiles& log, std::string_view text) {
    log.write(LogChannel::TWLogCategorySyncBundle, LogLevel::Default, text);
  }

  const fakes::TemporaryFolder folder_;
  const fs::path newest_ = folder_ / "log/device.log";
};

TEST_F(LogFilesTest, RecordsComeBackAsTheyWereWritten) {
  const std::string everyByte = [] {
    std::string bytes;
    for (int i = 0; i < 256; ++i) bytes += static_cast<char>(i);
    return bytes + "\\n\\x41 \\";
  }();
  const auto before = std::chrono::system_clock::now().time_since_epoch();
  LogFiles log(folder_ / "log", true);
  log.write(LogChannel::TWLogCategorySyncBundle_Oversize, LogLevel::Fault, everyByte);
  log.write(LogChannel::TWLogCategoryFramework, LogLevel::Debug, "");
  std::vector<LogLine> lines;
  log.read([&](const LogLine& line) { lines.push_back(line); });
  ASSERT_EQ(lines.size(), 2u);
  EXPECT_EQ(lines[0].text, everyByte);
  EXPECT_EQ(lines[0].channel, LogChannel::TWLogCategorySyncBundle_Oversize);
  EXPECT_EQ(lines[0].level, LogLevel::Fault);
  EXPECT_NEAR(lines[0].time, std::chrono::duration<double>(before).count(), 60);
  EXPECT_EQ(lines[1].text, "");
  EXPECT_EQ(lines[1].level, LogLevel::Debug);
}

TEST_F(LogFilesTest, EveryRecordIsExactlyOneLine) {
  LogFiles log(folder_ / "log", true);
  say(log, "first\nsecond\tthird\r\x1b[31m\\");
  EXPECT_THAT(fakes::fileText(newest_),
              MatchesRegex("[0-9]+-[0-9]+-[0-9]+T[0-9]+:[0-9]+:[0-9]+\\.[0-9]+Z\tdefault\t"
                           "TWLogCategorySyncBundle\tfirst.nsecond.tthird.x0d.x1b.31m..\n"));
}

TEST_F(LogFilesTest, TimeKeepsItsMicroseconds) {
  const std::chrono::system_clock::time_point time(
      std::chrono::microseconds(1'700'000'000'000'042));
  const std::string line =
      formatLogLine(time, LogChannel::TWLogCategoryFramework, LogLevel::Info, "x");
  EXPECT_EQ(line, "2023-11-14T22:13:20.000042Z\tinfo\tTWLogCategoryFramework\tx\n");
  EXPECT_NEAR(parseLogLine(line.substr(0, line.size() - 1))->time, 1'700'000'000.000042, 1e-6);
}

TEST_F(LogFilesTest, ReaderSeesTheRecordsOfAllFilesOldestFirst) {
  LogFiles log(folder_ / "log", true, 400);
  std::vector<std::string> written;
  for (int i = 0; i < 12; ++i) {
    written.push_back("record " + std::to_string(i));
    say(log, written.back());
  }
  EXPECT_TRUE(fs::exists(folder_ / "log/device.log.2"));
  EXPECT_EQ(texts(), written);
}

TEST_F(LogFilesTest, KeepsThreeOldFilesAndDropsTheOldest) {
  LogFiles log(folder_ / "log", true, 100);
  for (int i = 0; i < 20; ++i) say(log, std::string(40, static_cast<char>('a' + i)));
  std::set<std::string> names;
  for (const auto& entry : fs::directory_iterator(folder_ / "log"))
    names.insert(entry.path().filename());
  EXPECT_EQ(names,
            (std::set<std::string>{"device.log", "device.log.1", "device.log.2", "device.log.3"}));
  EXPECT_THAT(texts(), ElementsAre(std::string(40, 'q'), std::string(40, 'r'), std::string(40, 's'),
                                   std::string(40, 't')));
}

TEST_F(LogFilesTest, RecordLargerThanAFileIsKept) {
  LogFiles log(folder_ / "log", true, 100);
  const std::string large(1000, 'x');
  say(log, "small");
  say(log, large);
  say(log, "after");
  EXPECT_THAT(texts(), ElementsAre("small", large, "after"));
}

TEST_F(LogFilesTest, TornLastLineIsPassedOverAndSpoilsNothingAfterIt) {
  {
    LogFiles log(folder_ / "log", true);
    say(log, "whole");
  }
  const std::string whole = fakes::fileText(newest_);
  for (std::size_t size = 1; size < whole.size(); ++size) {
    fakes::putFile(newest_, whole + whole.substr(0, size));
    EXPECT_THAT(texts(), ElementsAre("whole")) << size;
    LogFiles log(folder_ / "log", true);
    say(log, "after");
    const std::vector<std::string> now = texts();
    // A line cut within its text is a record with a shorter text once a new line follows it.
    EXPECT_EQ(now.front(), "whole") << size;
    EXPECT_EQ(now.back(), "after") << size;
  }
}

TEST_F(LogFilesTest, LinesThatAreNoRecordsArePassedOver) {
  fakes::putFile(newest_,
                 "nonsense\n\n\t\t\t\n2023-11-14T22:13:20.000042Z\tloud\tTWLog\tx\n" +
                     formatLogLine({}, LogChannel::TWLogCategoryFramework, LogLevel::Info, "ok"));
  EXPECT_THAT(texts(), ElementsAre("ok"));
}

TEST_F(LogFilesTest, WithoutWritingNothingIsMade) {
  LogFiles log(folder_ / "log", false);
  say(log, "dropped");
  EXPECT_FALSE(fs::exists(folder_ / "log"));
  EXPECT_TRUE(texts().empty());
}

TEST_F(LogFilesTest, ThreadsDoNotMixTheirLines) {
  LogFiles log(folder_ / "log", true, 20'000);
  std::vector<std::thread> threads;
  for (int t = 0; t < 4; ++t)
    threads.emplace_back([&log, t] {
      for (int i = 0; i < 100; ++i)
        say(log, std::to_string(t) + ":" + std::string(static_cast<std::size_t>(i % 50), 'x') +
                     std::to_string(i));
    });
  std::size_t seenMeanwhile = 0;
  log.read([&](const LogLine&) { ++seenMeanwhile; });
  for (std::thread& thread : threads) thread.join();
  EXPECT_LE(seenMeanwhile, 400u);
  std::map<char, std::vector<std::string>> perThread;
  for (const std::string& text : texts()) perThread[text.front()].push_back(text);
  for (const auto& [thread, lines] : perThread) {
    ASSERT_EQ(lines.size(), 100u) << thread;
    for (std::size_t i = 0; i < lines.size(); ++i)
      EXPECT_TRUE(lines[i].ends_with(std::to_string(i))) << lines[i];
  }
}

TEST_F(LogFilesTest, VisitorMayWrite) {
  LogFiles log(folder_ / "log", true, 200);
  say(log, "one");
  say(log, "two");
  int visits = 0;
  log.read([&](const LogLine&) {
    ++visits;
    say(log, "during");
  });
  EXPECT_EQ(visits, 2);
}

}  // namespace
}  // namespace appsync::device::testing
