// Which placeholders there are.
#include "tests/client/client_test.h"

namespace appsync {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

class PlaceholderQueries : public ClientTest {
 protected:
  static AppRecord record(const std::string& identifier,
                          std::string_view type = ApplicationTypeUser) {
    AppRecord made;
    made.applicationIdentifier = identifier;
    made.applicationType = type;
    return made;
  }

  Lines enumerated() {
    Lines found;
    client()._enumeratePlaceholdersWithBlock(
        [&](const AppRecord& visited, bool&) { found.push_back(visited.applicationIdentifier); });
    return found;
  }
};

TEST_F(PlaceholderQueries, APlaceholderIsFoundByItsIdentifier) {
  phone.appRegistry.seedPlaceholder("com.a");
  EXPECT_TRUE(client()._placeholderExistsForApplication("com.a"));
  expectTrace({"AppRegistry.enumerateBundles(1)",
               "log default SyncBundle|Found placeholder for bundle com.a"},
              fakes::TraceAll);
}

TEST_F(PlaceholderQueries, OnlyTheExactIdentifierIsFound) {
  phone.appRegistry.seedPlaceholder("com.a");
  for (const char* identifier : {"com.A", "com.a.b", "com", "com.a ", ""}) {
    EXPECT_FALSE(client()._placeholderExistsForApplication(identifier)) << identifier;
  }
  expectTrace({});
}

TEST_F(PlaceholderQueries, TheBundleIdentifierDecidesNotTheApplications) {
  AppRecord other = record("com.a");
  other.bundleIdentifier = "com.other";
  phone.appRegistry.seedPlaceholder(other);
  EXPECT_FALSE(client()._placeholderExistsForApplication("com.a"));
  EXPECT_TRUE(client()._placeholderExistsForApplication("com.other"));
}

TEST_F(PlaceholderQueries, ARecordWithoutABundleIdentifierIsNotFound) {
  phone.appRegistry.seedPlaceholder(record("com.a", ApplicationTypeSystem));
  phone.appRegistry.seedPlaceholder("com.b");
  for (const char* identifier : {"com.a", "com.b"}) {
    phone.appRegistry.edit(identifier, [](AppRecord& found) { found.bundleIdentifier.reset(); });
  }
  EXPECT_FALSE(client()._placeholderExistsForApplication("com.b"));
  EXPECT_FALSE(client()._placeholderExistsForApplication(""));
  EXPECT_THAT(client()._getSystemAppPlaceholders(), IsEmpty());
}

TEST_F(PlaceholderQueries, AnInstalledApplicationCountsAsOneThatHasItsPlaceholder) {
  // Either way the identifier is taken, so that a restore makes no placeholder over it.
  phone.appRegistry.seedInstalled("com.a");
  ASSERT_FALSE(phone.appRegistry.placeholder("com.a"));
  EXPECT_TRUE(client()._placeholderExistsForApplication("com.a"));
  expectTrace({"log default SyncBundle|Found placeholder for bundle com.a"});
}

TEST_F(PlaceholderQueries, TheSearchEndsAtTheFirstRecordThatFits) {
  AppRecord twin = record("com.a.twin");
  twin.bundleIdentifier = "com.a";
  phone.appRegistry.seedPlaceholder(twin);
  phone.appRegistry.seedPlaceholder("com.a");
  EXPECT_TRUE(client()._placeholderExistsForApplication("com.a"));
  expectTrace({"log default SyncBundle|Found placeholder for bundle com.a"});
}

TEST_F(PlaceholderQueries, WithCoordinationOnNoPlaceholderExistsAndTheRegistryIsNotAsked) {
  phone.installCoordination.setEnabled(true);
  phone.appRegistry.seedPlaceholder("com.a");
  EXPECT_FALSE(client()._placeholderExistsForApplication("com.a"));
  expectTrace({}, fakes::TraceAll);
}

TEST_F(PlaceholderQueries, TheEnumerationVisitsPlaceholdersOfApplicationsOnly) {
  phone.appRegistry.seedInstalled("com.installed");
  phone.appRegistry.seedPlaceholder("com.user");
  phone.appRegistry.seedPlaceholder(record("com.system", ApplicationTypeSystem));
  phone.appRegistry.seedInstalled("com.updating");
  phone.appRegistry.seedPlaceholder("com.updating");
  AppRecord extension = record("com.extension");
  extension.isApplication = false;
  extension.isPlaceholder = true;
  phone.appRegistry.seedOther(extension);
  EXPECT_THAT(enumerated(), ElementsAre("com.system", "com.updating", "com.user"));
  expectTrace({"AppRegistry.enumerateBundles(0)"}, fakes::TraceAll);
}

TEST_F(PlaceholderQueries, TheVisitorMayStopTheEnumeration) {
  phone.appRegistry.seedPlaceholder("com.a");
  phone.appRegistry.seedPlaceholder("com.b");
  Lines found;
  client()._enumeratePlaceholdersWithBlock([&](const AppRecord& visited, bool& stop) {
    found.push_back(visited.applicationIdentifier);
    stop = true;
  });
  EXPECT_THAT(found, ElementsAre("com.a"));
}

TEST_F(PlaceholderQueries, WithoutPlaceholdersNothingIsVisited) {
  phone.appRegistry.seedInstalled("com.a");
  EXPECT_THAT(enumerated(), IsEmpty());
}

TEST_F(PlaceholderQueries, SystemPlaceholdersAreThoseOfSystemApplications) {
  phone.appRegistry.seedPlaceholder("com.user");
  phone.appRegistry.seedInstalled(record("com.installed", ApplicationTypeSystem));
  phone.appRegistry.seedPlaceholder(record("com.b", ApplicationTypeSystem));
  phone.appRegistry.seedPlaceholder(record("com.a", ApplicationTypeSystem));
  EXPECT_THAT(client()._getSystemAppPlaceholders(), ElementsAre("com.a", "com.b"));
  expectTrace({"AppRegistry.enumerateBundles(7)",
               "log default SyncBundle|SystemAppPlaceholders (com.a, com.b)"},
              fakes::TraceAll);
}

TEST_F(PlaceholderQueries, WithoutSystemPlaceholdersTheSetIsEmpty) {
  EXPECT_THAT(client()._getSystemAppPlaceholders(), IsEmpty());
  expectTrace({"log default SyncBundle|SystemAppPlaceholders ()"});
}

}  // namespace
}  // namespace appsync
