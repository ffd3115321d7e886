#include "host/report/columns.h"

#include <gtest/gtest.h>

#include <clocale>

namespace appsync::host {
namespace {

TEST(FittedText, HasExactlyTheColumnsAskedFor) {
  ASSERT_NE(std::setlocale(LC_CTYPE, "C.UTF-8"), nullptr);
  EXPECT_EQ(fitted("abc", 5), "abc  ");
  EXPECT_EQ(fitted("abcdef", 3), "abc");
  EXPECT_EQ(fitted("写真", 3), "写 ");  // two columns each
  EXPECT_EQ(displayWidth("写真"), 4U);
}

}  // namespace
}  // namespace appsync::host
