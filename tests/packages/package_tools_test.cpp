#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <cstdlib>

#include "tests/packages/package_builder.h"

namespace appsync::package_tests {
namespace {

namespace fs = std::filesystem;

/// A package as the tools that people have make it, from a folder with the sample application.
struct Tool {
  std::string name;
  std::string command;  ///< run in the folder; makes ../package
};

std::vector<Tool> tools() {
  const std::string all = " Sample.app HalvoMetadata.plist HalvoArtwork";
  return {
      {"InfoZip", "zip -q -r ../p.zip" + all + " && mv ../p.zip ../package"},
      {"InfoZipFromHere", "zip -q -r ../p.zip . && mv ../p.zip ../package"},
      {"InfoZipWithoutFolders", "zip -q -r -D ../p.zip" + all + " && mv ../p.zip ../package"},
      {"InfoZipStreamed", "zip -q -r -" + all + " > ../package"},
      {"InfoZipStored", "zip -q -0 -r ../p.zip" + all + " && mv ../p.zip ../package"},
      {"InfoZipBzip2", "zip -q -Z bzip2 -r ../p.zip" + all + " && mv ../p.zip ../package"},
      {"SevenZip", "7zz a -bso0 -bsp0 -tzip ../p.zip" + all + " && mv ../p.zip ../package"},
      {"SevenZipLzma",
       "7zz a -bso0 -bsp0 -tzip -mm=LZMA ../p.zip" + all + " && mv ../p.zip ../package"},
      {"PythonCommand", "python3 -m zipfile -c ../package" + all},
      {"PythonShutil",
       "python3 -c 'import shutil; shutil.make_archive(\"../p\", \"zip\", \".\")' && "
       "mv ../p.zip ../package"},
      {"PythonTarfile",
       "python3 -m tarfile -c ../p.tar.gz" + all + " && mv ../p.tar.gz ../package"},
      {"Tar", "tar -cf ../package" + all},
      {"TarFromHere", "tar -cf ../package ."},
      {"TarV7", "tar --format=v7 -cf ../package" + all},
      {"TarUstar", "tar --format=ustar -cf ../package" + all},
      {"TarPax", "tar --format=posix -cf ../package" + all},
      {"TarSparse", "tar --format=posix -Scf ../package" + all},
      {"TarGnuSparse", "tar --format=gnu -Scf ../package" + all},
      {"TarFolderTwice",
       "tar -cf ../package Sample.app --no-recursion Sample.app "
       "HalvoMetadata.plist HalvoArtwork"},
      {"TarGz", "tar -czf ../package" + all},
      {"TarGzInParts", "tar -cf ../t" + all +
                           " && (head -c 3000 ../t | gzip; "
                           "tail -c +3001 ../t | gzip) > ../package"},
      {"TarXz", "tar -cJf ../package" + all},
      {"TarBz2", "tar -cjf ../package" + all},
      {"TarZst", "tar -c --zstd -f ../package" + all},
      {"TarZstFast", "tar -c" + all + " | zstd -q --fast=5 --check -o ../package"},
      {"TarLzma", "tar -c" + all + " | xz --format=lzma > ../package"},
  };
}

void makeSample(const fs::path& folder) {
  fakes::putFile(folder / "Sample.app/Info.plist", infoPlist());
  fakes::putFile(folder / "Sample.app/run.sh", "#!/bin/sh\necho hello\n");
  fakes::putFile(folder / "Sample.app/not-marked", "x");
  fakes::putFile(folder / "Sample.app/empty", "");
  fakes::putFile(folder / "Sample.app/with space/Gr\xc3\xbc\xc3\x9f \xe4\xb8\xad\xf0\x9f\x98\x80",
                 "names");
  fakes::putFile(folder / "Sample.app/holes", std::string(200'000, '\0') + "middle");
  fs::resize_file(folder / "Sample.app/holes", 500'000);
  fakes::putFile(folder / "Sample.app/large", [] {
    std::string text;
    for (int i = 0; i < 60'000; ++i) text += std::to_string(i * 7919);
    return text;
  }());
  fs::create_directories(folder / "Sample.app/Empty folder");
  fakes::putFile(folder / "HalvoMetadata.plist", "metadata");
  fakes::putFile(folder / "HalvoArtwork", "picture");
  ::chmod((folder / "Sample.app/run.sh").c_str(), 0755);
  ::chmod((folder / "Sample.app/not-marked").c_str(), 0640);
}

class PackageOfTool : public ::testing::TestWithParam<Tool> {};

TEST_P(PackageOfTool, UnpacksToWhatWentIn) {
  const fakes::TemporaryFolder folder;
  const fs::path source = folder / "source";
  makeSample(source);
  const std::string command = "cd '" + source.string() + "' && { " + GetParam().command + "; }";
  ASSERT_EQ(std::system(command.c_str()), 0) << command;

  const Outcome outcome = unpackFile(folder / "package");
  ASSERT_EQ(outcome.result(), "ok") << outcome.reason();
  EXPECT_FALSE(outcome.outsideTouched);
  ::chmod((source / "Sample.app/not-marked").c_str(), 0644);
  std::map<std::string, std::string> expected = fakes::snapshot(source);
  if (GetParam().name == "InfoZipWithoutFolders") expected.erase("Sample.app/Empty folder");
  EXPECT_EQ(outcome.files, expected);
  EXPECT_EQ(outcome.package->bundleName, "Sample.app");
  EXPECT_EQ(outcome.package->identifier, "com.example.sample");
  EXPECT_EQ(outcome.package->version, "1.2");
  EXPECT_EQ(outcome.package->displayName, "Sample");
  EXPECT_TRUE(outcome.package->hasMetadata);
  EXPECT_TRUE(outcome.package->hasArtwork);
}

INSTANTIATE_TEST_SUITE_P(OfOthers, PackageOfTool, ::testing::ValuesIn(tools()),
                         [](const auto& test) { return test.param.name; });

TEST(PackageOfTool, EncryptedIsRefusedAsSuch) {
  for (const std::string how : {"zip -q -P secret -r ../package.zip",
                                "7zz a -bso0 -bsp0 -tzip "
                                "-psecret -mem=AES256 ../package.zip"}) {
    const fakes::TemporaryFolder folder;
    makeSample(folder / "source");
    const std::string command =
        "cd '" + (folder / "source").string() + "' && " + how + " Sample.app";
    ASSERT_EQ(std::system(command.c_str()), 0) << command;
    const Outcome outcome = unpackFile(folder / "package.zip");
    EXPECT_EQ(outcome.result(), "encrypted") << outcome.reason();
  }
}

TEST(PackageOfTool, ThatCompressedInAWayNobodyReadsIsRefusedWithTheReason) {
  const fakes::TemporaryFolder folder;
  makeSample(folder / "source");
  const std::string command = "cd '" + (folder / "source").string() +
                              "' && 7zz a -bso0 -bsp0 -tzip -mm=Deflate64 ../p.zip Sample.app";
  ASSERT_EQ(std::system(command.c_str()), 0) << command;
  const Outcome outcome = unpackFile(folder / "p.zip");
  EXPECT_EQ(outcome.result(), "damaged");
  EXPECT_THAT(outcome.reason(), ::testing::HasSubstr("Unsupported ZIP compression method"));
}

TEST(PackageOfTool, OfTheFormatsNotTakenIsNoArchive) {
  const fakes::TemporaryFolder folder;
  makeSample(folder / "source");
  const std::string command = "cd '" + (folder / "source").string() +
                              "' && 7zz a -bso0 -bsp0 -t7z ../package.7z Sample.app && "
                              "zip -q -r - Sample.app | gzip > ../package.zip.gz";
  ASSERT_EQ(std::system(command.c_str()), 0) << command;
  EXPECT_EQ(unpackFile(folder / "package.7z").result(), "not an archive");
  EXPECT_EQ(unpackFile(folder / "package.zip.gz").result(), "not an archive");
}

TEST(PackageModes, OnlyTheOwnersRightToRunCounts) {
  const Outcome outcome = unpack(buildArchive(
      ArchiveForm::Tar, {RawEntry::folder("Sample.app", 0700),
                         {"Sample.app/Info.plist", infoPlist(), RawEntry::Kind::File, 0},
                         {"Sample.app/run.sh", "x", RawEntry::Kind::File, 0600},
                         {"Sample.app/tool", "x", RawEntry::Kind::File, 0700},
                         {"Sample.app/open", "x", RawEntry::Kind::File, 0666}}));
  ASSERT_EQ(outcome.result(), "ok") << outcome.reason();
  EXPECT_EQ(outcome.files.at("Sample.app"), "folder 0755");
  EXPECT_EQ(outcome.files.at("Sample.app/Info.plist").substr(0, 9), "file 0644");
  EXPECT_EQ(outcome.files.at("Sample.app/run.sh"), "file 0755 x") << "named as the executable";
  EXPECT_EQ(outcome.files.at("Sample.app/tool"), "file 0755 x");
  EXPECT_EQ(outcome.files.at("Sample.app/open"), "file 0644 x");
}

}  // namespace
}  // namespace appsync::package_tests
