// The plug-in's shared object, as a host meets it: only through its entry points.
#include "platform/plugin.h"

#include <dlfcn.h>
#include <gtest/gtest.h>

#include <typeinfo>

#include "client/apps_client.h"
#include "tests/fakes/fake_platform.h"

namespace appsync {
namespace {

class PluginObject : public testing::Test {
 protected:
  PluginObject() : library_(dlopen(APPSYNC_PLUGIN, RTLD_NOW | RTLD_LOCAL)) {}
  ~PluginObject() override {
    if (library_) dlclose(library_);
  }
  void SetUp() override { ASSERT_NE(library_, nullptr) << dlerror(); }

  template <typename Function>
  Function* entryPoint(const char* symbol) const {
    return reinterpret_cast<Function*>(dlsym(library_, symbol));
  }
  auto* create() const { return entryPoint<decltype(appsync_plugin_create)>(PluginCreateSymbol); }
  auto* destroy() const {
    return entryPoint<decltype(appsync_plugin_destroy)>(PluginDestroySymbol);
  }

  fakes::FakePlatform phone;
  void* const library_;
};

TEST_F(PluginObject, TellsTheInterfaceVersionItWasBuiltAgainst) {
  auto* const version =
      entryPoint<decltype(appsync_plugin_interface_version)>(PluginInterfaceVersionSymbol);
  ASSERT_NE(version, nullptr);
  EXPECT_EQ(version(), PluginInterfaceVersion);
}

TEST_F(PluginObject, MakesAClientThatWorksAndDestroysIt) {
  ASSERT_NE(create(), nullptr);
  ASSERT_NE(destroy(), nullptr);
  const Platform platform = phone.platform();
  SyncClient* client = create()(&platform);
  ASSERT_NE(client, nullptr);
  EXPECT_EQ(client->supportedDataclasses(), std::vector<std::string>{"Application"});
  EXPECT_EQ(client->installedAssets().count("_Deleted"), 1u);
  EXPECT_EQ(phone.appRegistry.observerCount(), 1u);
  destroy()(client);
  EXPECT_EQ(phone.appRegistry.observerCount(), 0u);
}

TEST_F(PluginObject, KeepsNoReferenceToTheCallersListOfServices) {
  auto platform = std::make_unique<Platform>(phone.platform());
  SyncClient* client = create()(platform.get());
  platform.reset();
  EXPECT_EQ(client->currentSyncAnchor(), "NO_APP_SYNC_ANCHOR");
  EXPECT_EQ(client->disabledAssetTypes(), std::nullopt);
  destroy()(client);
}

TEST_F(PluginObject, MakesNoClientWithoutServices) { EXPECT_EQ(create()(nullptr), nullptr); }

TEST_F(PluginObject, PassesOverAClientThatIsNone) { destroy()(nullptr); }

TEST_F(PluginObject, HidesItsClasses) {
  for (const char* kind : {"_ZTI", "_ZTV"}) {
    const std::string symbol = std::string(kind) + typeid(AppsClient).name();
    EXPECT_EQ(dlsym(library_, symbol.c_str()), nullptr) << symbol;
  }
}

}  // namespace
}  // namespace appsync
