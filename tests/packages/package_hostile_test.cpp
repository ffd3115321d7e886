#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>

#include "tests/packages/package_builder.h"

namespace appsync::package_tests {
namespace {

using Kind = RawEntry::Kind;
using ::testing::HasSubstr;

struct Hostile {
  std::string what;
  std::vector<RawEntry> entries;
  std::string refusal;
};

std::vector<Hostile> hostilePackages() {
  const std::string deep = [] {
    std::string path = "Sample.app";
    for (int i = 0; i < 32; ++i) path += "/d";
    return path;
  }();
  return {
      {"temporary", sampleEntriesAnd({"Sample.app/.appsync-0123456789abcdef", "x"}), "unsafe name"},
      {"parent", sampleEntriesAnd({"../evil", "x"}), "parent name"},
      {"parentInside", sampleEntriesAnd({"Sample.app/../../evil", "x"}), "parent name"},
      {"parentThatReturns", sampleEntriesAnd({"Sample.app/a/../b", "x"}), "parent name"},
      {"parentFolder", sampleEntriesAnd(RawEntry::folder("Sample.app/../..")), "parent name"},
      {"parentAtEnd", sampleEntriesAnd({"Sample.app/..", "x"}), "parent name"},
      {"absolute", sampleEntriesAnd({"/witness", "x"}), "absolute name"},
      {"absoluteTwoSlashes", sampleEntriesAnd({"//witness", "x"}), "absolute name"},
      {"symbolicLink", sampleEntriesAnd({"Sample.app/l", "Info.plist", Kind::SymbolicLink}),
       "link"},
      {"absoluteLink", sampleEntriesAnd({"Sample.app/l", "/etc/passwd", Kind::SymbolicLink}),
       "link"},
      {"writeThroughLink",
       {{"Sample.app/l", "../..", Kind::SymbolicLink}, {"Sample.app/l/witness", "x"}},
       "link"},
      {"bundleIsLink",
       {{"Sample.app", "..", Kind::SymbolicLink}, {"Sample.app/witness", "x"}},
       "link"},
      {"setUserId", sampleEntriesAnd({"Sample.app/s", "x", Kind::File, 04755}), "privileged mode"},
      {"setGroupId", sampleEntriesAnd({"Sample.app/s", "x", Kind::File, 02755}), "privileged mode"},
      {"sticky", sampleEntriesAnd(RawEntry::folder("Sample.app/s", 01777)), "privileged mode"},
      {"newline", sampleEntriesAnd({"Sample.app/a\nb", "x"}), "unsafe name"},
      {"escape", sampleEntriesAnd({"Sample.app/a\x1b[2Jb", "x"}), "unsafe name"},
      {"delete", sampleEntriesAnd({"Sample.app/a\x7f", "x"}), "unsafe name"},
      {"c1Control", sampleEntriesAnd({"Sample.app/a\xc2\x9b", "x"}), "unsafe name"},
      {"turnedReading", sampleEntriesAnd({"Sample.app/a\xe2\x80\xaegnp.exe", "x"}), "unsafe name"},
      {"noUtf8", sampleEntriesAnd({"Sample.app/\xff\xfe", "x"}), "unsafe name"},
      {"overlongSlash", sampleEntriesAnd({"Sample.app/a\xc0\xaf..", "x"}), "unsafe name"},
      {"longComponent", sampleEntriesAnd({"Sample.app/" + std::string(256, 'n'), "x"}),
       "unsafe name"},
      {"longPath",
       sampleEntriesAnd({"Sample.app/" + std::string(250, 'a') + "/" + std::string(250, 'b') + "/" +
                             std::string(250, 'c') + "/" + std::string(250, 'd') + "/" +
                             std::string(50, 'e'),
                         "x"}),
       "unsafe name"},
      {"deep", sampleEntriesAnd({deep, "x"}), "unsafe name"},
      {"sameFileTwice", sampleEntriesAnd({"Sample.app/run.sh", "other"}), "duplicate name"},
      {"otherCase", sampleEntriesAnd({"Sample.app/RUN.sh", "other"}), "duplicate name"},
      {"otherCaseFolder", sampleEntriesAnd({"Sample.app/pages/two.txt", "x"}), "duplicate name"},
      {"otherCaseBundle", sampleEntriesAnd({"SAMPLE.app/two.txt", "x"}), "duplicate name"},
      {"otherCaseBeyondAscii",
       {{"Sample.app/\xc3\x89t\xc3\xa9", "x"}, {"Sample.app/\xc3\xa9t\xc3\x89", "y"}},
       "duplicate name"},
      {"otherForm",
       {{"Sample.app/caf\u00e9", "x"}, {"Sample.app/cafe\u0301", "y"}},
       "duplicate name"},
      {"otherFormFolder",
       {{"Sample.app/\u1fb4/x", "x"}, {"Sample.app/\u03b1\u0345\u0301/y", "y"}},
       "duplicate name"},
      {"foldsIntoSeveral",
       {{"Sample.app/Stra\u00dfe", "x"}, {"Sample.app/STRASSE", "y"}},
       "duplicate name"},
      {"sameAfterDots", sampleEntriesAnd({"./Sample.app//./run.sh", "other"}), "duplicate name"},
      {"fileThenFolder", sampleEntriesAnd({"Sample.app/run.sh/inner", "x"}), "duplicate name"},
      {"folderThenFile", sampleEntriesAnd({"Sample.app/Pages", "x"}), "duplicate name"},
      {"twoApplications", sampleEntriesAnd({"Other.app/Info.plist", infoPlist()}),
       "several applications"},
      {"foreignFile", sampleEntriesAnd({"README", "x"}), "foreign entry"},
      {"foreignFolder", sampleEntriesAnd(RawEntry::folder("lib")), "foreign entry"},
      {"hiddenBundle", sampleEntriesAnd({".app/x", "x"}), "foreign entry"},
      {"bundleIsFile", {{"Sample.app", "x"}}, "foreign entry"},
      {"metadataIsFolder", sampleEntriesAnd(RawEntry::folder("HalvoMetadata.plist/")),
       "foreign entry"},
      {"nothing", {}, "no application"},
      {"onlyMetadata", {{"HalvoMetadata.plist", "x"}}, "no application"},
      {"noInfo", {{"Sample.app/run.sh", "x"}}, "bad information"},
      {"infoIsFolder", {RawEntry::folder("Sample.app/Info.plist/")}, "bad information"},
      {"infoIsNoPropertyList", {{"Sample.app/Info.plist", "hello"}}, "bad information"},
      {"infoIsHuge", {{"Sample.app/Info.plist", std::string(2 << 20, ' ')}}, "bad information"},
      {"noExecutable", {{"Sample.app/Info.plist", infoPlist()}}, "bad information"},
      {"otherIdentifier",
       {{"Sample.app/Info.plist", infoPlist("com.example.other")}},
       "wrong identifier"},
  };
}

std::vector<Hostile> hostileTars() {
  return {
      {"hardLink", sampleEntriesAnd({"Sample.app/h", "Sample.app/run.sh", Kind::HardLink}), "link"},
      {"hardLinkOutside", sampleEntriesAnd({"Sample.app/h", "../witness", Kind::HardLink}), "link"},
      {"pipe", sampleEntriesAnd({"Sample.app/p", "", Kind::Pipe}), "special file"},
      {"device", sampleEntriesAnd({"Sample.app/d", "", Kind::CharacterDevice}), "special file"},
  };
}

void expectRefused(ArchiveForm form, const Hostile& hostile) {
  SCOPED_TRACE(std::string(name(form)) + " " + hostile.what);
  const Outcome outcome = unpack(buildArchive(form, hostile.entries));
  EXPECT_EQ(outcome.result(), hostile.refusal) << outcome.reason();
  EXPECT_FALSE(outcome.outsideTouched);
  EXPECT_TRUE(outcome.reason().starts_with(hostile.refusal + ": ")) << outcome.reason();
  EXPECT_EQ(outcome.reason().find('\n'), std::string::npos);
  for (const auto& [path, item] : outcome.files)
    EXPECT_TRUE(item.starts_with("file ") || item.starts_with("folder ")) << path << " " << item;
}

TEST(HostilePackage, IsRefusedWithItsNamedReasonAndTouchesNothingElse) {
  for (const Hostile& hostile : hostilePackages())
    for (const ArchiveForm form : {ArchiveForm::Zip, ArchiveForm::Tar})
      expectRefused(form, hostile);
}

TEST(HostilePackage, MayNotHoldWhatOnlyTarKnows) {
  for (const Hostile& hostile : hostileTars()) expectRefused(ArchiveForm::Tar, hostile);
}

TEST(HostilePackage, WithUnusableIdentifierIsRefused) {
  for (const std::string_view identifier :
       {"", "..", ".", "a..b", "../evil", "com/evil", "com evil", "com.evil\n", "\xc3\xa9"}) {
    const std::vector<RawEntry> entries{{"Sample.app/Info.plist", infoPlist(identifier)},
                                        {"Sample.app/run.sh", "x"}};
    const Outcome outcome = unpack(buildArchive(ArchiveForm::Tar, entries), std::nullopt);
    EXPECT_EQ(outcome.result(), "bad information") << identifier << ": " << outcome.reason();
  }
}

/// The bytes with every occurrence of `from` replaced by `to` of the same length.
std::string patched(std::string bytes, std::string_view from, std::string_view to) {
  for (std::size_t at = 0; (at = bytes.find(from, at)) != std::string::npos; at += to.size())
    bytes.replace(at, from.size(), to);
  return bytes;
}

TEST(HostileZip, MayNotHideTheEndOfANameBehindANul) {
  const std::string zip =
      buildArchive(ArchiveForm::Zip, sampleEntriesAnd({"Sample.app/a.txt.sh", "x"}));
  const std::string_view name("Sample.app/a.txt\0sh", 19);
  const Outcome outcome = unpack(patched(zip, "Sample.app/a.txt.sh", name));
  EXPECT_EQ(outcome.result(), "unsafe name");
  EXPECT_THAT(outcome.reason(), HasSubstr("NUL"));
}

TEST(HostileZip, MayNotListOtherNamesThanItUnpacks) {
  std::string zip = buildArchive(ArchiveForm::Zip, sampleEntriesAnd({"Sample.app/good", "x"}));
  zip.replace(zip.rfind("Sample.app/good"), 15, "Sample.app/evil");
  EXPECT_EQ(unpack(zip).result(), "damaged");
}

TEST(HostileZip, ThatIsEncryptedIsRefusedAsSuch) {
  std::string zip = buildArchive(ArchiveForm::Zip, sampleEntries());
  for (const auto& [signature, flags] : {std::pair("PK\x03\x04", 6), std::pair("PK\x01\x02", 8)}) {
    for (std::size_t at = 0; (at = zip.find(signature, at)) != std::string::npos; at += 4) {
      char& flag = zip[at + static_cast<std::size_t>(flags)];
      flag = static_cast<char>(flag | 1);
    }
  }
  EXPECT_EQ(unpack(zip).result(), "encrypted");
}

TEST(HostileZip, OfSeveralPartsIsRefused) {
  std::string zip = buildArchive(ArchiveForm::Zip, sampleEntries());
  zip[zip.rfind("PK\x05\x06") + 4] = 1;
  const Outcome outcome = unpack(zip);
  EXPECT_EQ(outcome.result(), "damaged");
  EXPECT_THAT(outcome.reason(), HasSubstr("several parts"));
}

TEST(HostileZip, WithSomethingBehindItsEndIsRefused) {
  EXPECT_EQ(unpack(buildArchive(ArchiveForm::Zip, sampleEntries()) + "more").result(), "damaged");
}

TEST(HostileTar, WithSomethingBehindItsEndIsRefused) {
  EXPECT_EQ(unpack(buildArchive(ArchiveForm::Tar, sampleEntries()) + "more").result(), "damaged");
}

TEST(ForeignFile, IsNoArchive) {
  EXPECT_EQ(unpack("").result(), "not an archive");
  EXPECT_EQ(unpack("P").result(), "not an archive");
  EXPECT_EQ(unpack("hello, world").result(), "not an archive");
  EXPECT_EQ(unpack(std::string(100'000, 'z')).result(), "not an archive");
}

}  // namespace
}  // namespace appsync::package_tests
