// TransactionLog and Log.
#include <algorithm>
#include <thread>

#include "tests/contract/phone.h"

namespace appsync::contract {
namespace {

SERVICE_CONTRACT(TransactionLogContract);

TEST_P(TransactionLogContract, KeepsScenariosAndStepsInTheirOrder) {
  TransactionLog& log = platform.transactionLog;
  log.initializeWithLog({"com.corvane.appinstallation", "twc.appsync"});
  log.logScenario("Asset install", 0U, true, "com.a", "assertion succeeded");
  log.logScenario("Install placeholder", std::nullopt, false, "com.b", "Failed \"to\" install");
  log.logStep(3, 1, 2, true, "com.c", "Finished creating coordinator");
  const std::vector<KeptRecord> expected = {
      {"Asset install", 0U, 0, 0, true, "com.a", "assertion succeeded"},
      {"Install placeholder", std::nullopt, 0, 0, false, "com.b", "Failed \"to\" install"},
      {"", 3U, 1, 2, true, "com.c", "Finished creating coordinator"},
  };
  EXPECT_EQ(phone->records(), expected);
}

TEST_P(TransactionLogContract, KeepsItsOwnCopyOfTheHandle) {
  {
    const std::string subsystem = "com.corvane.appinstallation";
    const std::string category = "twc.appsync";
    platform.transactionLog.initializeWithLog({subsystem, category});
  }
  platform.transactionLog.logScenario("Halvo Sync", 0U, true, "com.a", "Uninstall succeeded");
  EXPECT_EQ(phone->records().size(), 1U);
}

TEST_P(TransactionLogContract, KeepsEveryRecordOfManyThreads) {
  platform.transactionLog.initializeWithLog({"com.corvane.appinstallation", "twc.appsync"});
  std::vector<std::thread> threads;
  for (int thread = 0; thread < 4; ++thread) {
    threads.emplace_back([&, thread] {
      for (std::uint32_t step = 0; step < 25; ++step) {
        platform.transactionLog.logScenario("Asset install", step, true,
                                            "com.app" + std::to_string(thread), "step");
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  const std::vector<KeptRecord> records = phone->records();
  EXPECT_EQ(records.size(), 100U);
  for (int thread = 0; thread < 4; ++thread) {
    std::uint32_t next = 0;
    for (const KeptRecord& record : records) {
      if (record.bundleId != "com.app" + std::to_string(thread)) continue;
      EXPECT_EQ(record.step, next++);
    }
    EXPECT_EQ(next, 25U);
  }
}

SERVICE_CONTRACT(LogContract);

TEST_P(LogContract, KeepsLinesWithChannelAndLevelInTheirOrder) {
  const std::vector<KeptLine> lines = {
      {LogChannel::TWLogCategorySyncBundle, LogLevel::Default, "one|of it"},
      {LogChannel::TWLogCategorySyncBundle_Oversize, LogLevel::Info, "two \t \"2\" \\ {x = 1}"},
      {LogChannel::TWLogCategoryFramework, LogLevel::Debug, "three"},
      {LogChannel::TWLogCategorySyncBundle, LogLevel::Error, "vi\xC3\xA9r"},
      {LogChannel::TWLogCategorySyncBundle, LogLevel::Fault, ""},
  };
  for (const KeptLine& line : lines) platform.log.write(line.channel, line.level, line.text);
  EXPECT_EQ(phone->logLines(), lines);
}

TEST_P(LogContract, AnyBytesMakeOneLine) {
  const auto write = [&](std::string_view text) {
    platform.log.write(LogChannel::TWLogCategorySyncBundle, LogLevel::Default, text);
  };
  const std::vector<std::string> texts = {"a\nb\r\nc", std::string("nul\0nul", 7),
                                          "\xff\xfe\x1b[31m", "back\\nslash", "last"};
  for (const std::string& text : texts) write(text);
  const std::vector<KeptLine> lines = phone->logLines();
  ASSERT_EQ(lines.size(), texts.size());
  for (std::size_t at = 0; at < texts.size(); ++at) EXPECT_EQ(lines[at].text, texts[at]);
}

TEST_P(LogContract, KeepsAVeryLongLine) {
  const std::string text(100'000, 'x');
  platform.log.write(LogChannel::TWLogCategorySyncBundle_Oversize, LogLevel::Default, text);
  ASSERT_EQ(phone->logLines().size(), 1U);
  EXPECT_EQ(phone->logLines().front().text, text);
}

TEST_P(LogContract, KeepsEveryLineOfManyThreads) {
  std::vector<std::thread> threads;
  for (int thread = 0; thread < 4; ++thread) {
    threads.emplace_back([&, thread] {
      for (int line = 0; line < 100; ++line) {
        platform.log.write(LogChannel::TWLogCategorySyncBundle, LogLevel::Default,
                           std::to_string(thread) + "/" + std::to_string(line));
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  std::vector<std::string> texts;
  for (const KeptLine& line : phone->logLines()) texts.push_back(line.text);
  EXPECT_EQ(texts.size(), 400U);
  std::ranges::sort(texts);
  EXPECT_EQ(std::ranges::adjacent_find(texts), texts.end());
}

}  // namespace
}  // namespace appsync::contract
