#include "device/files/containers.h"
#include "platform/bundle.h"
#include "tests/device/data_trees.h"
#include "tests/device/device_test.h"
#include "tests/device/failing_calls.h"
#include "tests/packages/package_builder.h"

namespace appsync::device {
namespace {

namespace fs = std::filesystem;
using Lines = std::vector<std::string>;
using Snapshot = std::map<std::string, std::string>;

constexpr std::string_view Id = "com.example.a";
const std::string Notes = Containers::dataPath(Id) + "/notes";
const std::string WaitingNotes = Containers::waitingDataPath(Id) + "/notes";

/// Each call to the system fails once, or each SWEEP_STEP-th in slow builds.
class FileFaultsTest : public DeviceTest {
 protected:
  /// Begins with the present device over and over, lets one call after another fail while the work
  /// is done and the device is opened again, as a person's next command does, and looks at the
  /// device that is opened after that. `look` is told whether the work said that it was done. At
  /// last nothing fails, and it must be.
  void sweep(const std::function<bool()>& work, const std::function<void(bool done)>& look) {
    device.reset();
    const fs::path origin = temporary.path() / "origin";
    fs::rename(folder, origin);
    bool struck = true;
    bool done = false;
    for (int call = 0; struck; call += SWEEP_STEP) {
      SCOPED_TRACE("call " + std::to_string(call));
      device.reset();
      fs::remove_all(folder);
      fs::copy(origin, folder, fs::copy_options::recursive);
      reopen();
      {
        const FailingCalls failing(call);
        done = work();
        device.reset();
        DeviceError problem;
        device = EmbeddedDevice::open(folder, Access::Write, problem);
        struck = failing.struck();
      }
      reopen();
      look(done);
      EXPECT_EQ(containerCount(), registry().size());
      ASSERT_FALSE(HasFailure());
    }
    EXPECT_TRUE(done);
  }

  /// Whether the work was done; else it must have told why.
  bool attempt(const std::function<bool()>& work) {
    error.reset();
    const bool done = work();
    EXPECT_TRUE(done || error) << "it failed without a reason";
    return done;
  }

  bool install(const FileLocation& package) {
    const PropertyList::Dictionary options{{std::string(SWPackageTypeKey), SWPackageTypeCustomer},
                                           {std::string(KBBundleIdentifier), Id}};
    return attempt(
        [&] { return device->appRegistry().installApplication(package, options, &error); });
  }
  PackageArchive archive(std::string_view version) {
    return PackageArchive()
        .addApplication(Id, version)
        .add("HalvoMetadata.plist", "metadata " + std::string(version));
  }
  Snapshot containerOf(std::string_view identifier) {
    return fakes::snapshot(onDisk(*record(identifier)->bundleContainerPath));
  }
};

TEST_F(FileFaultsTest, AnOperationOnFilesThatFailsTellsWhy) {
  FileManager& files = device->files();
  const FileAttributes mobile{.owner = std::string("mobile"), .group = std::string("mobile")};
  const std::map<std::string, std::function<bool()>> operations = {
      {"contents", [&] { return files.contentsAtPath("/a/file", &error).has_value(); }},
      {"write", [&] { return files.writeAtomically("/a/file", {}, &error); }},
      {"make", [&] { return files.createDirectory("/a/new", false, mobile, &error); }},
      {"make all", [&] { return files.createDirectory("/x/y", true, {}, &error); }},
      {"remove", [&] { return files.removeItem("/a", &error); }},
      {"move", [&] { return files.moveItem("/a", "/b", &error); }},
      {"copy", [&] { return files.copyItem("/a", "/b", &error); }},
      {"attributes", [&] { return files.attributesOfItem("/a", &error).has_value(); }},
      {"touch", [&] { return files.touch("/a", &error); }}};
  for (const auto& [name, operation] : operations) {
    bool struck = true;
    for (int call = 0; struck; ++call) {
      SCOPED_TRACE(name + ", call " + std::to_string(call));
      for (const std::string_view path : {"/a", "/b", "/x"}) files.removeItem(path);
      putFile("/a/file", "text");
      const FailingCalls failing(call);
      attempt(operation);
      struck = failing.struck();
    }
  }
}

TEST_F(FileFaultsTest, ADemotedAndTappedApplicationKeepsItsDataAndMetadata) {
  ASSERT_TRUE(installPackage(archive("1.0"), Id));
  putFile(Notes, "mine");
  const Lines whole{"com.example.a 1.0"};
  const Lines demoted{"com.example.a 1.0 (placeholder)"};
  const Lines between{whole.front(), demoted.front()};
  sweep(
      [&] {
        const bool done = attempt([&] { return device->demote(Id, &error); });
        device.reset();
        DeviceError problem;
        std::optional<Error> reason;
        EmbeddedDevice::tap(folder, Id, problem, &reason);
        return done;
      },
      [&](bool done) {
        EXPECT_EQ(textAt(Notes), "mine");
        const Lines found = registry();
        EXPECT_TRUE(done ? found == demoted : found == whole || found == between);
        for (const AppRecord& each : device->applications()) {
          EXPECT_EQ(textAt(*each.bundleContainerPath + "/HalvoMetadata.plist"), "metadata 1.0");
        }
      });
  EXPECT_EQ(registry(), demoted);
  EXPECT_EQ(record(Id)->installType, InstallType::StoreDownload);
}

TEST_F(FileFaultsTest, WaitingDataComesWithItsPackageInTheEnd) {
  ASSERT_TRUE(installRestorePlaceholder(Id));
  putFile(WaitingNotes, "from the backup");
  const FileLocation package = stage(archive("1.0"));
  sweep([&] { return install(package); },
        [&](bool done) {
          EXPECT_EQ(done, version(Id) == "1.0");
          EXPECT_TRUE(done || install(package));
          EXPECT_EQ(textAt(Notes), "from the backup");
          EXPECT_FALSE(device->files().fileExists(WaitingNotes));
        });
}

TEST_F(FileFaultsTest, WaitingDataAndWhatItReplacesAreNeverLostBetween) {
  ASSERT_TRUE(installRestorePlaceholder(Id));
  putFile(Notes, "older");
  putFile(WaitingNotes, "from the backup");
  const FileLocation package = stage(archive("1.0"));
  sweep([&] { return install(package); },
        [&](bool done) {
          EXPECT_EQ(textAt(Notes), done ? "from the backup" : "older");
          EXPECT_EQ(done, !device->files().fileExists(WaitingNotes));
          EXPECT_TRUE(done || install(package));
          EXPECT_EQ(textAt(Notes), "from the backup");
          EXPECT_EQ(device->namesIn(Containers::DataDirectory, nullptr), Lines{std::string(Id)});
        });
}

TEST_F(FileFaultsTest, AnInstallThatIsTriedAgainFindsBothDataAsTheyWere) {
  ASSERT_TRUE(installRestorePlaceholder(Id));
  putFile(Notes, "older");
  putFile(WaitingNotes, "from the backup");
  const FileLocation package = stage(archive("1.0"));
  sweep([&] { return install(package) || install(package); },
        [&](bool done) {
          EXPECT_TRUE(done);
          EXPECT_EQ(textAt(Notes), "from the backup");
          EXPECT_EQ(device->namesIn(Containers::DataDirectory, nullptr), Lines{std::string(Id)});
        });
}

TEST_F(FileFaultsTest, DataThatIsOverwrittenIsTheOldOrTheNew) {
  ASSERT_TRUE(installPackage(archive("1.0"), Id));
  putFile(Notes, "mine");
  const std::string given = package_tests::buildArchive(
      package_tests::ArchiveForm::Tar,
      {package_tests::RawEntry::folder("kept/"), {"kept/notes", "given"}});
  const Snapshot before = fakes::snapshot(onDisk(Containers::DataDirectory));
  const Snapshot after = {{"com.example.a", "folder 0755"},
                          {"com.example.a/kept", "folder 0755"},
                          {"com.example.a/kept/notes", "file 0644 given"}};
  sweep([&] { return attempt([&] { return device->overwriteData(Id, piecesOf(given), &error); }); },
        [&](bool done) {
          EXPECT_EQ(fakes::snapshot(onDisk(Containers::DataDirectory)), done ? after : before);
        });
}

TEST_F(FileFaultsTest, AnUpdateLeavesTheOldVersionOrTheNewOneWhole) {
  ASSERT_TRUE(installPackage(archive("1.0"), Id));
  putFile(Notes, "mine");
  ASSERT_TRUE(installPlaceholder(Id, "2.0"));
  const FileLocation package = stage(PackageArchive().addApplication(Id, "2.0"));
  const Snapshot old = containerOf(Id);
  sweep([&] { return install(package); },
        [&](bool done) {
          EXPECT_EQ(textAt(Notes), "mine");
          EXPECT_EQ(done, version(Id) == "2.0");
          if (done) {
            EXPECT_EQ(registry(), Lines{"com.example.a 2.0"});
            EXPECT_EQ(textAt(*record(Id)->bundleContainerPath + "/HalvoMetadata.plist"),
                      "metadata 1.0")
                << "carried over";
            EXPECT_EQ(textAt(*record(Id)->bundlePath + "/run.sh"), "#!/bin/sh\necho hello\n");
          } else {
            EXPECT_EQ(registry(), (Lines{"com.example.a 1.0", "com.example.a 2.0 (placeholder)"}));
            EXPECT_TRUE(containerOf(Id) == old);
          }
        });
}

}  // namespace
}  // namespace appsync::device
