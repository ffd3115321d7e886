#include <gtest/gtest.h>

#include "platform/property_list_codec.h"
#include "tests/platform/binary_file_builder.h"

namespace appsync {
namespace {

using namespace std::string_literals;
using Array = PropertyList::Array;
using Builder = BinaryFileBuilder;
using Dictionary = PropertyList::Dictionary;

void expectRefused(const Bytes& bytes, std::string_view reason,
                   const PropertyListLimits& limits = {}) {
  std::optional<Error> error;
  EXPECT_EQ(parsePropertyList(bytes, &error, limits), std::nullopt);
  ASSERT_TRUE(error) << reason;
  EXPECT_EQ(error->domain, PropertyListErrorDomain);
  EXPECT_EQ(error->localizedDescription(), "not a usable property list: " + std::string(reason));
}

/// A file whose top object is `object`.
Bytes single(const std::string& object) { return Builder().object(object).build(); }

TEST(BinaryInput, ReadsEveryIntegerSize) {
  EXPECT_EQ(parsePropertyList(single("\x10\xff")), PropertyList(255));
  EXPECT_EQ(parsePropertyList(single("\x11\xff\xff")), PropertyList(65535));
  EXPECT_EQ(parsePropertyList(single("\x12\xff\xff\xff\xff")),
            PropertyList(std::int64_t{4294967295}));
  EXPECT_EQ(parsePropertyList(single("\x13" + std::string(8, '\xff'))), PropertyList(-1));
  EXPECT_EQ(parsePropertyList(single("\x14" + Builder::bigEndian(~std::uint64_t{0}, 16))),
            PropertyList(~std::uint64_t{0}));
  EXPECT_EQ(parsePropertyList(single("\x14" + Builder::bigEndian(7, 16))), PropertyList(7));
}

TEST(BinaryInput, ReadsBothRealSizes) {
  EXPECT_EQ(parsePropertyList(single("\x22\x3f\xc0\0\0"s)), PropertyList(1.5));
  EXPECT_EQ(parsePropertyList(single("\x23\xbf\xf8\0\0\0\0\0\0"s)), PropertyList(-1.5));
}

TEST(BinaryInput, ReadsStringsOfBothEncodings) {
  EXPECT_EQ(parsePropertyList(single("\x53"
                                     "abc")),
            PropertyList("abc"));
  EXPECT_EQ(parsePropertyList(single("\x53"
                                     "a\xc3\xa9")),
            PropertyList("a\xc3\xa9"));
  EXPECT_EQ(parsePropertyList(single("\x63\x00\xe9\xd8\x3d\xde\x00"s)),
            PropertyList("\xc3\xa9\xf0\x9f\x98\x80"));
  EXPECT_EQ(parsePropertyList(single("\x62\xfe\xff\x00\x61"s)), PropertyList("\xef\xbb\xbf"
                                                                             "a"));
  EXPECT_EQ(parsePropertyList(single("\x5f\x10\x10"
                                     "0123456789abcdef")),
            PropertyList("0123456789abcdef"));
}

class OffsetSize : public testing::TestWithParam<std::size_t> {};

TEST_P(OffsetSize, OfAnyWidthIsRead) {
  Builder offsets(GetParam(), 1);
  offsets.dictionary({1, 2, 3, 4}).object("\x51k").object("\x51l").object("\x09").array({3});
  EXPECT_EQ(parsePropertyList(offsets.build()),
            PropertyList(Dictionary{{"k", true}, {"l", Array{true}}}));
  Builder references(1, GetParam());
  references.array({1, 2, 1}).object("\x51k").object("\x08");
  EXPECT_EQ(parsePropertyList(references.build()), PropertyList(Array{"k", false, "k"}));
}

INSTANTIATE_TEST_SUITE_P(BinaryInput, OffsetSize, testing::Range(std::size_t{1}, std::size_t{9}));

TEST(BinaryInput, ReadsObjectsThatAreShared) {
  const auto bytes = Builder().array({1, 1, 2}).array({2, 2}).object("\x10\x05").build();
  EXPECT_EQ(parsePropertyList(bytes), PropertyList(Array{Array{5, 5}, Array{5, 5}, 5}));
}

TEST(BinaryInput, TheLastOfEqualKeysCounts) {
  const auto bytes =
      Builder().dictionary({1, 1, 2, 3}).object("\x51k").object("\x08").object("\x09").build();
  EXPECT_EQ(parsePropertyList(bytes), PropertyList(Dictionary{{"k", true}}));
}

TEST(BinaryInput, RefusesADamagedTrailer) {
  const auto file = [](const BinaryFileTrailer& trailer) {
    return Builder().array({1}).object("\x09").build(trailer);
  };
  expectRefused(toBytes("bplist00"), "the file is cut off");
  expectRefused(toBytes("bplist00" + std::string(32, '\0')), "the file is cut off");
  expectRefused(file({.offsetSize = 0}), "the trailer is damaged");
  expectRefused(file({.offsetSize = 9}), "the trailer is damaged");
  expectRefused(file({.referenceSize = 0}), "the trailer is damaged");
  expectRefused(file({.referenceSize = 200}), "the trailer is damaged");
  expectRefused(file({.table = 8}), "the offset table lies outside the file");
  expectRefused(file({.table = 1'000'000}), "the offset table lies outside the file");
  expectRefused(file({.table = ~std::uint64_t{0}}), "the offset table lies outside the file");
  expectRefused(file({.objects = 3}), "the offset table lies outside the file");
  expectRefused(file({.objects = ~std::uint64_t{0} / 2 + 1}),
                "the offset table lies outside the file");
  expectRefused(file({.top = 2}), "the top object does not exist");
  expectRefused(file({.objects = 0}), "the top object does not exist");
}

TEST(BinaryInput, RefusesObjectsOutsideTheFile) {
  for (const std::uint64_t offset : {0u, 7u, 18u, 60000u}) {
    Builder builder;
    builder.array({1}).object("\x09");
    builder.offsets()[1] = offset;
    expectRefused(builder.build(), "an object lies outside the file");
  }
  for (const std::string& object :
       {"\x11\x01"s, "\x14\x01"s, "\x22\x01"s, "\x23\x01"s, "\x33\x01"s,
        "\x43"
        "ab"s,
        "\x53"
        "ab"s,
        "\x62\x01\x01\x01"s, "\x5f"s, "\x5f\x13\x01"s, "\x4f\x13" + std::string(8, '\xff'),
        "\x6f\x13" + std::string(8, '\xff'), "\x6f\x13\x80" + std::string(7, '\0'),
        "\xaf\x13" + std::string(8, '\xff'), "\xdf\x13\x80" + std::string(7, '\0'), "\xa2\x01"s}) {
    SCOPED_TRACE(testing::PrintToString(object));
    expectRefused(single(object), "an object lies outside the file");
  }
}

TEST(BinaryInput, RefusesObjectsThatNoPropertyListHas) {
  expectRefused(single("\x80\x01"), "it holds a UID");
  for (const char* object : {"\x0f", "\x01", "\x70", "\x91", "\xb0", "\xc0", "\xe0", "\xf0"})
    expectRefused(single(object), "it holds an object of an unknown type");
  expectRefused(single(std::string("\x00", 1)), "it holds an object of an unknown type");
  expectRefused(single("\x15" + std::string(32, '\0')), "an integer has no valid size");
  expectRefused(single("\x14" + std::string(16, '\xff')), "an integer is too large");
  expectRefused(single("\x21\x01\x01"), "a real has no valid size");
  expectRefused(single("\x30\x01"), "a date has no valid size");
  expectRefused(single("\x5f\x20"
                       "abc"),
                "an object has no valid length");
  expectRefused(single("\x5f\x14" + Builder::bigEndian(1, 16) + "a"),
                "an object has no valid length");
}

TEST(BinaryInput, RefusesTextThatNoStringHolds) {
  expectRefused(single("\x53"
                       "a\0b"s),
                "a string holds a NUL character");
  expectRefused(single("\x62\0\x61\0\0"s), "a string holds a NUL character");
  expectRefused(single("\x51\xff"), "a string is not valid text");
  expectRefused(single("\x61\xd8\x00"s), "a string is not valid text");
  expectRefused(single("\x61\xdc\x00"s), "a string is not valid text");
  expectRefused(single("\x62\xd8\x00\xd8\x00"s), "a string is not valid text");
  expectRefused(single("\x60"), "a string is not valid text");  // UTF-16, and empty
}

TEST(BinaryInput, RefusesDatesThatAreNoNumber) {
  expectRefused(single("\x33\x7f\xf8\0\0\0\0\0\x01"s), "a date is no finite number");
  expectRefused(single("\x33\xff\xf0\0\0\0\0\0\0"s), "a date is no finite number");
}

TEST(BinaryInput, RefusesReferencesThatLeadNowhere) {
  expectRefused(Builder().array({1}).build(), "it refers to an object that does not exist");
  expectRefused(Builder(2, 8).array({~std::uint64_t{0}}).build(),
                "it refers to an object that does not exist");
}

TEST(BinaryInput, RefusesKeysThatAreNoStrings) {
  expectRefused(Builder().dictionary({1, 1}).object("\x10\x01").build(),
                "a dictionary key is no string");
  expectRefused(Builder().dictionary({1, 2}).array({}).object("\x09").build(),
                "a dictionary key is no string");
}

TEST(BinaryInput, RefusesCycles) {
  expectRefused(Builder().array({0}).build(), "it refers to itself");
  expectRefused(Builder().array({1}).array({2}).array({1}).build(), "it refers to itself");
  expectRefused(Builder().dictionary({1, 2}).object("\x51k").array({0}).build(),
                "it refers to itself");
}

TEST(BinaryInput, RefusesATreeTooDeep) {
  const auto nested = [](std::size_t depth) {
    Builder builder;
    for (std::size_t i = 1; i < depth; ++i) builder.array({i});
    return builder.array({}).build();
  };
  EXPECT_TRUE(parsePropertyList(nested(128)));
  expectRefused(nested(129), "it is nested too deeply");
  EXPECT_TRUE(parsePropertyList(nested(3), nullptr, {.depth = 3}));
  expectRefused(nested(4), "it is nested too deeply", {.depth = 3});
  expectRefused(nested(60'000 / 6), "it is nested too deeply", {.depth = 1'000'000});
}

TEST(BinaryInput, CountsTheDepthOfSharedObjectsWhereTheyStand) {
  // Object 1 is first met at depth one, then again below object 2.
  const auto bytes = Builder().array({1, 2}).array({}).array({3}).array({1}).build();
  EXPECT_TRUE(parsePropertyList(bytes, nullptr, {.depth = 4}));
  expectRefused(bytes, "it is nested too deeply", {.depth = 3});
}

TEST(BinaryInput, RefusesSharingThatExpandsWithoutEnd) {
  Builder doubling;
  for (std::uint64_t i = 1; i <= 100; ++i) doubling.array({i, i});
  expectRefused(doubling.object("\x09").build(), "it holds too many objects");

  Builder heavy;
  heavy.array({1, 1, 1, 1})
      .array({2, 2, 2, 2})
      .object("\x4f\x12" + Builder::bigEndian(5 << 20, 4) + std::string(5 << 20, 'x'));
  expectRefused(Builder(heavy).build(), "it is too large");
}

TEST(BinaryInput, RefusesObjectsThatOverlapToGrow) {
  Builder builder(4, 2);
  std::string top = "\xaf\x11" + Builder::bigEndian(1000, 2);
  for (std::uint64_t i = 1; i <= 1000; ++i) top += Builder::bigEndian(i, 2);
  builder.object(top).object("\x5f\x12" + Builder::bigEndian(1 << 20, 4) +
                             std::string(1 << 20, 'x'));
  for (int i = 2; i <= 1000; ++i) builder.alias(1);
  expectRefused(builder.build(), "it is too large");
}

TEST(BinaryInput, ObeysTheCallersLimits) {
  const auto bytes = Builder().array({1, 1, 1}).object("\x09").build();
  EXPECT_TRUE(parsePropertyList(bytes, nullptr, {.objects = 4}));
  expectRefused(bytes, "it holds too many objects", {.objects = 3});
  EXPECT_TRUE(parsePropertyList(bytes, nullptr, {.bytes = bytes.size()}));
  expectRefused(bytes, "it is too large", {.bytes = bytes.size() - 1});
}

TEST(BinaryInput, NeverCrashesOnAFileWithOneByteChanged) {
  const auto whole = serializePropertyList(
      Dictionary{{"a", Array{1, -1, 2.5, "\xc3\xa9", Bytes(20), PropertyList::Date{5}}},
                 {"b", Dictionary{{"c", true}, {"d", std::string(40, 'x')}}}},
      PropertyListFormat::Binary);
  ASSERT_TRUE(whole);
  int refused = 0;
  for (std::size_t at = 0; at < whole->size(); ++at) {
    for (unsigned value = 0; value < 256; ++value) {
      Bytes changed = *whole;
      changed[at] = static_cast<std::byte>(value);
      refused += !parsePropertyList(changed);
    }
    EXPECT_EQ(parsePropertyList(ByteView(*whole).first(at)), std::nullopt);
  }
  EXPECT_GT(refused, 1000);
}

}  // namespace
}  // namespace appsync
