#include "host/library/version.h"

#include "tests/test_pch.h"

namespace appsync::host {
namespace {

int order(std::string_view left, std::string_view right) {
  const auto result = compareVersions(left, right);
  return result < 0 ? -1 : result > 0 ? 1 : 0;
}

TEST(VersionOrder, ComparesNumbersNotDigits) {
  EXPECT_EQ(order("1.10", "1.9"), 1);
  EXPECT_EQ(order("2", "10"), -1);
  EXPECT_EQ(order("1.07", "1.7"), 0);
}

TEST(VersionOrder, TakesMissingPartsForZero) {
  EXPECT_EQ(order("1", "1.0.0"), 0);
  EXPECT_EQ(order("1", "1.0.1"), -1);
}

TEST(VersionOrder, ComparesTheTextBehindEqualNumbers) {
  EXPECT_EQ(order("1.0a", "1.0b"), -1);
  EXPECT_EQ(order("1.0", "1.0b"), -1);
  EXPECT_EQ(order("1.2b", "1.10a"), -1);
}

TEST(VersionOrder, PutsAnEmptyVersionFirst) {
  EXPECT_EQ(order("", "0"), -1);
  EXPECT_EQ(order("", ""), 0);
  EXPECT_EQ(order("0", ""), 1);
}

TEST(VersionOrder, ComparesNumbersLongerThanAnyInteger) {
  EXPECT_EQ(order("99999999999999999999999998", "99999999999999999999999999"), -1);
  EXPECT_EQ(order("1" + std::string(400, '0'), "9"), 1);
}

TEST(VersionOrder, IsTheSameFromBothSides) {
  const std::vector<std::string> versions = {"",      "0",   "1",    "1.0", "1.0a", "1..2",
                                             "1.2.3", "abc", "1.a9", "10",  "."};
  for (const auto& left : versions) {
    for (const auto& right : versions) {
      EXPECT_EQ(order(left, right), -order(right, left)) << left << " and " << right;
    }
  }
}

}  // namespace
}  // namespace appsync::host
