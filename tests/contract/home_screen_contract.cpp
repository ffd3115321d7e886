#include "platform/property_list_codec.h"
#include "tests/contract/phone.h"

namespace appsync::contract {
namespace {

class HomeScreenContract : public ServiceContract {
 protected:
  HomeScreenService& homeScreen = platform.homeScreen;
  HomeScreenService::Port port = homeScreen.serverPort();

  int setLayout(const PropertyList& layout) {
    const auto bytes = serializePropertyList(layout, PropertyListFormat::Binary);
    return homeScreen.setIconState(port, bytes.value());
  }
  /// The order shown; empty with a failure when it is no array of strings.
  std::vector<std::string> order() {
    const auto bytes = homeScreen.getFlattenedIconState(port, 1);
    const auto parsed = bytes ? parsePropertyList(*bytes) : std::nullopt;
    const PropertyList::Array* items = parsed ? parsed->asArray() : nullptr;
    EXPECT_TRUE(items);
    std::vector<std::string> identifiers;
    for (const PropertyList& item : items ? *items : PropertyList::Array{}) {
      EXPECT_TRUE(item.asString());
      if (item.asString()) identifiers.push_back(*item.asString());
    }
    return identifiers;
  }
};

SERVICE_CONTRACT_OF(HomeScreenContract);

using Array = PropertyList::Array;

TEST_P(HomeScreenContract, ShowsApplicationsInTheOrderOfTheLayout) {
  for (const char* identifier : {"com.a", "com.b", "com.c"}) {
    ASSERT_TRUE(installPackage(identifier));
  }
  EXPECT_EQ(setLayout(Array{Array{"com.c"}, Array{"com.a", "com.b"}}), 0);
  EXPECT_EQ(order(), (std::vector<std::string>{"com.c", "com.a", "com.b"}));
  EXPECT_EQ(setLayout(Array{Array{"com.b", "com.c", "com.a"}}), 0);
  EXPECT_EQ(order(), (std::vector<std::string>{"com.b", "com.c", "com.a"}));
}

TEST_P(HomeScreenContract, ALayoutThatIsNoPropertyListIsRefusedAndTheOldOneStays) {
  ASSERT_TRUE(installPackage("com.a"));
  ASSERT_TRUE(installPackage("com.b"));
  ASSERT_EQ(setLayout(Array{Array{"com.b", "com.a"}}), 0);
  EXPECT_NE(homeScreen.setIconState(port, asBytes("no layout")), 0);
  EXPECT_NE(homeScreen.setIconState(port, {}), 0);
  EXPECT_EQ(order(), (std::vector<std::string>{"com.b", "com.a"}));
}

TEST_P(HomeScreenContract, AnAssertionKeepsTheApplicationFromRunningUntilItIsReleased) {
  ASSERT_TRUE(installPackage("com.a"));
  auto result = homeScreen.createTerminationAssertion("com.a", 0);
  EXPECT_EQ(result.outcome, AssertionOutcome::Success);
  ASSERT_TRUE(result.assertion);
  EXPECT_FALSE(phone->launch("com.a"));
  result.assertion.reset();
  EXPECT_TRUE(phone->launch("com.a"));
}

TEST_P(HomeScreenContract, AnApplicationInTheForegroundDeniesTheAssertion) {
  ASSERT_TRUE(installPackage("com.a"));
  ASSERT_TRUE(installPackage("com.b"));
  ASSERT_TRUE(phone->launch("com.a"));
  EXPECT_EQ(homeScreen.createTerminationAssertion("com.a", 0).outcome, AssertionOutcome::Denied);
  EXPECT_EQ(homeScreen.createTerminationAssertion("com.b", 0).outcome, AssertionOutcome::Success);
  phone->quit("com.a");
  EXPECT_EQ(homeScreen.createTerminationAssertion("com.a", 0).outcome, AssertionOutcome::Success);
}

TEST_P(HomeScreenContract, TwoAssertionsMayBeHeldAtOnce) {
  ASSERT_TRUE(installPackage("com.a"));
  auto one = homeScreen.createTerminationAssertion("com.a", 0);
  auto two = homeScreen.createTerminationAssertion("com.a", 0);
  EXPECT_EQ(two.outcome, AssertionOutcome::Success);
  one.assertion.reset();
  EXPECT_FALSE(phone->launch("com.a"));
  two.assertion.reset();
  EXPECT_TRUE(phone->launch("com.a"));
}

}  // namespace
}  // namespace appsync::contract
