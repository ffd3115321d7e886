#include "platform/property_list.h"

#include <gtest/gtest.h>

#include <limits>

namespace appsync {
namespace {

using Array = PropertyList::Array;
using Dictionary = PropertyList::Dictionary;
using Type = PropertyList::Type;

constexpr auto Largest = std::numeric_limits<std::int64_t>::max();
constexpr auto Smallest = std::numeric_limits<std::int64_t>::min();

TEST(PropertyList, TellsTheTypeOfEachValue) {
  EXPECT_EQ(PropertyList().type(), Type::Null);
  EXPECT_EQ(PropertyList(true).type(), Type::Boolean);
  EXPECT_EQ(PropertyList(7).type(), Type::Integer);
  EXPECT_EQ(PropertyList(std::uint64_t{1} << 63).type(), Type::Integer);
  EXPECT_EQ(PropertyList(0.5).type(), Type::Real);
  EXPECT_EQ(PropertyList("text").type(), Type::String);
  EXPECT_EQ(PropertyList(Bytes{}).type(), Type::Data);
  EXPECT_EQ(PropertyList(PropertyList::Date{0}).type(), Type::Date);
  EXPECT_EQ(PropertyList(Array{}).type(), Type::Array);
  EXPECT_EQ(PropertyList(Dictionary{}).type(), Type::Dictionary);
  EXPECT_TRUE(PropertyList::null().isNull());
}

TEST(PropertyList, AccessToAnotherTypeGivesNone) {
  const PropertyList text("7");
  EXPECT_EQ(text.asInteger(), std::nullopt);
  EXPECT_EQ(text.asUnsigned(), std::nullopt);
  EXPECT_EQ(text.asReal(), std::nullopt);
  EXPECT_EQ(text.asBoolean(), std::nullopt);
  EXPECT_EQ(text.asDate(), std::nullopt);
  EXPECT_EQ(text.asData(), nullptr);
  EXPECT_EQ(text.asArray(), nullptr);
  EXPECT_EQ(text.asDictionary(), nullptr);
  EXPECT_EQ(PropertyList(7).asString(), nullptr);
  EXPECT_EQ(PropertyList(true).asInteger(), std::nullopt);
}

TEST(PropertyList, IntegersKeepTheirSignAndRange) {
  const PropertyList above(std::uint64_t(Largest) + 1);
  EXPECT_EQ(above.asInteger(), std::nullopt);
  EXPECT_EQ(above.asUnsigned(), std::uint64_t(Largest) + 1);
  EXPECT_EQ(PropertyList(Smallest).asInteger(), Smallest);
  EXPECT_EQ(PropertyList(-1).asUnsigned(), std::nullopt);
  EXPECT_EQ(PropertyList(5).asUnsigned(), 5u);
  EXPECT_EQ(PropertyList(-3).asReal(), -3.0);
}

TEST(PropertyList, OneNumberIsOneValueHoweverItWasGiven) {
  EXPECT_EQ(PropertyList(std::uint64_t{5}), PropertyList(5));
  EXPECT_NE(PropertyList(5), PropertyList(5.0));
  EXPECT_NE(PropertyList(1), PropertyList(true));
}

TEST(PropertyList, FindsValuesByKey) {
  const Dictionary dictionary{{"name", "Chess"}, {"size", 3}};
  EXPECT_EQ(*find(dictionary, "size"), PropertyList(3));
  EXPECT_EQ(find(dictionary, "nothing"), nullptr);
  EXPECT_EQ(*findString(dictionary, "name"), "Chess");
  EXPECT_EQ(findString(dictionary, "size"), nullptr);
  EXPECT_EQ(*PropertyList(dictionary).find("size"), PropertyList(3));
  EXPECT_EQ(PropertyList("text").find("size"), nullptr);
}

struct BooleanReading {
  PropertyList value;
  bool expected;
};

class BooleanValue : public testing::TestWithParam<BooleanReading> {};

TEST_P(BooleanValue, IsReadFromAnyType) {
  EXPECT_EQ(GetParam().value.booleanValue(), GetParam().expected) << description(GetParam().value);
}

INSTANTIATE_TEST_SUITE_P(
    Types, BooleanValue,
    testing::Values(BooleanReading{true, true}, BooleanReading{false, false},
                    BooleanReading{2, true}, BooleanReading{-1, true}, BooleanReading{0, false},
                    BooleanReading{std::uint64_t{1} << 63, true}, BooleanReading{0.5, true},
                    BooleanReading{0.0, false}, BooleanReading{PropertyList(), false},
                    BooleanReading{Bytes{std::byte{1}}, false}, BooleanReading{Array{true}, false},
                    BooleanReading{PropertyList::Date{1}, false}));

INSTANTIATE_TEST_SUITE_P(Texts, BooleanValue,
                         testing::Values(BooleanReading{"YES", true}, BooleanReading{"true", true},
                                         BooleanReading{"t", true}, BooleanReading{"y", true},
                                         BooleanReading{"1", true}, BooleanReading{" \t-007", true},
                                         BooleanReading{"+9", true}, BooleanReading{"00Y", true},
                                         BooleanReading{"", false}, BooleanReading{"0", false},
                                         BooleanReading{"NO", false},
                                         BooleanReading{"false", false},
                                         BooleanReading{"--1", false}, BooleanReading{"on", false},
                                         BooleanReading{"-", false}, BooleanReading{"000", false}));

TEST(PropertyListDescription, ShowsEachTypeInOneLine) {
  EXPECT_EQ(description(PropertyList()), "(null)");
  EXPECT_EQ(description(PropertyList(true)), "1");
  EXPECT_EQ(description(PropertyList(false)), "0");
  EXPECT_EQ(description(PropertyList(Smallest)), "-9223372036854775808");
  EXPECT_EQ(description(PropertyList(std::numeric_limits<std::uint64_t>::max())),
            "18446744073709551615");
  EXPECT_EQ(description(PropertyList(0.1)), "0.1");
  EXPECT_EQ(description(PropertyList("text")), "text");
}

TEST(PropertyListDescription, ShowsContainersWithTheirContents) {
  EXPECT_EQ(description(Array{}), "()");
  EXPECT_EQ(description(Array{"a", 1, Array{"b"}}), "(a, 1, (b))");
  EXPECT_EQ(description(Dictionary{}), "{}");
  EXPECT_EQ(description(Dictionary{{"l", "w"}, {"k", Dictionary{{"x", PropertyList()}}}}),
            "{k = {x = (null)}; l = w}");
  EXPECT_EQ(description(PropertyList(Dictionary{{"k", Array{1, 2}}})), "{k = (1, 2)}");
}

TEST(PropertyListDescription, ShortensDataPastSixteenBytes) {
  EXPECT_EQ(description(PropertyList(Bytes{})), "<>");
  EXPECT_EQ(description(PropertyList(Bytes{std::byte{0x0a}, std::byte{0x0b}})), "<0a0b>");
  EXPECT_EQ(description(PropertyList(Bytes(16, std::byte{0xff}))),
            "<ffffffffffffffffffffffffffffffff>");
  EXPECT_EQ(description(PropertyList(Bytes(4096, std::byte{0x01}))),
            "<01010101010101010101010101010101... 4096 bytes>");
}

TEST(PropertyListDescription, ShowsDatesInUniversalTime) {
  const auto shown = [](double seconds) {
    return description(PropertyList(PropertyList::Date{seconds}));
  };
  EXPECT_EQ(shown(0), "2001-01-01T00:00:00Z");
  EXPECT_EQ(shown(791553600), "2026-01-31T12:00:00Z");
  EXPECT_EQ(shown(-0.5), "2000-12-31T23:59:59Z");
  EXPECT_EQ(shown(252423993599), "9999-12-31T23:59:59Z");
  EXPECT_EQ(shown(1e300), "1e+300 seconds since 2001");
}

TEST(PropertyListDescription, KeepsControlCharactersFromBreakingTheLine) {
  EXPECT_EQ(description(PropertyList("a\nb\tc\rd\x1b")), "a\\nb\\tc\\x0dd\\x1b");
  EXPECT_EQ(description(Dictionary{{"k\n", 1}}), "{k\\n = 1}");
  EXPECT_EQ(description(PropertyList("\xc3\xa9")), "\xc3\xa9");
}

}  // namespace
}  // namespace appsync
