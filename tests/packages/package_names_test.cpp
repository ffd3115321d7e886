#include "packages/package_names.h"

#include <gtest/gtest.h>

namespace appsync {
namespace {

TEST(PackageNames, FoldCaseOfTheAlphabetsNamed) {
  EXPECT_EQ(foldCase("Info.PLIST-09_z"), "info.plist-09_z");
  EXPECT_EQ(foldCase("ÀÉÖØÞ×ÿŸ"), "àéöøþ×ÿÿ");
  EXPECT_EQ(foldCase("ĀĂĮĲĶĹŇŊŶŹŽ"), "āăįĳķĺňŋŷźž");
  EXPECT_EQ(foldCase("ΆΈΊΌΎΏΑΡΣΫς"), "άέίόύώαρσϋσ");
  EXPECT_EQ(foldCase("ЀЏАЯѠҀҊӁӍӐ"), "ѐџаяѡҁҋӂӎӑ");
  EXPECT_EQ(foldCase("ԱՖ Ａ Ｚ"), "աֆ ａ ｚ");
  EXPECT_EQ(foldCase("\u212a\u212b\u017f\u00b5"), "kåsμ");
}

TEST(PackageNames, LeaveWhatIsFoldedAlreadyAsItIs) {
  for (const std::string_view name : {"straße", "łódź", "ийк", "αβγ", "中文", "😀", "ıi"})
    EXPECT_EQ(foldCase(name), name);
}

TEST(PackageNames, ControlsAreFoundWhereverTheyHide) {
  for (const std::string_view name :
       {"a\x01", "\x7f", "\u0085", "a\u2028", "\u202e", "\u2066", "tab\there"})
    EXPECT_TRUE(holdsInvisibleControls(name)) << shown(name);
  for (const std::string_view name : {"a b", "naïve", "👩\u200d💻", "\u200fעברית"})
    EXPECT_FALSE(holdsInvisibleControls(name)) << shown(name);
}

TEST(PackageNames, AreShownOnOneLineOfReadableText) {
  EXPECT_EQ(shown("plain é 😀"), "plain é 😀");
  EXPECT_EQ(shown("a\nb\x1b\xff"), "a\\x0ab\\x1b\\xff");
  EXPECT_EQ(shown("\xc3"), "\\xc3");
  EXPECT_EQ(shown("\u202e"), "\\xe2\\x80\\xae");
  EXPECT_TRUE(shown(std::string(500, 'x')).ends_with("xxx..."));
  EXPECT_EQ(shown(std::string(500, 'x')).size(), 123u);
}

}  // namespace
}  // namespace appsync
