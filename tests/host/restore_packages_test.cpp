// Packages of restored applications that the host itself brings, to a phone without coordination.
#include <cerrno>

#include "tests/host/restore_fixture.h"

namespace appsync::host {
namespace {

using namespace testing;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

class RestorePackagesTest : public RestoreTest {
 protected:
  RestorePackagesTest() { packages = true; }
};

TEST_F(RestorePackagesTest, PackageWithoutWaitingDataIsInstalledAtOnce) {
  backUp("com.a");
  offer("com.a");
  EXPECT_EQ(restore(), "installed: com.a");
  EXPECT_THAT(trace("client.restoreParts"),
              ElementsAre("client.restoreParts(com.a, 1.0, asked 3, came 1)"));
  EXPECT_THAT(trace("phone.received"), ElementsAre("phone.received(STAGING/com.a.tar, durable)"));
}

TEST_F(RestorePackagesTest, DataPartsFollowWhenAllPackagesAreThere) {
  for (const char* identifier : {"com.a", "com.b", "com.c"}) offer(identifier);
  backUp("com.a", "data of a");
  backUp("com.b");
  backUp("com.c", "data of c");
  EXPECT_EQ(restore(), "installed: com.a com.b com.c");
  EXPECT_THAT(trace("client.restoreParts"),
              ElementsAre("client.restoreParts(com.a, 1.0, asked 3, came 1)",
                          "client.restoreParts(com.b, 1.0, asked 3, came 1)",
                          "client.restoreParts(com.c, 1.0, asked 3, came 1)",
                          "client.restoreParts(com.a, 1.0, asked 2, came 2)",
                          "client.restoreParts(com.c, 1.0, asked 2, came 2)"));
}

TEST_F(RestorePackagesTest, RememberedPackageIsNotSentAgain) {
  backUp("com.a", "data of a");
  offer("com.a");
  seedRestoring("com.a");
  waiting["com.a"] = "data of a";
  phone.files.putFile(std::string(Root) + "com.a.zip", "an earlier package");
  putRemembered("com.a", std::string(Root) + "com.a.zip");
  EXPECT_EQ(restore(), "installed: com.a");
  EXPECT_THAT(trace("phone"), IsEmpty());
  EXPECT_THAT(trace("client.restoreParts"),
              ElementsAre("client.restoreParts(com.a, 1.0, asked 2, came 2)"));
}

TEST_F(RestorePackagesTest, NothingIsSentWhenItCannotBeSeenWhatIsRemembered) {
  backUp("com.a", "data of a");
  offer("com.a");
  // The first look is for packages left behind.
  phone.faults.failWhere("FileManager.contentsAtPath", exchange::RestoreState,
                         Error::posix(EMFILE));
  EXPECT_EQ(restore(),
            "failed: com.a (what the phone remembers of it could not be looked at: Too many open "
            "files)");
  EXPECT_THAT(trace("phone.receive"), IsEmpty());
}

TEST_F(RestorePackagesTest, RememberedPackageNeedsNoLibrary) {
  packages = false;
  backUp("com.a", "data of a");
  seedRestoring("com.a");
  waiting["com.a"] = "data of a";
  phone.files.putFile(std::string(Root) + "com.a.zip", "an earlier package");
  putRemembered("com.a", std::string(Root) + "com.a.zip");
  EXPECT_EQ(restore(), "installed: com.a");
}

TEST_F(RestorePackagesTest, RememberedPackageThatIsGoneIsSentAnew) {
  backUp("com.a", "data of a");
  offer("com.a");
  seedRestoring("com.a");
  waiting["com.a"] = "data of a";
  putRemembered("com.a", std::string(Root) + "com.a.zip");
  EXPECT_EQ(restore(), "installed: com.a");
  EXPECT_THAT(trace("client.restoreParts"),
              ElementsAre("client.restoreParts(com.a, 1.0, asked 3, came 1)",
                          "client.restoreParts(com.a, 1.0, asked 2, came 2)"));
}

TEST_F(RestorePackagesTest, InterruptionLeavesPackagesRemembered) {
  backUp("com.a", "data of a");
  backUp("com.b", "data of b");
  offer("com.a");
  offer("com.b");
  client.onProgress = [this](const SyncAssetPtr& asset, double) {
    if (asset->identifier == "com.b") interruption.request();
  };
  restore();
  EXPECT_THAT(trace("client.restoreParts"),
              ElementsAre("client.restoreParts(com.a, 1.0, asked 3, came 1)",
                          "client.restoreParts(com.b, 1.0, asked 3, came 1)"));
  EXPECT_TRUE(phone.files.exists(std::string(Root) + "com.a.tar"));
}

TEST_F(RestorePackagesTest, WhatTheLibraryLacksAndWhatIsDemotedStays) {
  backUp("com.a", "data of a");
  backUp("com.b", "data of b", true);
  offer("com.b");
  EXPECT_EQ(restore(),
            "skipped: com.a (the library does not have it) com.b (stays a placeholder until it is "
            "asked for)");
}

TEST_F(RestorePackagesTest, RefusedPackageFailsAloneAndLeavesThePlaceholder) {
  backUp("com.a");
  backUp("com.b");
  offer("com.a");
  offer("com.b");
  client.refusedPackages.emplace("com.a", Error::withDescription("Test", 1, "damaged"));
  EXPECT_EQ(restore(), "installed: com.b; failed: com.a (damaged)");
}

}  // namespace
}  // namespace appsync::host
