// The database fails at one place after another while the coordination service works. Whatever the
// place, the device that is opened afterwards is whole.

#include "tests/device/coordination_faults.h"

#include <gmock/gmock.h>

#include <future>

#include "device/recovery.h"
#include "platform/bundle.h"

namespace appsync::device {
namespace {

namespace fs = std::filesystem;
using Lines = std::vector<std::string>;
void installAll(DeviceInstallCoordination& service, CoordinatorObserver& observer) {
  install(service, observer);
}

void uninstall(DeviceInstallCoordination& service, CoordinatorObserver&) {
  std::promise<void> told;
  service.uninstallApp(Id, false, [&](const std::optional<Error>&) { told.set_value(); });
  told.get_future().wait();  // a second call throws, which ends the test
}

/// What is done while the database fails, and how the registry may be found afterwards, when a
/// coordinator that is still live has been cancelled.
struct Course {
  const char* name;
  bool installed;         ///< version 1.0 is there at first
  bool prepared;          ///< and an install of version 2.0 that waits for its package
  const char* asCrashed;  ///< turns that into what a crash leaves; the faults begin when opening
  void (*run)(DeviceInstallCoordination& service, CoordinatorObserver& observer);
  Lines outcomes;
};

constexpr const char* PackageCame =
    "UPDATE data_promises SET path = '/var/mobile/Media/PublicStaging/a.pkg', complete = 1 "
    "WHERE name LIKE '%-Asset'";
constexpr const char* InstallBroken =
    "UPDATE data_promises SET path = '/var/mobile/Media/PublicStaging/a.pkg', complete = 1 "
    "WHERE name LIKE '%-Asset'; UPDATE install_coordinators SET stage = 1";
constexpr const char* CancelBroken =
    "UPDATE data_promises SET path = '/var/mobile/Media/PublicStaging/a.pkg', complete = 1, "
    "over = 1; UPDATE install_placeholders SET over = 1; "
    "UPDATE install_coordinators SET stage = 3, error = x'00'";

void cancelAsClient(DeviceInstallCoordination& service, CoordinatorObserver&) {
  if (const auto live = find(service)) live->cancel(Error::posix(EIO), SyncHostClientID);
}
void cancelAsPerson(DeviceInstallCoordination& service, CoordinatorObserver&) {
  service.tap(Id);
  service.cancelInstall(Id);
}
void nothing(DeviceInstallCoordination&, CoordinatorObserver&) {}

void PrintTo(const Course& course, std::ostream* out) { *out << course.name; }

const Lines OldOrNew{"com.example.a 1.0", "com.example.a 2.0"};
const Course Courses[] = {
    {"AFirstInstall", false, false, nullptr, installAll, {"", "com.example.a 2.0"}},
    {"AnUpdate", true, false, nullptr, installAll, OldOrNew},
    {"ACancelByItsClient", false, true, nullptr, cancelAsClient, {""}},
    {"ACancelByThePerson", true, true, nullptr, cancelAsPerson, {"com.example.a 1.0"}},
    {"AnUninstall", true, false, nullptr, uninstall, {"", "com.example.a 1.0"}},
    {"AnUninstallDuringAnUpdate", true, true, nullptr, uninstall, {"com.example.a 1.0"}},
    {"AnOpeningThatInstalls", true, true, PackageCame, nothing, OldOrNew},
    {"AnOpeningAfterABrokenInstall", true, true, InstallBroken, nothing, OldOrNew},
    {"AnOpeningAfterABrokenCancel", true, true, CancelBroken, nothing, {"com.example.a 1.0"}},
};

class CoordinationFaultsTest : public CoordinationTest,
                               public ::testing::WithParamInterface<std::tuple<Course, Mode>> {
 protected:
  CoordinationFaultsTest() {
    device.reset();
    fs::remove_all(folder);
    folder = memory_.path() / "device";
    DeviceError problem;
    EXPECT_TRUE(EmbeddedDevice::initialize(folder, {true}, problem));
    reopen();
  }

  const Course& course() const { return std::get<0>(GetParam()); }

  void begin() {
    if (course().installed) {
      ASSERT_TRUE(installPackage(Id, "1.0"));
    }
    if (course().prepared) {
      prepare(Id);
      ASSERT_TRUE(recorder.waitFor("placeholder"));
      waitUntilIdle(Id);
    }
    fakes::putFile(onDisk(Package.path),
                   asText(PackageArchive().addApplication(Id, "2.0").bytes()));
    putFile(Icon, "picture");
    device.reset();
    if (course().asCrashed) edit(course().asCrashed);
    fs::remove_all(folder / "log");
    fs::rename(folder, origin_);
  }

  /// Whether the database failed. Events come to `observer`.
  bool runWithFault(int step, EventRecorder& observer) {
    fs::remove_all(folder);
    fs::copy(origin_, folder, fs::copy_options::recursive);
    DatabaseFaults faults(std::get<1>(GetParam()), step);
    DeviceParts parts(folder);
    finishInterruptedWork(parts.core());
    if (course().asCrashed) faults.strike(parts.database());
    DeviceInstallCoordination service(parts.core(), parts.registry());
    const auto listener =
        service.createEventListener("com.corvane.test", {SyncHostClientID}, observer);
    if (!course().asCrashed) faults.strike(parts.database());
    course().run(service, observer);
    EXPECT_TRUE(comesToRest(service)) << "the service does not come to rest";
    return faults.struck();
  }

  static bool comesToRest(DeviceInstallCoordination& service) {
    const DatabaseFaults::Uncounted uncounted;
    const auto limit = std::chrono::steady_clock::now() + std::chrono::seconds(30);
    while (service.isBusy(Id)) {
      if (std::chrono::steady_clock::now() > limit) return false;
      std::this_thread::yield();
    }
    return true;
  }

  /// What was told in both lives of the device.
  void expectWhole(EventRecorder& before) {
    reopen();
    EXPECT_TRUE(logMentions("the phone's database: not authorized")) << "the log says what failed";
    EventRecorder after;
    const auto listener =
        service().createEventListener("com.corvane.test", {SyncHostClientID}, after);
    ASSERT_TRUE(comesToRest(service()));
    const auto left = live(Id);
    if (left) {
      EXPECT_TRUE(left->cancel(reason, SyncHostClientID)) << "it has a way to end";
      waitUntilIdle(Id);
      EXPECT_EQ(live(Id), nullptr);
    }
    const Lines found = registry();
    EXPECT_THAT(course().outcomes, ::testing::Contains(found.empty() ? "" : found.front()));
    EXPECT_LE(found.size(), 1U) << "no placeholder is left";
    EXPECT_EQ(containerCount(), found.size());
    if (const auto installed = record(Id)) expectWholeApplication(*installed);
    if (version(Id) == "2.0") {
      EXPECT_GE(before.count("complete") + after.count("complete"), 1U) << "somebody was told";
    }
    if (version(Id) == "2.0" || course().asCrashed) {
      EXPECT_FALSE(device->files().fileExists(Package.path)) << "the service takes it away";
    }
  }

  void expectWholeApplication(const AppRecord& application) {
    const auto bundle =
        Bundle::open(device->files(), FileLocation::directory(*application.bundlePath));
    ASSERT_TRUE(bundle);
    EXPECT_EQ(*appsync::find(bundle->infoDictionary(), KBBundleVersion),
              PropertyList(*application.bundleVersion));
    EXPECT_FALSE(application.isPlaceholder);
  }

 private:
  const fakes::TemporaryFolder memory_{fakes::memoryFolder()};
  const fs::path origin_ = memory_.path() / "origin";
};

TEST_P(CoordinationFaultsTest, LeaveAWholeDevice) {
  begin();
  int step = 1;
  for (bool struck = true; struck && !HasFailure(); ++step) {
    SCOPED_TRACE("step " + std::to_string(step));
    EventRecorder observer;
    struck = runWithFault(step, observer);
    if (struck && !HasFatalFailure()) expectWhole(observer);
    device.reset();
  }
  EXPECT_GT(step, 2) << "nothing was tried";
}

INSTANTIATE_TEST_SUITE_P(WhileTheDatabaseFails, CoordinationFaultsTest,
                         ::testing::Combine(::testing::ValuesIn(Courses),
                                            ::testing::ValuesIn(Modes)),
                         [](const auto& given) {
                           return std::string(std::get<0>(given.param).name) +
                                  std::get<1>(given.param).name;
                         });

}  // namespace
}  // namespace appsync::device
