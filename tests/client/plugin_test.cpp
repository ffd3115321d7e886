// The plug-in's shared object, as a host meets it: only through its entry points.
#include "platform/plugin.h"

#include <dlfcn.h>
#include <gtest/gtest.h>

#include <new>
#include <typeinfo>

#include "tests/client/allocations.h"
#include "tests/client/client_test.h"

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

/// Services have memory of their own.
class OwnMemory {
 public:
  OwnMemory() { allocationsLeft = EndlessAllocations; }
  ~OwnMemory() { allocationsLeft = kept_; }

 private:
  const unsigned kept_ = allocationsLeft;
};

class HostWithMemory : public fakes::FakeSyncHost {
 public:
  using FakeSyncHost::FakeSyncHost;
  std::string mainBundleIdentifier() noexcept override {
    const OwnMemory own;
    return FakeSyncHost::mainBundleIdentifier();
  }
  std::string pluginBundleIdentifier() noexcept override {
    const OwnMemory own;
    return FakeSyncHost::pluginBundleIdentifier();
  }
};

class RegistryWithMemory : public fakes::FaultyAppRegistry {
 public:
  using FaultyAppRegistry::FaultyAppRegistry;
  void addObserver(AppRegistryObserver* observer) noexcept override {
    allocationsLeft = EndlessAllocations;  // from here on others borrow the client
    FaultyAppRegistry::addObserver(observer);
  }
};

TEST_F(PluginObject, MakesNoClientWhenMakingItFailsAtAnyPoint) {
  HostWithMemory host(phone.trace);
  RegistryWithMemory registry(phone.appRegistry, phone.faults);
  const Platform platform = with(with(phone.platform(), host), registry);
  auto* const make = create();
  SyncClient* client = nullptr;
  unsigned failures = 0;
  while (failures < 1000) {
    allocationsLeft = failures;
    client = make(&platform);
    allocationsLeft = EndlessAllocations;
    if (client) break;
    ++failures;
    ASSERT_EQ(phone.appRegistry.observerCount(), 0u);
    ASSERT_THAT(phone.trace.calls(), testing::IsEmpty());
  }
  EXPECT_GT(failures, 0u);
  ASSERT_NE(client, nullptr);
  destroy()(client);
}

TEST_F(PluginObject, PassesOverAClientThatIsNone) { destroy()(nullptr); }

TEST_F(PluginObject, HidesItsClasses) {
  for (const char* kind : {"_ZTI", "_ZTV"}) {
    const std::string symbol = std::string(kind) + typeid(AppsClient).name();
    EXPECT_EQ(dlsym(library_, symbol.c_str()), nullptr) << symbol;
  }
}

}  // namespace
}  // namespace appsync
