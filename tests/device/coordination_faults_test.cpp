// The database fails at one place after another while the coordination service works. Whatever the
// place, the device that is opened afterwards is whole.

#include <sqlite3.h>

#include <array>
#include <atomic>
#include <future>

#include "device/recovery.h"
#include "platform/bundle.h"
#include "tests/device/coordination_test.h"
#include "tests/device/device_parts.h"

namespace appsync::device {
namespace {

namespace fs = std::filesystem;
using Lines = std::vector<std::string>;
constexpr std::string_view Id = "com.example.a";
const std::string Icon = "/tmp/Icons/com.example.a.png";
const FileLocation Package = FileLocation::file("/var/mobile/Media/PublicStaging/a.pkg");

/// What fails of the database, and for how long.
struct Mode {
  const char* name;
  bool reads;  ///< reads outside of changes; else the commits of changes
  bool once;   ///< else all from that step on
};
constexpr Mode Modes[] = {{"ReadsOnce", true, true},
                          {"ReadsFromThenOn", true, false},
                          {"ChangesOnce", false, true},
                          {"ChangesFromThenOn", false, false}};

/// Lets one connection fail from a step on, counted from 1. Works under the lock of its owner.
class DatabaseFaults {
 public:
  DatabaseFaults(const Mode& mode, int step) : mode_(mode), left_(step) {}

  void strike(Database& database) {
    database.read("", [this](SQLite::Database& connection) {
      handle_ = connection.getHandle();
      sqlite3_set_authorizer(
          handle_,
          [](void* faults, int action, const char* name, const char*, const char*, const char*) {
            return static_cast<DatabaseFaults*>(faults)->allows(action, name) ? SQLITE_OK
                                                                              : SQLITE_DENY;
          },
          this);
    });
  }
  bool struck() const { return struck_; }

  /// While it lives, what its thread asks is no step.
  class Uncounted {
   public:
    Uncounted() { uncounted_ = true; }
    ~Uncounted() { uncounted_ = false; }
    Uncounted(const Uncounted&) = delete;
    Uncounted& operator=(const Uncounted&) = delete;
  };

 private:
  bool allows(int action, const char* name) {
    const bool isStep = mode_.reads
                            ? action == SQLITE_SELECT && sqlite3_get_autocommit(handle_) != 0
                            : action == SQLITE_TRANSACTION && std::string_view(name) == "COMMIT";
    if (!isStep) return true;
    if (struck_) return mode_.once;
    if (uncounted_ || --left_ > 0) return true;
    struck_ = true;
    return false;
  }

  static inline thread_local bool uncounted_ = false;
  const Mode mode_;
  int left_;
  sqlite3* handle_ = nullptr;
  std::atomic<bool> struck_ = false;
};

/// What a client does, as far as it gets: it gives up when it is refused.
void install(DeviceInstallCoordination& service, CoordinatorObserver& observer) {
  const auto coordinator = service.coordinatorFor(CoordinatorKind::Initiating, Id, SyncHostClientID,
                                                  true, nullptr, nullptr);
  if (!coordinator) return;
  coordinator->setObserver(&observer);
  const auto package =
      service.createPathTransferPromise("com.example.a-Asset", SyncHostClientID, std::nullopt, 0);
  const auto icon = service.createPathTransferPromise("com.example.a-Icon", SyncHostClientID,
                                                      FileLocation::file(Icon), 1);
  const auto placeholder =
      service.createAppPlaceholder("A", Id, InstallType::Sync, SyncHostClientID);
  if (icon) icon->setComplete(true);
  const InstallOptions options{StoreMetadata{{{"itemName", "A"}}}, InstallType::Sync, 1,
                               toBytes("sinf")};
  const bool ready = package && icon && placeholder &&
                     coordinator->setInstallOptions(options, nullptr) &&
                     coordinator->setInitialQPKAssetPromises({}, nullptr) &&
                     coordinator->setAppAssetPromise(package, nullptr) &&
                     placeholder->setIconPromise(icon, nullptr) &&
                     placeholder->setPlaceholderAttributes({}, nullptr) &&
                     placeholder->setConfigurationComplete(nullptr) &&
                     coordinator->setPlaceholderPromise(placeholder, nullptr);
  if (!ready) {
    coordinator->cancel(Error::posix(ECANCELED), SyncHostClientID);
    return;
  }
  package->setTransferPath(Package);
  package->setPercentComplete(1.0);
  package->setComplete(true);
}

std::shared_ptr<InstallCoordinator> find(DeviceInstallCoordination& service) {
  return service.coordinatorFor(CoordinatorKind::Any, Id, SyncHostClientID, false, nullptr,
                                nullptr);
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
void PrintTo(const Mode& mode, std::ostream* out) { *out << mode.name; }

const Lines OldOrNew{"com.example.a 1.0", "com.example.a 2.0"};
const Course Courses[] = {
    {"AFirstInstall", false, false, nullptr, install, {"", "com.example.a 2.0"}},
    {"AnUpdate", true, false, nullptr, install, OldOrNew},
    {"ACancelByItsClient", false, true, nullptr, cancelAsClient, {""}},
    {"ACancelByThePerson", true, true, nullptr, cancelAsPerson, {"com.example.a 1.0"}},
    {"AnUninstall", true, false, nullptr, uninstall, {"", "com.example.a 1.0"}},
    {"AnUninstallDuringAnUpdate", true, true, nullptr, uninstall, {"com.example.a 1.0"}},
    {"AnOpeningThatInstalls", true, true, PackageCame, nothing, OldOrNew},
    {"AnOpeningAfterABrokenInstall", true, true, InstallBroken, nothing, OldOrNew},
    {"AnOpeningAfterABrokenCancel", true, true, CancelBroken, nothing, {"com.example.a 1.0"}},
};

/// A coordinator, and a database that fails from now on.
class CoordinationRefusalsTest : public CoordinationTest {
 protected:
  void strike(const Mode& mode) {
    EXPECT_TRUE(installPackage(Id, "1.0"));
    device.reset();
    faults_.emplace(mode, 1);
    parts_.emplace(folder);
    service_.emplace(parts_->core(), parts_->registry());
    coordinator = service_->coordinatorFor(CoordinatorKind::Updating, Id, SyncHostClientID, true,
                                           nullptr, nullptr);
    faults_->strike(parts_->database());
  }
  DeviceInstallCoordination& failing() { return *service_; }

  std::shared_ptr<InstallCoordinator> coordinator;

 private:
  std::optional<DatabaseFaults> faults_;
  std::optional<DeviceParts> parts_;
  std::optional<DeviceInstallCoordination> service_;
};

TEST_F(CoordinationRefusalsTest, WhatCannotBeWrittenIsRefused) {
  strike(Modes[3]);
  EXPECT_EQ(failing().createPathTransferPromise("a", SyncHostClientID, std::nullopt, 0), nullptr);
  EXPECT_EQ(failing().createOutOfBandTransferPromise("a", SyncHostClientID, 0), nullptr);
  EXPECT_EQ(failing().createAppPlaceholder("A", Id, InstallType::Sync, SyncHostClientID), nullptr);
  EXPECT_EQ(failing().coordinatorFor(CoordinatorKind::Initiating, "com.example.b", SyncHostClientID,
                                     true, nullptr, &error),
            nullptr);
  EXPECT_TRUE(error);
  error.reset();
  EXPECT_FALSE(coordinator->setInstallOptions({}, &error));
  EXPECT_TRUE(error);
  EXPECT_FALSE(coordinator->hasInstallOptions());
  EXPECT_FALSE(coordinator->cancel(reason, SyncHostClientID));
  EXPECT_FALSE(coordinator->error());
  EXPECT_FALSE(failing().tap(Id));
  EXPECT_FALSE(failing().cancelInstall(Id));
}

TEST_F(CoordinationRefusalsTest, WhatCannotBeReadIsAnErrorAndNotTakenForWell) {
  strike(Modes[1]);
  EXPECT_TRUE(coordinator->error());
  EXPECT_EQ(coordinator->appAssetPromise(&error), nullptr);
  EXPECT_TRUE(error);
  error.reset();
  EXPECT_EQ(
      failing().coordinatorFor(CoordinatorKind::Any, Id, SyncHostClientID, false, nullptr, &error),
      nullptr);
  EXPECT_TRUE(error);
}

TEST_F(CoordinationRefusalsTest, AnUninstallThatCannotBeWrittenSaysSoAndRemovesNothing) {
  strike(Modes[3]);
  std::promise<std::optional<Error>> told;
  failing().uninstallApp(Id, false, [&](const auto& outcome) { told.set_value(outcome); });
  EXPECT_TRUE(told.get_future().get());
  EXPECT_EQ(find(failing()), coordinator);
}

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
    EXPECT_TRUE(logMentions("the device's database: not authorized")) << "the log says what failed";
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
