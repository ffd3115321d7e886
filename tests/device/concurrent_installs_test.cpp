#include <atomic>
#include <barrier>
#include <thread>

#include "tests/device/device_test.h"

namespace appsync::device {
namespace {

constexpr int Count = 10;

std::string identifier(int number) { return "com.example.app" + std::to_string(number); }

class ConcurrentInstallsTest : public DeviceTest {
 protected:
  bool install(const FileLocation& package, const std::string& id) {
    return device->appRegistry().installApplication(
        package,
        {{std::string(SWPackageTypeKey), SWPackageTypeCustomer},
         {std::string(KBBundleIdentifier), id}},
        nullptr);
  }

  /// Runs all at once.
  static void together(int count, const std::function<void(int)>& work) {
    std::barrier start(count);
    std::vector<std::thread> threads;
    for (int i = 0; i < count; ++i) {
      threads.emplace_back([&, i] {
        start.arrive_and_wait();
        work(i);
      });
    }
    for (std::thread& thread : threads) thread.join();
  }
};

/// Counts how many installs have finished while others had not begun to return.
class CountingWatcher final : public PhoneWatcher {
 public:
  void installFinished(std::string_view, const std::optional<Error>& error) noexcept override {
    error ? ++refused : ++installed;
  }
  std::atomic<int> installed = 0;
  std::atomic<int> refused = 0;
};

TEST_F(ConcurrentInstallsTest, TenApplicationsInstallAtOnce) {
  CountingWatcher watcher;
  device->setWatcher(&watcher);
  std::vector<FileLocation> packages;
  for (int i = 0; i < Count; ++i) {
    packages.push_back(stage(PackageArchive()
                                 .addApplication(identifier(i), "2.0")
                                 .add("Sample.app/data", std::string(200'000, 'x'))));
    ASSERT_TRUE(installPlaceholder(identifier(i), "2.0"));
  }
  std::atomic<int> installed = 0;
  together(Count, [&](int i) {
    const auto progress = device->appRegistry().installProgressSync(*record(identifier(i), true));
    progress->setTotalUnitCount(1000);
    for (int units = 0; units <= 1000; units += 50) progress->setCompletedUnitCount(units);
    installed += install(packages[static_cast<std::size_t>(i)], identifier(i)) ? 1 : 0;
  });
  EXPECT_EQ(installed, Count);
  EXPECT_EQ(watcher.installed, Count);
  EXPECT_EQ(watcher.refused, 0);
  device->setWatcher(nullptr);
  EXPECT_EQ(registry().size(), static_cast<std::size_t>(Count));
  EXPECT_EQ(containerCount(), static_cast<std::size_t>(Count));
  for (int i = 0; i < Count; ++i) EXPECT_EQ(version(identifier(i)), "2.0");
}

TEST_F(ConcurrentInstallsTest, ChangesOfOneApplicationWaitForOneAnother) {
  const FileLocation one = stage(PackageArchive().addApplication("com.example.a", "1.0"));
  const FileLocation two = stage(PackageArchive().addApplication("com.example.a", "2.0"));
  together(6, [&](int i) {
    for (int round = 0; round < 5; ++round) {
      if (i % 3 == 0) install(one, "com.example.a");
      if (i % 3 == 1) install(two, "com.example.a");
      if (i % 3 == 2) device->uninstall("com.example.a", nullptr);
    }
  });
  EXPECT_EQ(containerCount(), registry().size());
  EXPECT_EQ(device->files().directoryExists("/var/mobile/Containers/Data/com.example.a"),
            !registry().empty());
}

TEST_F(ConcurrentInstallsTest, AWatcherIsNotCalledAfterItWasReplaced) {
  const FileLocation package = stage(PackageArchive().addApplication("com.example.a", "1.0"));
  std::atomic<bool> over = false;
  std::thread installer([&] {
    while (!over) install(package, "com.example.a");
  });
  for (int i = 0; i < 10; ++i) {
    CountingWatcher watcher;
    device->setWatcher(&watcher);
    install(package, "com.example.a");
    device->setWatcher(nullptr);
  }
  over = true;
  installer.join();
}

}  // namespace
}  // namespace appsync::device
