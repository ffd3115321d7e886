#include "base/identifiers.h"

#include <gtest/gtest.h>

namespace appsync {
namespace {

TEST(Identifiers, AreUsableWhenThePhoneCanKeepThemApart) {
  EXPECT_TRUE(isSendableIdentifier("com.example.app-2_b"));
  EXPECT_FALSE(isSendableIdentifier(""));
  EXPECT_FALSE(isSendableIdentifier(".."));
  EXPECT_FALSE(isSendableIdentifier(".hidden"));
  EXPECT_FALSE(isSendableIdentifier("a/b"));
  EXPECT_FALSE(isSendableIdentifier("a b"));
  EXPECT_FALSE(isSendableIdentifier("ApplicationsSync.plist"));
  EXPECT_FALSE(isSendableIdentifier(std::string(300, 'a')));
}

}  // namespace
}  // namespace appsync
