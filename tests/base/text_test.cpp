#include "base/text.h"

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

TEST(PrintableText, KeepsTheDirectionMarksOfOrdinaryNames) {
  EXPECT_EQ(printable("\u200Fעברית\u200E \u061Cعربي"), "\u200Fעברית\u200E \u061Cعربي");
}

TEST(PrintableText, ReplacesBytesThatAreNoUtf8) {
  EXPECT_EQ(printable("\xff"), "\uFFFD");
  EXPECT_EQ(printable("\xc0\xaf"), "\uFFFD\uFFFD");            // longer than need be
  EXPECT_EQ(printable("\xed\xa0\x80"), "\uFFFD\uFFFD\uFFFD");  // a surrogate
  EXPECT_EQ(printable("\xe5\x86"), "\uFFFD\uFFFD");            // cut off
}

TEST(ControlCharacters, AreFoundWhereverTheyHide) {
  for (const std::string_view name :
       {"a\x01", "\x7f", "\u0085", "a\u2028", "\u202e", "\u2066", "tab\there", "\xff"})
    EXPECT_TRUE(holdsControls(name)) << shown(name);
  for (const std::string_view name : {"a b", "naïve", "👩\u200d💻", "\u200fעברית"})
    EXPECT_FALSE(holdsControls(name)) << shown(name);
}

TEST(QuotedText, IsShownOnOneLineOfReadableText) {
  EXPECT_EQ(shown("plain é 😀"), "plain é 😀");
  EXPECT_EQ(shown("a\nb\x1b\xff"), "a\\x0ab\\x1b\\xff");
  EXPECT_EQ(shown("\xc3"), "\\xc3");
  EXPECT_EQ(shown("\u202e"), "\\xe2\\x80\\xae");
  EXPECT_TRUE(shown(std::string(500, 'x')).ends_with("xxx..."));
  EXPECT_EQ(shown(std::string(500, 'x')).size(), 123u);
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
