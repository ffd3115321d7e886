// Values kept per application and version until its install has ended.
#include <thread>

#include "tests/client/client_test.h"

namespace appsync {
namespace {

class RestoreState : public ClientTest {
 protected:
  static inline const std::string Write = "FileManager.writeAtomically(" + RestoreStatePath + ")";
  static inline const std::string Remove = "FileManager.removeItem(" + RestoreStatePath + ")";

  void put(const PropertyList& state) { phone.files.putPlist(RestoreStatePath, state); }
  std::optional<PropertyList> state() { return phone.files.plistAt(RestoreStatePath); }

  /// The state is there, but no look at it and no read of it succeeds.
  void hide(const PropertyList& there) {
    put(there);
    for (const char* look : {"contentsAtPath", "fileExists", "attributesOfItem"}) {
      phone.faults.failWhere(std::string("FileManager.") + look, RestoreStatePath,
                             Error::posix(24));
    }
    client();
  }
  void expectOnlySaid() {
    expectTrace({"fault FileManager.contentsAtPath(" + RestoreStatePath + ")",
                 "log error SyncBundle|can't read " + RestoreStatePath + ": " +
                     description(Error::posix(24))});
  }
};

TEST_F(RestoreState, SettingTheFirstPropertyCreatesTheFileWithOneOfEachLevel) {
  phone.files.putDirectory(SyncRootPath);
  client()._setRestoreStatePropertyValue("/var/a.zip", "path", "com.a", "1.0");
  expectTrace({Write});
  const Dictionary versions{{"1.0", Dictionary{{"path", "/var/a.zip"}}}};
  EXPECT_EQ(state(), PropertyList(Dictionary{{"com.a", versions}}));
}

TEST_F(RestoreState, IsWrittenAsAnXmlPropertyList) {
  put(Dictionary{});
  client()._setRestoreStatePropertyValue("/var/a.zip", "path", "com.a", "1.0");
  EXPECT_TRUE(phone.files.textAt(RestoreStatePath)->starts_with("<?xml"));
}

TEST_F(RestoreState, SettingAPropertyKeepsWhatElseIsThere) {
  const Dictionary others{{"com.b", Dictionary{{"2.0", Dictionary{{"path", "/b"}}}}},
                          {"com.a", Dictionary{{"0.9", Dictionary{{"path", "/old"}}},
                                               {"1.0", Dictionary{{"mark", 7}}}}}};
  put(others);
  client()._setRestoreStatePropertyValue("/new", "path", "com.a", "1.0");
  const Dictionary expected{
      {"com.b", Dictionary{{"2.0", Dictionary{{"path", "/b"}}}}},
      {"com.a", Dictionary{{"0.9", Dictionary{{"path", "/old"}}},
                           {"1.0", Dictionary{{"mark", 7}, {"path", "/new"}}}}}};
  EXPECT_EQ(state(), PropertyList(expected));
}

TEST_F(RestoreState, SettingAPropertyAgainReplacesItsValue) {
  put(Dictionary{});
  client()._setRestoreStatePropertyValue("/old", "path", "com.a", "1.0");
  client()._setRestoreStatePropertyValue(7, "path", "com.a", "1.0");
  EXPECT_EQ(client()._restoreStatePropertyForKey("path", "com.a", "1.0"), PropertyList(7));
}

TEST_F(RestoreState, ALevelThatIsNoDictionaryIsReplacedByOne) {
  put(Dictionary{{"com.a", "text"}, {"com.b", Dictionary{{"1.0", 7}}}});
  client()._setRestoreStatePropertyValue("/a", "path", "com.a", "1.0");
  client()._setRestoreStatePropertyValue("/b", "path", "com.b", "1.0");
  EXPECT_EQ(client()._restoreStatePropertyForKey("path", "com.a", "1.0"), PropertyList("/a"));
  EXPECT_EQ(client()._restoreStatePropertyForKey("path", "com.b", "1.0"), PropertyList("/b"));
}

TEST_F(RestoreState, NoVersionIsAVersionOfItsOwn) {
  put(Dictionary{{"com.a", Dictionary{{"1.0", Dictionary{{"path", "/old"}}}}}});
  client()._setRestoreStatePropertyValue("/a", "path", "com.a", std::nullopt);
  EXPECT_EQ(client()._restoreStatePropertyForKey("path", "com.a", std::nullopt),
            PropertyList("/a"));
  EXPECT_EQ(client()._restoreStatePropertyForKey("path", "com.a", "1.0"), PropertyList("/old"));
}

TEST_F(RestoreState, AValueThatNoFileCanHoldIsNotWritten) {
  put(Dictionary{});
  client()._setRestoreStatePropertyValue(PropertyList::null(), "path", "com.a", "1.0");
  expectTrace({});
  EXPECT_EQ(state(), PropertyList(Dictionary{}));
}

TEST_F(RestoreState, AFailedWriteLeavesTheFileAsItWas) {
  put(Dictionary{});
  phone.faults.failEvery("FileManager.writeAtomically", Error::posix(28));
  client()._setRestoreStatePropertyValue("/a", "path", "com.a", "1.0");
  expectTrace({"fault " + Write});
  EXPECT_EQ(state(), PropertyList(Dictionary{}));
}

TEST_F(RestoreState, APropertyIsFoundUnderItsIdentifierVersionAndKeyOnly) {
  put(Dictionary{{"com.a", Dictionary{{"1.0", Dictionary{{"path", "/a"}}}}}});
  EXPECT_EQ(client()._restoreStatePropertyForKey("path", "com.a", "1.0"), PropertyList("/a"));
  EXPECT_EQ(client()._restoreStatePropertyForKey("other", "com.a", "1.0"), std::nullopt);
  EXPECT_EQ(client()._restoreStatePropertyForKey("path", "com.a", "2.0"), std::nullopt);
  EXPECT_EQ(client()._restoreStatePropertyForKey("path", "com.a", std::nullopt), std::nullopt);
  EXPECT_EQ(client()._restoreStatePropertyForKey("path", "com.b", "1.0"), std::nullopt);
  expectTrace({});
}

TEST_F(RestoreState, NoPropertyIsFoundBelowALevelThatIsNoDictionary) {
  put(Dictionary{{"com.a", Array{"1.0"}}, {"com.b", Dictionary{{"1.0", "path"}}}});
  EXPECT_EQ(client()._restoreStatePropertyForKey("path", "com.a", "1.0"), std::nullopt);
  EXPECT_EQ(client()._restoreStatePropertyForKey("path", "com.b", "1.0"), std::nullopt);
}

TEST_F(RestoreState, IsReadInEitherFormat) {
  phone.files.putPlist(RestoreStatePath,
                       Dictionary{{"com.a", Dictionary{{"1.0", Dictionary{{"path", "/a"}}}}}},
                       PropertyListFormat::Binary);
  EXPECT_EQ(client()._restoreStatePropertyForKey("path", "com.a", "1.0"), PropertyList("/a"));
}

TEST_F(RestoreState, CleaningOneIdentifierKeepsTheOthers) {
  put(Dictionary{{"com.a", Dictionary{{"1.0", Dictionary{{"path", "/a"}}}}},
                 {"com.b", Dictionary{{"1.0", Dictionary{{"path", "/b"}}}}}});
  client().cleanRestoreStateForIdentifier("com.a");
  expectTrace({Write});
  const Dictionary left{{"com.b", Dictionary{{"1.0", Dictionary{{"path", "/b"}}}}}};
  EXPECT_EQ(state(), PropertyList(left));
  EXPECT_TRUE(phone.files.textAt(RestoreStatePath)->starts_with("<?xml"));
}

TEST_F(RestoreState, CleaningTheLastIdentifierDeletesTheFile) {
  put(Dictionary{{"com.a", Dictionary{{"1.0", Dictionary{{"path", "/a"}}}}}});
  client().cleanRestoreStateForIdentifier("com.a");
  expectTrace({Remove});
  EXPECT_FALSE(phone.files.exists(RestoreStatePath));
}

TEST_F(RestoreState, CleaningThatCannotWriteTheRestKeepsTheFileAsItWas) {
  const Dictionary both{{"com.a", Dictionary{{"1.0", Dictionary{{"path", "/a"}}}}},
                        {"com.b", Dictionary{{"1.0", Dictionary{{"path", "/b"}}}}}};
  put(both);
  phone.faults.failEvery("FileManager.writeAtomically", Error::posix(28));
  client().cleanRestoreStateForIdentifier("com.a");
  expectTrace({"fault " + Write});
  EXPECT_EQ(state(), PropertyList(both));
}

TEST_F(RestoreState, CleaningThatCannotDeleteTheFileKeepsItForTheNextTime) {
  const Dictionary last{{"com.a", Dictionary{{"1.0", Dictionary{{"path", "/a"}}}}}};
  put(last);
  phone.faults.failEvery("FileManager.removeItem", Error::posix(13));
  client().cleanRestoreStateForIdentifier("com.a");
  expectTrace({"fault " + Remove});
  EXPECT_EQ(state(), PropertyList(last));
  phone.faults.clear();
  client().cleanRestoreStateForIdentifier("com.a");
  expectTrace({Remove});
  EXPECT_FALSE(phone.files.exists(RestoreStatePath));
}

TEST_F(RestoreState, CleaningAnIdentifierThatIsAbsentWritesTheOthersBack) {
  put(Dictionary{{"com.b", Dictionary{}}});
  client().cleanRestoreStateForIdentifier("com.a");
  expectTrace({Write});
  EXPECT_EQ(state(), PropertyList(Dictionary{{"com.b", Dictionary{}}}));
}

TEST_F(RestoreState, CleaningAnIdentifierThatIsAbsentDeletesAnEmptyList) {
  put(Dictionary{});
  client().cleanRestoreStateForIdentifier("com.a");
  expectTrace({Remove});
}

TEST_F(RestoreState, CleaningWithoutAFileDoesNothing) {
  client().cleanRestoreStateForIdentifier("com.a");
  expectTrace({});
}

TEST_F(RestoreState, CleaningKeepsAFileThatCannotBeReadJustNow) {
  hide(Dictionary{{"com.b", Dictionary{}}});
  client().cleanRestoreStateForIdentifier("com.a");
  expectOnlySaid();
  EXPECT_EQ(state(), PropertyList(Dictionary{{"com.b", Dictionary{}}}));
}

TEST_F(RestoreState, SettingKeepsAFileThatCannotBeReadJustNow) {
  hide(Dictionary{{"com.b", Dictionary{}}});
  client()._setRestoreStatePropertyValue("/a", "path", "com.a", "1.0");
  expectOnlySaid();
  EXPECT_EQ(state(), PropertyList(Dictionary{{"com.b", Dictionary{}}}));
}

TEST_F(RestoreState, AFileThatCannotBeReadJustNowIsSaidAndHoldsNoProperty) {
  hide(Dictionary{{"com.a", Dictionary{{"1.0", Dictionary{{"path", "/a"}}}}}});
  EXPECT_EQ(client()._restoreStatePropertyForKey("path", "com.a", "1.0"), std::nullopt);
  expectOnlySaid();
}

class DamagedRestoreState : public ClientTest, public testing::WithParamInterface<const char*> {
 protected:
  void SetUp() override {
    phone.files.putFile(RestoreStatePath, GetParam());
    client();
  }
};

TEST_P(DamagedRestoreState, HoldsNoProperty) {
  EXPECT_EQ(client()._restoreStatePropertyForKey("path", "com.a", "1.0"), std::nullopt);
  expectTrace({});
}

TEST_P(DamagedRestoreState, IsNotChangedBySettingAProperty) {
  client()._setRestoreStatePropertyValue("/a", "path", "com.a", "1.0");
  expectTrace({});
  EXPECT_EQ(phone.files.textAt(RestoreStatePath), GetParam());
}

TEST_P(DamagedRestoreState, IsDeletedByCleaning) {
  client().cleanRestoreStateForIdentifier("com.a");
  expectTrace({"FileManager.removeItem(" + RestoreStatePath + ")"});
  EXPECT_FALSE(phone.files.exists(RestoreStatePath));
}

INSTANTIATE_TEST_SUITE_P(
    Files, DamagedRestoreState,
    testing::Values("", "no property list", "bplist00",
                    "<?xml version=\"1.0\"?><plist version=\"1.0\"><array/></plist>"));

TEST_F(RestoreState, NoChangeOfTenThreadsIsLost) {
  put(Dictionary{{"com.keep", Dictionary{}}});
  for (int i = 0; i < 10; ++i) {
    client()._setRestoreStatePropertyValue("/old", "path", "com.old" + std::to_string(i), "1.0");
  }
  std::vector<std::thread> threads;
  for (int i = 0; i < 10; ++i) {
    threads.emplace_back([this, number = std::to_string(i)] {
      client()._setRestoreStatePropertyValue("/new", "path", "com.new" + number, "1.0");
      client().cleanRestoreStateForIdentifier("com.old" + number);
    });
  }
  for (std::thread& thread : threads) thread.join();

  Dictionary expected{{"com.keep", Dictionary{}}};
  for (int i = 0; i < 10; ++i) {
    expected.emplace("com.new" + std::to_string(i),
                     Dictionary{{"1.0", Dictionary{{"path", "/new"}}}});
  }
  EXPECT_EQ(state(), PropertyList(expected));
}

}  // namespace
}  // namespace appsync
