// Desktop syncs of phones on which applications wait as placeholders: demoted, asked for, restored.

#include "platform/property_list_codec.h"
#include "tests/scenarios/restore_phone.h"
#include "tests/test_pch.h"

namespace appsync::host {
namespace {

using namespace testing;
using ::testing::ElementsAre;
using Demotion = SampleBackup::Demotion;

/// In both ways of installing.
class WaitingSync : public ::testing::TestWithParam<bool> {
 protected:
  WaitingSync() {
    for (const char* identifier : {"com.a", "com.b"}) shelf.add(identifier);
  }

  std::string sync(const PlanOptions& options = {}) { return phone.sync(shelf.library(), options); }
  static PlanOptions named(const std::string& identifier) {
    PlanOptions options;
    options.install = {identifier};
    return options;
  }
  /// com.a with notes of its own, and com.b.
  void installBoth() {
    ASSERT_EQ(sync(), "installed com.a; installed com.b");
    ASSERT_TRUE(phone.device().files().createFile("/var/mobile/Containers/Data/com.a/notes",
                                                  toBytes("notes of a"), {}));
  }
  void demote() { ASSERT_TRUE(phone.device().demote("com.a", nullptr)); }
  void tap() {
    device::DeviceError problem;
    ASSERT_TRUE(device::EmbeddedDevice::tap(phone.folder(), "com.a", problem, nullptr));
  }
  /// Why it could not be done; "done" else.
  std::string cancel() {
    device::DeviceError problem;
    std::optional<Error> error;
    const bool done = device::EmbeddedDevice::cancel(phone.folder(), "com.a", problem, &error);
    return done ? "done" : error ? error->localizedDescription() : problem.message;
  }
  static PlanOptions removal() {
    PlanOptions options;
    options.install = {"com.b"};
    options.remove = {"com.a"};
    return options;
  }
  /// Nothing of it, listed or not.
  void expectGone() {
    EXPECT_THAT(phone.applications(), ElementsAre("com.b 1.0"));
    for (const std::string_view directory :
         {"/var/mobile/Containers/Data", "/var/mobile/Media/HalvoRestore/Data"}) {
      EXPECT_FALSE(phone.device().files().fileExists(joinPath(directory, "com.a")));
    }
    EXPECT_THAT(phone.device().homeScreenOrder(), ElementsAre("com.b"));
  }
  void restore(Demotion demotion = Demotion::None) {
    backup.add("com.a", "notes of a", demotion);
    phone.restore(backup.read());
    ASSERT_THAT(phone.applications(), ElementsAre("com.a 1.0?"));
  }
  void expectWhole() {
    EXPECT_THAT(phone.applications(), ElementsAre("com.a 1.0", "com.b 1.0"));
    EXPECT_EQ(phone.notes("com.a"), "notes of a");
    EXPECT_FALSE(
        phone.device().files().fileExists("/var/mobile/Media/HalvoRestore/Data/com.a/notes"));
  }

  Shelf shelf;
  SampleBackup backup;
  RestoringPhone phone{GetParam()};
};

TEST_P(WaitingSync, ADemotedApplicationStaysSo) {
  installBoth();
  demote();
  EXPECT_EQ(sync(),
            "skipped com.a: stays a placeholder until it is asked for; "
            "skipped com.b: version 1.0 is installed");
  EXPECT_THAT(phone.applications(), ElementsAre("com.a 1.0?", "com.b 1.0"));
  EXPECT_EQ(phone.notes("com.a"), "notes of a");
}

TEST_P(WaitingSync, ADemotedApplicationThatIsNamedComesBackWithItsData) {
  installBoth();
  demote();
  EXPECT_EQ(sync(named("com.a")), "installed com.a");
  expectWhole();
}

TEST_P(WaitingSync, ADemotedApplicationThatWasTappedComesBackWithItsData) {
  installBoth();
  demote();
  tap();
  EXPECT_EQ(sync(), "installed com.a; skipped com.b: version 1.0 is installed");
  expectWhole();
}

TEST_P(WaitingSync, ARestoredApplicationComesWithItsData) {
  restore();
  EXPECT_EQ(sync(), "installed com.a; installed com.b");
  expectWhole();
}

TEST_P(WaitingSync, ARestoredApplicationThatWasTappedComesWithItsData) {
  restore();
  tap();
  EXPECT_EQ(sync(), "installed com.a; installed com.b");
  expectWhole();
}

TEST_P(WaitingSync, ARestoredApplicationThatIsDemotedComesWhenItIsNamed) {
  restore(Demotion::Intentional);
  EXPECT_EQ(sync(), "installed com.b; skipped com.a: stays a placeholder until it is asked for");
  EXPECT_EQ(sync(named("com.a")), "installed com.a");
  expectWhole();
}

TEST_P(WaitingSync, ARestoredApplicationWhosePackageIsDamagedStillWaits) {
  restore();
  shelf.addTruncated("com.a");
  EXPECT_EQ(sync().substr(0, 37), "installed com.b; failed com.a: damage");
  EXPECT_EQ(phone.notes("com.a"), "notes of a");
  shelf.add("com.a");
  EXPECT_EQ(sync(), "installed com.a; skipped com.b: version 1.0 is installed");
  expectWhole();
}

TEST_P(WaitingSync, ARestoredApplicationThatThePersonTookAwayIsInstalledAsNew) {
  restore();
  ASSERT_TRUE(phone.device().uninstall("com.a", nullptr));
  EXPECT_EQ(sync(), "installed com.a; installed com.b");
  EXPECT_THAT(phone.applications(), ElementsAre("com.a 1.0", "com.b 1.0"));
  EXPECT_EQ(phone.notes("com.a"), "");
}

TEST_P(WaitingSync, ADemotedApplicationThatIsRemovedByNameLeavesNothing) {
  installBoth();
  demote();
  EXPECT_THAT(sync(removal()), ::testing::HasSubstr("deleted com.a"));
  expectGone();
}

TEST_P(WaitingSync, ATappedApplicationThatIsRemovedByNameLeavesNothing) {
  installBoth();
  demote();
  tap();
  EXPECT_THAT(sync(removal()), ::testing::HasSubstr("deleted com.a"));
  expectGone();
}

TEST_P(WaitingSync, ARestoredApplicationThatIsRemovedByNameLeavesNothing) {
  restore();
  EXPECT_EQ(sync(removal()), "installed com.b; deleted com.a");
  expectGone();
}

TEST_P(WaitingSync, ATapThatIsCancelledLeavesADemotedApplicationAsItWas) {
  installBoth();
  demote();
  phone.open();
  const auto before = phone.picture();
  tap();
  EXPECT_NE(phone.picture(), before);
  EXPECT_EQ(cancel(), "done");
  EXPECT_EQ(phone.picture(), before);
  EXPECT_EQ(sync(),
            "skipped com.a: stays a placeholder until it is asked for; "
            "skipped com.b: version 1.0 is installed");
}

TEST_P(WaitingSync, ATapThatIsCancelledLeavesARestoredApplicationDemoted) {
  restore(Demotion::Intentional);
  const auto before = phone.picture();
  tap();
  EXPECT_EQ(cancel(), "done");
  EXPECT_EQ(phone.picture(), before);
  EXPECT_EQ(sync(), "installed com.b; skipped com.a: stays a placeholder until it is asked for");
}

TEST_P(WaitingSync, ARestoredApplicationIsNotCancelledWhileRemovingIsForbidden) {
  restore();
  const auto before = phone.picture();
  auto& device = phone.device();
  ASSERT_TRUE(
      device.setPolicy(PolicySetting::AppRemovalAllowed, PolicyValue::ExplicitlyNo, nullptr));
  EXPECT_EQ(cancel(), "removing applications is forbidden on this phone");
  EXPECT_EQ(phone.picture(), before);
  ASSERT_TRUE(device.setPolicy(PolicySetting::AppRemovalAllowed, PolicyValue::Yes, nullptr));
  EXPECT_EQ(cancel(), "done");
  EXPECT_THAT(phone.applications(), ElementsAre());
}

INSTANTIATE_TEST_SUITE_P(BothWays, WaitingSync, ::testing::Bool(),
                         [](const auto& mode) { return mode.param ? "Coordinated" : "Plain"; });

}  // namespace
}  // namespace appsync::host
