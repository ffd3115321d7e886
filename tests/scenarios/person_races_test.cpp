// A person taps and cancels while a sync runs against a real device: whatever meets whatever, each
// application ends up installed or not there, and the desktop is told which.

#include <unistd.h>

#include <atomic>
#include <thread>

#include "client/apps_client.h"
#include "device/embedded_device.h"
#include "host/phone/installed_applications.h"
#include "host/phone/sync_host.h"
#include "host/sync/session.h"
#include "tests/host/host_files.h"
#include "tests/test_pch.h"

namespace appsync::host {
namespace {

constexpr int Applications = 8;
constexpr int Rounds = 3;

std::string idOf(int number) { return "org.example.app" + std::to_string(number); }

class Quiet : public Reporter {
 public:
  void report(const Event&) override {}
};

class PersonRacesTest : public ::testing::Test {
 protected:
  PersonRacesTest() {
    device::DeviceError error;
    EXPECT_TRUE(device::EmbeddedDevice::initialize(phone_, {true}, error));
    device_ = device::EmbeddedDevice::open(phone_, device::Access::Write, error);
    if (!device_) throw std::runtime_error(error.message);
  }

  /// A sync of all applications in this version. A person meanwhile taps all, and cancels those
  /// with odd numbers; the identifiers that were cancelled in time.
  std::set<std::string> sync(const std::string& version, Summary& summary) {
    const SyncInput input = inputOf(version);
    Interruption interruption;
    HostProcess host(SyncHostBundleIdentifier, "com.corvane.twc.AppsClient", interruption);
    AppsClient client(device_->platform(host));
    announceStartUp(device_->systemNotifier());
    Quiet reporter;
    Session session(client, host, device_->phone(), reporter, interruption);
    std::atomic<bool> over = false;
    std::set<std::string> cancelled;
    std::thread person([&] {
      while (!over) {
        for (int number = 0; number < Applications; ++number) {
          device::DeviceError problem;
          device::EmbeddedDevice::tap(phone_, idOf(number), problem, nullptr);
          if (number % 2 == 1 &&
              device::EmbeddedDevice::cancel(phone_, idOf(number), problem, nullptr)) {
            cancelled.insert(idOf(number));
          }
        }
      }
    });
    const SyncResult result = session.run(input);
    over = true;
    person.join();
    EXPECT_TRUE(result.completed);
    summary = result.summary;
    return cancelled;
  }

  /// "identifier version", and whether it is only a placeholder.
  std::vector<std::string> applications() {
    std::vector<std::string> lines;
    for (const AppRecord& record : device_->applications()) {
      lines.push_back(record.applicationIdentifier + " " + record.bundleVersion.value_or("none") +
                      (record.isPlaceholder ? " (placeholder)" : ""));
    }
    return lines;
  }

  bool isLive(const std::string& id) {
    return device_->installCoordination().coordinatorFor(CoordinatorKind::Any, id, SyncHostClientID,
                                                         false, nullptr, nullptr) != nullptr;
  }

 private:
  SyncInput inputOf(const std::string& version) {
    SyncInput input;
    input.newAnchor = "NEW";
    PlanOptions options;
    for (int number = 0; number < Applications; ++number) {
      const auto file = folder_ / (idOf(number) + "-" + version + ".zip");
      testing::packSample(file, idOf(number), version, 4000);
      options.install.push_back(idOf(number));
      input.library.packages.emplace(idOf(number),
                                     PackageFacts{file, idOf(number), version, "Sample"});
    }
    std::string problem;
    input.plan = makePlan(input.library, installedApplications(device_->phone(), problem).value(),
                          options, problem)
                     .value();
    return input;
  }

  const testing::Folder folder_;
  const std::filesystem::path phone_ = folder_ / "phone";
  std::unique_ptr<device::EmbeddedDevice> device_;
};

TEST_F(PersonRacesTest, ATapOrCancelAtAnyMomentOfASyncHarmsNothing) {
  std::map<std::string, std::string> versions;
  for (int round = 1; round <= Rounds; ++round) {
    const std::string version = std::to_string(round) + ".0";
    SCOPED_TRACE(version);
    Summary summary;
    const std::set<std::string> cancelled = sync(version, summary);
    std::set<std::string> told;
    for (const auto& failure : summary.failed) told.insert(failure.identifier);
    EXPECT_EQ(told, cancelled) << "who was cancelled in time is told as failed, once";
    EXPECT_EQ(summary.failed.size(), cancelled.size());
    EXPECT_EQ(summary.installed.size() + summary.updated.size(), Applications - cancelled.size());
    std::vector<std::string> expected;
    for (int number = 0; number < Applications; ++number) {
      if (!cancelled.contains(idOf(number))) versions[idOf(number)] = version;
      EXPECT_FALSE(isLive(idOf(number)));
    }
    for (const auto& [id, installed] : versions) expected.push_back(id + " " + installed);
    EXPECT_EQ(applications(), expected);
  }
}

}  // namespace
}  // namespace appsync::host
