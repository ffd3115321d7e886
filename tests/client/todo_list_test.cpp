// The todo list, and the reader of lists that it shares.
#include <thread>

#include "tests/client/client_test.h"

namespace appsync {
namespace {

using testing::ElementsAre;

class TodoList : public ClientTest {
 protected:
  std::string bytesOfTodoList() { return phone.files.textAt(TodoListPath).value_or("missing"); }
};

TEST_F(TodoList, ChangingAnEntryIsLoggedAndWritesTheFileOnce) {
  putTodo({{"com.a", "install"}, {"com.b", "install"}});
  client().changeAssetID("com.b", "DOWNLOADED");
  expectTrace({"FileManager.contentsAtPath(" + TodoListPath + ")",
               "log default SyncBundle|Changing com.b from install to DOWNLOADED",
               "FileManager.writeAtomically(" + TodoListPath + ")"},
              fakes::TraceAll);
  EXPECT_EQ(todoOperation("com.a"), "install");
  EXPECT_EQ(todoOperation("com.b"), "DOWNLOADED");
}

TEST_F(TodoList, IsWrittenAsABinaryPropertyListWhateverTheDesktopSent) {
  for (const PropertyListFormat format : {PropertyListFormat::Xml, PropertyListFormat::Binary}) {
    phone.files.putPlist(
        TodoListPath, Array{Dictionary{{"identifier", "com.a"}, {"operation", "install"}}}, format);
    client().changeAssetID("com.a", "SENT");
    EXPECT_TRUE(bytesOfTodoList().starts_with("bplist00"));
    EXPECT_EQ(todoOperation("com.a"), "SENT");
  }
}

TEST_F(TodoList, ChangesOnlyTheFirstEntryOfAnIdentifierThatAppearsTwice) {
  putTodo({{"com.a", "install"}, {"com.b", "remove"}, {"com.b", "install"}});
  client().changeAssetID("com.b", "SENT");
  const PropertyList expected(Array{Dictionary{{"identifier", "com.a"}, {"operation", "install"}},
                                    Dictionary{{"identifier", "com.b"}, {"operation", "SENT"}},
                                    Dictionary{{"identifier", "com.b"}, {"operation", "install"}}});
  EXPECT_EQ(phone.files.plistAt(TodoListPath), expected);
}

TEST_F(TodoList, PassesEverythingElseOfTheHostThroughUnchanged) {
  const Dictionary hostsOwn{{"version", "1.2"},
                            {"size", std::int64_t{1} << 40},
                            {"ratio", 0.25},
                            {"flag", true},
                            {"cookie", toBytes("\x01\x02")},
                            {"when", PropertyList::Date{791553600}},
                            {"nested", Dictionary{{"list", Array{1, "two", Dictionary{}}}}}};
  Dictionary changed = hostsOwn;
  changed.insert({{"identifier", "com.a"}, {"operation", "install"}});
  Dictionary other = hostsOwn;
  other.insert({{"identifier", "com.b"}});
  phone.files.putPlist(TodoListPath, Array{"no dictionary", other, changed, 7});

  client().changeAssetID("com.a", "INSTALLED");
  changed.insert_or_assign("operation", "INSTALLED");
  EXPECT_EQ(phone.files.plistAt(TodoListPath),
            PropertyList(Array{"no dictionary", other, changed, 7}));
}

TEST_F(TodoList, IsNotRewrittenAndNothingIsLoggedForAnIdentifierThatIsAbsent) {
  putTodo({{"com.a", "install"}});
  const std::string before = bytesOfTodoList();
  client().changeAssetID("com.b", "SENT");
  expectTrace({});
  EXPECT_EQ(bytesOfTodoList(), before);
}

TEST_F(TodoList, EntriesThatAreNoDictionariesOrHaveNoTextAsIdentifierAreSkipped) {
  phone.files.putPlist(
      TodoListPath, Array{"com.a", 7, Array{"com.a"}, Dictionary{{"identifier", 7}}, Dictionary{},
                          Dictionary{{"identifier", "com.a"}, {"operation", "install"}}});
  client().changeAssetID("com.a", "SENT");
  EXPECT_EQ(client()._operationStateForIdentifier("com.a"), "SENT");
}

TEST_F(TodoList, AnEntryWithoutAnOperationIsGivenOne) {
  phone.files.putPlist(TodoListPath, Array{Dictionary{{"identifier", "com.a"}}});
  client().changeAssetID("com.a", "SENT");
  expectTrace({"log default SyncBundle|Changing com.a from (null) to SENT",
               "FileManager.writeAtomically(" + TodoListPath + ")"});
  EXPECT_EQ(todoOperation("com.a"), "SENT");
}

TEST_F(TodoList, AnOperationThatIsNoTextIsLoggedAndReplaced) {
  phone.files.putPlist(TodoListPath, Array{Dictionary{{"identifier", "com.a"}, {"operation", 7}}});
  client().changeAssetID("com.a", "SENT");
  expectTrace({"log default SyncBundle|Changing com.a from 7 to SENT",
               "FileManager.writeAtomically(" + TodoListPath + ")"});
}

TEST_F(TodoList, IsLeftWholeWhenItCannotBeWritten) {
  putTodo({{"com.a", "install"}});
  phone.faults.failEvery("FileManager.writeAtomically", Error::posix(28));
  client().changeAssetID("com.a", "SENT");
  EXPECT_EQ(todoOperation("com.a"), "install");
  expectTrace({"log default SyncBundle|Changing com.a from install to SENT",
               "fault FileManager.writeAtomically(" + TodoListPath + ")"});
}

TEST_F(TodoList, ThatCannotBeReadJustNowIsSaidAndNotChanged) {
  putTodo({{"com.a", "install"}});
  const Error failure = Error::posix(24, TodoListPath);
  phone.faults.failEvery("FileManager.contentsAtPath", failure);
  const Lines said{"fault FileManager.contentsAtPath(" + TodoListPath + ")",
                   "log error SyncBundle|can't read " + TodoListPath + ": " + description(failure)};
  client().changeAssetID("com.a", "SENT");
  expectTrace(said);
  EXPECT_EQ(client()._operationStateForIdentifier("com.a"), std::nullopt);
  expectTrace(said);
  EXPECT_EQ(todoOperation("com.a"), "install");
}

TEST_F(TodoList, NoChangeOfTenThreadsIsLost) {
  constexpr int Each = 20;
  Array list;
  for (int i = 0; i < 10 * Each; ++i) {
    list.push_back(
        Dictionary{{"identifier", "com." + std::to_string(i)}, {"operation", "install"}});
  }
  phone.files.putPlist(TodoListPath, list);
  client();
  std::vector<std::thread> threads;
  for (int thread = 0; thread < 10; ++thread) {
    threads.emplace_back([this, thread] {
      for (int i = thread * Each; i < (thread + 1) * Each; ++i) {
        client().changeAssetID("com." + std::to_string(i), "INSTALLED");
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  for (int i = 0; i < 10 * Each; ++i) {
    EXPECT_EQ(todoOperation("com." + std::to_string(i)), "INSTALLED") << i;
  }
}

TEST_F(TodoList, TellsTheOperationOfTheFirstEntryOfAnIdentifier) {
  putTodo({{"com.a", "install"}, {"com.b", "remove"}, {"com.a", "FAILED"}});
  EXPECT_EQ(client()._operationStateForIdentifier("com.a"), "install");
  EXPECT_EQ(client()._operationStateForIdentifier("com.b"), "remove");
  EXPECT_EQ(client()._operationStateForIdentifier("com.c"), std::nullopt);
  EXPECT_EQ(client()._operationStateForIdentifier(""), std::nullopt);
  expectTrace({});
}

TEST_F(TodoList, AnEntryWithoutATextAsOperationHasNoOperationState) {
  phone.files.putPlist(TodoListPath, Array{Dictionary{{"identifier", "com.a"}},
                                           Dictionary{{"identifier", "com.b"}, {"operation", 1}}});
  EXPECT_EQ(client()._operationStateForIdentifier("com.a"), std::nullopt);
  EXPECT_EQ(client()._operationStateForIdentifier("com.b"), std::nullopt);
}

// A file that is not a list of entries counts as none, and only a damaged one is worth a line.

struct BadTodoList {
  std::string name;
  std::optional<std::string> contents;
  std::vector<std::string> lines;
};

void PrintTo(const BadTodoList& bad, std::ostream* out) { *out << bad.name; }

const std::string Unparseable = "log error SyncBundle|couldn't parse todo list";
const std::string NoArray = "log error SyncBundle|todo list is not an array";

std::string xml(const PropertyList& value) {
  return std::string(asText(*serializePropertyList(value, PropertyListFormat::Xml)));
}

class UnusableTodoList : public ClientTest, public testing::WithParamInterface<BadTodoList> {
 protected:
  void SetUp() override {
    if (GetParam().contents) phone.files.putFile(TodoListPath, *GetParam().contents);
    client();
  }
};

TEST_P(UnusableTodoList, IsNotChanged) {
  client().changeAssetID("com.a", "SENT");
  expectTrace(GetParam().lines);
  EXPECT_EQ(phone.files.textAt(TodoListPath), GetParam().contents);
}

TEST_P(UnusableTodoList, HoldsNoOperation) {
  EXPECT_EQ(client()._operationStateForIdentifier("com.a"), std::nullopt);
  expectTrace(GetParam().lines);
}

TEST_P(UnusableTodoList, LoadsAsNoneAndOnlyAReadErrorGoesToTheCaller) {
  std::optional<Error> error;
  EXPECT_EQ(client()._loadPlist(TodoListPath, &error), std::nullopt);
  expectTrace(GetParam().lines);
  const bool couldBeRead = GetParam().contents.has_value();
  EXPECT_EQ(error.has_value(), !couldBeRead);
}

TEST_P(UnusableTodoList, LoadsAsNoneForACallerWhoWantsNoError) {
  EXPECT_EQ(client()._loadPlist(TodoListPath), std::nullopt);
  expectTrace(GetParam().lines);
}

const PropertyList OneEntry = PropertyList::Dictionary{{"identifier", "com.a"}};

INSTANTIATE_TEST_SUITE_P(
    Files, UnusableTodoList,
    testing::Values(BadTodoList{"Missing", std::nullopt, {}}, BadTodoList{"Empty", "", {}},
                    BadTodoList{"Damaged", "no property list", {Unparseable}},
                    BadTodoList{
                        "CutOff", xml(PropertyList::Array{OneEntry}).substr(0, 150), {Unparseable}},
                    BadTodoList{"Dictionary", xml(OneEntry), {NoArray}},
                    BadTodoList{"Text", xml("com.a"), {NoArray}}),
    [](const auto& instance) { return instance.param.name; });

TEST_F(TodoList, LoadsFromXmlAndFromBinary) {
  const PropertyList::Array list{Dictionary{{"identifier", "com.a"}}, "b"};
  for (const PropertyListFormat format : {PropertyListFormat::Xml, PropertyListFormat::Binary}) {
    phone.files.putPlist("/var/mobile/list.plist", list, format);
    EXPECT_EQ(client()._loadPlist("/var/mobile/list.plist"), list);
  }
}

TEST_F(TodoList, AReadErrorGoesToTheCallerWithoutALine) {
  putTodo({{"com.a", "install"}});
  const Error failure = Error::posix(5, TodoListPath);
  phone.faults.failEvery("FileManager.contentsAtPath", failure);
  std::optional<Error> error;
  EXPECT_EQ(client()._loadPlist(TodoListPath, &error), std::nullopt);
  EXPECT_EQ(error, failure);
  expectTrace({}, fakes::TraceLog);
}

TEST_F(TodoList, LoadingAMissingFileGivesTheFileSystemsError) {
  std::optional<Error> error;
  EXPECT_EQ(client()._loadPlist(TodoListPath, &error), std::nullopt);
  ASSERT_TRUE(error);
  EXPECT_EQ(error->domain, POSIXErrorDomain);
  EXPECT_EQ(error->code, 2);
}

// The list of demoted applications is read in the same way, but is a dictionary.

class DemotedAppsList : public ClientTest {
 protected:
  static inline const std::string Path = "/var/mobile/Library/Preferences/demoted.plist";
};

TEST_F(DemotedAppsList, LoadsADictionary) {
  const Dictionary lists{{"AutomaticDowngrades", Array{"com.a"}}};
  for (const PropertyListFormat format : {PropertyListFormat::Xml, PropertyListFormat::Binary}) {
    phone.files.putPlist(Path, lists, format);
    EXPECT_EQ(client()._loadDemotedAppsPlist(Path), lists);
  }
  expectTrace({});
}

TEST_F(DemotedAppsList, IsNoneWithoutALineWhenTheFileIsMissingOrEmpty) {
  std::optional<Error> error;
  EXPECT_EQ(client()._loadDemotedAppsPlist(Path, &error), std::nullopt);
  ASSERT_TRUE(error);
  EXPECT_EQ(error->code, 2);
  phone.files.putFile(Path, "");
  EXPECT_EQ(client()._loadDemotedAppsPlist(Path), std::nullopt);
  expectTrace({});
}

TEST_F(DemotedAppsList, GivesAReadErrorToTheCallerWithoutALine) {
  phone.files.putPlist(Path, Dictionary{});
  const Error failure = Error::posix(5, Path);
  phone.faults.failEvery("FileManager.contentsAtPath", failure);
  std::optional<Error> error;
  EXPECT_EQ(client()._loadDemotedAppsPlist(Path, &error), std::nullopt);
  EXPECT_EQ(error, failure);
  expectTrace({}, fakes::TraceLog);
}

TEST_F(DemotedAppsList, IsNoneWithALineButNoErrorWhenTheFileIsDamaged) {
  phone.files.putFile(Path, "no property list");
  std::optional<Error> error;
  EXPECT_EQ(client()._loadDemotedAppsPlist(Path, &error), std::nullopt);
  EXPECT_EQ(error, std::nullopt);
  expectTrace({"log error SyncBundle|couldn't parse demoted apps list"});
}

TEST_F(DemotedAppsList, IsNoneWithALineButNoErrorWhenTheTopLevelIsAnArray) {
  phone.files.putPlist(Path, Array{"com.a"});
  std::optional<Error> error;
  EXPECT_EQ(client()._loadDemotedAppsPlist(Path, &error), std::nullopt);
  EXPECT_EQ(error, std::nullopt);
  expectTrace({"log error SyncBundle|demoted apps list is not a dictionary"});
}

}  // namespace
}  // namespace appsync
