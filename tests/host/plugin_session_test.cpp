// The real plug-in, loaded and made ready for a phone.
#include "host/cli/plugin_session.h"

#include <cerrno>
#include <thread>

#include "tests/host/host_files.h"
#include "tests/test_pch.h"

namespace appsync::host {
namespace {

using testing::Folder;

class PluginSessionTest : public ::testing::Test {
 protected:
  PluginSessionTest() {
    device::DeviceError problem;
    device::EmbeddedDevice::initialize(folder / "phone", {.coordination = true}, problem);
    device = device::EmbeddedDevice::open(folder / "phone", device::Access::Write, problem);
    std::string reason;
    plugin = Plugin::load(std::filesystem::path(APPSYNC_PLUGIN).parent_path(), reason);
    EXPECT_TRUE(device && plugin) << problem.message << reason;
  }

  /// What a sync that was killed leaves: an event that nobody has got yet.
  void leaveAnEvent(std::string_view identifier) {
    InstallCoordination& service = device->installCoordination();
    const auto coordinator = service.coordinatorFor(CoordinatorKind::Initiating, identifier,
                                                    SyncHostClientID, true, nullptr, nullptr);
    ASSERT_TRUE(coordinator);
    ASSERT_TRUE(coordinator->cancel(Error::posix(ECANCELED), KQClientKiosk));
    ASSERT_TRUE(device->busyAmong({std::string(identifier)}).empty());
  }

  bool logMentions(std::string_view text) {
    bool found = false;
    device->readLog(
        [&](const device::LogLine& line) { found |= line.text.find(text) != std::string::npos; });
    return found;
  }

  Folder folder;
  Interruption interruption;
  std::unique_ptr<device::EmbeddedDevice> device;
  std::unique_ptr<Plugin> plugin;
};

TEST_F(PluginSessionTest, TheClientGetsWhatAKilledSyncLeftAndCanBeWaitedFor) {
  leaveAnEvent("com.a");
  PluginSession session(*plugin, SyncHostBundleIdentifier, *device, interruption, nullptr);
  while (!device->busyAmong({"com.a"}).empty()) std::this_thread::yield();
  EXPECT_TRUE(logMentions("com.a"));
}

TEST_F(PluginSessionTest, AToolThatOnlyAsksGetsNoEvents) {
  leaveAnEvent("com.a");
  PluginSession session(*plugin, QueryToolBundleIdentifier, *device, interruption, nullptr);
  EXPECT_TRUE(device->busyAmong({"com.a"}).empty());
  EXPECT_FALSE(logMentions("com.a"));
}

}  // namespace
}  // namespace appsync::host
