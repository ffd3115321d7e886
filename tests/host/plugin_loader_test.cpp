#include "host/phone/plugin_loader.h"

#include "platform/bundle.h"
#include "platform/plugin.h"
#include "tests/host/host_files.h"
#include "tests/test_pch.h"

namespace appsync::host {
namespace {

using namespace testing;
using ::testing::EndsWith;
using ::testing::HasSubstr;
using ::testing::StartsWith;

class PluginLoading : public ::testing::Test {
 protected:
  void describe(const PropertyList& info) { putFile(bundle / "Info.plist", xmlText(info)); }
  PropertyList::Dictionary goodInfo() {
    return {{std::string(KBBundleIdentifier), "com.corvane.twc.AppsClient"},
            {std::string(KBBundleExecutable), "AppsClient.so"},
            {std::string(PluginInterfaceVersionKey), std::int64_t{PluginInterfaceVersion}}};
  }

  /// Why the bundle cannot be used, without its name.
  std::string problem() {
    std::string text;
    EXPECT_EQ(Plugin::load(bundle, text), nullptr);
    const std::string beginning = "cannot use the plug-in " + bundle.string() + ": ";
    EXPECT_THAT(text, StartsWith(beginning));
    EXPECT_EQ(text.find('\n'), std::string::npos);
    return text.substr(std::min(beginning.size(), text.size()));
  }

  Folder folder;
  const std::filesystem::path bundle = folder / "A.syncplugin";
};

TEST_F(PluginLoading, NamesABundleThatIsMissing) {
  EXPECT_EQ(problem(), "there is no such folder; give the right one with --plugin");
}

TEST_F(PluginLoading, RefusesAFolderThatIsNoPlugIn) {
  std::filesystem::create_directories(bundle);
  EXPECT_EQ(problem(), "it has no readable Info.plist, so it is no plug-in");
  putFile(bundle / "Info.plist", "garbage");
  EXPECT_EQ(problem(), "it has no readable Info.plist, so it is no plug-in");
}

TEST_F(PluginLoading, RefusesTheDescriptionOfSomethingElse) {
  for (const auto& [key, value] : goodInfo()) {
    auto info = goodInfo();
    info.erase(key);
    describe(info);
    EXPECT_EQ(problem(), "its Info.plist does not describe a sync plug-in") << key;
  }
}

TEST_F(PluginLoading, RefusesAnotherVersionBeforeAnyCodeIsLoaded) {
  auto info = goodInfo();
  info[std::string(PluginInterfaceVersionKey)] = 99;
  describe(info);
  EXPECT_EQ(problem(),
            "it was built for interface version 99, this program needs 1; install the plug-in that "
            "came with appsync");
}

TEST_F(PluginLoading, RefusesAnExecutableOutsideTheBundle) {
  for (const char* name : {"../A.so", "/lib/A.so", "sub/A.so", ".."}) {
    auto info = goodInfo();
    info[std::string(KBBundleExecutable)] = name;
    describe(info);
    EXPECT_EQ(problem(), "its Info.plist names an executable outside the bundle") << name;
  }
}

TEST_F(PluginLoading, TellsTheLoadersReason) {
  describe(goodInfo());
  EXPECT_THAT(problem(), HasSubstr("its code cannot be loaded: "));
  putFile(bundle / "AppsClient.so", "no shared object");
  EXPECT_THAT(problem(), HasSubstr("its code cannot be loaded: "));
}

TEST_F(PluginLoading, RefusesASharedObjectWithoutEntryPoints) {
  describe(goodInfo());
  std::string library;
  for (const char* place : {"/lib/x86_64-linux-gnu", "/lib/aarch64-linux-gnu", "/lib64", "/lib"}) {
    const std::string candidate = std::string(place) + "/libm.so.6";
    if (std::filesystem::exists(candidate)) library = candidate;
  }
  ASSERT_FALSE(library.empty());
  std::filesystem::copy_file(library, bundle / "AppsClient.so");
  EXPECT_EQ(problem(), "its code has no plug-in entry points");
}

TEST_F(PluginLoading, SaysWhereItLookedForThePlugIn) {
  std::string text;
  EXPECT_EQ(findPlugin("given", text), "given");
  // The test program stands in a folder of its own, without a plug-in beside it.
  EXPECT_FALSE(findPlugin({}, text));
  EXPECT_THAT(text, StartsWith("there is no AppsClient.syncplugin in "));
  EXPECT_THAT(text, EndsWith("say where it is with --plugin or APPSYNC_PLUGIN"));
}

}  // namespace
}  // namespace appsync::host
