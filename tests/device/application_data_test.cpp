#include <SQLiteCpp/SQLiteCpp.h>
#include <fcntl.h>
#include <gmock/gmock.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>

#include "base/temporary_file.h"
#include "device/files/containers.h"
#include "packages/data_archive.h"
#include "tests/device/data_trees.h"
#include "tests/device/device_test.h"
#include "tests/packages/package_builder.h"

namespace appsync::device {
namespace {

namespace fs = std::filesystem;
using package_tests::buildArchive;
using package_tests::RawEntry;
using ::testing::HasSubstr;

constexpr const char* App = "com.example.app";
const std::string Data = Containers::dataPath(App);
const std::string Waiting = Containers::waitingDataPath(App);

class ApplicationDataTest : public DeviceTest {
 protected:
  ApplicationDataTest() { EXPECT_TRUE(installPackage(App)); }

  std::string save(std::string_view identifier = App) {
    std::string archive;
    error.reset();
    const auto append = [&](ByteView bytes) {
      archive += asText(bytes);
      return true;
    };
    EXPECT_TRUE(device->saveData(identifier, append, &error)) << error->localizedDescription();
    return archive;
  }

  void restore(std::string_view archive, std::string_view identifier = App) {
    error.reset();
    EXPECT_TRUE(device->restoreData(identifier, piecesOf(archive), &error))
        << error->localizedDescription();
  }

  /// The reason for refusing the archive, which must leave everything as it was.
  std::string refusal(std::string_view archive) {
    fs::create_directories(onDisk(Waiting).parent_path());
    const auto before = treeOf(onDisk("/var"));
    error.reset();
    EXPECT_FALSE(device->restoreData(App, piecesOf(archive), &error));
    auto after = treeOf(onDisk("/var"));
    forgetTimeOfTemporaries(after, before);
    EXPECT_TRUE(before == after) << "nothing may have changed";
    return error ? error->localizedDescription() : "no reason";
  }

  std::string refusalOf(std::vector<RawEntry> entries) {
    return refusal(buildArchive(package_tests::ArchiveForm::Tar, entries));
  }

  /// The folder in which something came and went has a new time.
  void forgetTimeOfTemporaries(std::map<std::string, std::string>& tree,
                               const std::map<std::string, std::string>& before) {
    const std::string around = fs::path(Waiting).parent_path().lexically_relative("/var").string();
    tree.at(around) = before.at(around);
  }

  timespec timeOf(const fs::path& path) {
    struct stat status {};
    EXPECT_EQ(::lstat(path.c_str(), &status), 0) << path;
    return status.st_mtim;
  }

  void setTime(const fs::path& path, time_t seconds) {
    const timespec times[2] = {{seconds, 123456789}, {seconds, 123456789}};
    ASSERT_EQ(::utimensat(AT_FDCWD, path.c_str(), times, AT_SYMLINK_NOFOLLOW), 0) << path;
  }

  /// Data with everything that it may hold.
  void fillData() {
    const fs::path data = onDisk(Data);
    putFile(Data + "/notes.txt", "one\ntwo\n");
    putFile(Data + "/empty", "");
    putFile(Data + "/Library/cache/big", std::string(200'001, 'b'));
    putFile(Data + "/Library/" + std::string(255, 'n'), "long name");
    putFile(Data + "/" + std::string(120, 'd') + "/" + std::string(120, 'e') + "/f", "long path");
    putFile(Data + "/umlaut-\xc3\xa4\xe6\x97\xa5", "UTF-8");
    putFile(Data + "/bytes-\xff\xfe\n", "no UTF-8");
    fs::create_directory(data / "nothing in it");
    fs::create_symlink("notes.txt", data / "link");
    fs::create_symlink("/etc/passwd", data / "outside");
    fs::create_symlink("dangling-\xff", data / "Library/dangling");
    fs::create_directory_symlink("/", data / "folder link");
    ::chmod((data / "notes.txt").c_str(), 0640);
    ::chmod((data / "empty").c_str(), 04755);
    ::chmod((data / "nothing in it").c_str(), 01770);
    setTime(data / "notes.txt", 1'000'000'000);
    setTime(data / "empty", -5);
    setTime(data / "Library/cache/big", 5'000'000'000);
    setTime(data / "outside", 1'100'000'000);
    setTime(data / "Library", 1'200'000'000);
  }
};

TEST_F(ApplicationDataTest, WhatWasSavedComesBackAsItWas) {
  fillData();
  ::chmod((onDisk(Data) / "empty").c_str(), 0755);
  ::chmod((onDisk(Data) / "nothing in it").c_str(), 0770);
  restore(save());
  const auto restored = treeOf(onDisk(Waiting));
  EXPECT_EQ(restored.size(), 16u);
  EXPECT_TRUE(restored == treeOf(onDisk(Data)));
  EXPECT_EQ(timeOf(onDisk(Waiting) / "empty").tv_sec, -5);
  EXPECT_EQ(timeOf(onDisk(Waiting) / "empty").tv_nsec, 0);
}

TEST_F(ApplicationDataTest, SavingRestoringAndSavingGivesTheSameBytes) {
  fillData();
  const std::string first = save();
  EXPECT_EQ(save(), first);
  restore(first, "com.example.restored");
  EXPECT_EQ(save("com.example.restored"), first);
}

TEST_F(ApplicationDataTest, TheArchiveIsSortedAndTellsNothingOfThisMachine) {
  for (const char* name : {"/z", "/a/c", "/a/b", "/a.txt", "/Z"}) putFile(Data + name, "x");
  const std::string archive = save();
  std::vector<std::size_t> places;
  for (const char* name : {"Z", "a/", "a/b", "a/c", "a.txt", "z"}) {
    std::string header(name);
    header.resize(100);
    places.push_back(archive.find(header));
    EXPECT_NE(places.back(), std::string::npos) << name;
  }
  std::vector<std::size_t> inOrder = {places[0], places[1], places[2],
                                      places[3], places[4], places[5]};
  std::ranges::sort(inOrder);
  EXPECT_EQ(archive.find("root"), std::string::npos);
}

TEST_F(ApplicationDataTest, SetIdBitsAreNotKept) {
  fillData();
  restore(save());
  struct stat status {};
  ASSERT_EQ(::stat((onDisk(Waiting) / "empty").c_str(), &status), 0);
  EXPECT_EQ(status.st_mode & 07777, 0755u);
  ASSERT_EQ(::stat((onDisk(Waiting) / "nothing in it").c_str(), &status), 0);
  EXPECT_EQ(status.st_mode & 07777, 0770u);
}

TEST_F(ApplicationDataTest, EmptyDataGivesNoBytes) {
  EXPECT_EQ(save(), "");
  EXPECT_EQ(save("com.example.unknown"), "");
}

TEST_F(ApplicationDataTest, NoBytesTakeAwayWhatWaited) {
  putFile(Waiting + "/old", "old");
  restore("");
  EXPECT_FALSE(fs::exists(onDisk(Waiting)));
}

TEST_F(ApplicationDataTest, WhatIsNoFileFolderOrLinkIsLeftOutAndNamed) {
  putFile(Data + "/kept", "kept");
  ASSERT_EQ(::mkfifo((onDisk(Data) / "pipe").c_str(), 0600), 0);
  ASSERT_EQ(::mknod((onDisk(Data) / "socket").c_str(), S_IFSOCK | 0600, 0), 0);
  restore(save());
  EXPECT_EQ(treeOf(onDisk(Waiting)).size(), 1u);
  const std::string reason = " is left out of the backup: it is no file, folder or link";
  EXPECT_THAT(logTexts(),
              ::testing::IsSupersetOf({Data + "/pipe" + reason, Data + "/socket" + reason}));
}

TEST_F(ApplicationDataTest, OfAPlaceholderTheDataThatWaitsIsSaved) {
  constexpr const char* Coming = "com.example.coming";
  ASSERT_TRUE(installRestorePlaceholder(Coming));
  EXPECT_EQ(save(Coming), "");
  putFile(Containers::dataPath(Coming) + "/half", "adopted by an install that did not end");
  EXPECT_THAT(save(Coming), HasSubstr("adopted"));
  putFile(Containers::waitingDataPath(Coming) + "/file", "it waits");
  EXPECT_THAT(save(Coming), HasSubstr("it waits"));
}

TEST_F(ApplicationDataTest, OfAnInstalledApplicationItsOwnDataIsSaved) {
  putFile(Waiting + "/file", "it waits");
  putFile(Data + "/file", "its own");
  EXPECT_THAT(save(), HasSubstr("its own"));
}

TEST_F(ApplicationDataTest, RestoredDataReturnsWithItsPackage) {
  putFile(Data + "/file", "text");
  const std::string archive = save();
  ASSERT_TRUE(device->uninstall(App, &error));
  ASSERT_TRUE(installRestorePlaceholder(App));
  restore(archive);
  ASSERT_TRUE(installPackage(App));
  EXPECT_EQ(textAt(Data + "/file"), "text");
  EXPECT_EQ(save(), archive);
}

TEST_F(ApplicationDataTest, WhatIsRestoredAfterARemovalThatBrokeOffIsNotRemovedWithTheOld) {
  putFile(Data + "/file", "new");
  const std::string archive = save();
  SQLite::Database((folder / "device.db").string(), SQLite::OPEN_READWRITE)
      .exec("INSERT INTO abandoned_data VALUES ('com.example.app')");
  restore(archive);
  EXPECT_FALSE(fs::exists(onDisk(Data))) << "the old data";
  reopen();
  EXPECT_EQ(textAt(Waiting + "/file"), "new");
}

TEST_F(ApplicationDataTest, WhatWaitedBeforeIsReplaced) {
  putFile(Waiting + "/old", "old");
  putFile(Data + "/new", "new");
  restore(save());
  EXPECT_TRUE(treeOf(onDisk(Waiting)) == treeOf(onDisk(Data)));
  EXPECT_EQ(treeOf(onDisk(Waiting).parent_path()).size(), 2u) << "nothing else may lie there";
}

TEST_F(ApplicationDataTest, ALinkInThePlaceOfTheDataIsNotFollowed) {
  fs::create_directory(temporary / "outside");
  fs::remove_all(onDisk(Data));
  fs::create_directory_symlink(temporary / "outside", onDisk(Data));
  EXPECT_FALSE(device->saveData(
      App, [](ByteView) { return true; }, &error));
  EXPECT_EQ(error->code, ENOTDIR);

  fs::create_directories(onDisk(Waiting).parent_path());
  fs::create_directory_symlink(temporary / "outside", onDisk(Waiting));
  restore(buildArchive(package_tests::ArchiveForm::Tar, {{"file", "text"}}));
  EXPECT_EQ(textAt(Waiting + "/file"), "text");
  EXPECT_TRUE(fs::is_empty(temporary / "outside"));
}

TEST_F(ApplicationDataTest, HostileArchivesAreRefusedAndChangeNothing) {
  using Kind = RawEntry::Kind;
  putFile(Waiting + "/old", "old");
  EXPECT_THAT(refusalOf({{"/etc/evil", "x"}}), HasSubstr("\"/etc/evil\" has an absolute name"));
  EXPECT_THAT(refusalOf({{"../evil", "x"}}), HasSubstr("\"../evil\" leads outside"));
  EXPECT_THAT(refusalOf({RawEntry::folder("a"), {"a/../../evil", "x"}}),
              HasSubstr("leads outside"));
  EXPECT_THAT(refusalOf({RawEntry::folder("..")}), HasSubstr("leads outside"));
  EXPECT_THAT(refusalOf({RawEntry::folder("./")}), HasSubstr("has an unusual name"));
  EXPECT_THAT(refusalOf({RawEntry::folder("a"), {"a//b", "x"}}), HasSubstr("has an unusual name"));
  EXPECT_THAT(refusalOf({{"missing/file", "x"}}),
              HasSubstr("lies in a folder that did not come before it"));
  EXPECT_THAT(refusalOf({{"link", "/", Kind::SymbolicLink}, {"link/evil", "x"}}),
              HasSubstr("lies in a folder that did not come before it"));
  EXPECT_THAT(refusalOf({{"link", "/etc/passwd", Kind::SymbolicLink}, {"link", "x"}}),
              HasSubstr("\"link\" comes twice"));
  EXPECT_THAT(refusalOf({{"file", "x"}, {"file", "y"}}), HasSubstr("\"file\" comes twice"));
  EXPECT_THAT(refusalOf({RawEntry::folder("a"), RawEntry::folder("a")}), HasSubstr("comes twice"));
  EXPECT_THAT(refusalOf({{"file", "x"}, {"hard", "file", Kind::HardLink}}),
              HasSubstr("\"hard\" is a hard link"));
  EXPECT_THAT(refusalOf({{"hard", "/etc/passwd", Kind::HardLink}}), HasSubstr("is a hard link"));
  EXPECT_THAT(refusalOf({{"pipe", "", Kind::Pipe}}), HasSubstr("is no file, folder or link"));
  EXPECT_THAT(refusalOf({{"device", "", Kind::CharacterDevice}}),
              HasSubstr("is no file, folder or link"));
  EXPECT_THAT(refusalOf({{std::string(4001, 'x'), "x"}}), HasSubstr("has too long a name"));
}

TEST_F(ApplicationDataTest, DataNestedTooDeepIsNeitherSavedNorRestored) {
  std::string path = Data;
  std::vector<RawEntry> entries;
  for (std::size_t depth = 0; depth <= DeepestData; ++depth) {
    path += "/d";
    entries.push_back(RawEntry::folder(path.substr(Data.size() + 1)));
  }
  EXPECT_THAT(refusalOf(entries), HasSubstr("lies too deep"));
  entries.pop_back();
  restore(buildArchive(package_tests::ArchiveForm::Tar, entries));
  fs::create_directories(onDisk(path));
  EXPECT_FALSE(device->saveData(
      App, [](ByteView) { return true; }, &error));
  EXPECT_EQ(error->code, ENAMETOOLONG);
}

TEST_F(ApplicationDataTest, WhatIsNoArchiveIsRefused) {
  putFile(Waiting + "/old", "old");
  EXPECT_THAT(refusal("nonsense"), HasSubstr("the archive of the data is damaged"));
  EXPECT_THAT(refusal(std::string(5000, 'x')), HasSubstr("damaged"));
  EXPECT_THAT(refusal(buildArchive(package_tests::ArchiveForm::Zip, {{"file", "x"}})),
              HasSubstr("damaged"));
  EXPECT_THAT(refusal(buildArchive(package_tests::ArchiveForm::TarGz, {{"file", "x"}})),
              HasSubstr("damaged"));
}

TEST_F(ApplicationDataTest, AnArchiveCutOffAnywhereIsRefused) {
  putFile(Data + "/a", std::string(700, 'a'));
  putFile(Data + "/b/c", std::string(512, 'c'));
  putFile(Waiting + "/old", "old");
  const std::string archive = save();
  for (std::size_t length = 1; length < archive.size(); length += 311) {
    EXPECT_THAT(refusal(archive.substr(0, length)), HasSubstr("damaged")) << length;
  }
  for (std::size_t length = 512; length < archive.size(); length += 512) {
    EXPECT_THAT(refusal(archive.substr(0, length)), HasSubstr("damaged")) << length;
  }
  EXPECT_THAT(refusal(archive + "x"), HasSubstr("something follows its end"));
  restore(archive + std::string(10'000, '\0'));
}

TEST_F(ApplicationDataTest, ChangedBytesNeverLeadOutsideOrHalfRestore) {
  putFile(Data + "/a", std::string(300, 'a'));
  putFile(Data + "/b/c", "c");
  putFile(Waiting + "/old", "old");
  const std::string archive = save();
  const auto outside = [&] {
    auto tree = treeOf(onDisk("/var"));
    std::erase_if(tree, [](const auto& item) {
      return item.first.find("HalvoRestore") != std::string::npos;
    });
    return tree;
  };
  const auto before = outside();
  for (std::size_t bit = 0; bit < archive.size() * 8; bit += 211) {
    std::string changed = archive;
    changed[bit / 8] = static_cast<char>(changed[bit / 8] ^ (1 << bit % 8));
    const auto waited = treeOf(onDisk(Waiting));
    if (!device->restoreData(App, piecesOf(changed), &error)) {
      EXPECT_TRUE(treeOf(onDisk(Waiting)) == waited) << bit;
    }
    ASSERT_TRUE(outside() == before) << bit;
  }
}

TEST_F(ApplicationDataTest, ASourceThatFailsIsTheReasonEvenAtTheVeryEnd) {
  putFile(Data + "/a", std::string(100'000, 'a'));
  putFile(Waiting + "/old", "old");
  const std::string archive = save();
  for (const std::size_t good : {std::size_t{0}, std::size_t{50'000}, archive.size()}) {
    auto pieces = piecesOf(std::string_view(archive).substr(0, good));
    const auto failing = [&](std::uint8_t* bytes, std::size_t size) {
      const std::int64_t count = pieces(bytes, size);
      return count == 0 ? -1 : count;
    };
    EXPECT_FALSE(device->restoreData(App, failing, &error));
    EXPECT_EQ(error->code, ECANCELED) << good;
    EXPECT_EQ(textAt(Waiting + "/old"), "old");
  }
}

TEST_F(ApplicationDataTest, ASinkThatFailsEndsTheSaving) {
  putFile(Data + "/a", std::string(300'000, 'a'));
  int calls = 0;
  EXPECT_FALSE(device->saveData(
      App, [&](ByteView) { return ++calls < 2; }, &error));
  EXPECT_EQ(error->code, ECANCELED);
  EXPECT_EQ(calls, 2);
}

TEST_F(ApplicationDataTest, IdentifiersThatCannotBeNamesAreRefused) {
  for (const char* identifier : {"", ".", "..", "a/b", "../x", ".appsync-0123456789abcdef"}) {
    EXPECT_FALSE(device->saveData(
        identifier, [](ByteView) { return true; }, &error));
    EXPECT_FALSE(device->restoreData(identifier, piecesOf(""), &error));
  }
}

TEST_F(ApplicationDataTest, ADeviceOpenForReadingSavesButDoesNotRestore) {
  putFile(Data + "/a", "text");
  const std::string archive = save();
  reopen(Access::ReadOnly);
  EXPECT_EQ(save(), archive);
  EXPECT_FALSE(device->restoreData(App, piecesOf(archive), &error));
  EXPECT_EQ(error->code, EROFS);
}

TEST_F(ApplicationDataTest, WhatAKilledRestoreLeftIsSweptWhenTheDeviceIsOpened) {
  putFile(Data + "/a", std::string(300'000, 'a'));
  putFile(Waiting + "/old", "old");
  const std::string archive = save();
  device.reset();
  const int status = inOtherProcess([&] {
    reopen();
    auto pieces = piecesOf(archive);
    int left = 150;
    const auto deadly = [&](std::uint8_t* bytes, std::size_t size) {
      if (left-- == 0) ::_exit(77);
      return pieces(bytes, size);
    };
    device->restoreData(App, deadly, nullptr);
    return 0;
  });
  EXPECT_EQ(status, 77);
  EXPECT_EQ(treeOf(onDisk(Waiting).parent_path()).size(), 4u) << "half of it must lie there";
  reopen();
  EXPECT_EQ(treeOf(onDisk(Waiting).parent_path()).size(), 2u);
  EXPECT_EQ(textAt(Waiting + "/old"), "old");
}

}  // namespace
}  // namespace appsync::device
