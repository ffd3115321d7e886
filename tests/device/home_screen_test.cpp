#include <signal.h>
#include <unistd.h>

#include <cerrno>
#include <thread>

#include "platform/property_list_codec.h"
#include "tests/device/device_test.h"

namespace appsync::device {
namespace {

using Lines = std::vector<std::string>;
using Array = PropertyList::Array;
using Dictionary = PropertyList::Dictionary;

class HomeScreenTest : public DeviceTest {
 protected:
  int adopt(const PropertyList& layout) {
    const auto bytes = serializePropertyList(layout, PropertyListFormat::Binary);
    return home().setIconState(home().serverPort(), *bytes);
  }
  HomeScreenService& home() { return device->homeScreen(); }
  AssertionOutcome outcomeFor(std::string_view identifier) {
    return home().createTerminationAssertion(identifier, 0).outcome;
  }
  bool launch(std::string_view identifier) {
    error.reset();
    return EmbeddedDevice::launch(folder, identifier, problem, &error);
  }
  bool quit(std::string_view identifier) {
    return EmbeddedDevice::quit(folder, identifier, problem, &error);
  }

  DeviceError problem;
};

TEST_F(HomeScreenTest, ApplicationsStandInTheOrderOfTheirArrival) {
  ASSERT_TRUE(installPlaceholder("com.example.c"));
  ASSERT_TRUE(installPackage("com.example.b"));
  ASSERT_TRUE(device->addSystemApplication("com.example.a", "A", "1", &error));
  const Lines order{"com.example.c", "com.example.b", "com.example.a"};
  EXPECT_EQ(device->homeScreenOrder(), order);
  ASSERT_TRUE(installPackage("com.example.c"));
  EXPECT_EQ(device->homeScreenOrder(), order) << "an update keeps its place";
}

TEST_F(HomeScreenTest, ALayoutGoesFirstAndSurvivesClosing) {
  for (const char* identifier : {"com.example.a", "com.example.b", "com.example.c"}) {
    ASSERT_TRUE(installPlaceholder(identifier));
  }
  EXPECT_EQ(adopt(Array{Array{"com.example.c", "com.example.later"}, Array{"com.example.b"}}), 0);
  reopen();
  EXPECT_EQ(device->homeScreenOrder(), (Lines{"com.example.c", "com.example.b", "com.example.a"}));
  ASSERT_TRUE(installPlaceholder("com.example.new"));
  ASSERT_TRUE(installPlaceholder("com.example.later"));
  EXPECT_EQ(device->homeScreenOrder(), (Lines{"com.example.c", "com.example.later", "com.example.b",
                                              "com.example.a", "com.example.new"}));
}

TEST_F(HomeScreenTest, PagesFoldersAndStrayNamesAreFlattened) {
  for (const char* identifier : {"a", "b", "c", "d"}) ASSERT_TRUE(installPlaceholder(identifier));
  const PropertyList games =
      Dictionary{{"displayName", "Games"}, {"iconLists", Array{Array{"d"}, Array{"b", "a"}}}};
  EXPECT_EQ(adopt(Dictionary{{"iconLists", Array{Array{games, "not/an/app", "d"}, "c"}}}), 0);
  EXPECT_EQ(device->homeScreenOrder(), (Lines{"d", "b", "a", "c"}));
}

TEST_F(HomeScreenTest, GarbageIsRefusedAndChangesNothing) {
  for (const char* identifier : {"a", "b"}) ASSERT_TRUE(installPlaceholder(identifier));
  ASSERT_EQ(adopt(Array{"b", "a"}), 0);
  EXPECT_NE(home().setIconState(home().serverPort(), asBytes("no property list")), 0);
  EXPECT_NE(home().setIconState(home().serverPort(), {}), 0);
  EXPECT_NE(adopt("a"), 0);
  EXPECT_NE(adopt(Dictionary{{"pages", Array{"a"}}}), 0);
  EXPECT_NE(adopt(Array{"a", 7}), 0);
  EXPECT_NE(adopt(Array{"a", Dictionary{{"iconLists", "b"}}}), 0);
  EXPECT_NE(home().setIconState(home().serverPort() + 1,
                                *serializePropertyList(Array{"a"}, PropertyListFormat::Binary)),
            0);
  EXPECT_EQ(device->homeScreenOrder(), (Lines{"b", "a"}));
}

TEST_F(HomeScreenTest, TheFlattenedStateIsABinaryArrayOfFormatOne) {
  ASSERT_TRUE(installPlaceholder("a"));
  const auto state = home().getFlattenedIconState(home().serverPort(), 1);
  ASSERT_TRUE(state);
  EXPECT_TRUE(asText(*state).starts_with("bplist00"));
  EXPECT_EQ(parsePropertyList(*state), PropertyList(Array{"a"}));
  EXPECT_FALSE(home().getFlattenedIconState(home().serverPort(), 2));
  EXPECT_FALSE(home().getFlattenedIconState(home().serverPort() + 1, 1));
}

TEST_F(HomeScreenTest, ARemovedApplicationLosesItsPlace) {
  for (const char* identifier : {"a", "b"}) ASSERT_TRUE(installPackage(identifier));
  ASSERT_TRUE(device->uninstall("a", &error));
  ASSERT_TRUE(installPackage("a"));
  EXPECT_EQ(device->homeScreenOrder(), (Lines{"b", "a"}));
}

TEST_F(HomeScreenTest, AnAssertionIsDeniedWhileTheApplicationIsInTheForeground) {
  ASSERT_TRUE(installPackage("com.example.a"));
  EXPECT_EQ(outcomeFor("com.example.a"), AssertionOutcome::Success);
  ASSERT_TRUE(launch("com.example.a"));
  ASSERT_TRUE(launch("com.example.a")) << "it is in the foreground already";
  EXPECT_EQ(device->foregroundApplications(), Lines{"com.example.a"});
  const auto denied = home().createTerminationAssertion("com.example.a", 0);
  EXPECT_EQ(denied.outcome, AssertionOutcome::Denied);
  EXPECT_FALSE(denied.assertion);
  ASSERT_TRUE(quit("com.example.a"));
  ASSERT_TRUE(quit("com.example.a"));
  EXPECT_TRUE(device->foregroundApplications().empty());
  EXPECT_EQ(outcomeFor("com.example.a"), AssertionOutcome::Success);
}

TEST_F(HomeScreenTest, TheWatcherHearsOfADenial) {
  struct Watcher final : PhoneWatcher {
    void assertionDenied(std::string_view id) noexcept override { denied.emplace_back(id); }
    Lines denied;
  } watcher;
  ASSERT_TRUE(installPackage("com.example.a"));
  ASSERT_TRUE(launch("com.example.a"));
  device->setWatcher(&watcher);
  outcomeFor("com.example.a");
  outcomeFor("com.example.none");
  EXPECT_EQ(watcher.denied, Lines{"com.example.a"});
  device->setWatcher(nullptr);
}

TEST_F(HomeScreenTest, UnknownApplicationsAndPlaceholdersAreNotFound) {
  ASSERT_TRUE(installPlaceholder("com.example.a"));
  EXPECT_EQ(outcomeFor("com.example.a"), AssertionOutcome::NotFound);
  EXPECT_EQ(outcomeFor("com.example.none"), AssertionOutcome::NotFound);
}

TEST_F(HomeScreenTest, WhileAnAssertionIsHeldTheApplicationCannotBeLaunched) {
  ASSERT_TRUE(installPackage("com.example.a"));
  auto first = home().createTerminationAssertion("com.example.a", 0);
  auto second = home().createTerminationAssertion("com.example.a", 0);
  EXPECT_FALSE(launch("com.example.a"));
  EXPECT_EQ(error->code, EBUSY);
  EXPECT_EQ(inOtherProcess([&] { return launch("com.example.a") ? 1 : 0; }), 0);
  first.assertion.reset();
  EXPECT_FALSE(launch("com.example.a"));
  second.assertion.reset();
  EXPECT_TRUE(launch("com.example.a"));
}

TEST_F(HomeScreenTest, AnAssertionEndsWithTheProcessThatHeldIt) {
  ASSERT_TRUE(installPackage("com.example.a"));
  device.reset();
  EXPECT_EQ(inOtherProcess([&] {
              reopen();
              const auto held = home().createTerminationAssertion("com.example.a", 0);
              return held.assertion ? kill(getpid(), SIGKILL) : 1;
            }),
            128 + SIGKILL);
  EXPECT_TRUE(std::filesystem::exists(folder / "foreground/com.example.a.held"));
  EXPECT_TRUE(launch("com.example.a"));
  ASSERT_TRUE(quit("com.example.a"));
  reopen();
  EXPECT_FALSE(std::filesystem::exists(folder / "foreground/com.example.a.held"));
  EXPECT_EQ(outcomeFor("com.example.a"), AssertionOutcome::Success);
}

TEST_F(HomeScreenTest, WhatIsNotInstalledOrMayNotRunCannotBeLaunched) {
  Dictionary info = infoOf("com.example.prohibited", "1.0");
  info.emplace("SWApplicationLaunchProhibited", true);
  ASSERT_TRUE(installPackage(PackageArchive().addApplication(info), "com.example.prohibited"));
  ASSERT_TRUE(installPlaceholder("com.example.placeholder"));
  EXPECT_FALSE(launch("com.example.prohibited"));
  EXPECT_EQ(error->code, EPERM);
  for (const char* identifier : {"com.example.placeholder", "com.example.none", "../lock", ""}) {
    EXPECT_FALSE(launch(identifier)) << identifier;
    EXPECT_EQ(error->code, ENOENT) << identifier;
    EXPECT_TRUE(quit(identifier)) << identifier;
  }
  EXPECT_TRUE(device->foregroundApplications().empty());
}

TEST_F(HomeScreenTest, AnApplicationWhoseExecutableIsGoneCannotBeLaunched) {
  ASSERT_TRUE(installPackage("com.example.a"));
  std::filesystem::remove(onDisk(*record("com.example.a")->bundlePath + "/run.sh"));
  EXPECT_FALSE(launch("com.example.a"));
  EXPECT_EQ(error->localizedDescription(),
            "com.example.a cannot be launched: its executable is gone; install it anew");
  ASSERT_TRUE(device->addSystemApplication("com.example.clock", "Clock", "1", &error));
  EXPECT_TRUE(launch("com.example.clock")) << "it names no executable";
}

TEST_F(HomeScreenTest, WhatCannotBeLookedAtCountsAsHeldAndAsRunning) {
  ASSERT_TRUE(installPackage("com.example.a"));
  std::filesystem::create_symlink("x", folder / "foreground/com.example.a.held");
  EXPECT_FALSE(launch("com.example.a"));
  EXPECT_EQ(error->code, ELOOP);
  reopen();
  EXPECT_TRUE(std::filesystem::is_symlink(folder / "foreground/com.example.a.held"));
  EXPECT_EQ(static_cast<int>(outcomeFor("com.example.a")), 3);
}

TEST_F(HomeScreenTest, LaunchingOnNoDeviceTellsTheDevicesProblem) {
  EXPECT_FALSE(EmbeddedDevice::launch(temporary.path() / "none", "a", problem, &error));
  EXPECT_EQ(problem.problem, DeviceProblem::Missing);
  EXPECT_FALSE(EmbeddedDevice::quit(temporary.path() / "none", "a", problem, &error));
  EXPECT_FALSE(error);
}

TEST_F(HomeScreenTest, AnUninstalledApplicationIsNotInTheForegroundAnyMore) {
  ASSERT_TRUE(installPackage("com.example.a"));
  ASSERT_TRUE(launch("com.example.a"));
  ASSERT_TRUE(device->uninstall("com.example.a", &error));
  EXPECT_TRUE(device->foregroundApplications().empty());
  ASSERT_TRUE(installPackage("com.example.b"));
  ASSERT_TRUE(launch("com.example.b"));
  ASSERT_TRUE(device->appRegistry().uninstallApplication("com.example.b", {}));
  EXPECT_TRUE(device->foregroundApplications().empty());
}

TEST_F(HomeScreenTest, WhenExpeditedAssertionsAreRefusedAndDelaysRunAtOnce) {
  ASSERT_TRUE(installPackage("com.example.a"));
  const Platform services = platform();
  std::thread::id ranOn;
  const auto token = services.backgroundQueue.after(std::chrono::hours(1),
                                                    [&] { ranOn = std::this_thread::get_id(); });
  device->expedite();
  services.backgroundQueue.cancel(token);
  EXPECT_EQ(static_cast<int>(outcomeFor("com.example.a")), 3);
}

}  // namespace
}  // namespace appsync::device
