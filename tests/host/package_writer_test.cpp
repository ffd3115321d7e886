#include "packages/package_writer.h"

#include <sys/stat.h>
#include <unistd.h>

#include "packages/archive_reader.h"
#include "platform/bundle.h"
#include "tests/host/host_files.h"
#include "tests/test_pch.h"

namespace appsync::host {
namespace {

using namespace testing;
using ::testing::ElementsAre;
using ::testing::EndsWith;
using ::testing::HasSubstr;
namespace fs = std::filesystem;

class PackageWriting : public ::testing::Test {
 protected:
  PackageWriting() {
    putFile(app / "Info.plist", xmlText(appInfo("com.a", "1.0", "Alpha")));
    putFile(app / "run", "#!/bin/sh\n");
    fs::permissions(app / "run", fs::perms::owner_exec, fs::perm_options::add);
    putFile(app / "pages" / "índice.html", "<p>hello");
  }

  std::optional<WrittenPackage> write(const fs::path& output) {
    problem.clear();
    return writePackage(app, output, problem);
  }
  std::string refusal() {
    EXPECT_FALSE(write(folder / "out.zip"));
    EXPECT_FALSE(fs::exists(folder / "out.zip"));
    return problem;
  }
  /// Names of everything in the folder: nothing may be left over beside the output.
  std::vector<std::string> folderNames() {
    std::vector<std::string> names;
    for (const auto& item : fs::directory_iterator(folder.path())) {
      names.push_back(item.path().filename().string());
    }
    std::sort(names.begin(), names.end());
    return names;
  }

  Folder folder;
  const fs::path app = folder / "Alpha.app";
  std::string problem;
};

TEST_F(PackageWriting, MakesEveryFormat) {
  putFile(folder / "HalvoMetadata.plist", "metadata");
  putFile(folder / "HalvoArtwork", "artwork");
  for (const char* name :
       {"a.zip", "a.tar", "a.tar.gz", "a.TGZ", "a.tar.xz", "a.tar.zst", "a.tar.bz2"}) {
    const auto package = write(folder / name);
    ASSERT_TRUE(package) << name << ": " << problem;
    EXPECT_EQ(package->identifier + " " + package->version, "com.a 1.0");
    EXPECT_EQ(package->bytes, fs::file_size(folder / name));
    std::vector<std::string> names;
    ArchiveReader reader(folder / name);
    while (reader.next()) names.push_back(reader.name());
    EXPECT_THAT(names, ElementsAre("Alpha.app/", "Alpha.app/Info.plist", "Alpha.app/pages/",
                                   "Alpha.app/pages/índice.html", "Alpha.app/run", "HalvoArtwork",
                                   "HalvoMetadata.plist"))
        << name;
  }
}

TEST_F(PackageWriting, GivesTheSameBytesForTheSameFolder) {
  for (const char* ending : {".zip", ".tar.gz", ".tar.xz", ".tar.zst", ".tar.bz2"}) {
    ASSERT_TRUE(write(folder / ("one" + std::string(ending))));
    fs::last_write_time(app / "run", fs::file_time_type::clock::now() + std::chrono::hours(30));
    fs::permissions(app / "Info.plist", fs::perms::owner_read);
    ASSERT_TRUE(write(folder / ("two" + std::string(ending))));
    EXPECT_EQ(fileText(folder / ("one" + std::string(ending))),
              fileText(folder / ("two" + std::string(ending))))
        << ending;
  }
}

TEST_F(PackageWriting, ReplacesAnOlderPackageAndLeavesNothingElse) {
  putFile(folder / "out.zip", "old");
  ASSERT_TRUE(write(folder / "out.zip"));
  EXPECT_NE(fileText(folder / "out.zip"), "old");
  EXPECT_THAT(folderNames(), ElementsAre("Alpha.app", "out.zip"));
}

TEST_F(PackageWriting, KeepsAnOlderPackageWhenItFails) {
  putFile(folder / "out.zip", "old");
  fs::remove(app / "Info.plist");
  EXPECT_FALSE(write(folder / "out.zip"));
  EXPECT_EQ(fileText(folder / "out.zip"), "old");
  EXPECT_THAT(folderNames(), ElementsAre("Alpha.app", "out.zip"));
}

TEST_F(PackageWriting, InsistsOnADescription) {
  fs::remove(app / "Info.plist");
  EXPECT_THAT(refusal(), EndsWith("Alpha.app has no Info.plist"));
  putFile(app / "Info.plist", "garbage");
  EXPECT_THAT(refusal(), EndsWith("Info.plist is no property list with a dictionary"));
  putFile(app / "Info.plist", xmlText(appInfo("../up", "1", "A")));
  EXPECT_THAT(refusal(), EndsWith("Info.plist has no usable KBBundleIdentifier"));
}

TEST_F(PackageWriting, InsistsOnTheExecutableThatIsNamed) {
  fs::remove(app / "run");
  EXPECT_THAT(refusal(), EndsWith("names the executable \"run\", which is not there"));
}

TEST_F(PackageWriting, RefusesLinksAndOtherSpecialFiles) {
  fs::create_symlink("run", app / "link");
  EXPECT_THAT(refusal(), EndsWith("link is a link, which packages may not hold"));
  fs::remove(app / "link");
  ASSERT_EQ(::mkfifo((app / "pipe").c_str(), 0600), 0);
  EXPECT_THAT(refusal(), EndsWith("pipe is neither a file nor a folder"));
  fs::remove(app / "pipe");
  ASSERT_EQ(::chmod((app / "run").c_str(), 04755), 0);
  EXPECT_THAT(refusal(), EndsWith("run has a set-id or sticky bit, which packages may not hold"));
}

TEST_F(PackageWriting, RefusesNamesThatThePhoneCannotKeepApart) {
  putFile(app / "README", "one");
  putFile(app / "ReadMe", "two");
  EXPECT_THAT(refusal(), HasSubstr("the phone would refuse this package: "));
  fs::remove(app / "README");
  fs::remove(app / "ReadMe");
  putFile(app / "a\nb", "x");
  EXPECT_THAT(refusal(), EndsWith("has an unusable name"));
}

TEST_F(PackageWriting, RefusesPlacesThatMakeNoSense) {
  EXPECT_FALSE(write(folder / "out.rar"));
  EXPECT_THAT(problem, HasSubstr("must end in .zip, "));
  EXPECT_FALSE(write(app / "out.zip"));
  EXPECT_EQ(problem, "the package cannot lie inside its own folder");
  EXPECT_FALSE(write(folder / "nowhere" / "out.zip"));
  EXPECT_THAT(problem, HasSubstr("No such file or directory"));
  EXPECT_FALSE(writePackage(folder / "missing.app", folder / "out.zip", problem));
  EXPECT_THAT(problem, EndsWith("missing.app is no folder"));
  EXPECT_FALSE(writePackage(folder.path(), folder / "out.zip", problem));
  EXPECT_THAT(problem, EndsWith("is not called NAME.app"));
}

}  // namespace
}  // namespace appsync::host
