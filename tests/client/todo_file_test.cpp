// A todo list found and changed as bytes. The parser says what must come out.
#include "client/todo_file.h"

#include <algorithm>
#include <random>

#include "platform/property_list_codec.h"
#include "platform/todo_entry.h"
#include "tests/client/client_test.h"
#include "tests/platform/binary_file_builder.h"

namespace appsync {
namespace {

using namespace std::string_literals;
using Array = PropertyList::Array;
using Builder = BinaryFileBuilder;
using Dictionary = PropertyList::Dictionary;

Bytes binary(const PropertyList& list) {
  return *serializePropertyList(list, PropertyListFormat::Binary);
}

PropertyList entry(std::string_view identifier, std::string_view operation) {
  return Dictionary{{"identifier", identifier}, {"operation", operation}};
}

TodoFile fileOf(Bytes bytes) {
  TodoFile file;
  EXPECT_TRUE(file.take(bytes));
  EXPECT_TRUE(bytes.empty());
  return file;
}

TEST(TodoFile, TellsTheOperationOfTheFirstEntryOfAnIdentifier) {
  const TodoFile file = fileOf(
      binary(Array{entry("b", "remove"), entry("a", "install"), entry("b", "x"), entry("", "y")}));
  EXPECT_EQ(file.operationOf("a"), "install");
  EXPECT_EQ(file.operationOf("b"), "remove");
  EXPECT_EQ(file.operationOf(""), "y");
  EXPECT_EQ(file.operationOf("c"), std::nullopt);
  EXPECT_EQ(file.operationOf("A"), std::nullopt);
}

TEST(TodoFile, ChangesTheFirstEntryOfAnIdentifier) {
  TodoFile file = fileOf(binary(Array{entry("a", "install"), entry("b", "install")}));
  EXPECT_FALSE(file.setOperation("c", "SENT"));
  EXPECT_TRUE(file.setOperation("b", "SENT"));
  EXPECT_EQ(file.operationOf("b"), "SENT");
  EXPECT_EQ(parsePropertyList(file.bytes()),
            PropertyList(Array{entry("a", "install"), entry("b", "SENT")}));
}

TEST(TodoFile, OfAnEmptyListHoldsNothing) {
  TodoFile file = fileOf(binary(Array{}));
  EXPECT_EQ(file.operationOf("a"), std::nullopt);
  EXPECT_FALSE(file.setOperation("a", "SENT"));
}

TEST(TodoFile, GrowsOnlyByTextsThatItDoesNotHold) {
  TodoFile file = fileOf(binary(Array{entry("a", "install")}));
  const std::size_t before = file.bytes().size();
  for (int round = 0; round < 3; ++round) {
    for (const char* operation : {"DOWNLOADED", "INSTALLED", "install"})
      EXPECT_TRUE(file.setOperation("a", operation));
  }
  // Two texts with their markers and their offsets of one byte.
  EXPECT_EQ(file.bytes().size(), before + (1 + 10 + 1) + (1 + 9 + 1));
}

TEST(TodoFile, TakesAnotherListInPlaceOfTheOneItHolds) {
  TodoFile file = fileOf(binary(Array{entry("a", "install")}));
  Bytes other = binary(Array{entry("b", "remove")});
  EXPECT_TRUE(file.take(other));
  EXPECT_EQ(file.operationOf("a"), std::nullopt);
  EXPECT_EQ(file.operationOf("b"), "remove");
}

TEST(TodoFile, LeavesAListForTheParserAndForgetsItsOwn) {
  TodoFile file = fileOf(binary(Array{entry("a", "install")}));
  const Bytes xml = *serializePropertyList(Array{entry("b", "remove")}, PropertyListFormat::Xml);
  Bytes list = xml;
  EXPECT_FALSE(file.take(list));
  EXPECT_EQ(list, xml);
  EXPECT_TRUE(file.bytes().empty());
  EXPECT_EQ(file.operationOf("a"), std::nullopt);
  EXPECT_FALSE(file.setOperation("a", "SENT"));
  Bytes empty;
  EXPECT_FALSE(file.take(empty));
}

// --- What only the parser reads ---

struct Unusual {
  std::string name;
  Bytes list;
};

void PrintTo(const Unusual& unusual, std::ostream* out) { *out << unusual.name; }

class UnusualList : public testing::TestWithParam<Unusual> {};

TEST_P(UnusualList, IsLeftForTheParser) {
  Bytes list = GetParam().list;
  EXPECT_FALSE(TodoFile().take(list));
  EXPECT_EQ(list, GetParam().list);
}

/// An array of one entry, with these objects as 2 to 5: two keys, two values.
Builder oneEntry(const std::array<std::string, 4>& objects, std::size_t offsetSize = 2) {
  Builder builder(offsetSize, 1);
  builder.array({1}).dictionary({2, 3, 4, 5});
  for (const std::string& object : objects) builder.object(object);
  return builder;
}

const std::string IdentifierKey = "\x5aidentifier", OperationKey = "\x59operation";
const std::string IdentifierA = "\x51\x61", Install = "\x57install";
const std::array<std::string, 4> Usual{IdentifierKey, OperationKey, IdentifierA, Install};

std::array<std::string, 4> with(std::size_t which, std::string object) {
  auto objects = Usual;
  objects[which] = std::move(object);
  return objects;
}

/// With one more key, whose value is the identifier.
Bytes withThirdKey(const std::string& key) {
  Builder builder(2, 1);
  builder.array({1}).dictionary({2, 3, 6, 4, 5, 4});
  for (const std::string& object : Usual) builder.object(object);
  return builder.object(key).build();
}

Bytes withOffset(std::size_t index, std::uint64_t offset) {
  Builder builder = oneEntry(Usual);
  builder.offsets()[index] = offset;
  return builder.build();
}

Bytes withFirstByte(std::byte first) {
  Bytes bytes = oneEntry(Usual).build();
  bytes[0] = first;
  return bytes;
}

Bytes nested(std::size_t depth) {
  Builder builder;
  for (std::size_t i = 1; i < depth; ++i) builder.array({i});
  return builder.array({}).build();
}

std::vector<Unusual> unusualLists() {
  const Builder usual = oneEntry(Usual);
  const PropertyList good = entry("a", "install");
  return {
      {"ADictionary", binary(good)},
      {"AnEmptyDictionary", binary(Dictionary{})},
      {"AText", binary("a")},
      {"OfAnotherName", withFirstByte(std::byte{'B'})},
      {"AnEntryThatIsAText", binary(Array{good, "a"})},
      {"AnEntryThatIsAnArray", binary(Array{good, Array{"identifier", "operation"}})},
      {"WithoutIdentifier", binary(Array{good, Dictionary{{"operation", "install"}}})},
      {"WithoutOperation", binary(Array{good, Dictionary{{"identifier", "b"}}})},
      {"ANumberAsIdentifier", oneEntry(with(2, "\x10\x07")).build()},
      {"ANumberAsOperation", oneEntry(with(3, "\x10\x07")).build()},
      {"AnIdentifierInUtf16", binary(Array{entry("\xc3\xa9", "install")})},
      {"AnOperationInUtf16", binary(Array{entry("a", "\xc3\xa9")})},
      {"AKeyInUtf16", withThirdKey("\x61\0\x61"s)},
      {"AKeyThatIsANumber", oneEntry(with(0, "\x10\x07")).build()},
      {"TwoIdentifiers", withThirdKey(IdentifierKey)},
      {"TwoOperations", withThirdKey(OperationKey)},
      {"AnEntryThatStandsTwice", Builder(2, 1)
                                     .array({1, 1})
                                     .dictionary({2, 3, 2, 3})
                                     .object(IdentifierKey)
                                     .object(OperationKey)
                                     .build()},
      {"ObjectsThatOverlap", Builder(usual).alias(4).build()},
      {"ACycle", Builder().array({1}).dictionary({2, 0}).object(IdentifierKey).build()},
      {"NestedTooDeeply", nested(200)},
      {"AHugeCount", oneEntry(with(3, "\x5f\x13\x7f\xff\xff\xff\xff\xff\xff\xff")).build()},
      {"AHugeArray", Builder().object("\xaf\x13\x40\0\0\0\0\0\0\0"s).build()},
      {"AnOffsetPastTheEnd", withOffset(4, 0xffff)},
      {"AnOffsetInTheName", withOffset(4, 3)},
      {"MoreObjectsThanOffsets", usual.build({.objects = ~std::uint64_t{0} / 2})},
      {"ATableOutside", usual.build({.table = ~std::uint64_t{0} - 8})},
      {"ATopThatIsNot", usual.build({.top = 6})},
      {"OffsetsOfNoSize", usual.build({.offsetSize = std::uint8_t{0}})},
      {"ReferencesOfNineBytes", usual.build({.referenceSize = std::uint8_t{9}})},
      {"AReferenceThatLeadsNowhere", Builder(2, 1)
                                         .array({1})
                                         .dictionary({2, 3, 4, 9})
                                         .object(IdentifierKey)
                                         .object(OperationKey)
                                         .object(IdentifierA)
                                         .build()},
  };
}

INSTANTIATE_TEST_SUITE_P(TodoFile, UnusualList, testing::ValuesIn(unusualLists()),
                         [](const auto& instance) { return instance.param.name; });

TEST(TodoFile, LeavesAListForTheParserThatAChangeMightMakeTooLarge) {
  const auto listWith = [](std::size_t size) {
    return binary(
        Array{Dictionary{{"identifier", "a"}, {"operation", "install"}, {"cookie", Bytes(size)}}});
  };
  const std::size_t half = PropertyListLimits{}.bytes / 2;
  Bytes small = listWith(half - 100), large = listWith(half);
  EXPECT_TRUE(TodoFile().take(small));
  EXPECT_FALSE(TodoFile().take(large));
}

TEST(TodoFile, TakesTheUsualListThatTheUnusualOnesAreMadeOf) {
  EXPECT_EQ(fileOf(withThirdKey("\x51k")).operationOf("a"), "install");
  for (std::size_t offsetSize = 1; offsetSize <= 8; ++offsetSize) {
    TodoFile file = fileOf(oneEntry(Usual, offsetSize).build());
    EXPECT_TRUE(file.setOperation("a", "SENT"));
    EXPECT_EQ(parsePropertyList(file.bytes()), PropertyList(Array{entry("a", "SENT")}));
  }
}

// --- Beside the parser ---

class RandomLists {
 public:
  explicit RandomLists(std::uint64_t seed) : random_(seed) {}

  std::size_t upTo(std::size_t last) {
    return std::uniform_int_distribution<std::size_t>(0, last)(random_);
  }
  /// Few enough to meet again; some only by the parser.
  std::string identifier() { return "com." + std::to_string(upTo(30)); }
  std::string operation() {
    static const std::vector<std::string> operations{
        "install",   "remove", "SENT", "DOWNLOADED",
        "INSTALLED", "FAILED", "",     "an operation too long"};
    return operations[upTo(operations.size() - 1)];
  }
  PropertyList entry() {
    Dictionary made{{"identifier", identifier()}, {"operation", operation()}};
    if (upTo(1)) made["version"] = std::to_string(upTo(3));
    if (upTo(3) == 0) made["name"] = "\xc3\xa9" + std::to_string(upTo(300));
    if (upTo(3) == 0) made["size"] = std::uint64_t{1} << upTo(60);
    if (upTo(5) == 0) made["more"] = Array{1.5, Dictionary{{"operation", "remove"}}, Bytes(20)};
    if (upTo(200) == 0) made["operation"] = 7;
    return made;
  }
  Array list() {
    Array made;
    for (std::size_t count = upTo(upTo(9) == 0 ? 300 : 20); count > 0; --count)
      made.push_back(entry());
    return made;
  }

 private:
  std::mt19937_64 random_;
};

auto entryOf(Array& list, std::string_view identifier) {
  return std::ranges::find_if(
      list, [&](const PropertyList& item) { return TodoEntry(item).isFor(identifier); });
}

TEST(TodoFile, DoesToRandomListsWhatTheParserDoes) {
  const std::uint64_t seed = std::random_device()();
  SCOPED_TRACE("seed " + std::to_string(seed));
  RandomLists random(seed);
  int taken = 0, changed = 0;
  for (int round = 0; round < 300; ++round) {
    Array list = random.list();
    Bytes bytes = binary(list);
    TodoFile file;
    if (!file.take(bytes)) continue;
    ++taken;
    for (int change = 0; change < 20; ++change) {
      const std::string identifier = random.identifier(), operation = random.operation();
      const auto found = entryOf(list, identifier);
      const std::string* before = found == list.end() ? nullptr : TodoEntry(*found).operation();
      ASSERT_EQ(file.operationOf(identifier),
                before ? std::optional<std::string_view>(*before) : std::nullopt);
      const bool done = file.setOperation(identifier, operation);
      ASSERT_TRUE(before || !done);
      if (done) (*found->asDictionary())["operation"] = operation;
      ASSERT_EQ(parsePropertyList(file.bytes()), PropertyList(list));
      changed += done;
    }
  }
  EXPECT_GT(taken, 150);
  EXPECT_GT(changed, 500);
}

}  // namespace
}  // namespace appsync
