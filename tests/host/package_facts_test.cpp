#include "packages/package_facts.h"

#include "host/library/library.h"
#include "platform/bundle.h"
#include "tests/host/host_files.h"
#include "tests/test_pch.h"

namespace appsync::host {
namespace {

using namespace testing;
using ::testing::HasSubstr;

class PackageReading : public ::testing::Test {
 protected:
  /// "identifier version name", or "package: reason" or "no package: reason".
  std::string read(const std::string& name) {
    UnreadablePackage failure;
    const auto package = readPackage(folder / name, failure);
    if (package) return package->identifier + " " + package->version + " " + package->name;
    EXPECT_EQ(failure.file, name);
    return (failure.looksLikePackage ? "package: " : "no package: ") + failure.reason;
  }

  std::string readPacked(const Entries& entries) {
    pack(folder / "a.zip", entries);
    return read("a.zip");
  }

  std::string readInfo(const PropertyList& info) {
    return readPacked({{"A.app/Info.plist", xmlText(info)}});
  }

  Folder folder;
};

TEST_F(PackageReading, ReadsEveryFormat) {
  for (const char* file : {"a.zip", "a.tar", "a.tar.gz", "a.tar.xz", "a.tar.zst", "a.tar.bz2"}) {
    pack(folder / file, sampleEntries("com.a", "1.2", "Alpha"));
    EXPECT_EQ(read(file), "com.a 1.2 Alpha") << file;
  }
}

TEST_F(PackageReading, TakesTheFoldersNameWhenThereIsNoDisplayName) {
  auto info = appInfo("com.a", "1", "");
  EXPECT_EQ(readInfo(info), "com.a 1 A");
  info.erase(std::string(KBBundleDisplayName));
  info.erase(std::string(KBBundleVersion));
  EXPECT_EQ(readInfo(info), "com.a  A");
}

TEST_F(PackageReading, KnowsAPackageByItsContentsWhateverItsEnding) {
  pack(folder / "a.zip", sampleEntries("com.a"));
  std::filesystem::rename(folder / "a.zip", folder / "mislabelled.txt");
  EXPECT_EQ(read("mislabelled.txt"), "com.a 1.0 Sample");
}

TEST_F(PackageReading, ReadsAPackageWhoseBodyIsDamaged) {
  Entries entries = sampleEntries("com.a");
  entries.erase("HalvoArtwork");
  entries.erase("HalvoMetadata.plist");
  entries["Sample.app/body"] = std::string(100'000, 'x');
  pack(folder / "a.tar", entries);
  std::filesystem::resize_file(folder / "a.tar", 20'000);
  EXPECT_EQ(read("a.tar"), "com.a 1.0 Sample");
}

TEST_F(PackageReading, TellsWhyAFileIsNoPackage) {
  putFile(folder / "notes.txt", "buy milk");
  EXPECT_EQ(read("notes.txt"), "no package: it is neither a zip nor a tar archive");
  putFile(folder / "empty.zip", "");
  EXPECT_EQ(read("empty.zip"), "package: it is neither a zip nor a tar archive");
  putFile(folder / "noise.tar.gz", std::string("\x1f\x8b\x08") + std::string(500, '\x55'));
  EXPECT_THAT(read("noise.tar.gz"), ::testing::StartsWith("package: "));
  EXPECT_THAT(readPacked({{"readme", "hello"}}), HasSubstr("holds no application"));
  EXPECT_THAT(readPacked({{"deep/A.app/Info.plist", "x"}}), HasSubstr("holds no application"));
}

TEST_F(PackageReading, TellsWhatIsWrongWithTheInformationDictionary) {
  EXPECT_EQ(readPacked({{"A.app/Info.plist", "no list"}}),
            "package: its Info.plist is no property list that can be read");
  EXPECT_EQ(readInfo(PropertyList::Array{"com.a"}),
            "package: its Info.plist is no property list that can be read");
  EXPECT_EQ(readInfo(PropertyList::Dictionary{{std::string(KBBundleIdentifier), 7}}),
            "package: its Info.plist names no KBBundleIdentifier");
  EXPECT_EQ(readInfo(appInfo("../up", "1", "A")),
            "package: its identifier \"../up\" cannot be used");
  EXPECT_EQ(readInfo(appInfo("com.a", "1\n2", "A")),
            "package: its version \"1\uFFFD2\" cannot be used");
}

TEST_F(PackageReading, RefusesAnInformationDictionaryBeyondMeasure) {
  EXPECT_EQ(readPacked({{"A.app/Info.plist", std::string(3 << 20, 'x')}}),
            "package: A.app/Info.plist is larger than 1.0 MB");
}

TEST_F(PackageReading, TakesControlCharactersOutOfTheName) {
  EXPECT_EQ(readInfo(appInfo("com.a", "1", "Evil\tname")), "com.a 1 Evil\uFFFDname");
}

TEST_F(PackageReading, CollectsWhatThePhoneShowsBeforeThePackageArrives) {
  pack(folder / "a.tar.gz", sampleEntries("com.a"));
  const PackageParts parts = readPackageParts(folder / "a.tar.gz");
  EXPECT_EQ(parts.iconName, "Icon.png");
  EXPECT_EQ(asText(parts.icon.value()), "icon of com.a");
  EXPECT_EQ(asText(parts.artwork.value()), "artwork");
  EXPECT_TRUE(parts.metadata.has_value());
  EXPECT_EQ(asText(parts.infoPlist.value()), xmlText(appInfo("com.a", "1.0", "Sample")));
}

TEST_F(PackageReading, FindsAnIconThatIsNamedWithoutItsEnding) {
  auto info = appInfo("com.a", "1", "A");
  info[std::string(KBBundleIconFile)] = "Picture";
  pack(folder / "a.zip", {{"A.app/Info.plist", xmlText(info)}, {"A.app/Picture.png", "png"}});
  EXPECT_EQ(readPackageParts(folder / "a.zip").iconName, "Picture.png");
}

TEST_F(PackageReading, LeavesAnIconOutsideTheBundleAlone) {
  for (const char* icon : {"../Icon.png", "sub/Icon.png", "Info.plist", ".."}) {
    auto info = appInfo("com.a", "1", "A");
    info[std::string(KBBundleIconFile)] = icon;
    pack(folder / "a.zip",
         {{"A.app/Info.plist", xmlText(info)}, {"A.app/sub/Icon.png", "png"}, {"Icon.png", "png"}});
    EXPECT_FALSE(readPackageParts(folder / "a.zip").icon) << icon;
  }
}

TEST_F(PackageReading, GoesOnBehindAPartThatIsTooLarge) {
  pack(folder / "a.tar", {{"A.app/Info.plist", xmlText(appInfo("com.a", "1", "A"))},
                          {"A.app/Icon.png", std::string(17 << 20, 'x')},
                          {"HalvoArtwork", "artwork"},
                          {"z", "behind"}});
  const PackageParts parts = readPackageParts(folder / "a.tar");
  EXPECT_FALSE(parts.icon);
  EXPECT_TRUE(parts.infoPlist && parts.artwork);
}

TEST_F(PackageReading, GivesNothingForAMissingFile) {
  const PackageParts parts = readPackageParts(folder / "missing.zip");
  EXPECT_FALSE(parts.infoPlist || parts.icon || parts.metadata || parts.artwork);
  EXPECT_THAT(read("missing.zip"), HasSubstr("No such file"));
}

TEST_F(PackageReading, OfALibraryIsNotStoppedByOneFile) {
  packSample(folder / "a.zip", "com.a");
  putFile(folder / "b.zip", "garbage");
  packSample(folder / "c.zip", "com.c");
  putFile(folder / ".hidden.zip", "garbage");
  putFile(folder / "sub" / "d.zip", "garbage");
  std::string problem;
  const auto library = readLibrary(folder.path(), problem);
  ASSERT_TRUE(library);
  EXPECT_TRUE(library->find("com.a") && library->find("com.c"));
  ASSERT_EQ(library->unreadable.size(), 1U);
  EXPECT_EQ(library->unreadable[0].file, "b.zip");
}

TEST_F(PackageReading, OfALibraryTakesTheHighestVersion) {
  packSample(folder / "a.zip", "com.a", "1.9");
  packSample(folder / "b.zip", "com.a", "1.10");
  packSample(folder / "c.zip", "com.a", "1.2");
  std::string problem;
  const auto library = readLibrary(folder.path(), problem);
  ASSERT_TRUE(library && library->find("com.a"));
  EXPECT_EQ(library->packages.size(), 1U);
  EXPECT_EQ(library->find("com.a")->file.filename(), "b.zip");
}

TEST_F(PackageReading, OfALibraryPassesOverADamagedPackageBesideAWholeOne) {
  packSample(folder / "a.zip", "com.a", "1.0", 20'000);
  packSample(folder / "b.zip", "com.a", "1.0", 20'000);
  packSample(folder / "c.zip", "com.a", "0.9");
  std::string bytes = fileText(folder / "a.zip");
  bytes[bytes.size() / 2] = static_cast<char>(bytes[bytes.size() / 2] ^ 1);
  putFile(folder / "a.zip", bytes);
  std::string problem;
  const Library library = readLibrary(folder.path(), problem).value();
  EXPECT_EQ(library.find("com.a")->file, folder / "b.zip");
  ASSERT_THAT(library.unreadable, ::testing::SizeIs(1));
  EXPECT_EQ(library.unreadable[0].file, "a.zip");
  EXPECT_FALSE(library.unreadable[0].looksLikePackage);
  EXPECT_THAT(library.unreadable[0].reason,
              ::testing::AllOf(::testing::StartsWith("damaged: "),
                               ::testing::EndsWith("; b.zip is used instead")));
}

TEST_F(PackageReading, OfALibraryLeavesPackagesThatAreAllDamagedToThePhone) {
  for (const char* name : {"a.tar", "b.tar"}) {
    packSample(folder / name, "com.a", "1.0", 20'000);
    std::filesystem::resize_file(folder / name, 12'000);
  }
  std::string problem;
  const Library library = readLibrary(folder.path(), problem).value();
  EXPECT_EQ(library.find("com.a")->file, folder / "a.tar");
  EXPECT_THAT(library.unreadable, ::testing::IsEmpty());
}

TEST_F(PackageReading, OfALibraryThatIsNotThereNamesIt) {
  std::string problem;
  EXPECT_FALSE(readLibrary(folder / "nowhere", problem));
  EXPECT_THAT(problem, HasSubstr("nowhere: No such file"));
}

}  // namespace
}  // namespace appsync::host
