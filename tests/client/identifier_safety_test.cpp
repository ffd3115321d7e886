#include "client/identifier_safety.h"

#include <gtest/gtest.h>

namespace appsync {
namespace {

TEST(IdentifierSafety, AcceptsAnOrdinaryIdentifierAndPath) {
  const PropertyList identifier("com.example.chess");
  EXPECT_TRUE(isSafe(&identifier));
  EXPECT_TRUE(isSafe(std::optional<std::string>("/var/mobile/Media/PublicStaging/chess.zip")));
}

TEST(IdentifierSafety, RefusesWhatClimbsWhereverItDoes) {
  for (const char* text : {"a/../b", "/..", "a/..", "/../a", "a/..b", "/var/mobile/../x"}) {
    const PropertyList value(text);
    EXPECT_FALSE(isSafe(&value)) << text;
    EXPECT_FALSE(isSafe(std::optional<std::string>(text))) << text;
  }
}

TEST(IdentifierSafety, OnlyASlashBeforeTwoDotsCounts) {
  for (const char* text : {"..", "../a", "a..b", "a/.b", "a/./b", ""}) {
    const PropertyList value(text);
    EXPECT_TRUE(isSafe(&value)) << text;
    EXPECT_TRUE(isSafe(std::optional<std::string>(text))) << text;
  }
}

TEST(IdentifierSafety, SeesPastANulByte) {
  const PropertyList value(std::string("a\0/../b", 7));
  EXPECT_FALSE(isSafe(&value));
}

TEST(IdentifierSafety, RefusesNothingAtAll) {
  EXPECT_FALSE(isSafe(static_cast<const PropertyList*>(nullptr)));
  EXPECT_FALSE(isSafe(std::optional<std::string>()));
}

TEST(IdentifierSafety, RefusesAValueThatIsNoString) {
  for (const PropertyList& value :
       {PropertyList(7), PropertyList(true), PropertyList(1.5), PropertyList(toBytes("a")),
        PropertyList(PropertyList::Array{"a"}), PropertyList(PropertyList::Dictionary{{"a", "b"}}),
        PropertyList::null()}) {
    EXPECT_FALSE(isSafe(&value)) << description(value);
  }
}

}  // namespace
}  // namespace appsync
