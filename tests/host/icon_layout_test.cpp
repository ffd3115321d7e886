#include "host/library/icon_layout.h"

#include "platform/property_list_codec.h"
#include "tests/host/host_files.h"
#include "tests/test_pch.h"

namespace appsync::host {
namespace {

using namespace testing;
using ::testing::HasSubstr;

class IconLayout : public ::testing::Test {
 protected:
  std::optional<Bytes> read(std::string_view contents) {
    putFile(folder / "layout", contents);
    return readIconLayout(folder / "layout", problem);
  }
  std::optional<PropertyList> layout(std::string_view contents) {
    const auto bytes = read(contents);
    return bytes ? parsePropertyList(*bytes) : std::nullopt;
  }

  Folder folder;
  std::string problem;
};

TEST_F(IconLayout, PassesAPropertyListOnByteForByte) {
  const std::string text = xmlText(PropertyList::Array{"com.b", PropertyList::Array{"com.a"}});
  const auto bytes = read(text);
  ASSERT_TRUE(bytes) << problem;
  EXPECT_EQ(asText(*bytes), text);
}

TEST_F(IconLayout, TakesAJsonArray) {
  EXPECT_EQ(layout(R"(["com.b", "com.a"])"), PropertyList(PropertyList::Array{"com.b", "com.a"}));
}

TEST_F(IconLayout, TakesOneIdentifierPerLine) {
  EXPECT_EQ(layout("# home screen\n com.b \r\n\ncom.a"),
            PropertyList(PropertyList::Array{"com.b", "com.a"}));
  EXPECT_EQ(layout(""), PropertyList(PropertyList::Array{}));
}

TEST_F(IconLayout, RefusesAllElse) {
  for (const char* text : {R"({"a": 1})", R"([1, 2])", "two words", "<plist><array>", "a\x1b[0m"}) {
    EXPECT_FALSE(read(text)) << text;
    EXPECT_THAT(problem, HasSubstr("neither a property list, nor a JSON array"));
  }
  EXPECT_FALSE(read(std::string(5 << 20, 'a')));
  EXPECT_THAT(problem, HasSubstr("is larger than 4.2 MB"));
}

TEST_F(IconLayout, SaysWhyAFileCannotBeRead) {
  EXPECT_FALSE(readIconLayout(folder / "missing", problem));
  EXPECT_THAT(problem, HasSubstr("No such file or directory"));
  EXPECT_FALSE(readIconLayout(folder.path(), problem));
  EXPECT_THAT(problem, HasSubstr("Is a directory"));
}

}  // namespace
}  // namespace appsync::host
