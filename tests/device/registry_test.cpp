#include <SQLiteCpp/SQLiteCpp.h>

#include "platform/bundle.h"
#include "tests/device/device_parts.h"
#include "tests/device/device_test.h"

namespace appsync::device {
namespace {

using Lines = std::vector<std::string>;

class RegistryTest : public DeviceTest {
 protected:
  Lines enumerate(BundleKind kind) {
    Lines visited;
    device->appRegistry().enumerateBundles(
        kind, [&](const AppRecord& each, bool&) { visited.push_back(description(each)); });
    return visited;
  }

  bool addSystem(std::string_view identifier) {
    return device->addSystemApplication(identifier, "System Thing", "9.0", &error);
  }
};

TEST_F(RegistryTest, RecordsSurviveClosingTheDevice) {
  ASSERT_TRUE(installPackage("com.example.b", "2.1"));
  ASSERT_TRUE(installPlaceholder("com.example.a", "1.0"));
  const Lines expected{"com.example.a 1.0 (placeholder)", "com.example.b 2.1"};
  EXPECT_EQ(registry(), expected);
  reopen();
  EXPECT_EQ(registry(), expected);
}

TEST_F(RegistryTest, AnUpdateHasTwoRecordsOfWhichTheInstalledOneIsPreferred) {
  ASSERT_TRUE(installPackage("com.example.a", "1.0"));
  ASSERT_TRUE(installPlaceholder("com.example.a", "2.0"));
  EXPECT_EQ(registry(), (Lines{"com.example.a 1.0", "com.example.a 2.0 (placeholder)"}));
  EXPECT_EQ(record("com.example.a", false)->bundleVersion, "1.0");
  EXPECT_EQ(record("com.example.a", true)->bundleVersion, "2.0");
  EXPECT_EQ(enumerate(BundleKind::All), (Lines{"com.example.a", "com.example.a (placeholder)"}));
  EXPECT_EQ(enumerate(BundleKind::User), Lines{"com.example.a"});
}

TEST_F(RegistryTest, KindsTellApplicationsOfTheUserFromThoseOfTheSystem) {
  ASSERT_TRUE(installPackage("com.example.user"));
  ASSERT_TRUE(installPlaceholder("com.example.waiting"));
  ASSERT_TRUE(addSystem("com.example.system"));
  EXPECT_EQ(enumerate(BundleKind::User),
            (Lines{"com.example.user", "com.example.waiting (placeholder)"}));
  EXPECT_EQ(enumerate(BundleKind::System), Lines{"com.example.system"});
  const auto system = record("com.example.system");
  EXPECT_EQ(system->applicationType, ApplicationTypeSystem);
  EXPECT_EQ(system->displayName, "System Thing");
  EXPECT_EQ(system->bundleVersion, "9.0");
  const auto bundle = Bundle::open(device->files(), FileLocation::directory(*system->bundlePath));
  ASSERT_TRUE(bundle);
  EXPECT_EQ(*findString(bundle->infoDictionary(), KBBundleIdentifier), "com.example.system");
}

TEST_F(RegistryTest, WhatComesOverASystemApplicationBelongsToTheSystemToo) {
  ASSERT_TRUE(addSystem("com.example.system"));
  ASSERT_TRUE(installPlaceholder("com.example.system", "9.1"));
  EXPECT_EQ(record("com.example.system", true)->applicationType, ApplicationTypeSystem);
  EXPECT_EQ(enumerate(BundleKind::System), Lines{"com.example.system"});
  ASSERT_TRUE(installPackage("com.example.system", "9.1"));
  EXPECT_EQ(record("com.example.system")->applicationType, ApplicationTypeSystem);
  EXPECT_EQ(version("com.example.system"), "9.1");
}

TEST_F(RegistryTest, ASystemApplicationCannotBeUninstalled) {
  ASSERT_TRUE(addSystem("com.example.system"));
  EXPECT_FALSE(device->appRegistry().uninstallApplication("com.example.system", {}));
  EXPECT_FALSE(device->uninstall("com.example.system", &error));
  EXPECT_NE(error->localizedDescription().find("belongs to the system"), std::string::npos);
  EXPECT_EQ(version("com.example.system"), "9.0");
}

TEST_F(RegistryTest, AVisitorMayChangeTheRegistryAndStop) {
  for (const char* identifier : {"com.example.a", "com.example.b", "com.example.c"}) {
    ASSERT_TRUE(installPlaceholder(identifier));
  }
  Lines visited;
  device->appRegistry().enumerateBundles(BundleKind::All, [&](const AppRecord& each, bool& stop) {
    visited.push_back(each.applicationIdentifier);
    EXPECT_TRUE(device->appRegistry().uninstallApplication(each.applicationIdentifier, {}));
    stop = visited.size() == 2;
  });
  EXPECT_EQ(visited, (Lines{"com.example.a", "com.example.b"}));
  EXPECT_EQ(registry(), Lines{"com.example.c 1.0 (placeholder)"});
}

TEST_F(RegistryTest, IdentifiersThatAreNoFileNamesAreRefused) {
  const std::string tooLong(201, 'a');
  for (const std::string_view identifier :
       {std::string_view(""), std::string_view("."), std::string_view(".."),
        std::string_view("../escape"), std::string_view("com/example"),
        std::string_view("com.example\0x", 13), std::string_view("com example"),
        std::string_view("caf\xc3\xa9"), std::string_view(tooLong)}) {
    EXPECT_FALSE(installPackage(PackageArchive().addApplication("com.example.a", "1"), identifier));
    ASSERT_TRUE(error);
    EXPECT_FALSE(device->uninstall(identifier, &error));
    EXPECT_FALSE(device->appRegistry().uninstallApplication(identifier, {}));
    EXPECT_FALSE(addSystem(identifier));
    EXPECT_FALSE(platform().backupManager.restoreDataExists(identifier));
    platform().backupManager.cancelApplicationRestore(identifier);
    EXPECT_EQ(device->homeScreen().createTerminationAssertion(identifier, 0).outcome,
              AssertionOutcome::NotFound);
  }
  EXPECT_TRUE(registry().empty());
  EXPECT_EQ(containerCount(), 0U);
  EXPECT_TRUE(installPackage(std::string(200, 'a')));
}

TEST_F(RegistryTest, WaitingDataIsForgottenOnlyWhenItIsKnownThatNothingIsLeftOfTheApplication) {
  const std::string data = "/var/mobile/Media/HalvoRestore/Data/com.example.a/saved";
  putFile(data, "old");
  device.reset();
  DeviceParts parts(folder);
  const auto rename = [&](const std::string& from, const std::string& to) {
    ASSERT_TRUE(parts.database().change("", Database::Commit::Ordinary, [&](Connection& database) {
      database.exec("ALTER TABLE " + from + " RENAME TO " + to);
    }));
  };
  rename("applications", "hidden");
  parts.registry().change("com.example.a", forgetWaitingData, nullptr);
  EXPECT_EQ(fakes::fileText(onDisk(data)), "old");
  rename("hidden", "applications");
  parts.registry().change("com.example.a", forgetWaitingData, nullptr);
  EXPECT_FALSE(std::filesystem::exists(onDisk(data)));
}

TEST_F(RegistryTest, AFolderCannotBeInstalledAsPackageNorAFileAsPlaceholder) {
  auto& registry = device->appRegistry();
  const FileLocation file = stage(PackageArchive().addApplication("com.example.a", "1"));
  const PropertyList::Dictionary package{{std::string(SWPackageTypeKey), SWPackageTypeCustomer},
                                         {std::string(KBBundleIdentifier), "com.example.a"}};
  EXPECT_FALSE(registry.installApplication(FileLocation::directory(file.path), package, &error));
  EXPECT_FALSE(registry.installApplication(FileLocation::file("/tmp"), package, &error));
  EXPECT_FALSE(registry.installApplication(FileLocation::file("/tmp/none"), package, &error));
  EXPECT_EQ(error->domain, POSIXErrorDomain);
  EXPECT_EQ(error->code, ENOENT);
  PropertyList::Dictionary placeholder = package;
  placeholder.insert_or_assign(std::string(SWPackageTypeKey), SWPackageTypePlaceholder);
  EXPECT_FALSE(registry.installApplication(file, placeholder, &error));
  EXPECT_EQ(containerCount(), 0U);
}

TEST_F(RegistryTest, ARegistryThatCannotBeReadSaysWhy) {
  ASSERT_TRUE(installPackage("com.example.a"));
  device.reset();
  {
    SQLite::Database database((folder / "device.db").string(), SQLite::OPEN_READWRITE);
    database.exec("ALTER TABLE applications RENAME COLUMN sinf TO other");
  }
  reopen(Access::ReadOnly);
  EXPECT_TRUE(device->applications(&error).empty());
  ASSERT_TRUE(error);
  EXPECT_EQ(error->localizedDescription(), "the phone's database: it cannot be read or written");
}

}  // namespace
}  // namespace appsync::device
