#include "device/state/connection.h"

#include <gtest/gtest.h>
#include <sqlite3.h>

#include "device/state/database.h"
#include "tests/fakes/temporary_folder.h"

namespace appsync::device {
namespace {

class ConnectionTest : public ::testing::Test {
 protected:
  ConnectionTest() { connection_.exec("CREATE TABLE numbers (number INTEGER)"); }

  std::vector<std::string> numbers(int least) {
    return Query(connection_, "SELECT number FROM numbers WHERE number >= ? ORDER BY number", least)
        .texts();
  }

  const fakes::TemporaryFolder folder_;
  const std::string file_ = folder_ / "a.db";
  Connection connection_{file_, SQLite::OPEN_READWRITE | SQLite::OPEN_CREATE};
};

TEST_F(ConnectionTest, AKeptStatementTakesNewArguments) {
  for (const int number : {1, 2, 3}) {
    Query(connection_, "INSERT INTO numbers VALUES (?)", number).run();
  }
  EXPECT_EQ(numbers(2), (std::vector<std::string>{"2", "3"}));
  EXPECT_EQ(numbers(3), (std::vector<std::string>{"3"}));
}

TEST_F(ConnectionTest, PreparesOneTextOnceUnlessItIsRunAlready) {
  const char* const text = "SELECT 1";
  auto first = connection_.prepare(text);
  const auto second = connection_.prepare(text);
  EXPECT_NE(first, second);
  const SQLite::Statement* const kept = first.get();
  connection_.giveBack(std::move(first));
  const auto again = connection_.prepare(text);
  EXPECT_EQ(again.get(), kept);
}

TEST_F(ConnectionTest, AStatementThatWasNotRunToItsEndHoldsNoTransactionOpen) {
  for (const int number : {1, 2}) {
    Query(connection_, "INSERT INTO numbers VALUES (?)", number).run();
  }
  EXPECT_TRUE(Query(connection_, "SELECT number FROM numbers").next());
  Connection other(file_, SQLite::OPEN_READWRITE);
  EXPECT_EQ(other.tryExec("DELETE FROM numbers"), 0);
}

TEST_F(ConnectionTest, KeepsNothingWhenItIsTold) {
  int prepared = 0;
  const auto count = [](void* counter, int action, const char*, const char*, const char*,
                        const char*) {
    if (action == SQLITE_SELECT) ++*static_cast<int*>(counter);
    return SQLITE_OK;
  };
  sqlite3_set_authorizer(connection_.getHandle(), count, &prepared);
  for (int round = 0; round < 3; ++round) numbers(0);
  EXPECT_EQ(prepared, 1);
  connection_.keepNothing();
  for (int round = 0; round < 3; ++round) numbers(0);
  EXPECT_EQ(prepared, 4);
}

}  // namespace
}  // namespace appsync::device
