#include <gtest/gtest.h>

#include <cmath>
#include <limits>

#include "platform/property_list_codec.h"

namespace appsync {
namespace {

using namespace std::string_literals;
using Array = PropertyList::Array;
using Dictionary = PropertyList::Dictionary;

std::string document(const std::string& contents) {
  return "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<!DOCTYPE plist PUBLIC \"-//X//DTD PLIST "
         "1.0//EN\" \"http://example.com/plist.dtd\">\n<plist version=\"1.0\">\n" +
         contents + "\n</plist>\n";
}

std::optional<PropertyList> parse(const std::string& text, const PropertyListLimits& limits = {}) {
  return parsePropertyList(asBytes(text), nullptr, limits);
}
std::optional<PropertyList> parseValue(const std::string& value) { return parse(document(value)); }

void expectRefused(const std::string& text, std::string_view reason,
                   const PropertyListLimits& limits = {}) {
  std::optional<Error> error;
  EXPECT_EQ(parsePropertyList(asBytes(text), &error, limits), std::nullopt) << text;
  ASSERT_TRUE(error) << reason;
  EXPECT_EQ(error->localizedDescription(), "not a usable property list: " + std::string(reason))
      << text;
}
/// `value` stands on line 4 of the document.
void expectValueRefused(const std::string& value, const std::string& reason) {
  expectRefused(document(value), reason + " (line 4)");
}

TEST(XmlInput, ReadsEveryType) {
  EXPECT_EQ(parseValue("<dict><key>a</key><array><true/><false/></array><key>b</key><integer>-5"
                       "</integer><key>c</key><real>2.5</real><key>d</key><data>aGVs\n\tbG8=</data>"
                       "<key>e</key><date>2026-01-31T12:00:00Z</date><key>f</key><string>x</string>"
                       "</dict>"),
            PropertyList(Dictionary{{"a", Array{true, false}},
                                    {"b", -5},
                                    {"c", 2.5},
                                    {"d", toBytes("hello")},
                                    {"e", PropertyList::Date{791553600}},
                                    {"f", "x"}}));
}

TEST(XmlInput, ReadsIntegersAsTheyAreMeant) {
  const auto integer = [](const std::string& text) {
    return parseValue("<integer>" + text + "</integer>");
  };
  EXPECT_EQ(integer("-5"), PropertyList(-5));
  EXPECT_EQ(integer("+5"), PropertyList(5));
  EXPECT_EQ(integer("-0"), PropertyList(0));
  EXPECT_EQ(integer(" \n -5\t"), PropertyList(-5));
  EXPECT_EQ(integer("012"), PropertyList(12));
  EXPECT_EQ(integer("0x1F"), PropertyList(31));
  EXPECT_EQ(integer("-0x1f"), PropertyList(-31));
  EXPECT_EQ(integer("18446744073709551611"), PropertyList(std::uint64_t(-5)));
  EXPECT_EQ(integer("-9223372036854775808"),
            PropertyList(std::numeric_limits<std::int64_t>::min()));
}

TEST(XmlInput, RefusesMalformedIntegers) {
  for (const char* text : {"", " ", "12abc", "1 2", "- 5", "--5", "0x", "1.0", "0b1",
                           "18446744073709551616", "-9223372036854775809"})
    expectValueRefused("<integer>" + std::string(text) + "</integer>",
                       "an integer is malformed or too large");
  expectValueRefused("<integer/>", "an integer is malformed or too large");
}

TEST(XmlInput, ReadsReals) {
  const auto real = [](const std::string& text) {
    return parseValue("<real>" + text + "</real>")->asReal().value();
  };
  EXPECT_EQ(real("0.1"), 0.1);
  EXPECT_EQ(real(" -1.5e3 "), -1500);
  EXPECT_EQ(real("+2"), 2);
  EXPECT_EQ(real(".5"), 0.5);
  EXPECT_EQ(real("-infinity"), -std::numeric_limits<double>::infinity());
  EXPECT_EQ(real("+INF"), std::numeric_limits<double>::infinity());
  EXPECT_NE(real("nan"), real("nan"));
  EXPECT_TRUE(std::signbit(real("-0.0")));
}

TEST(XmlInput, RefusesMalformedReals) {
  for (const char* text : {"", "1.5xyz", "1,5", "0x1p3", "e5", "1e999", "- 1", "nan(1)"})
    expectValueRefused("<real>" + std::string(text) + "</real>",
                       "a real is malformed or too large");
}

TEST(XmlInput, ReadsDatesFarFromToday) {
  EXPECT_EQ(parseValue("<date>9999-12-31T23:59:59Z</date>"),
            PropertyList(PropertyList::Date{252423993599}));
  EXPECT_EQ(parseValue("<date> 1600-02-29T12:34:56Z\n</date>"),
            PropertyList(PropertyList::Date{-12649260304}));
}

TEST(XmlInput, RefusesMalformedDates) {
  for (const char* text : {"", "hello", "2026-01-31", "2026-01-31T12:00:00",
                           "2026-01-31T12:00:00.5Z", "2026-02-29T12:00:00Z", "2026-13-01T12:00:00Z",
                           "2026-01-31T24:00:00Z", "2026-01-31T12:60:00Z", "26-01-31T12:00:00Z",
                           "2026-01-31 12:00:00Z", "0999-01-01T00:00:00Z"})
    expectValueRefused("<date>" + std::string(text) + "</date>", "a date is malformed");
}

TEST(XmlInput, ReadsTextWithItsMarkup) {
  EXPECT_EQ(parseValue("<string>  a\n </string>"), PropertyList("  a\n "));
  EXPECT_EQ(parseValue("<string>&lt;&amp;&gt;&quot;&apos;&#65;&#x1F600;&#9;</string>"),
            PropertyList("<&>\"'A\xf0\x9f\x98\x80\t"));
  EXPECT_EQ(parseValue("<string>a<![CDATA[<b>&amp;\xc3\xa9]]]>c</string>"),
            PropertyList("a<b>&amp;\xc3\xa9]c"));
  EXPECT_EQ(parseValue("<string>a<!-- <b> -->c</string>"), PropertyList("ac"));
  EXPECT_EQ(parseValue("<string>a>b]]>c</string>"), PropertyList("a>b]]>c"));
  EXPECT_EQ(parseValue("<string/>"), PropertyList(""));
  EXPECT_EQ(parseValue("<string />"), PropertyList(""));
}

TEST(XmlInput, RefusesTextThatNoStringHolds) {
  expectValueRefused("<string>&foo;</string>", "an entity is unknown or no character");
  expectValueRefused("<string>&#0;</string>", "an entity is unknown or no character");
  expectValueRefused("<string>&#xD800;</string>", "an entity is unknown or no character");
  expectValueRefused("<string>&#x110000;</string>", "an entity is unknown or no character");
  expectValueRefused("<string>&#99999999999;</string>", "an entity is unknown or no character");
  expectValueRefused("<string>&;</string>", "an entity is unknown or no character");
  expectValueRefused("<string>a & b</string>", "an entity is malformed");
  expectRefused(document("<string>\x01</string>"), "it holds a control character (line 4)");
  expectRefused(document("<string>a\0b</string>"s), "it holds a control character (line 4)");
  expectRefused(document("<string><![CDATA[\x1b]]></string>"),
                "it holds a control character (line 4)");
  expectRefused(document("<string>\xff\xfe</string>"), "it is not valid UTF-8 (line 1)");
  expectRefused(document("<string>\xed\xa0\x80</string>"), "it is not valid UTF-8 (line 1)");
}

TEST(XmlInput, RefusesDataThatIsNotWhole) {
  for (const char* text : {"!!!!", "aGVsbG8", "aGVsbG8=aGVs", "a===", "aGVs&amp;aaa"})
    expectValueRefused("<data>" + std::string(text) + "</data>", "data is not Base64");
  EXPECT_EQ(parseValue("<data> a G V s </data>"), PropertyList(toBytes("hel")));
  EXPECT_EQ(parseValue("<data/>"), PropertyList(Bytes{}));
}

TEST(XmlInput, ReadsDictionariesWithEmptyAndRepeatedKeys) {
  EXPECT_EQ(parseValue("<dict><key/><true/></dict>"), PropertyList(Dictionary{{"", true}}));
  EXPECT_EQ(parseValue("<dict><key>a</key><integer>1</integer><key>a</key><true/></dict>"),
            PropertyList(Dictionary{{"a", true}}));
  EXPECT_EQ(parseValue("<dict><key>CF$UID</key><integer>2</integer></dict>"),
            PropertyList(Dictionary{{"CF$UID", 2}}));
}

TEST(XmlInput, RefusesDictionariesWhoseKeysAndValuesDoNotMatch) {
  expectValueRefused("<dict><key>a</key></dict>", "a dictionary's key has no value");
  expectValueRefused("<dict><key>a</key><key>b</key><true/></dict>",
                     "a dictionary's key has no value");
  expectValueRefused("<dict><true/></dict>", "a dictionary's value has no key");
  expectValueRefused("<dict><key>a</key><true/><true/></dict>", "a dictionary's value has no key");
  expectValueRefused("<array><key>a</key></array>", "a key stands outside a dictionary");
  expectValueRefused("<key>a</key>", "a key stands outside a dictionary");
}

TEST(XmlInput, RefusesMarkupThatDoesNotMatch) {
  expectValueRefused("<array><string>a</string></dict>", "an element is closed that is not open");
  expectValueRefused("<array></plist>", "an element is closed that is not open");
  expectValueRefused("</array>", "an element is closed that is not open");
  expectValueRefused("<string>a<true/></string>", "an element stands inside a value");
  expectValueRefused("<string>a</data>", "an element stands inside a value");
  expectValueRefused("<true>x</true>", "a boolean holds text");
  expectValueRefused("<foo/>", "an element has an unknown name");
  expectValueRefused("<plist><true/></plist>", "an element stands inside a value");
  expectValueRefused("<array>text</array>", "text stands outside a value");
  expectValueRefused("<string a='/>'>x</string>", "an element is malformed");
  expectValueRefused("<\xc3\xa9/>", "an element is malformed");
  expectValueRefused("<true/><false/>", "it holds more than one value");
  EXPECT_EQ(parseValue("<array ><true></true ></array\n>"), PropertyList(Array{true}));
}

TEST(XmlInput, RefusesAFileThatIsCutOffAnywhere) {
  const std::string whole = document("<dict><key>a</key><string>b&amp;</string></dict>");
  const std::size_t end = whole.rfind('>');
  for (std::size_t size = 0; size <= end; ++size)
    EXPECT_EQ(parse(whole.substr(0, size)), std::nullopt) << size;
  EXPECT_TRUE(parse(whole));
}

TEST(XmlInput, ReadsWhatSurroundsTheValue) {
  EXPECT_EQ(parse("<plist><true/></plist>"), PropertyList(true));
  EXPECT_EQ(parse("\xef\xbb\xbf<?xml version='1.0'?><plist a=\"a>b\" b='/'><true/></plist>"),
            PropertyList(true));
  EXPECT_EQ(parse(" \r\n\t<plist>\r\n<true/></plist> \n"), PropertyList(true));
  EXPECT_EQ(parse("<!-- <plist> --><?pi <x>?><plist><!-- a --><true/><?pi?></plist><!-- b -->"),
            PropertyList(true));
}

TEST(XmlInput, RefusesWhatIsNoDocument) {
  for (const char* text : {"", " \n", "{\"a\": 1}", "{ a = 1; }", "(a, b)", "plist", "bplist0",
                           "bplist15", "\xff\xfe<\0p\0"})
    expectRefused(text, "it is neither XML nor binary");
  expectRefused("<html></html>", "it has no plist element (line 1)");
  expectRefused("<array><true/></array>", "it has no plist element (line 1)");
  expectRefused("<plist/>", "it holds no value (line 1)");
  expectRefused("<plist></plist>", "it holds no value (line 1)");
  expectRefused("<plist><true/></plist>garbage", "something follows the plist element (line 1)");
  expectRefused("<plist><true/></plist><plist><true/></plist>",
                "something follows the plist element (line 1)");
  expectRefused("<plist>\n<!-- <true/></plist>", "a comment has no end (line 2)");
}

TEST(XmlInput, RefusesDeclaredEntitiesAndOtherEncodings) {
  expectRefused("<!DOCTYPE plist [<!ENTITY a \"b\">]><plist><string>&a;</string></plist>",
                "it declares entities of its own (line 1)");
  expectRefused("<!DOCTYPE plist SYSTEM \"a>b\" [<!ENTITY a \"b\">]><plist><true/></plist>",
                "it declares entities of its own (line 1)");
  expectRefused("<!DOCTYPE plist", "the document type has no end (line 1)");
  EXPECT_TRUE(parse("<!DOCTYPE plist SYSTEM \"a[>b\"><plist><true/></plist>"));
  expectRefused("<?xml version='1.0' encoding='UTF-16'?><plist><true/></plist>",
                "its encoding is not UTF-8 (line 1)");
  EXPECT_TRUE(parse("<?xml version='1.0' encoding='utf-8'?><plist><true/></plist>"));
}

TEST(XmlInput, ReadsManyKeysChosenToCollideInOneSweep) {
  // "Ez" and "FY" hash alike wherever the factor is 33.
  std::string text = "<dict>";
  for (unsigned i = 0; i < 1u << 17; ++i) {
    text += "<key>";
    for (unsigned bit = 0; bit < 17; ++bit) text += (i >> bit & 1) != 0 ? "Ez" : "FY";
    text += "</key><true/>";
  }
  const auto parsed = parseValue(text + "</dict>");
  ASSERT_TRUE(parsed && parsed->asDictionary());
  EXPECT_EQ(parsed->asDictionary()->size(), 1u << 17);
}

TEST(XmlInput, ObeysTheLimits) {
  const auto nested = [](int depth) {
    std::string text;
    for (int i = 0; i < depth; ++i) text += "<array>";
    for (int i = 0; i < depth; ++i) text += "</array>";
    return document(text);
  };
  EXPECT_TRUE(parse(nested(128)));
  expectRefused(nested(129), "it is nested too deeply (line 4)");
  expectRefused(nested(100'000), "it is nested too deeply (line 4)", {.depth = 200'000});
  const std::string list = document("<array><true/><true/></array>");
  EXPECT_TRUE(parse(list, {.objects = 3}));
  expectRefused(list, "it holds too many objects (line 4)", {.objects = 2});
  EXPECT_TRUE(parse(list, {.bytes = list.size()}));
  expectRefused(list, "it is too large", {.bytes = list.size() - 1});
}

}  // namespace
}  // namespace appsync
