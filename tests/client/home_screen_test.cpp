// The home screen's order of applications, and what it is told of a sync.
#include "tests/client/client_test.h"

namespace appsync {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

const std::string SortOrderPath = SyncRootPath + "/AssetSortOrder.plist";
const std::string Notification = "com.corvane.dashel.twc.wsyncnotify";

class IconOrder : public ClientTest {
 protected:
  IconOrder() { phone.files.putDirectory(SyncRootPath); }

  /// What every ordering with an answer from the home screen begins with.
  static Lines answered(const Lines& more) {
    Lines lines{"HomeScreenService.serverPort()", "HomeScreenService.getFlattenedIconState(7, 1)",
                line("saved icon sort order"),
                "FileManager.writeAtomically(" + SortOrderPath + ")"};
    lines.insert(lines.end(), more.begin(), more.end());
    return lines;
  }

  static std::string line(const std::string& text) { return "log default SyncBundle|" + text; }
};

TEST_F(IconOrder, PutsWhatTheHomeScreenShowsFirstAndTheRestLast) {
  phone.homeScreen.setOrder({"com.c", "com.unknown", "com.a"});
  Dictionary items{{"com.a", 1}, {"com.b", 2}, {"com.c", 3}, {"com.d", 4}};
  const std::vector<PropertyList> ordered = client()._orderTheItems(items);
  ASSERT_EQ(ordered.size(), 4u);
  EXPECT_EQ(ordered[0], PropertyList(3));
  EXPECT_EQ(ordered[1], PropertyList(1));
  EXPECT_THAT((std::vector<PropertyList>{ordered[2], ordered[3]}),
              testing::UnorderedElementsAre(PropertyList(2), PropertyList(4)));
  EXPECT_EQ(items, (Dictionary{{"com.b", 2}, {"com.d", 4}}));
  expectTrace(answered({line("prioritize com.c"), line("prioritize com.a"), line("lastly com.b"),
                        line("lastly com.d")}));
}

TEST_F(IconOrder, LeavesNothingBehindWhenTheHomeScreenNamesEveryItem) {
  phone.homeScreen.setOrder({"com.b", "com.a"});
  Dictionary items{{"com.a", Dictionary{{"n", 1}}}, {"com.b", "item"}};
  EXPECT_THAT(client()._orderTheItems(items),
              ElementsAre(PropertyList("item"), PropertyList(Dictionary{{"n", 1}})));
  EXPECT_THAT(items, IsEmpty());
  expectTrace(answered({line("prioritize com.b"), line("prioritize com.a")}));
}

TEST_F(IconOrder, AnIdentifierListedTwiceIsTakenOnce) {
  phone.homeScreen.setOrder({"com.a", "com.b", "com.a"});
  Dictionary items{{"com.a", 1}, {"com.b", 2}};
  EXPECT_THAT(client()._orderTheItems(items), ElementsAre(PropertyList(1), PropertyList(2)));
  expectTrace(answered({line("prioritize com.a"), line("prioritize com.b")}));
}

TEST_F(IconOrder, OfNoItemsIsEmptyButTheOrderIsStillFetchedAndKept) {
  phone.homeScreen.setOrder({"com.a"});
  Dictionary items;
  EXPECT_THAT(client()._orderTheItems(items), IsEmpty());
  expectTrace(answered({}));
  EXPECT_EQ(phone.files.plistAt(SortOrderPath), PropertyList(Array{"com.a"}));
}

TEST_F(IconOrder, KeepsTheHomeScreensBytesUnchanged) {
  const std::string bytes =
      "<plist version='1.0'>\n\n<array><string>com.a</string></array></plist>";
  phone.homeScreen.setFlattenedIconState(toBytes(bytes));
  Dictionary items{{"com.a", 1}};
  EXPECT_THAT(client()._orderTheItems(items), ElementsAre(PropertyList(1)));
  EXPECT_EQ(phone.files.textAt(SortOrderPath), bytes);
}

TEST_F(IconOrder, WithoutAnAnswerPutsEveryItemLastAndKeepsTheEarlierOrder) {
  phone.files.putFile(SortOrderPath, "earlier");
  Dictionary items{{"com.a", 1}, {"com.b", 2}};
  EXPECT_EQ(client()._orderTheItems(items).size(), 2u);
  EXPECT_EQ(items.size(), 2u);
  expectTrace({"HomeScreenService.serverPort()", "HomeScreenService.getFlattenedIconState(7, 1)",
               line("got no icon sort order from DS"), line("lastly com.a"), line("lastly com.b")});
  EXPECT_EQ(phone.files.textAt(SortOrderPath), "earlier");
}

TEST_F(IconOrder, AnAnswerThatIsNoListIsKeptAndOrdersNothing) {
  const Bytes dictionary =
      *serializePropertyList(Dictionary{{"com.a", 1}}, PropertyListFormat::Xml);
  for (const Bytes& answer : {toBytes("no property list"), toBytes(""), dictionary}) {
    phone.homeScreen.setFlattenedIconState(answer);
    Dictionary items{{"com.a", 1}};
    EXPECT_THAT(client()._orderTheItems(items), ElementsAre(PropertyList(1)));
    expectTrace(answered({line("lastly com.a")}));
    EXPECT_EQ(phone.files.bytesAt(SortOrderPath), answer);
  }
}

TEST_F(IconOrder, WhatIsNoIdentifierInTheOrderIsPassedOver) {
  phone.homeScreen.setFlattenedIconState(
      serializePropertyList(Array{7, Array{"com.a"}, "com.b", true}, PropertyListFormat::Binary));
  Dictionary items{{"com.a", 1}, {"com.b", 2}};
  EXPECT_THAT(client()._orderTheItems(items), ElementsAre(PropertyList(2), PropertyList(1)));
}

TEST_F(IconOrder, IsUsedThoughItCannotBeKept) {
  phone.homeScreen.setOrder({"com.b"});
  phone.faults.failEvery("FileManager.writeAtomically", Error::posix(28));
  Dictionary items{{"com.a", 1}, {"com.b", 2}};
  EXPECT_THAT(client()._orderTheItems(items), ElementsAre(PropertyList(2), PropertyList(1)));
}

class HomeScreenNotification : public ClientTest {};

TEST_F(HomeScreenNotification, OfTheStartSetsTheStateBeforeItIsPosted) {
  client()._notifyDashel(true);
  expectTrace({"SystemNotifier.registerCheck(" + Notification + ")",
               "log default SyncBundle|Notifying DS we are starting syncing",
               "HomeScreenService.serverPort()", "SystemNotifier.setState(" + Notification + ", 1)",
               "SystemNotifier.post(" + Notification + ")"});
  EXPECT_THAT(phone.notifier.postedStates(Notification), ElementsAre(1u));
}

TEST_F(HomeScreenNotification, OfTheEndSetsTheStateToZeroBeforeItIsPosted) {
  client()._notifyDashel(true);
  forgetTrace();
  client()._notifyDashel(false);
  expectTrace({"SystemNotifier.registerCheck(" + Notification + ")",
               "log default SyncBundle|Notifying DS we are done syncing",
               "HomeScreenService.serverPort()", "SystemNotifier.setState(" + Notification + ", 0)",
               "SystemNotifier.post(" + Notification + ")"});
  EXPECT_THAT(phone.notifier.postedStates(Notification), ElementsAre(1u, 0u));
}

TEST_F(HomeScreenNotification, IsNotPostedWhenItCannotBeRegistered) {
  phone.notifier.setRegistrationStatus(1'000'001);
  client()._notifyDashel(true);
  expectTrace({"SystemNotifier.registerCheck(" + Notification + ")",
               "log default SyncBundle|Notifying DS we are starting syncing",
               "HomeScreenService.serverPort()",
               "log error SyncBundle|Uh Oh...can't send notification to DS:1000001"});
  EXPECT_THAT(phone.notifier.postedStates(Notification), IsEmpty());
}

TEST_F(HomeScreenNotification, ThatCannotBeRegisteredDoesNotStopTheSync) {
  phone.notifier.setRegistrationStatus(9);
  phone.files.putDirectory(StagingRootPath + "/ApplicationSync");
  EXPECT_TRUE(client().reconcileSync({}, "a", nullptr, nullptr));
}

}  // namespace
}  // namespace appsync
