#include <gtest/gtest.h>

#include <bit>
#include <cmath>
#include <limits>
#include <random>

#include "platform/property_list_codec.h"

namespace appsync {
namespace {

using Array = PropertyList::Array;
using Date = PropertyList::Date;
using Dictionary = PropertyList::Dictionary;

constexpr auto Xml = PropertyListFormat::Xml;
constexpr auto Binary = PropertyListFormat::Binary;

/// Random trees of everything that the format holds, the awkward values more often than by chance.
class TreeGenerator {
 public:
  TreeGenerator(std::uint64_t seed, PropertyListFormat format)
      : random_(seed), isXml_(format == Xml) {}

  PropertyList tree(int depth = 0) {
    switch (upTo(depth < 5 ? 9 : 6)) {
      case 0:
        return upTo(1) == 0;
      case 1:
        return integer();
      case 2:
        return real();
      case 3:
        return text();
      case 4:
        return data();
      case 5:
        return date();
      case 6:
        return std::uint64_t{random_()};
      case 7: {
        Array array;
        for (auto count = upTo(8); count > 0; --count) array.push_back(tree(depth + 1));
        return array;
      }
      default: {
        Dictionary dictionary;
        for (auto count = upTo(8); count > 0; --count) dictionary[text()] = tree(depth + 1);
        return dictionary;
      }
    }
  }

 private:
  std::uint64_t upTo(std::uint64_t last) {
    return std::uniform_int_distribution<std::uint64_t>(0, last)(random_);
  }

  PropertyList integer() {
    const std::uint64_t near = (std::uint64_t{1} << upTo(63)) + upTo(4) - 2;
    switch (upTo(3)) {
      case 0:
        return static_cast<std::int64_t>(near);
      case 1:
        return near;
      case 2:
        return -static_cast<std::int64_t>(upTo(5));
      default:
        return static_cast<std::int64_t>(random_());
    }
  }

  double real() {
    constexpr double awkward[] = {
        0.0,  0.1,    1.0,      1e300,   5e-324,
        1e17, -1e-17, 16777217, 1.0 / 3, std::numeric_limits<double>::infinity()};
    const double value = upTo(1) ? awkward[upTo(std::size(awkward) - 1)]
                                 : std::bit_cast<double>(std::uint64_t{random_()});
    if (std::isnan(value) || (isXml_ && value == 0)) return 0.0;
    return value;
  }

  std::string text() {
    static const std::string pieces[] = {"a",
                                         "INSTALL",
                                         "<&>\"'",
                                         "]]>",
                                         "&amp;",
                                         " ",
                                         "\t",
                                         "\n",
                                         "\r",
                                         "\xc3\xa9",
                                         "\xe2\x82\xac",
                                         "\xf0\x9f\x98\x80",
                                         "\xef\xbb\xbf",
                                         "\xef\xbf\xbf",
                                         "\xed\x9f\xbf",
                                         "\xf4\x8f\xbf\xbf",
                                         "CF$UID",
                                         "<!--",
                                         "<![CDATA["};
    std::string out;
    for (auto count = upTo(4); count > 0; --count) out += pieces[upTo(std::size(pieces) - 1)];
    if (!isXml_ && upTo(9) == 0) out += '\x01';
    if (upTo(99) == 0) out.append(300, 'x');
    return out;
  }

  Bytes data() {
    Bytes out(upTo(20) == 0 ? 1000 : upTo(6));
    for (std::byte& byte : out) byte = static_cast<std::byte>(upTo(255));
    return out;
  }

  Date date() {
    if (isXml_) return {double(upTo(252'423'993'599 + 31'588'963'200)) - 31'588'963'200.0};
    return {(double(upTo(20'000'000'000)) - 1e10) + double(upTo(999'999)) / 1e6};
  }

  std::mt19937_64 random_;
  bool isXml_;
};

class RoundTrip : public testing::TestWithParam<PropertyListFormat> {
 protected:
  static std::optional<PropertyList> roundTrip(const PropertyList& value) {
    std::optional<Error> error;
    const auto bytes = serializePropertyList(value, GetParam(), &error);
    if (!bytes) return ADD_FAILURE() << error->localizedDescription(), std::nullopt;
    auto parsed = parsePropertyList(*bytes, &error);
    if (!parsed) ADD_FAILURE() << error->localizedDescription();
    return parsed;
  }
};

TEST_P(RoundTrip, KeepsRandomTreesExactly) {
  for (std::uint64_t seed = 1; seed <= 3000; ++seed) {
    const PropertyList tree = TreeGenerator(seed, GetParam()).tree();
    ASSERT_EQ(roundTrip(tree), tree) << "seed " << seed << ": " << description(tree);
  }
}

TEST_P(RoundTrip, TellsEqualBitsOfDifferentIntegersApart) {
  const Array array{-5,
                    std::uint64_t(-5),
                    -5,
                    std::uint64_t(-5),
                    std::numeric_limits<std::int64_t>::min(),
                    std::uint64_t{1} << 63};
  EXPECT_EQ(roundTrip(array), PropertyList(array));
}

TEST_P(RoundTrip, KeepsEmptyValues) {
  const Dictionary tree{
      {"", ""}, {"array", Array{}}, {"data", Bytes{}}, {"dictionary", Dictionary{}}};
  EXPECT_EQ(roundTrip(tree), PropertyList(tree));
}

TEST_P(RoundTrip, KeepsEveryKindOfValueAtTheTop) {
  for (const PropertyList& value :
       {PropertyList(true), PropertyList(-1), PropertyList(2.5), PropertyList(""),
        PropertyList("text"), PropertyList(Bytes(3)), PropertyList(Date{-1}), PropertyList(Array{}),
        PropertyList(Dictionary{})}) {
    EXPECT_EQ(roundTrip(value), value) << description(value);
  }
}

TEST_P(RoundTrip, KeepsRealsToTheLastBit) {
  std::mt19937_64 random(7);
  for (int i = 0; i < 2000; ++i) {
    const double value = std::bit_cast<double>(std::uint64_t{random()});
    if (std::isnan(value)) continue;
    ASSERT_EQ(roundTrip(value), PropertyList(value));
  }
}

TEST_P(RoundTrip, KeepsTreesAsDeepAsTheLimit) {
  PropertyList tree = Array{};
  for (std::size_t depth = 1; depth < PropertyListLimits{}.depth; ++depth)
    tree = depth % 2 ? PropertyList(Array{std::move(tree)})
                     : PropertyList(Dictionary{{"k", std::move(tree)}});
  EXPECT_EQ(roundTrip(tree), tree);
  EXPECT_EQ(serializePropertyList(Array{tree}, GetParam()), std::nullopt);
}

TEST_P(RoundTrip, KeepsAListOfTenThousandDictionaries) {
  Array list;
  for (int i = 0; i < 10'000; ++i)
    list.push_back(Dictionary{{"Identifier", "com.example." + std::to_string(i)},
                              {"Operation", "INSTALL"},
                              {"Size", i},
                              {"Restore", i % 2 == 0}});
  EXPECT_EQ(roundTrip(list), PropertyList(list));
}

TEST_P(RoundTrip, KeepsADictionaryOfManyEntries) {
  Dictionary dictionary;
  for (int i = 0; i < 20'000; ++i) dictionary["com.example." + std::to_string(i)] = i;
  EXPECT_EQ(roundTrip(dictionary), PropertyList(dictionary));
}

INSTANTIATE_TEST_SUITE_P(Formats, RoundTrip, testing::Values(Xml, Binary),
                         [](const auto& format) { return format.param == Xml ? "Xml" : "Binary"; });

TEST(BinaryRoundTrip, KeepsTheBitsOfNegativeZeroAndNan) {
  for (const std::uint64_t bits : {0x8000000000000000u, 0x7ff8000000000001u, 0xfff0000000000001u}) {
    const auto bytes = serializePropertyList(std::bit_cast<double>(bits), Binary);
    ASSERT_TRUE(bytes);
    const auto parsed = parsePropertyList(*bytes);
    ASSERT_TRUE(parsed && parsed->asReal());
    EXPECT_EQ(std::bit_cast<std::uint64_t>(*parsed->asReal()), bits);
  }
}

TEST(XmlRoundTrip, RoundsDatesDownToSeconds) {
  const auto stored = [](double seconds) {
    const auto bytes = serializePropertyList(Date{seconds}, Xml);
    return parsePropertyList(*bytes)->asDate()->secondsSince2001;
  };
  EXPECT_EQ(stored(1.75), 1);
  EXPECT_EQ(stored(-0.25), -1);
  EXPECT_EQ(stored(3e9), 3e9);
}

void expectRefused(const PropertyList& value, PropertyListFormat format, std::string_view reason) {
  std::optional<Error> error;
  EXPECT_EQ(serializePropertyList(value, format, &error), std::nullopt);
  ASSERT_TRUE(error) << reason;
  EXPECT_EQ(error->domain, PropertyListErrorDomain);
  EXPECT_EQ(error->localizedDescription(),
            "the property list cannot be written: " + std::string(reason));
}

TEST(Serializing, RefusesWhatNoFileCanHold) {
  for (const auto format : {Xml, Binary}) {
    expectRefused(PropertyList(), format, "it holds a null");
    expectRefused(Array{1, Dictionary{{"k", PropertyList()}}}, format, "it holds a null");
    expectRefused(std::string("a\0b", 3), format, "a string holds a NUL character");
    expectRefused(Dictionary{{std::string("\0", 1), 1}}, format, "a string holds a NUL character");
    expectRefused("\xff", format, "a string is not valid UTF-8");
    expectRefused(Dictionary{{"\xc3", 1}}, format, "a string is not valid UTF-8");
    expectRefused(Date{std::nan("")}, format, "a date is no finite number");
  }
}

TEST(Serializing, RefusesInXmlWhatOnlyBinaryHolds) {
  expectRefused("\x01", Xml, "a string holds a control character");
  expectRefused(Dictionary{{"\x1b", 1}}, Xml, "a string holds a control character");
  expectRefused(Date{1e12}, Xml, "a date is outside the years 1000 to 9999");
  expectRefused(Date{-1e11}, Xml, "a date is outside the years 1000 to 9999");
  EXPECT_TRUE(serializePropertyList("\x01", Binary));
  EXPECT_TRUE(serializePropertyList(Date{1e12}, Binary));
}

TEST(Serializing, WritesTheCustomaryXmlDocument) {
  const auto bytes = serializePropertyList(Dictionary{{"b", 1}, {"a", "<&>"}}, Xml);
  ASSERT_TRUE(bytes);
  const std::string_view text = asText(*bytes);
  EXPECT_TRUE(
      text.starts_with("<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<!DOCTYPE plist PUBLIC "));
  EXPECT_TRUE(
      text.ends_with("<plist version=\"1.0\">\n<dict>\n\t<key>a</key>\n"
                     "\t<string>&lt;&amp;&gt;</string>\n\t<key>b</key>\n"
                     "\t<integer>1</integer>\n</dict>\n</plist>\n"))
      << text;
}

TEST(Serializing, LeavesTheErrorAloneOnSuccess) {
  std::optional<Error> error;
  EXPECT_TRUE(serializePropertyList(1, Xml, &error));
  EXPECT_EQ(error, std::nullopt);
}

}  // namespace
}  // namespace appsync
