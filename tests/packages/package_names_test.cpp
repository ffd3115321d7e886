#include "packages/package_names.h"

#include <gtest/gtest.h>

#include <vector>

namespace appsync {
namespace {

using Names = std::vector<std::string>;

void expectAllSame(const Names& names) {
  for (const std::string& name : names)
    EXPECT_EQ(comparableName(name), comparableName(names.front())) << name;
}

void expectAllDifferent(const Names& names) {
  for (const std::string& one : names)
    for (const std::string& other : names)
      EXPECT_EQ(comparableName(one) == comparableName(other), one == other) << one << " " << other;
}

TEST(PackageNames, AreTheSameInAnyCase) {
  expectAllSame({"Info.PLIST-09_z", "info.plist-09_Z"});
  expectAllSame({"ÀÉÖØÞŸ ĀĂĮĲĶĹŇŊŶŹŽ", "àéöøþÿ āăįĳķĺňŋŷźž"});
  expectAllSame({"ΆΈΊΌΎΏΑΡΣΫ", "άέίόύώαρσϋ"});
  expectAllSame({"ЀЏАЯѠҀҊӁӍӐ", "ѐџаяѡҁҋӂӎӑ"});
  expectAllSame({"ԱՖ ႠႥ Ꭰ", "աֆ ⴀⴅ ꭰ"});
  expectAllSame({"\u212a\u017f", "Ks", "kS"});
  expectAllSame({"𐐀", "𐐨"});
}

TEST(PackageNames, AreTheSameInFullWidthOfAnyCase) { expectAllSame({"ＡＢＺ", "ａｂｚ"}); }

TEST(PackageNames, AreTheSameWhereALetterFoldsIntoSeveral) {
  expectAllSame({"straße", "STRASSE", "STRAẞE"});
  expectAllSame({"\ufb01n", "FIN"});
}

TEST(PackageNames, AreTheSameWithAnySigma) { expectAllSame({"ΟΔΟΣ", "οδος", "οδοσ"}); }

TEST(PackageNames, KeepTheTurkishLettersApart) {
  expectAllSame({"\u0130", "i\u0307", "I\u0307"});
  expectAllDifferent({"i", "\u0131", "\u0130"});
}

TEST(PackageNames, AreTheSameComposedAndDecomposed) {
  expectAllSame({"Caf\u00e9", "cafe\u0301", "CAFE\u0301"});
  expectAllSame({"\u212b", "\u00e5", "A\u030a"});
  expectAllSame({"\uac01", "\u1100\u1161\u11a8"});
}

TEST(PackageNames, AreTheSameInAnyOrderOfTheirMarks) {
  expectAllSame({"a\u0323\u0301", "a\u0301\u0323"});
  expectAllSame({"\u03b1\u0345\u0301", "\u03b1\u0301\u0345", "\u1fb4", "\u0386\u0399"});
}

TEST(PackageNames, StayDifferentWhereTheyOnlyLookOrMeanAlike) {
  expectAllDifferent({"A", "\u0410", "\u0391", "Ａ", "\u00aa", "\u00e4"});
  expectAllDifferent({"1", "\u2460", "\u00b9"});
  expectAllDifferent({"中文", "😀", "👩\u200d💻", "👩💻"});
}

}  // namespace
}  // namespace appsync
