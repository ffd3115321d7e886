#include <fcntl.h>
#include <gtest/gtest.h>
#include <sched.h>
#include <sys/mount.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>

#include "tests/packages/package_builder.h"

namespace appsync::package_tests {
namespace {

constexpr ArchiveForm Compressed[] = {ArchiveForm::Zip,    ArchiveForm::TarGz,
                                      ArchiveForm::TarBz2, ArchiveForm::TarXz,
                                      ArchiveForm::TarZst, ArchiveForm::TarLzip};

std::vector<RawEntry> sampleEntriesAndZeros(std::size_t count) {
  return sampleEntriesAnd({"Sample.app/zeros", std::string(count, '\0')});
}

std::uint64_t written(const Outcome& outcome) {
  std::uint64_t bytes = 0;
  for (const auto& [path, item] : outcome.files) bytes += item.size();
  return bytes;
}

TEST(PackageLimits, StopACompressionBombSoonAfterItShowsItself) {
  constexpr std::size_t size = std::size_t{64} << 20;
  for (const ArchiveForm form : Compressed) {
    const std::string bomb = buildArchive(form, sampleEntriesAndZeros(size));
    ASSERT_LT(bomb.size() * 200, size / 2) << name(form);
    const Outcome outcome = unpack(bomb);
    EXPECT_EQ(outcome.result(), "compression bomb") << name(form);
    EXPECT_LT(written(outcome), (std::uint64_t{20} << 20) + bomb.size() * 200) << name(form);
  }
}

TEST(PackageLimits, LetWellCompressedFilesOfOrdinarySizePass) {
  for (const ArchiveForm form : Compressed)
    EXPECT_EQ(unpack(buildArchive(form, sampleEntriesAndZeros(8 << 20))).result(), "ok")
        << name(form);
}

TEST(PackageLimits, CountEmptySpaceBehindTheArchiveToo) {
  const fakes::TemporaryFolder folder;
  fakes::putFile(folder / "package", buildArchive(ArchiveForm::TarGz, sampleEntries()));
  const std::string command =
      "head -c 100000000 /dev/zero | gzip >> '" + (folder / "package").string() + "'";
  ASSERT_EQ(std::system(command.c_str()), 0);
  EXPECT_EQ(unpackFile(folder / "package").result(), "compression bomb");
}

TEST(PackageLimits, CountBytesAsTheyComeAndNotAsAnnounced) {
  PackageLimits limits;
  limits.bytes = 10'000;
  EXPECT_EQ(unpack(buildArchive(ArchiveForm::Tar, sampleEntries()), std::nullopt, limits).result(),
            "ok");
  EXPECT_EQ(unpack(buildArchive(ArchiveForm::StoredZip, sampleEntriesAndZeros(8'000)), std::nullopt,
                   limits)
                .result(),
            "too large");
  EXPECT_EQ(
      unpack(buildArchive(ArchiveForm::Tar, sampleEntriesAndZeros(8'000)), std::nullopt, limits)
          .result(),
      "too large");
}

TEST(PackageLimits, AnnouncedSizeOfAZipEntryIsNotBelieved) {
  std::string zip = buildArchive(ArchiveForm::Zip, sampleEntriesAndZeros(100'000));
  const std::size_t central = zip.rfind("Sample.app/zeros") - 46;
  zip.replace(central + 24, 4, std::string("\x01\0\0\0", 4));
  const Outcome outcome = unpack(zip);
  EXPECT_EQ(outcome.result(), "damaged") << outcome.reason();
}

TEST(PackageLimits, RefuseMoreEntriesThanAllowed) {
  PackageLimits limits;
  limits.entries = 1000;
  std::vector<RawEntry> entries = sampleEntries();
  for (int i = 0; i < 100'001; ++i) entries.push_back({"Sample.app/f" + std::to_string(i), ""});
  for (const ArchiveForm form : {ArchiveForm::Zip, ArchiveForm::TarZst}) {
    const std::string package = buildArchive(form, entries);
    const Outcome outcome = unpack(package, std::nullopt, limits);
    EXPECT_EQ(outcome.result(), "too many entries") << name(form);
    EXPECT_LE(outcome.files.size(), limits.entries) << name(form);
  }
}

TEST(PackageLimits, CountFoldersThatTheArchiveDoesNotName) {
  PackageLimits limits;
  limits.entries = 100;
  std::vector<RawEntry> entries = sampleEntries();
  for (int i = 0; i < 10; ++i) {
    std::string path = "Sample.app/" + std::to_string(i);
    for (int depth = 0; depth < 20; ++depth) path += "/d";
    entries.push_back({path, ""});
  }
  EXPECT_EQ(unpack(buildArchive(ArchiveForm::Tar, entries), std::nullopt, limits).result(),
            "too many entries");
}

TEST(PackageLimits, HugeLimitsDoNotOverflow) {
  PackageLimits limits;
  limits.entries = limits.bytes = limits.ratio = UINT64_MAX;
  EXPECT_EQ(
      unpack(buildArchive(ArchiveForm::TarXz, sampleEntriesAndZeros(1 << 20)), std::nullopt, limits)
          .result(),
      "ok");
}

void putLine(const char* file, const std::string& line) {
  const FileDescriptor opened(::open(file, O_WRONLY | O_CLOEXEC));
  writeAll(opened.get(), asBytes(line));
}

/// Gives the process a small file system of its own in the folder; not every machine lets it.
bool mountSmallDisk(const std::filesystem::path& folder) {
  const std::string user = "0 " + std::to_string(::geteuid()) + " 1";
  const std::string group = "0 " + std::to_string(::getegid()) + " 1";
  if (::unshare(CLONE_NEWUSER | CLONE_NEWNS) != 0) return false;
  putLine("/proc/self/setgroups", "deny");
  putLine("/proc/self/uid_map", user);
  putLine("/proc/self/gid_map", group);
  return ::mount("none", folder.c_str(), "tmpfs", 0, "size=64k") == 0;
}

/// Unpacks into a file system of 64 KiB that only a child process sees; the code of the refusal, 0
/// for none, -1 where this machine lets nobody make such a file system.
int refusalOnSmallDisk(const std::string& package) {
  const fakes::TemporaryFolder folder;
  const FileDescriptor file = memoryFile(package);
  const pid_t child = ::fork();
  if (child == 0) {
    if (!mountSmallDisk(folder.path())) ::_exit(255);
    const FileDescriptor target(::open(folder.path().c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    std::optional<Error> error;
    const bool unpacked =
        extractPackage(file.get(), target.get(), std::nullopt, {}, &error).has_value();
    ::_exit(unpacked ? 0 : static_cast<int>(error->code));
  }
  int status = 0;
  ::waitpid(child, &status, 0);
  const int code = WIFEXITED(status) ? WEXITSTATUS(status) : 254;
  return code == 255 ? -1 : code;
}

TEST(PackageLimits, FullDiskIsNamed) {
  const std::string package = buildArchive(ArchiveForm::TarXz, sampleEntriesAndZeros(1 << 20));
  const int refusal = refusalOnSmallDisk(package);
  if (refusal == -1) GTEST_SKIP() << "no private file system to be had here";
  EXPECT_EQ(refusal, ENOSPC);
}

}  // namespace
}  // namespace appsync::package_tests
