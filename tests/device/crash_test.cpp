#include <sqlite3.h>
#include <sys/wait.h>
#include <unistd.h>

#include <set>

#include "platform/bundle.h"
#include "platform/sync_files.h"
#include "tests/device/device_parts.h"
#include "tests/device/device_test.h"
#include "tests/fakes/stepping_file_manager.h"

namespace appsync::device {
namespace {

namespace fs = std::filesystem;
using Lines = std::vector<std::string>;
using Snapshot = std::map<std::string, std::string>;

/// Ends the process, as a kill would, when it comes to the given step.
class Fuse {
 public:
  explicit Fuse(int steps) : left_(steps) {}
  void burn() {
    if (left_-- == 0) _exit(Died);
  }
  static constexpr int Died = 77;

 private:
  int left_;
};

/// The registry of a device whose process dies at a step: a change of a file, or a commit (before
/// it is made).
class FusedDevice {
 public:
  FusedDevice(const fs::path& folder, int steps)
      : fuse_(steps), parts_(folder, [this](auto& files) {
          return std::make_unique<fakes::SteppingFileManager>(files, [this] { fuse_.burn(); });
        }) {
    parts_.database().read("", [&](SQLite::Database& connection) {
      sqlite3_commit_hook(
          connection.getHandle(),
          [](void* fuse) {
            static_cast<Fuse*>(fuse)->burn();
            return 0;
          },
          &fuse_);
    });
  }
  DeviceAppRegistry& registry() { return parts_.registry(); }

 private:
  Fuse fuse_;
  DeviceParts parts_;
};

class CrashTest : public DeviceTest {
 protected:
  using Change = std::function<bool(DeviceAppRegistry&)>;

  /// What a person would find: the registry and all files that belong to it.
  Snapshot picture() {
    Snapshot found;
    for (const AppRecord& each : device->applications()) {
      const std::string name = description(each) + " ";
      for (const auto& [file, contents] : fakes::snapshot(onDisk(*each.bundleContainerPath))) {
        found[name + file] = contents;
      }
    }
    for (const auto& [file, contents] : fakes::snapshot(onDisk("/var/mobile/Containers/Data"))) {
      found["data " + file] = contents;
    }
    const fs::path waiting = onDisk(exchange::WaitingData);
    if (!fs::exists(waiting)) return found;
    for (const auto& [file, contents] : fakes::snapshot(waiting)) {
      found["waiting " + file] = contents;
    }
    return found;
  }

  /// Lets a process die at every step of a change that begins with the present device. Whatever
  /// the step, the device that is opened afterwards has the `before` picture or the `after` one.
  void expectOldOrNew(const Change& change) {
    const Snapshot before = picture();
    device.reset();
    const fs::path origin = temporary.path() / "origin";
    fs::rename(folder, origin);
    std::vector<Snapshot> pictures;
    int status = Fuse::Died;
    for (int step = 0; status == Fuse::Died; ++step) {
      fs::remove_all(folder);
      fs::copy(origin, folder, fs::copy_options::recursive);
      status = inOtherProcess([&] { return change(FusedDevice(folder, step).registry()) ? 0 : 1; });
      reopen();
      EXPECT_EQ(containerCount(), registry().size()) << "after step " << step;
      pictures.push_back(picture());
    }
    ASSERT_EQ(status, 0) << "the change fails of itself";
    ASSERT_GT(pictures.size(), 3U);
    const Snapshot& after = pictures.back();
    EXPECT_TRUE(before != after);
    std::size_t step = 0;
    while (step < pictures.size() && pictures[step] == before) ++step;
    EXPECT_GT(step, 0U);
    for (; step < pictures.size(); ++step) EXPECT_TRUE(pictures[step] == after) << "step " << step;
  }

  Change install(std::string_view identifier, std::string_view version) {
    const FileLocation package =
        stage(PackageArchive().addApplication(identifier, version).add("HalvoArtwork", "picture"));
    return [package, id = std::string(identifier)](DeviceAppRegistry& target) {
      return target.installApplication(package,
                                       {{std::string(SWPackageTypeKey), SWPackageTypeCustomer},
                                        {std::string(KBBundleIdentifier), id}},
                                       nullptr);
    };
  }
};

TEST_F(CrashTest, AFirstInstall) { expectOldOrNew(install("com.example.a", "1.0")); }

TEST_F(CrashTest, AnUpdateWithAPlaceholderLaidOver) {
  ASSERT_TRUE(installPackage("com.example.a", "1.0"));
  putFile("/var/mobile/Containers/Data/com.example.a/notes", "mine");
  ASSERT_TRUE(installPlaceholder("com.example.a", "2.0",
                                 {{std::string(SWHalvoMetadataKey), toBytes("metadata")}}));
  expectOldOrNew(install("com.example.a", "2.0"));
}

TEST_F(CrashTest, APlaceholderThatReplacesAnother) {
  ASSERT_TRUE(installPlaceholder("com.example.a", "2.0"));
  ASSERT_TRUE(installPlaceholder("com.example.a", "1.0"));
  const std::string bundle = "/tmp/com.corvane.twc.Apps/com.example.a.app";
  putFile(bundle + "/Info.plist", xml(infoOf("com.example.a", "3.0")));
  expectOldOrNew([&](DeviceAppRegistry& target) {
    return target.installApplication(FileLocation::directory(bundle),
                                     {{std::string(SWPackageTypeKey), SWPackageTypePlaceholder},
                                      {std::string(KBBundleIdentifier), "com.example.a"},
                                      {std::string(SWHalvoMetadataKey), toBytes("metadata")}},
                                     nullptr);
  });
}

TEST_F(CrashTest, AnUninstallOfAnApplicationWithData) {
  ASSERT_TRUE(installPackage("com.example.a", "1.0"));
  putFile("/var/mobile/Containers/Data/com.example.a/notes", "mine");
  expectOldOrNew(
      [](DeviceAppRegistry& target) { return target.uninstallApplication("com.example.a", {}); });
}

TEST_F(CrashTest, APersonsUninstallDuringAnUpdate) {
  ASSERT_TRUE(installPackage("com.example.a", "1.0"));
  ASSERT_TRUE(installPlaceholder("com.example.a", "2.0"));
  expectOldOrNew([](DeviceAppRegistry& target) {
    return target.change("com.example.a", removeForPerson, nullptr);
  });
}

TEST_F(CrashTest, ARestoreOverDataThatIsThereAlready) {
  ASSERT_TRUE(installRestorePlaceholder("com.example.a"));
  putFile("/var/mobile/Containers/Data/com.example.a/notes", "older");
  putFile("/var/mobile/Media/HalvoRestore/Data/com.example.a/notes", "from the backup");
  expectOldOrNew(install("com.example.a", "1.0"));
  EXPECT_EQ(textAt("/var/mobile/Containers/Data/com.example.a/notes"), "from the backup");
}

TEST_F(CrashTest, ARestoreNeverLosesItsData) {
  const std::string waiting = "/var/mobile/Media/HalvoRestore/Data/com.example.a";
  ASSERT_TRUE(installRestorePlaceholder("com.example.a"));
  putFile(waiting + "/notes", "from the backup");
  const Change change = install("com.example.a", "1.0");
  device.reset();
  const fs::path origin = temporary.path() / "origin";
  fs::rename(folder, origin);
  int status = Fuse::Died;
  for (int step = 0; status == Fuse::Died; ++step) {
    fs::remove_all(folder);
    fs::copy(origin, folder, fs::copy_options::recursive);
    status = inOtherProcess([&] { return change(FusedDevice(folder, step).registry()) ? 0 : 1; });
    reopen();
    if (version("com.example.a") != "1.0") {
      ASSERT_TRUE(change(static_cast<DeviceAppRegistry&>(device->appRegistry())));
    }
    EXPECT_EQ(textAt("/var/mobile/Containers/Data/com.example.a/notes"), "from the backup")
        << "after step " << step;
  }
  EXPECT_EQ(status, 0);
}

}  // namespace
}  // namespace appsync::device
