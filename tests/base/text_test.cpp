#include "base/text.h"

#include <clocale>

#include "platform/utf8.h"
#include "tests/test_pch.h"

namespace appsync {
namespace {

TEST(PrintableText, KeepsOrdinaryTextOfAnyScript) {
  EXPECT_EQ(printable("Añadir 写真 😀"), "Añadir 写真 😀");
}

TEST(PrintableText, TakesTheTeethOutOfEscapeSequences) {
  EXPECT_EQ(printable("a\x1b[2Jb"), "a\uFFFD[2Jb");
  EXPECT_EQ(printable("a\xc2\x9b"
                      "31mb"),
            "a\uFFFD31mb");
  EXPECT_EQ(printable("line\nline\r\t\x07\x7f"), "line\uFFFDline\uFFFD\uFFFD\uFFFD\uFFFD");
}

TEST(PrintableText, ReplacesDirectionOverridesAndLineSeparators) {
  EXPECT_EQ(printable("a\u202Eb\u2066c\u2028d"), "a\uFFFDb\uFFFDc\uFFFDd");
}

TEST(PrintableText, ReplacesBytesThatAreNoUtf8) {
  EXPECT_EQ(printable("\xff"), "\uFFFD");
  EXPECT_EQ(printable("\xc0\xaf"), "\uFFFD\uFFFD");            // longer than need be
  EXPECT_EQ(printable("\xed\xa0\x80"), "\uFFFD\uFFFD\uFFFD");  // a surrogate
  EXPECT_EQ(printable("\xe5\x86"), "\uFFFD\uFFFD");            // cut off
}

TEST(Utf8, IsToldFromOtherBytes) {
  EXPECT_TRUE(isUtf8("é 😀 \uFFFD"));
  EXPECT_FALSE(isUtf8("\xe9"));
  EXPECT_FALSE(isUtf8("abc\xf5"));
}

TEST(OneLine, DropsBlanksAtTheEndAndLineBreaksWithin) {
  EXPECT_EQ(oneLine("wrong size\n"), "wrong size");
  EXPECT_EQ(oneLine("two\nlines \n\n"), "two lines");
  EXPECT_EQ(oneLine(" \n"), "");
}

TEST(FittedText, HasExactlyTheColumnsAskedFor) {
  ASSERT_NE(std::setlocale(LC_CTYPE, "C.UTF-8"), nullptr);
  EXPECT_EQ(fitted("abc", 5), "abc  ");
  EXPECT_EQ(fitted("abcdef", 3), "abc");
  EXPECT_EQ(fitted("写真", 3), "写 ");  // two columns each
  EXPECT_EQ(displayWidth("写真"), 4U);
}

TEST(ByteCount, IsShort) {
  EXPECT_EQ(byteCount(0), "0 B");
  EXPECT_EQ(byteCount(999), "999 B");
  EXPECT_EQ(byteCount(1400), "1.4 kB");
  EXPECT_EQ(byteCount(9'960), "10 kB");
  EXPECT_EQ(byteCount(999'499), "999 kB");
  EXPECT_EQ(byteCount(999'500), "1.0 MB");
  EXPECT_EQ(byteCount(29'000'000), "29 MB");
  EXPECT_EQ(byteCount(UINT64_MAX), "18447 PB");
}

TEST(IsoTime, TellsMilliseconds) {
  EXPECT_EQ(isoTime(0), "1970-01-01T00:00:00.000Z");
  EXPECT_EQ(isoTime(1769860800.25), "2026-01-31T12:00:00.250Z");
}

}  // namespace
}  // namespace appsync
