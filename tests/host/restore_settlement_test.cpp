#include "host/restore/restore_settlement.h"

#include "tests/host/restore_fixture.h"

namespace appsync::host {
namespace {

using namespace testing;

class RestoreSettlementTest : public ::testing::Test {
 protected:
  std::string settled() {
    std::string problem;
    Backup backup;
    backup.applications = serializePropertyList(entries, PropertyListFormat::Xml).value();
    end.missing = "waits for its package";
    RestoreList list = RestoreList::of(backup, problem).value();
    if (!only.empty()) {
      EXPECT_TRUE(list.keepOnly(only, problem)) << problem;
    }
    return text(settleRestore(list, end));
  }
  void backUp(const std::string& identifier) {
    const auto metadata = serializePropertyList(metadataOf(identifier), PropertyListFormat::Xml);
    entries[identifier] = PropertyList::Dictionary{{"HalvoMetadata", *metadata}};
  }

  PropertyList::Dictionary entries;
  RestoreEnd end;
  std::set<std::string> only;
};

TEST_F(RestoreSettlementTest, TellsInstalledFromWhatWasInstalledBefore) {
  backUp("com.a");
  backUp("com.b");
  end.installedBefore = {"com.a", "com.other"};
  end.present.installed = {"com.a", "com.b", "com.other"};
  EXPECT_EQ(settled(), "installed: com.b; skipped: com.a (" + std::string(LeftAsItIs) + ")");
}

TEST_F(RestoreSettlementTest, TellsWhyAPlaceholderStays) {
  backUp("com.a");
  backUp("com.b");
  end.present.placeholders = {{"com.a", {}}, {"com.b", {}}};
  end.heldBack = {"com.b"};
  EXPECT_EQ(settled(),
            "skipped: com.a (waits for its package) com.b (stays a placeholder until it is asked "
            "for)");
}

TEST_F(RestoreSettlementTest, FailsWhatWasNamedAndThePackagesLack) {
  backUp("com.a");
  backUp("com.b");
  end.present.placeholders = {{"com.a", {}}, {"com.b", {}}};
  end.heldBack = {"com.b"};
  only = {"com.a", "com.b"};
  const std::string demoted = "com.b (stays a placeholder until it is asked for)";
  EXPECT_EQ(settled(), "skipped: com.a (waits for its package) " + demoted);
  end.packagesGiven = true;
  EXPECT_EQ(settled(), "failed: com.a (waits for its package); skipped: " + demoted);
  only.clear();
  EXPECT_EQ(settled(), "skipped: com.a (waits for its package) " + demoted);
}

TEST_F(RestoreSettlementTest, TellsWhichPlaceholdersGetTheBackupsData) {
  for (const char* identifier : {"com.a", "com.b", "com.c"}) backUp(identifier);
  end.present.placeholders = {{"com.a", {}}, {"com.b", {}}, {"com.c", {}}};
  end.heldBack = {"com.b", "com.c"};
  end.overwritten = {"com.a", "com.b"};
  const std::string demoted = "com.c (stays a placeholder until it is asked for)";
  EXPECT_EQ(settled(), "data restored: com.a com.b; skipped: " + demoted);
  end.packagesGiven = true;
  only = {"com.a", "com.b", "com.c"};
  EXPECT_EQ(settled(),
            "data restored: com.b; failed: com.a (waits for its package); skipped: " + demoted);
}

TEST_F(RestoreSettlementTest, TellsWhyNothingStands) {
  backUp("com.a");
  entries["com.b"] = PropertyList::Dictionary{};
  EXPECT_EQ(settled(),
            "failed: com.a (the phone made no placeholder of it (appsync log tells more)) "
            "com.b (the backup holds no metadata of it)");
  end.interrupted = true;
  EXPECT_EQ(settled(),
            "failed: com.a (interrupted; the next restore does it) com.b (interrupted; the next "
            "restore does it)");
  end.broken = "the phone cannot begin a restore";
  EXPECT_EQ(settled(),
            "failed: com.a (the phone cannot begin a restore) com.b (the phone cannot begin a "
            "restore)");
}

TEST_F(RestoreSettlementTest, FailureCountsUnlessTheApplicationCameAfterAll) {
  for (const char* identifier : {"com.a", "com.b", "com.c"}) backUp(identifier);
  end.present.placeholders = {{"com.a", {}}};
  end.present.installed = {"com.b"};
  end.failures = {{"com.a", "damaged"}, {"com.b", "first try"}, {"com.c", "refused"}};
  EXPECT_EQ(settled(), "installed: com.b; failed: com.a (damaged) com.c (refused)");
}

TEST_F(RestoreSettlementTest, CountsApplicationsBeyondTheBackup) {
  end.installedBefore = {"com.old", "com.failed"};
  end.present.installed = {"com.new", "com.old", "com.failed"};
  end.updated = {"com.old", "com.failed"};
  end.failures = {{"com.failed", "damaged"}};
  EXPECT_EQ(settled(), "installed: com.new; updated: com.old; failed: com.failed (damaged)");
}

class RestoreListTest : public ::testing::Test {
 protected:
  static std::optional<RestoreList> list(const PropertyList& value, std::string& problem) {
    Backup backup;
    backup.applications = serializePropertyList(value, PropertyListFormat::Xml).value();
    return RestoreList::of(backup, problem);
  }
  static BackedUpApplication only(const PropertyList& entry,
                                  const std::string& identifier = "com.a") {
    std::string problem;
    const auto made = list(PropertyList::Dictionary{{identifier, entry}}, problem);
    return made.value().applications().at(0);
  }
  static PropertyList withMetadata(const PropertyList& metadata) {
    return PropertyList::Dictionary{
        {"HalvoMetadata", serializePropertyList(metadata, PropertyListFormat::Binary).value()}};
  }
};

TEST_F(RestoreListTest, DescribesEachApplication) {
  const auto app = only(withMetadata(metadataOf("com.a", "2.5")));
  EXPECT_EQ(app.identifier, "com.a");
  EXPECT_EQ(app.version, "2.5");
  EXPECT_EQ(app.name, "Name of com.a");
  EXPECT_EQ(app.flaw, "");
  const PropertyList::Dictionary metadata{{"itemName", "Item"}, {"bundleVersion", "1"}};
  EXPECT_EQ(only(withMetadata(metadata)).name, "Item");
}

TEST_F(RestoreListTest, NamesWhatIsWrongWithAnApplication) {
  using Dictionary = PropertyList::Dictionary;
  EXPECT_EQ(only("text").flaw, "the backup holds no metadata of it");
  EXPECT_EQ(only(Dictionary{{"HalvoMetadata", "text"}}).flaw, "the backup holds no metadata of it");
  EXPECT_EQ(only(Dictionary{{"HalvoMetadata", Bytes(9)}}).flaw, "its metadata cannot be read");
  EXPECT_EQ(only(withMetadata(PropertyList::Array{})).flaw, "its metadata cannot be read");
  EXPECT_EQ(only(withMetadata(Dictionary{{"title", "A"}})).flaw, "its metadata tells no version");
  EXPECT_EQ(only(withMetadata(Dictionary{{"bundleVersion", "1"}})).flaw,
            "its metadata tells no name");
  for (const char* identifier : {"a/../b", "..", "a b\n", ""}) {
    EXPECT_EQ(only(withMetadata(metadataOf("com.a")), identifier).flaw,
              "no application can have this identifier");
  }
}

TEST_F(RestoreListTest, RefusesWhatIsNoList) {
  std::string problem;
  EXPECT_FALSE(list(PropertyList::Array{}, problem));
  EXPECT_EQ(problem, "the backup's list of applications cannot be read");
}

TEST_F(RestoreListTest, GivesThePhoneOnlyWhatIsChosenAndUnchanged) {
  std::string problem;
  PropertyList::Dictionary entries{{"com.a", withMetadata(metadataOf("com.a"))},
                                   {"com.b", PropertyList::Dictionary{{"Unknown", 7}}},
                                   {"com.c", "nothing"}};
  const auto bytes = list(entries, problem).value().only({"com.a", "com.b"}, nullptr);
  ASSERT_TRUE(bytes);
  entries.erase("com.c");
  EXPECT_EQ(parsePropertyList(*bytes), PropertyList(entries));
}

}  // namespace
}  // namespace appsync::host
