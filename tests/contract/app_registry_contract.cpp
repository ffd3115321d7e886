#include <algorithm>
#include <thread>

#include "tests/contract/phone.h"

namespace appsync::contract {
namespace {

class AppRegistryContract : public ServiceContract {
 protected:
  AppRegistry& registry = platform.appRegistry;

  /// Identifiers of a kind, sorted, as "com.a" and "com.a (placeholder)".
  std::vector<std::string> all(BundleKind kind) {
    std::vector<std::string> found;
    registry.enumerateBundles(
        kind, [&](const AppRecord& record, bool&) { found.push_back(description(record)); });
    std::ranges::sort(found);
    return found;
  }
  std::optional<std::string> version(std::string_view identifier) {
    const auto record = registry.recordForIdentifier(identifier, false);
    return record ? record->bundleVersion : std::nullopt;
  }
};

SERVICE_CONTRACT_OF(AppRegistryContract);

using Identifiers = std::vector<std::string>;

TEST_P(AppRegistryContract, KnowsNothingOfAnUnknownApplication) {
  EXPECT_FALSE(registry.isApplicationInstalled("com.a"));
  EXPECT_FALSE(registry.recordForIdentifier("com.a", false));
  EXPECT_FALSE(registry.recordForIdentifier("com.a", true));
  EXPECT_FALSE(registry.uninstallApplication("com.a", {}));
}

TEST_P(AppRegistryContract, APlaceholderIsInstalledAndTellsWhatItsBundleSays) {
  ASSERT_TRUE(installPlaceholder("com.a", "1.5", InstallType::Restore));
  EXPECT_TRUE(registry.isApplicationInstalled("com.a"));
  const auto record = registry.recordForIdentifier("com.a", true);
  ASSERT_TRUE(record);
  EXPECT_EQ(record->applicationIdentifier, "com.a");
  EXPECT_EQ(record->bundleIdentifier, "com.a");
  EXPECT_EQ(record->bundleVersion, "1.5");
  EXPECT_EQ(record->displayName, "Name of com.a");
  EXPECT_EQ(record->applicationType, ApplicationTypeUser);
  EXPECT_EQ(record->installType, InstallType::Restore);
  EXPECT_TRUE(record->isApplication);
  EXPECT_TRUE(record->isInstalled);
  EXPECT_TRUE(record->isPlaceholder);
  ASSERT_TRUE(record->bundlePath);
  ASSERT_TRUE(record->bundleContainerPath);
  EXPECT_TRUE(record->bundlePath->starts_with(*record->bundleContainerPath + "/"));
  EXPECT_TRUE(record->bundlePath->ends_with(".app"));
  EXPECT_TRUE(platform.files.fileExists(joinPath(*record->bundlePath, "Info.plist")));
  const auto alone = registry.recordForIdentifier("com.a", false);
  ASSERT_TRUE(alone);
  EXPECT_TRUE(alone->isPlaceholder);
}

TEST_P(AppRegistryContract, APlaceholdersStoreMetadataLiesInItsContainer) {
  const Bytes metadata = toBytes("as received");
  const PropertyList::Dictionary options = {
      {std::string(SWPackageTypeKey), SWPackageTypePlaceholder},
      {std::string(KBBundleIdentifier), "com.a"},
      {std::string(SWInstallTypeKey), 2},
      {std::string(SWHalvoMetadataKey), metadata},
      {std::string(SWApplicationSINFKey), PropertyList::null()}};
  const std::string bundle = placeholderBundle("com.a", "1.0");
  ASSERT_TRUE(registry.installApplication(FileLocation::directory(bundle), options, nullptr));
  const auto record = registry.recordForIdentifier("com.a", true);
  ASSERT_TRUE(record && record->bundleContainerPath);
  EXPECT_EQ(
      platform.files.contentsAtPath(joinPath(*record->bundleContainerPath, "HalvoMetadata.plist")),
      metadata);
}

TEST_P(AppRegistryContract, APackageTakesThePlaceOfThePlaceholder) {
  ASSERT_TRUE(installPlaceholder("com.a", "2.0"));
  ASSERT_TRUE(installPackage("com.a", "2.0"));
  EXPECT_FALSE(registry.recordForIdentifier("com.a", true));
  const auto record = registry.recordForIdentifier("com.a", false);
  ASSERT_TRUE(record);
  EXPECT_EQ(record->applicationIdentifier, "com.a");
  EXPECT_EQ(record->bundleVersion, "2.0");
  EXPECT_EQ(record->displayName, "Name of com.a");
  EXPECT_EQ(record->applicationType, ApplicationTypeUser);
  EXPECT_TRUE(record->isInstalled);
  EXPECT_FALSE(record->isPlaceholder);
  ASSERT_TRUE(record->bundlePath && record->bundleContainerPath);
  EXPECT_TRUE(record->bundlePath->starts_with(*record->bundleContainerPath + "/"));
  EXPECT_TRUE(platform.files.directoryExists(*record->bundlePath));
  EXPECT_EQ(all(BundleKind::All), Identifiers{"com.a"});
}

TEST_P(AppRegistryContract, APackageReplacesTheInstalledVersion) {
  ASSERT_TRUE(installPackage("com.a", "1.0"));
  ASSERT_TRUE(installPackage("com.a", "2.0"));
  EXPECT_EQ(version("com.a"), "2.0");
  EXPECT_EQ(all(BundleKind::All), Identifiers{"com.a"});
}

TEST_P(AppRegistryContract, APlaceholderLaidOverLeavesTheInstalledVersionWhole) {
  ASSERT_TRUE(installPackage("com.a", "1.0"));
  const std::string bundle = registry.recordForIdentifier("com.a", false)->bundlePath.value();
  ASSERT_TRUE(installPlaceholder("com.a", "2.0"));
  EXPECT_EQ(version("com.a"), "1.0");
  EXPECT_FALSE(registry.recordForIdentifier("com.a", false)->isPlaceholder);
  EXPECT_TRUE(platform.files.directoryExists(bundle));
  const auto placeholder = registry.recordForIdentifier("com.a", true);
  ASSERT_TRUE(placeholder);
  EXPECT_EQ(placeholder->bundleVersion, "2.0");
}

TEST_P(AppRegistryContract, UninstallingTakesFirstTheLaidOverPlaceholderThenTheApplication) {
  ASSERT_TRUE(installPackage("com.a", "1.0"));
  ASSERT_TRUE(installPlaceholder("com.a", "2.0"));
  EXPECT_TRUE(registry.uninstallApplication("com.a", {}));
  EXPECT_FALSE(registry.recordForIdentifier("com.a", true));
  EXPECT_EQ(version("com.a"), "1.0");
  const std::string bundle = registry.recordForIdentifier("com.a", false)->bundlePath.value();
  EXPECT_TRUE(registry.uninstallApplication("com.a", {}));
  EXPECT_FALSE(registry.isApplicationInstalled("com.a"));
  EXPECT_FALSE(platform.files.directoryExists(bundle));
  EXPECT_FALSE(registry.uninstallApplication("com.a", {}));
}

TEST_P(AppRegistryContract, UninstallingPlaceholdersOnlyNeverTouchesAnInstalledVersion) {
  const PropertyList::Dictionary only = {{std::string(UninstallPlaceholdersOnlyKey), true}};
  ASSERT_TRUE(installPackage("com.a", "1.0"));
  EXPECT_FALSE(registry.uninstallApplication("com.a", only));
  EXPECT_EQ(version("com.a"), "1.0");
  ASSERT_TRUE(installPlaceholder("com.a", "2.0"));
  EXPECT_TRUE(registry.uninstallApplication("com.a", only));
  EXPECT_FALSE(registry.recordForIdentifier("com.a", true));
  EXPECT_EQ(version("com.a"), "1.0");
  EXPECT_FALSE(registry.uninstallApplication("com.a", only));
  ASSERT_TRUE(installPlaceholder("com.b"));
  EXPECT_TRUE(registry.uninstallApplication("com.b", only));
  EXPECT_FALSE(registry.isApplicationInstalled("com.b"));
}

TEST_P(AppRegistryContract, OptionsWithoutAPackageTypeOrIdentifierAreRefused) {
  const FileLocation bundle = FileLocation::directory(placeholderBundle("com.a", "1.0"));
  const PropertyList::Dictionary whole = {{std::string(SWPackageTypeKey), SWPackageTypePlaceholder},
                                          {std::string(KBBundleIdentifier), "com.a"}};
  for (const std::string_view missing : {SWPackageTypeKey, KBBundleIdentifier}) {
    PropertyList::Dictionary options = whole;
    options.erase(std::string(missing));
    std::optional<Error> error;
    EXPECT_FALSE(registry.installApplication(bundle, options, &error));
    EXPECT_TRUE(error);
  }
  EXPECT_FALSE(registry.isApplicationInstalled("com.a"));
}

TEST_P(AppRegistryContract, APackageThatIsMissingOrOfAnotherApplicationLeavesTheOldStateWhole) {
  ASSERT_TRUE(installPackage("com.a", "1.0"));
  ASSERT_TRUE(installPlaceholder("com.a", "2.0"));
  phone->putPackage("/tmp/other.package", "com.other", "9.0");
  for (const char* path : {"/tmp/missing.package", "/tmp/other.package"}) {
    std::optional<Error> error;
    EXPECT_FALSE(
        registry.installApplication(FileLocation::file(path), packageOptions("com.a"), &error));
    EXPECT_TRUE(error);
    EXPECT_EQ(version("com.a"), "1.0");
    EXPECT_TRUE(registry.recordForIdentifier("com.a", true));
    EXPECT_FALSE(registry.isApplicationInstalled("com.other"));
  }
}

TEST_P(AppRegistryContract, APlaceholderBundleThatIsMissingOrOfAnotherApplicationIsRefused) {
  const std::string other = placeholderBundle("com.other", "1.0");
  const PropertyList::Dictionary options = {
      {std::string(SWPackageTypeKey), SWPackageTypePlaceholder},
      {std::string(KBBundleIdentifier), "com.a"},
      {std::string(SWInstallTypeKey), 4}};
  for (const std::string& path : {std::string("/tmp/missing.app"), other}) {
    std::optional<Error> error;
    EXPECT_FALSE(registry.installApplication(FileLocation::directory(path), options, &error));
    EXPECT_TRUE(error);
  }
  EXPECT_EQ(all(BundleKind::All), Identifiers{});
}

TEST_P(AppRegistryContract, EachKindVisitsItsRecords) {
  ASSERT_TRUE(installPackage("com.a"));
  ASSERT_TRUE(installPackage("com.b"));
  ASSERT_TRUE(installPlaceholder("com.b"));
  ASSERT_TRUE(installPlaceholder("com.c"));
  EXPECT_EQ(all(BundleKind::All),
            (Identifiers{"com.a", "com.b", "com.b (placeholder)", "com.c (placeholder)"}));
  const Identifiers user = all(BundleKind::User);
  ASSERT_EQ(user.size(), 3U);
  EXPECT_EQ(user.front(), "com.a");
  EXPECT_TRUE(user[1].starts_with("com.b"));
  EXPECT_EQ(user.back(), "com.c (placeholder)");
  EXPECT_EQ(all(BundleKind::System), Identifiers{});
}

TEST_P(AppRegistryContract, AVisitorEndsTheEnumerationAndMayChangeTheRegistry) {
  ASSERT_TRUE(installPlaceholder("com.a"));
  ASSERT_TRUE(installPlaceholder("com.b"));
  int visits = 0;
  registry.enumerateBundles(BundleKind::All, [&](const AppRecord&, bool& stop) {
    ++visits;
    stop = true;
  });
  EXPECT_EQ(visits, 1);
  Identifiers removed;
  registry.enumerateBundles(BundleKind::All, [&](const AppRecord& record, bool&) {
    if (removed.empty()) {
      EXPECT_TRUE(registry.uninstallApplication("com.a", {}));
      EXPECT_TRUE(registry.uninstallApplication("com.b", {}));
    }
    removed.push_back(record.applicationIdentifier);
  });
  EXPECT_EQ(removed.size(), 2U);
  EXPECT_EQ(all(BundleKind::All), Identifiers{});
}

TEST_P(AppRegistryContract, InstallsOfManyApplicationsMayOverlap) {
  std::vector<std::thread> threads;
  for (int number = 0; number < 6; ++number) {
    threads.emplace_back([this, number] {
      const std::string identifier = "com.app" + std::to_string(number);
      EXPECT_TRUE(installPlaceholder(identifier));
      EXPECT_TRUE(installPackage(identifier));
    });
  }
  for (std::thread& thread : threads) thread.join();
  EXPECT_EQ(all(BundleKind::User).size(), 6U);
}

}  // namespace
}  // namespace appsync::contract
