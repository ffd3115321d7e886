#include <set>

#include "tests/contract/phone.h"

namespace appsync::contract {
namespace {

class InstallerServiceContract : public ServiceContract {
 protected:
  /// The identifiers that the installer remembers.
  std::set<std::string> uninstalled() {
    const auto found = platform.installerService.lookupUninstalled();
    EXPECT_TRUE(found);
    std::set<std::string> identifiers;
    for (const auto& [identifier, value] : found.value_or(PropertyList::Dictionary{})) {
      identifiers.insert(identifier);
    }
    return identifiers;
  }
};

SERVICE_CONTRACT_OF(InstallerServiceContract);

using Identifiers = std::set<std::string>;

TEST_P(InstallerServiceContract, AnswersBeforeAnythingWasUninstalled) {
  ASSERT_TRUE(installPackage("com.a"));
  EXPECT_EQ(uninstalled(), Identifiers{});
}

TEST_P(InstallerServiceContract, RemembersWhatThePersonOrTheHostUninstalled) {
  for (const char* identifier : {"com.a", "com.b", "com.c"}) {
    ASSERT_TRUE(installPackage(identifier));
  }
  phone->uninstall("com.a");
  ASSERT_TRUE(platform.appRegistry.uninstallApplication("com.b", {}));
  EXPECT_EQ(uninstalled(), (Identifiers{"com.a", "com.b"}));
}

TEST_P(InstallerServiceContract, APlaceholderTakenFromOverAnApplicationUninstallsNothing) {
  ASSERT_TRUE(installPackage("com.a"));
  ASSERT_TRUE(installPlaceholder("com.a", "2.0"));
  ASSERT_TRUE(platform.appRegistry.uninstallApplication("com.a", {}));
  EXPECT_EQ(uninstalled(), Identifiers{});
}

TEST_P(InstallerServiceContract, AnApplicationInstalledAgainIsNotAmongThem) {
  ASSERT_TRUE(installPackage("com.a"));
  phone->uninstall("com.a");
  ASSERT_TRUE(installPackage("com.a"));
  EXPECT_EQ(uninstalled(), Identifiers{});
}

TEST_P(InstallerServiceContract, ForgetsWhatIsClearedAndPassesOverUnknownOnes) {
  ASSERT_TRUE(installPackage("com.a"));
  ASSERT_TRUE(installPackage("com.b"));
  phone->uninstall("com.a");
  phone->uninstall("com.b");
  EXPECT_EQ(platform.installerService.clearUninstalled({"com.a", "com.unknown"}), 0);
  EXPECT_EQ(uninstalled(), Identifiers{"com.b"});
  EXPECT_EQ(platform.installerService.clearUninstalled({}), 0);
  EXPECT_EQ(uninstalled(), Identifiers{"com.b"});
}

}  // namespace
}  // namespace appsync::contract
