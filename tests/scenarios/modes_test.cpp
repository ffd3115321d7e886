// The same syncs on two phones: one installs through coordinators, the other does not. Whatever the
// mix, both must end with the same applications and tell the desktop the same.

#include <algorithm>
#include <array>
#include <random>

#include "client/apps_client.h"
#include "device/embedded_device.h"
#include "host/phone/installed_applications.h"
#include "host/phone/sync_host.h"
#include "host/sync/session.h"
#include "tests/host/host_files.h"
#include "tests/test_pch.h"

namespace appsync::host {
namespace {

using fakes::memoryFolder;
using testing::Folder;

enum class Wish {
  Install,
  InstallTruncated,  ///< the package breaks off in its body
  InstallStranger,   ///< the file holds another application than the library says
  InstallCancelled,  ///< the person cancels it while its package is being sent
  Remove
};

struct Task {
  std::string identifier;
  Wish wish = Wish::Install;
  std::string version = "1.0";
};

/// What the desktop asks for in one sync, and what the phone's restrictions forbid by then.
struct Round {
  std::vector<Task> tasks;
  bool installingAllowed = true;
  bool removingAllowed = true;
};

/// Packages, each made when it is first asked for.
class Shelf {
 public:
  PackageFacts package(const Task& task) const {
    const std::string kind = std::to_string(static_cast<int>(task.wish));
    const auto file = folder_ / (task.identifier + "-" + task.version + "-" + kind + ".zip");
    if (!std::filesystem::exists(file)) make(file, task);
    return {file, task.identifier, task.version, "Sample"};
  }

 private:
  static void make(const std::filesystem::path& file, const Task& task) {
    const bool strange = task.wish == Wish::InstallStranger;
    const std::size_t size =
        task.wish == Wish::InstallCancelled ? 2 * PackageTransfer::ChunkSize : 4000;
    testing::packSample(file, strange ? "org.example.stranger" : task.identifier, task.version,
                        size);
    if (task.wish == Wish::InstallTruncated) std::filesystem::resize_file(file, 2000);
  }

  const Folder folder_{fakes::memoryFolder()};
};

/// Calls with the identifier of each package that has been sent in part.
class PartReporter : public Reporter {
 public:
  explicit PartReporter(std::function<void(const std::string&)> onPart)
      : onPart_(std::move(onPart)) {}

  void report(const Event& event) override {
    const auto* progress = std::get_if<TransferProgress>(&event);
    if (progress && progress->sent < progress->total) onPart_(progress->identifier);
  }

 private:
  const std::function<void(const std::string&)> onPart_;
};

/// Each list on its line, sorted; failures and skipped entries with their reasons.
std::string text(const Summary& summary) {
  std::string result;
  const auto add = [&](std::string_view title, std::vector<std::string> entries) {
    std::sort(entries.begin(), entries.end());
    result += title;
    for (const std::string& entry : entries) result += " " + entry;
    result += "\n";
  };
  const auto withReasons = [](const auto& list) {
    std::vector<std::string> entries;
    for (const auto& entry : list) entries.push_back(entry.identifier + " (" + entry.reason + ")");
    return entries;
  };
  add("installed", summary.installed);
  add("updated", summary.updated);
  add("deleted", summary.deleted);
  add("failed", withReasons(summary.failed));
  add("skipped", withReasons(summary.skipped));
  return result;
}

/// A new device that lives through syncs, each with a new host process and client.
class ModePhone {
 public:
  explicit ModePhone(bool coordination) {
    device::DeviceError error;
    EXPECT_TRUE(device::EmbeddedDevice::initialize(folder_ / "phone", {coordination}, error));
    open();
  }

  /// The summary as text.
  std::string sync(const Round& round, const Shelf& shelf) {
    const SyncInput input = prepare(round, shelf);
    restrict(PolicySetting::AppInstallationAllowed, round.installingAllowed);
    restrict(PolicySetting::AppRemovalAllowed, round.removingAllowed);
    cancelled_.clear();
    for (const Task& task : round.tasks) {
      if (task.wish == Wish::InstallCancelled) cancelled_.insert(task.identifier);
    }
    return run(input);
  }

  /// "identifier version" of each, sorted, and whether it is only a placeholder.
  std::vector<std::string> applications() {
    std::vector<std::string> lines;
    for (const AppRecord& record : device_->applications()) {
      lines.push_back(record.applicationIdentifier + " " + record.bundleVersion.value_or("none") +
                      (record.isPlaceholder ? " (placeholder)" : ""));
    }
    return lines;
  }

 private:
  void open() {
    device_.reset();
    device::DeviceError error;
    device_ = device::EmbeddedDevice::open(folder_ / "phone", device::Access::Write, error);
    if (!device_) throw std::runtime_error(error.message);
  }

  std::string run(const SyncInput& input) {
    Interruption interruption;
    HostProcess host(SyncHostBundleIdentifier, "com.corvane.twc.AppsClient", interruption);
    AppsClient client(device_->platform(host));
    announceStartUp(device_->systemNotifier());
    PartReporter reporter([&](const std::string& identifier) {
      if (cancelled_.erase(identifier) > 0) cancel(identifier, host);
    });
    Session session(client, host, device_->phone(), reporter, interruption);
    const SyncResult result = session.run(input);
    EXPECT_TRUE(result.completed);
    return text(result.summary);
  }

  /// Returns when the client knows. Without coordinators only the host can give an install up.
  void cancel(const std::string& identifier, HostProcess& host) {
    if (!device_->options().coordination) {
      host.service().cancelAssetAsFailed(
          host.makeDownload(identifier, "Application", std::nullopt));
      return;
    }
    device::DeviceError problem;
    EXPECT_TRUE(device::EmbeddedDevice::cancel(folder_ / "phone", identifier, problem, nullptr));
    while (!device_->busyAmong({identifier}).empty()) std::this_thread::yield();
  }

  /// The restrictions change after the plan is made, so that the phone must keep to them itself.
  SyncInput prepare(const Round& round, const Shelf& shelf) {
    SyncInput input;
    input.newAnchor = "NEW";
    PlanOptions options;
    for (const Task& task : round.tasks) {
      if (task.wish == Wish::Remove) {
        options.remove.push_back(task.identifier);
      } else {
        options.install.push_back(task.identifier);
      }
      // Also of what is to be removed: an application that nobody knows is refused.
      input.library.packages.emplace(task.identifier, shelf.package(task));
    }
    std::string problem;
    input.plan = makePlan(input.library, installedApplications(device_->phone(), problem).value(),
                          options, problem)
                     .value();
    return input;
  }

  void restrict(PolicySetting setting, bool allowed) {
    const PolicyValue value = allowed ? PolicyValue::NotSet : PolicyValue::ExplicitlyNo;
    EXPECT_TRUE(device_->setPolicy(setting, value, nullptr));
  }

  const Folder folder_{fakes::memoryFolder()};
  std::unique_ptr<device::EmbeddedDevice> device_;
  std::set<std::string> cancelled_;  ///< that are still to be cancelled in this sync
};

class ModesTest : public ::testing::Test {
 protected:
  /// Both phones go through the round, and must come out alike and as the tasks promise.
  void sync(const Round& round) {
    const std::string summary = plain_.sync(round, shelf_);
    EXPECT_EQ(coordinated_.sync(round, shelf_), summary);
    expect(round);
    EXPECT_THAT(plain_.applications(), ::testing::ElementsAreArray(expectedLines()));
    EXPECT_THAT(coordinated_.applications(), ::testing::ElementsAreArray(expectedLines()));
    summary_ = summary;
  }

  const std::string& summary() const { return summary_; }

 private:
  void expect(const Round& round) {
    for (const Task& task : round.tasks) {
      if (task.wish == Wish::Remove && round.removingAllowed) expected_.erase(task.identifier);
      // A package that is refused leaves what was there.
      if (task.wish == Wish::Install && round.installingAllowed) {
        expected_[task.identifier] = task.version;
      }
    }
  }

  std::vector<std::string> expectedLines() const {
    std::vector<std::string> lines;
    for (const auto& [identifier, version] : expected_) lines.push_back(identifier + " " + version);
    return lines;
  }

  const Shelf shelf_;
  ModePhone plain_{false};
  ModePhone coordinated_{true};
  std::map<std::string, std::string> expected_;  ///< version by identifier
  std::string summary_;
};

constexpr char A[] = "org.example.a";
constexpr char B[] = "org.example.b";
constexpr char C[] = "org.example.c";

TEST_F(ModesTest, InstallUpdateReinstallDowngradeAndRemoveEndAlike) {
  sync({{{A}, {B}, {C, Wish::Install, "2.0"}}});
  sync({{{A, Wish::Install, "2.0"}, {B}, {C, Wish::Install, "1.0"}}});
  sync({{{A, Wish::Remove}, {B, Wish::Install, "2.0"}}});
  EXPECT_EQ(summary(),
            "installed\nupdated org.example.b\ndeleted org.example.a\nfailed\nskipped\n");
}

TEST_F(ModesTest, DamagedPackageFailsAloneAndAnUpdateKeepsTheOldVersion) {
  sync({{{A}, {B, Wish::InstallTruncated}}});
  sync({{{A, Wish::InstallTruncated, "2.0"}, {B}}});
  sync({{{A, Wish::Install, "2.0"}}});
}

TEST_F(ModesTest, PackageOfAnotherApplicationIsRefused) {
  sync({{{A}, {B, Wish::InstallStranger}}});
  sync({{{A, Wish::InstallStranger, "2.0"}, {B}}});
}

TEST_F(ModesTest, ACancelledInstallIsNotThereAndACancelledUpdateKeepsTheOldVersion) {
  sync({{{A}, {B, Wish::InstallCancelled}}});
  EXPECT_EQ(summary(),
            "installed org.example.a\nupdated\ndeleted\n"
            "failed org.example.b (cancelled on the phone)\nskipped\n");
  sync({{{A, Wish::InstallCancelled, "2.0"}, {B}}});
  sync({{{A, Wish::Install, "2.0"}, {B, Wish::InstallCancelled}}});
}

TEST_F(ModesTest, RestrictionsKeepThePhoneAsItIs) {
  sync({{{A}, {B}}});
  sync({{{A, Wish::Install, "2.0"}, {B, Wish::Remove}, {C}}, false, true});
  sync({{{A, Wish::Remove}, {B}}, true, false});
  sync({{{A, Wish::Remove}, {C}}, false, false});
  sync({{{A, Wish::Remove}, {C}}});
}

/// A todo list that touches each of seven applications with some probability, in any way.
Round randomRound(std::mt19937& random) {
  const auto oneIn = [&](unsigned n) { return random() % n == 0; };
  constexpr std::array Wishes = {
      Wish::Install, Wish::Install,          Wish::Install,         Wish::Remove,
      Wish::Remove,  Wish::InstallTruncated, Wish::InstallStranger, Wish::InstallCancelled};
  Round round;
  for (char letter = 'a'; letter < 'h'; ++letter) {
    if (oneIn(4)) continue;
    round.tasks.push_back({std::string("org.example.") + letter, Wishes[random() % Wishes.size()],
                           oneIn(2) ? "2.0" : "1.0"});
  }
  round.installingAllowed = !oneIn(8);
  round.removingAllowed = !oneIn(8);
  return round;
}

class RandomModesTest : public ModesTest, public ::testing::WithParamInterface<unsigned> {};

TEST_P(RandomModesTest, AnyThreeSyncsEndAlike) {
  SCOPED_TRACE("seed " + std::to_string(GetParam()));
  std::mt19937 random(GetParam());
  for (int number = 1; number <= 3 && !HasFailure(); ++number) {
    SCOPED_TRACE("sync " + std::to_string(number));
    sync(randomRound(random));
  }
}

INSTANTIATE_TEST_SUITE_P(Seeds, RandomModesTest, ::testing::Range(1U, 31U));

}  // namespace
}  // namespace appsync::host
