// Binary property lists read where they lie, and changed in single places.
#include "platform/binary_property_list.h"

#include <gtest/gtest.h>

#include <random>

#include "platform/property_list_bounds.h"
#include "platform/utf8.h"
#include "tests/platform/binary_file_builder.h"
#include "tests/platform/same_tree.h"

namespace appsync {
namespace {

using namespace std::string_literals;
using Array = PropertyList::Array;
using Builder = BinaryFileBuilder;
using Dictionary = PropertyList::Dictionary;
using List = BinaryPropertyList;

List opened(const Bytes& bytes) {
  List list;
  EXPECT_EQ(list.open(bytes), nullptr);
  return list;
}

std::string utf8Of(const List& list, const List::Object& object) {
  std::string text;
  for (std::size_t at = object.start; at < object.start + object.size; at += 2) {
    auto character = static_cast<char32_t>(list.number(at, 2));
    if (character >= 0xd800 && character < 0xdc00) {
      at += 2;
      character = 0x10000 + ((character - 0xd800) << 10) +
                  static_cast<char32_t>(list.number(at, 2)) - 0xdc00;
    }
    appendUtf8(text, character);
  }
  return text;
}

PropertyList numberOf(const List& list, const List::Object& object) {
  if (object.size == 16) return list.number(object.start + 8, 8);
  const std::uint64_t value = list.number(object.start, object.size);
  if (object.kind == List::Integer) return static_cast<std::int64_t>(value);
  if (object.size == 4) return double{std::bit_cast<float>(static_cast<std::uint32_t>(value))};
  return std::bit_cast<double>(value);
}

/// The tree of a checked list, by nothing but what the list tells of itself.
PropertyList treeOf(const List& list, std::size_t index) {
  List::Object object;
  EXPECT_EQ(list.read(index, object), nullptr);
  const auto child = [&](std::size_t number) {
    const auto at = list.reference(list.placeOfReference(object, number));
    return treeOf(list, static_cast<std::size_t>(at));
  };
  const ByteView contents = list.contents(object);
  switch (object.kind) {
    case List::Constant:
      return object.info == 9;
    case List::Integer:
    case List::Real:
      return numberOf(list, object);
    case List::Date:
      return PropertyList::Date{std::bit_cast<double>(list.number(object.start, 8))};
    case List::Data:
      return Bytes(contents.begin(), contents.end());
    case List::Text:
      return asText(contents);
    case List::Utf16:
      return utf8Of(list, object);
    default:
      break;
  }
  const auto count = static_cast<std::size_t>(object.count);
  Array array;
  Dictionary dictionary;
  for (std::size_t i = 0; i < count; ++i) {
    if (object.kind == List::Array) {
      array.push_back(child(i));
    } else {
      dictionary.insert_or_assign(*child(i).asString(), child(count + i));
    }
  }
  return object.kind == List::Array ? PropertyList(array) : PropertyList(dictionary);
}

/// A file with all that the format has, in which most single bytes can be changed with some effect.
Bytes everyKind() {
  const Dictionary all{{"a", Array{1, -1, 2.5, "\xc3\xa9\xf0\x9f\x98\x80", Bytes(20)}},
                       {"b", Dictionary{{"c", true}, {"d", std::string(40, 'x')}}},
                       {"e", Array{PropertyList::Date{5}, 70'000, 300, ~std::uint64_t{0}, 1.5}}};
  return *serializePropertyList(all, PropertyListFormat::Binary);
}

TEST(BinaryView, ShowsWhatTheLibraryReads) {
  const Bytes bytes = everyKind();
  const List list = opened(bytes);
  EXPECT_EQ(treeOf(list, list.topIndex()), parsePropertyList(bytes));
}

TEST(BinaryView, OfADamagedFileShowsWhatTheLibraryReadsOrIsRefused) {
  const std::uint64_t seed = std::random_device()();
  SCOPED_TRACE("seed " + std::to_string(seed));
  std::mt19937_64 random(seed);
  const Bytes whole = everyKind();
  int passed = 0;
  for (int round = 0; round < 20'000; ++round) {
    Bytes bytes = whole;
    for (auto changes = random() % 3; changes-- > 0;)
      bytes[8 + random() % (bytes.size() - 8)] = static_cast<std::byte>(random());
    List list;
    const bool sound = !list.open(bytes) && !problemOf(list, {});
    const auto parsed = parsePropertyList(bytes);
    ASSERT_EQ(sound, parsed.has_value()) << "round " << round;
    if (!sound) continue;
    ASSERT_TRUE(sameTree(treeOf(list, list.topIndex()), *parsed)) << "round " << round;
    ++passed;
  }
  EXPECT_GT(passed, 5'000);
}

TEST(BinaryView, TellsWhetherAContainerStandsInTwoPlaces) {
  const auto shares = [](const Bytes& bytes) {
    bool found = false;
    EXPECT_EQ(problemOf(opened(bytes), {}, &found), nullptr);
    return found;
  };
  EXPECT_TRUE(shares(Builder().array({1, 1}).array({}).build()));
  EXPECT_TRUE(shares(Builder().array({1, 3}).array({3}).object("\x09").array({}).build()));
  EXPECT_FALSE(shares(Builder().array({1, 2, 2}).array({2}).object("\x51k").build()));
}

TEST(BinaryView, TellsWhetherObjectsLieApart) {
  const auto apart = [](const Bytes& bytes) { return opened(bytes).objectsLieApart(); };
  Builder whole;
  whole.array({1, 2}).object("\x51k").object("\x53\x51kl");
  EXPECT_TRUE(apart(whole.build()));
  EXPECT_FALSE(apart(Builder(whole).alias(1).build()));
  Builder inside(whole);
  inside.offsets().push_back(inside.offsets()[2] + 1);
  EXPECT_FALSE(apart(inside.build()));
  Builder backwards(whole);
  std::swap(backwards.offsets()[1], backwards.offsets()[2]);
  EXPECT_FALSE(apart(backwards.build()));
  EXPECT_FALSE(apart(Builder(whole).object("\x5f").build()));
}

// --- Changing single places ---

/// Makes the second element of the top array refer to the text.
bool setSecond(Bytes& file, std::string_view text) {
  BinaryPropertyListEditor editor(file);
  const auto index = editor.indexOfText(text);
  if (!index) return false;
  const List list = opened(file);
  List::Object top;
  EXPECT_EQ(list.read(list.topIndex(), top), nullptr);
  editor.refer(list.placeOfReference(top, 1), *index);
  return true;
}

class EditedSizes : public testing::TestWithParam<std::tuple<std::size_t, std::size_t>> {};

TEST_P(EditedSizes, TakeANewTextAndTheSameOneOnce) {
  const auto [offsetSize, referenceSize] = GetParam();
  const Builder builder = Builder(offsetSize, referenceSize).array({1, 1, 2}).object("\x51k");
  Bytes file = Builder(builder).object("\x08").build();
  ASSERT_TRUE(setSecond(file, "SENT"));
  const Bytes expected = Builder(offsetSize, referenceSize)
                             .array({1, 3, 2})
                             .object("\x51k")
                             .object("\x08")
                             .object("\x54SENT")
                             .build();
  EXPECT_EQ(file, expected);
  ASSERT_TRUE(setSecond(file, "k"));
  ASSERT_TRUE(setSecond(file, "SENT"));
  EXPECT_EQ(file, expected);
}

INSTANTIATE_TEST_SUITE_P(BinaryEdit, EditedSizes,
                         testing::Combine(testing::Range(std::size_t{1}, std::size_t{9}),
                                          testing::Range(std::size_t{1}, std::size_t{9})));

TEST(BinaryEdit, TakesNoDataForAText) {
  Bytes file = Builder().array({1, 1}).object("\x44SENT").build();
  ASSERT_TRUE(setSecond(file, "SENT"));
  EXPECT_EQ(parsePropertyList(file), PropertyList(Array{toBytes("SENT"), "SENT"}));
}

TEST(BinaryEdit, KeepsWhatLiesBehindTheOffsetTable) {
  Bytes file = Builder().array({1, 1}).object("\x51k").build();
  file.insert(file.end() - 32, 3, std::byte{0x77});
  ASSERT_TRUE(setSecond(file, "SENT"));
  EXPECT_EQ(parsePropertyList(file), PropertyList(Array{"k", "SENT"}));
}

TEST(BinaryEdit, ChangesNothingForATextThatIsLongOrNotAscii) {
  const Bytes before = Builder().array({1, 1}).object("\x51k").build();
  for (const std::string& text : {std::string(15, 'x'), "\xc3\xa9"s, "a\0b"s}) {
    Bytes file = before;
    EXPECT_FALSE(setSecond(file, text));
    EXPECT_EQ(file, before);
  }
  Bytes file = before;
  EXPECT_TRUE(setSecond(file, std::string(14, 'x')));
  EXPECT_EQ(parsePropertyList(file), PropertyList(Array{"k", std::string(14, 'x')}));
}

TEST(BinaryEdit, ChangesNothingWhenNoReferenceCanTellOneObjectMore) {
  Builder builder(2, 1);
  builder.array({1, 1});
  while (builder.offsets().size() < 255) builder.object("\x51k");
  Bytes file = builder.build();
  EXPECT_TRUE(setSecond(file, "SENT"));
  const Bytes full = file;
  EXPECT_FALSE(setSecond(file, "FAILED"));
  EXPECT_EQ(file, full);
}

TEST(BinaryEdit, ChangesNothingWhenNoOffsetCanTellAPlaceFurtherBehind) {
  const Bytes before =
      Builder(1, 1).array({1, 1}).object("\x5f\x10\xff" + std::string(255, 'x')).build();
  Bytes file = before;
  EXPECT_FALSE(setSecond(file, "SENT"));
  EXPECT_EQ(file, before);
}

}  // namespace
}  // namespace appsync
