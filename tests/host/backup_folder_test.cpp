#include "host/backup/backup_folder.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

#include <csignal>
#include <functional>

#include "platform/property_list_codec.h"
#include "tests/host/host_files.h"

namespace appsync::host {
namespace {

namespace fs = std::filesystem;
using ::testing::EndsWith;
using testing::Folder;
using ::testing::HasSubstr;

const std::string Applications = "what to restore";
const std::string Archive(300'000, 'x');

std::unique_ptr<BackupWriter> openWriter(const fs::path& folder) {
  BackupProblem problem;
  auto writer = BackupWriter::open(folder, problem);
  EXPECT_TRUE(writer) << problem.text;
  return writer;
}

bool addLists(BackupWriter& writer, std::string_view applications) {
  return writer.addFile(BackupApplicationsFile, asBytes(applications)) &&
         writer.addFile(BackupDemotionsFile, asBytes("who is demoted")) &&
         writer.addFile(BackupIconLayoutFile, asBytes("what stands where"));
}

bool addArchive(BackupWriter& writer, std::string_view identifier, std::string_view contents) {
  return writer.beginData(identifier) && writer.append(asBytes(contents.substr(0, 1000))) &&
         writer.append(asBytes(contents.substr(1000))) && writer.endData();
}

void makeBackup(const fs::path& folder, std::string_view applications = Applications) {
  const auto writer = openWriter(folder);
  ASSERT_TRUE(writer);
  EXPECT_TRUE(addLists(*writer, applications));
  EXPECT_TRUE(addArchive(*writer, "com.a", Archive));
  EXPECT_TRUE(writer->finish()) << writer->problem();
}

std::string applicationsOf(const fs::path& folder) {
  std::string problem;
  const auto backup = readBackup(folder, problem);
  return backup ? std::string(asText(backup->applications)) : problem;
}

/// Why a folder is no backup that can be used.
std::string objection(const fs::path& folder) {
  std::string problem;
  EXPECT_FALSE(readBackup(folder, problem));
  return problem;
}

/// Why a folder is none for a backup.
std::string objectionToWriting(const fs::path& folder) {
  BackupProblem problem;
  EXPECT_FALSE(BackupWriter::open(folder, problem));
  EXPECT_TRUE(problem.isWrongFolder) << problem.text;
  return problem.text;
}

/// The bytes, and at the end the reader's problem.
std::pair<std::string, std::string> readAll(const BackupFile& file) {
  BackupFileReader reader(file);
  std::vector<std::uint8_t> buffer(4096);
  std::string text;
  std::int64_t count = 0;
  while ((count = reader.read(buffer.data(), buffer.size())) > 0) {
    text.append(reinterpret_cast<const char*>(buffer.data()), static_cast<std::size_t>(count));
    EXPECT_EQ(reader.position(), text.size());
  }
  EXPECT_EQ(count < 0, !reader.problem().empty());
  EXPECT_EQ(reader.read(buffer.data(), buffer.size()), count) << "the end must last";
  return {text, reader.problem()};
}

std::pair<std::string, std::string> readArchive(const fs::path& folder, const char* identifier) {
  std::string problem;
  const auto backup = readBackup(folder, problem);
  EXPECT_TRUE(backup) << problem;
  return backup ? readAll(backup->data.at(identifier)) : std::pair<std::string, std::string>();
}

std::vector<std::string> namesIn(const fs::path& folder) {
  std::vector<std::string> names;
  for (const auto& item : fs::directory_iterator(folder)) names.push_back(item.path().filename());
  std::sort(names.begin(), names.end());
  return names;
}

void flipByte(const fs::path& file, std::size_t offset) {
  std::string contents = testing::fileText(file);
  contents.at(offset) = static_cast<char>(contents.at(offset) ^ 1);
  testing::putFile(file, contents);
}

/// Leaves this process so many descriptors to open.
class DescriptorLimit {
 public:
  explicit DescriptorLimit(rlim_t spare) {
    const int lowestFree = ::dup(0);
    ::close(lowestFree);
    ::getrlimit(RLIMIT_NOFILE, &before_);
    const rlimit tight{static_cast<rlim_t>(lowestFree) + spare, before_.rlim_max};
    ::setrlimit(RLIMIT_NOFILE, &tight);
  }
  ~DescriptorLimit() { ::setrlimit(RLIMIT_NOFILE, &before_); }
  DescriptorLimit(const DescriptorLimit&) = delete;
  DescriptorLimit& operator=(const DescriptorLimit&) = delete;

 private:
  rlimit before_{};
};

/// Lets the change work on the dictionary of a backup's manifest.
void editManifest(const fs::path& folder,
                  const std::function<void(PropertyList::Dictionary&)>& change) {
  const fs::path file = folder / "Manifest.plist";
  auto root = parsePropertyList(asBytes(testing::fileText(file)));
  ASSERT_TRUE(root && root->asDictionary());
  change(*root->asDictionary());
  testing::putFile(file, testing::xmlText(*root));
}

class BackupFolderTest : public ::testing::Test {
 protected:
  Folder around_;
  const fs::path folder_ = around_ / "phone";
};

TEST_F(BackupFolderTest, WhatWasWrittenIsReadAgain) {
  const auto writer = openWriter(folder_);
  ASSERT_TRUE(addLists(*writer, Applications));
  ASSERT_TRUE(addArchive(*writer, "com.a", Archive));
  ASSERT_TRUE(addArchive(*writer, "com.b", Archive));
  writer->dropData();  // closed already: nothing to take back
  ASSERT_TRUE(writer->beginData("com.dropped") && writer->append(asBytes("x")));
  writer->dropData();
  ASSERT_TRUE(writer->finish()) << writer->problem();

  std::string problem;
  const auto backup = readBackup(folder_, problem);
  ASSERT_TRUE(backup) << problem;
  EXPECT_EQ(asText(backup->applications), Applications);
  EXPECT_EQ(asText(backup->demotions), "who is demoted");
  EXPECT_EQ(asText(backup->iconLayout), "what stands where");
  ASSERT_EQ(backup->data.size(), 2u);
  EXPECT_EQ(readAll(backup->data.at("com.a")), std::pair(Archive, std::string()));
  EXPECT_EQ(namesIn(folder_ / "Data"), (std::vector<std::string>{"com.a.tar", "com.b.tar"}));
  EXPECT_EQ(namesIn(around_.path()), std::vector<std::string>{"phone"});
}

TEST_F(BackupFolderTest, TheDigestsAreThoseThatOtherToolsMake) {
  makeBackup(folder_, "abc");
  EXPECT_THAT(testing::fileText(folder_ / "Manifest.plist"),
              HasSubstr("ba7816bf8f01cfea414140de5dae2223b00361a396177a9cb410ff61f20015ad"));
}

TEST_F(BackupFolderTest, TheSameContentsGiveTheSameBytes) {
  makeBackup(folder_);
  makeBackup(around_ / "again");
  for (const char* name : {"Manifest.plist", "RestoreApplications.plist", "Data/com.a.tar"}) {
    EXPECT_EQ(testing::fileText(folder_ / name), testing::fileText(around_ / "again" / name));
  }
}

TEST_F(BackupFolderTest, OnlyItsOwnerMayLookIntoIt) {
  const mode_t mask = ::umask(0);
  makeBackup(folder_);
  ::umask(mask);
  const auto permissionsOf = [&](const char* name) {
    return fs::symlink_status(folder_ / name).permissions();
  };
  for (const char* name : {"", "Data"}) {
    EXPECT_EQ(permissionsOf(name), fs::perms::owner_all) << name;
  }
  for (const char* name : {"Manifest.plist", "RestoreApplications.plist", "DemotedApps.plist",
                           "IconState.plist", "Data/com.a.tar"}) {
    EXPECT_EQ(permissionsOf(name), fs::perms::owner_read | fs::perms::owner_write) << name;
  }
}

TEST_F(BackupFolderTest, AnOlderBackupIsReplacedWhenTheNewOneIsWhole) {
  makeBackup(folder_, "old");
  const auto writer = openWriter(folder_);
  ASSERT_TRUE(addLists(*writer, "new"));
  EXPECT_EQ(applicationsOf(folder_), "old");
  ASSERT_TRUE(writer->finish()) << writer->problem();
  EXPECT_EQ(applicationsOf(folder_), "new");
  EXPECT_FALSE(fs::exists(folder_ / "Data/com.a.tar"));
  EXPECT_EQ(namesIn(around_.path()), std::vector<std::string>{"phone"});
}

TEST_F(BackupFolderTest, AnUnfinishedBackupLeavesTheOlderOneAndNothingElse) {
  makeBackup(folder_, "old");
  auto writer = openWriter(folder_);
  ASSERT_TRUE(addLists(*writer, "new") && writer->beginData("com.a"));
  writer.reset();
  EXPECT_EQ(applicationsOf(folder_), "old");
  EXPECT_EQ(namesIn(around_.path()), std::vector<std::string>{"phone"});
}

TEST_F(BackupFolderTest, AnEmptyFolderAndALinkToAFolderCanBecomeABackup) {
  fs::create_directory(folder_);
  makeBackup(folder_);
  EXPECT_EQ(applicationsOf(folder_), Applications);

  fs::create_directory_symlink(folder_, around_ / "link");
  makeBackup(around_ / "link" / "", "through the link");
  EXPECT_TRUE(fs::is_symlink(around_ / "link"));
  EXPECT_EQ(applicationsOf(folder_), "through the link");
}

TEST_F(BackupFolderTest, WhatAKilledWriterLeftIsRemovedByTheNext) {
  testing::putFile(around_ / "phone.partial-Ab3xY9" / "Data" / "com.a.tar", "half");
  testing::putFile(around_ / "phone.partial-notes" / "kept", "");
  testing::putFile(around_ / "other.partial-Ab3xY9" / "kept", "");
  makeBackup(folder_);
  EXPECT_EQ(namesIn(around_.path()),
            (std::vector<std::string>{"other.partial-Ab3xY9", "phone", "phone.partial-notes"}));
}

TEST_F(BackupFolderTest, ABackupThatIsBeingMadeIsLeftAlone) {
  const auto first = openWriter(folder_);
  makeBackup(folder_, "second");
  ASSERT_TRUE(addLists(*first, "first"));
  EXPECT_FALSE(first->finish()) << "somebody else's backup stands there now";
  EXPECT_EQ(applicationsOf(folder_), "second");
}

TEST_F(BackupFolderTest, WhatIsNoBackupIsNeverReplaced) {
  testing::putFile(folder_ / "thesis.txt", "years of work");
  EXPECT_THAT(objectionToWriting(folder_), EndsWith("it is not empty, and it holds no "
                                                    "Manifest.plist, so it is no backup"));
  testing::putFile(folder_ / "Manifest.plist", "years of work");
  EXPECT_THAT(objectionToWriting(folder_), EndsWith("its manifest is damaged"));
  testing::putFile(around_ / "file", "");
  EXPECT_THAT(objectionToWriting(around_ / "file"), EndsWith("it is no folder"));
  EXPECT_THAT(objectionToWriting(around_ / "missing" / "phone"),
              EndsWith("missing: No such file or directory"));
  EXPECT_THAT(objectionToWriting("/"), EndsWith("it is no folder for a backup"));
  EXPECT_THAT(objectionToWriting("/proc"), EndsWith("it is a mount point; name a folder in it"));
  EXPECT_EQ(testing::fileText(folder_ / "thesis.txt"), "years of work");
}

TEST_F(BackupFolderTest, ABackupThatHoldsSomethingElseIsNotReplaced) {
  makeBackup(folder_);
  testing::putFile(folder_ / "notes.txt", "mine");
  EXPECT_THAT(objectionToWriting(folder_),
              EndsWith("it holds \"notes.txt\", which is no part of a backup"));
}

TEST_F(BackupFolderTest, ABackupOfANewerProgramIsNeitherReadNorReplaced) {
  makeBackup(folder_);
  editManifest(folder_, [](auto& manifest) { manifest["FormatVersion"] = 2; });
  const std::string reason = "it was made by a newer appsync; use that one";
  EXPECT_THAT(objection(folder_), EndsWith(reason));
  EXPECT_THAT(objectionToWriting(folder_), EndsWith(reason));
}

TEST_F(BackupFolderTest, TellsWhatTheOlderBackupHolds) {
  const auto first = openWriter(folder_);
  EXPECT_FALSE(first->olderHolds("com.a"));
  EXPECT_TRUE(first->olderApplications().empty());
  const auto list =
      serializePropertyList(PropertyList::Dictionary{{"com.a", 1}}, PropertyListFormat::Xml);
  makeBackup(folder_, asText(*list));
  const auto second = openWriter(folder_);
  EXPECT_TRUE(second->olderHolds("com.a"));
  EXPECT_FALSE(second->olderHolds("com.b"));
  EXPECT_EQ(second->olderApplications(), std::vector<std::string>{"com.a"});
  flipByte(folder_ / "RestoreApplications.plist", 3);
  EXPECT_FALSE(second->olderHolds("com.b")) << "it has been read";
  EXPECT_TRUE(openWriter(folder_)->olderHolds("com.b")) << "a damaged one may hold anything";
}

TEST_F(BackupFolderTest, AFolderThatCannotBeLookedAtIsNeitherReplacedNorWrong) {
  makeBackup(folder_, "old");
  testing::putFile(folder_ / "notes.txt", "mine");
  for (rlim_t spare = 0; spare < 20; ++spare) {
    BackupProblem problem;
    const DescriptorLimit limit(spare);
    EXPECT_FALSE(BackupWriter::open(folder_, problem)) << spare;
    if (problem.isWrongFolder) {
      EXPECT_THAT(problem.text, HasSubstr("\"notes.txt\""));
      EXPECT_GT(spare, 2U);
      return;
    }
    EXPECT_THAT(problem.text, EndsWith("Too many open files"));
  }
  FAIL() << "it never had enough";
}

TEST_F(BackupFolderTest, ABackupThatCannotBeLookedAtIsNotTakenForNone) {
  makeBackup(folder_);
  for (rlim_t spare = 0; spare < 20; ++spare) {
    std::string problem;
    const DescriptorLimit limit(spare);
    if (readBackup(folder_, problem)) {
      EXPECT_GT(spare, 0U);
      return;
    }
    EXPECT_THAT(problem, EndsWith("cannot be read: Too many open files"));
  }
  FAIL() << "it never had enough";
}

TEST_F(BackupFolderTest, AFileSystemThatTakesNoBackupIsNotAWrongFolder) {
  BackupProblem problem;
  EXPECT_FALSE(BackupWriter::open("/proc/phone", problem));
  EXPECT_FALSE(problem.isWrongFolder);
  EXPECT_THAT(problem.text, EndsWith("cannot write the backup /proc/phone: "
                                     "No such file or directory"));
}

TEST_F(BackupFolderTest, AFullDiskEndsTheBackupAndLeavesTheOlderOne) {
  makeBackup(folder_, "old");
  auto writer = openWriter(folder_);
  rlimit before{};
  ::getrlimit(RLIMIT_FSIZE, &before);
  const auto handler = std::signal(SIGXFSZ, SIG_IGN);
  const rlimit tight{100'000, before.rlim_max};
  ::setrlimit(RLIMIT_FSIZE, &tight);
  EXPECT_TRUE(addLists(*writer, "new"));
  EXPECT_FALSE(addArchive(*writer, "com.a", Archive));
  ::setrlimit(RLIMIT_FSIZE, &before);
  std::signal(SIGXFSZ, handler);

  EXPECT_THAT(writer->problem(), EndsWith("com.a.tar: File too large"));
  writer->dropData();
  EXPECT_FALSE(addArchive(*writer, "com.b", "small"));
  EXPECT_FALSE(writer->finish());
  writer.reset();
  EXPECT_EQ(applicationsOf(folder_), "old");
  EXPECT_EQ(namesIn(around_.path()), std::vector<std::string>{"phone"});
}

TEST_F(BackupFolderTest, AnIdentifierThatCannotBeAFileNameIsRefused) {
  const auto writer = openWriter(folder_);
  EXPECT_FALSE(writer->beginData("../../evil"));
  EXPECT_FALSE(fs::exists(around_ / "evil.tar"));
}

TEST_F(BackupFolderTest, WhatIsNoBackupIsNotRead) {
  EXPECT_THAT(objection(around_ / "missing"), EndsWith("there is no such folder"));
  testing::putFile(around_ / "file", "");
  EXPECT_THAT(objection(around_ / "file"), EndsWith("it is no folder"));
  fs::create_directory(folder_);
  EXPECT_THAT(objection(folder_), EndsWith("it holds no Manifest.plist, so it is no backup"));
  testing::putFile(folder_ / "Manifest.plist", "");
  EXPECT_THAT(objection(folder_), EndsWith("its manifest is damaged"));
  fs::remove(folder_ / "Manifest.plist");
  fs::create_symlink("/etc/passwd", folder_ / "Manifest.plist");
  EXPECT_THAT(objection(folder_), EndsWith("Manifest.plist is a link"));
}

TEST_F(BackupFolderTest, AManifestThatDoesNotDescribeABackupIsRefused) {
  const PropertyList entry =
      PropertyList::Dictionary{{"Size", 1}, {"SHA256", std::string(64, 'a')}};
  const auto withFile = [&](const char* path, const PropertyList& value) {
    fs::remove_all(folder_);
    makeBackup(folder_);
    editManifest(folder_,
                 [&](auto& manifest) { (*manifest.at("Files").asDictionary())[path] = value; });
    return objection(folder_);
  };
  for (const char* path : {"../x", "/etc/passwd", "Data/../../x.tar", "Data/...tar"}) {
    EXPECT_THAT(withFile(path, entry), HasSubstr("which leads outside")) << path;
  }
  for (const char* path :
       {"Data/a/b.tar", "Data/.tar", "Data/com.a", "notes.txt", "", "Data/a b.tar"}) {
    EXPECT_THAT(withFile(path, entry), EndsWith("which belongs to no backup")) << path;
  }
  for (const PropertyList& value :
       {PropertyList(1), PropertyList(PropertyList::Dictionary{{"Size", 1}}),
        PropertyList(PropertyList::Dictionary{{"Size", -1}, {"SHA256", std::string(64, 'a')}}),
        PropertyList(PropertyList::Dictionary{{"Size", 1}, {"SHA256", "abc"}})}) {
    EXPECT_THAT(withFile("Data/com.b.tar", value),
                EndsWith("lacks the size or digest of \"Data/com.b.tar\""));
  }
}

TEST_F(BackupFolderTest, AManifestThatLacksAListIsRefused) {
  makeBackup(folder_);
  editManifest(folder_, [](auto& manifest) {
    manifest.at("Files").asDictionary()->erase("DemotedApps.plist");
  });
  EXPECT_THAT(objection(folder_), EndsWith("its manifest does not name DemotedApps.plist"));
  editManifest(folder_, [](auto& manifest) { manifest.erase("Files"); });
  EXPECT_THAT(objection(folder_), EndsWith("its manifest is damaged"));
}

TEST_F(BackupFolderTest, ADamagedListSpoilsTheBackupAndIsNamed) {
  for (const char* name : {"RestoreApplications.plist", "DemotedApps.plist", "IconState.plist"}) {
    makeBackup(folder_);
    flipByte(folder_ / name, 3);
    EXPECT_THAT(objection(folder_), EndsWith(std::string(name) + " does not match its digest"));
    testing::putFile(folder_ / name, "cut");
    EXPECT_THAT(objection(folder_),
                EndsWith(std::string(name) + " is shorter or longer than the manifest tells"));
    fs::remove(folder_ / name);
    EXPECT_THAT(objection(folder_), EndsWith(std::string(name) + " is missing"));
    fs::create_symlink("/etc/passwd", folder_ / name);
    EXPECT_THAT(objection(folder_), EndsWith(std::string(name) + " is a link"));
    fs::remove(folder_ / name);
    ASSERT_EQ(::mkfifo((folder_ / name).c_str(), 0600), 0);
    EXPECT_THAT(objection(folder_), EndsWith(std::string(name) + " is no file"));
    fs::remove(folder_ / name);
  }
}

TEST_F(BackupFolderTest, ADamagedArchiveSpoilsOnlyItself) {
  makeBackup(folder_);
  const fs::path archive = folder_ / "Data/com.a.tar";
  for (const std::size_t offset : {std::size_t{0}, Archive.size() / 2, Archive.size() - 1}) {
    flipByte(archive, offset);
    EXPECT_EQ(readArchive(folder_, "com.a").second, "com.a.tar does not match its digest");
    flipByte(archive, offset);
  }
  EXPECT_EQ(readArchive(folder_, "com.a").second, "");
  const std::string size = "com.a.tar is shorter or longer than the manifest tells";
  testing::putFile(archive, Archive + "x");
  EXPECT_EQ(readArchive(folder_, "com.a"), std::pair(std::string(), size));
  testing::putFile(archive, "");
  EXPECT_EQ(readArchive(folder_, "com.a"), std::pair(std::string(), size));
  fs::remove(archive);
  EXPECT_EQ(readArchive(folder_, "com.a").second, "com.a.tar is missing");
}

TEST_F(BackupFolderTest, AnArchiveIsReadThroughNoLink) {
  makeBackup(folder_);
  fs::rename(folder_ / "Data", around_ / "Data");
  fs::create_directory_symlink(around_ / "Data", folder_ / "Data");
  EXPECT_EQ(readArchive(folder_, "com.a").second, "com.a.tar is a link");
}

}  // namespace
}  // namespace appsync::host
