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

}  // namespace
}  // namespace appsync
