#include <atomic>
#include <cerrno>
#include <thread>

#include "tests/contract/phone.h"

namespace appsync::contract {
namespace {

SERVICE_CONTRACT(FileManagerContract);

const FileAttributes mobile{"mobile", "mobile"};

std::int64_t posixCode(const std::optional<Error>& error) {
  if (!error) return 0;
  EXPECT_EQ(error->domain, POSIXErrorDomain);
  return error->code;
}

TEST_P(FileManagerContract, RefusesPathsThatAreRelativeEmptyOrHoldANul) {
  FileManager& files = platform.files;
  putFile("/tmp/file", "text");
  for (const std::string& path : {std::string("tmp/file"), std::string(), std::string("."),
                                  std::string("/tmp/file\0x", 11)}) {
    const auto fails = [](auto call) {
      std::optional<Error> error;
      return !call(&error) && posixCode(error) == EINVAL;
    };
    EXPECT_TRUE(fails([&](auto* error) { return files.contentsAtPath(path, error).has_value(); }));
    EXPECT_TRUE(fails([&](auto* error) { return files.writeAtomically(path, {}, error); }));
    EXPECT_TRUE(fails([&](auto* error) { return files.createDirectory(path, true, {}, error); }));
    EXPECT_TRUE(fails([&](auto* error) { return files.removeItem(path, error); }));
    EXPECT_TRUE(fails([&](auto* error) { return files.moveItem(path, "/tmp/new", error); }));
    EXPECT_TRUE(fails([&](auto* error) { return files.moveItem("/tmp/file", path, error); }));
    EXPECT_TRUE(fails([&](auto* error) { return files.copyItem(path, "/tmp/new", error); }));
    EXPECT_TRUE(fails([&](auto* error) { return files.copyItem("/tmp/file", path, error); }));
    EXPECT_TRUE(
        fails([&](auto* error) { return files.attributesOfItem(path, error).has_value(); }));
    EXPECT_TRUE(fails([&](auto* error) { return files.touch(path, error); }));
    EXPECT_FALSE(files.createFile(path, {}, {}));
    EXPECT_FALSE(files.fileExists(path));
    EXPECT_FALSE(files.directoryExists(path));
  }
  EXPECT_EQ(textAt("/tmp/file"), "text");
}

TEST_P(FileManagerContract, ANameThatIsJoinedToADirectoryNeverLeadsOutOfIt) {
  putFile("/tmp/file", "text");
  putFile("/tmp/box/file", "inner");
  for (const char* name : {".", "..", "../file", "./file", "file/..", "../box/file", "../../tmp"}) {
    const std::string path = joinPath("/tmp/box", name);
    std::optional<Error> error;
    EXPECT_FALSE(platform.files.contentsAtPath(path, &error)) << path;
    EXPECT_EQ(posixCode(error), EINVAL) << path;
    EXPECT_FALSE(platform.files.writeAtomically(path, asBytes("new"))) << path;
    EXPECT_FALSE(platform.files.removeItem(path)) << path;
    EXPECT_FALSE(platform.files.directoryExists(path)) << path;
  }
  EXPECT_EQ(textAt("/tmp/file"), "text");
  EXPECT_EQ(textAt("/tmp//box/file"), "inner");
  EXPECT_TRUE(platform.files.writeAtomically("/tmp/box/..file", asBytes("a plain name")));
}

TEST_P(FileManagerContract, ReadsAWholeFileAndTellsAnEmptyOneFromAMissingOne) {
  const std::string text("all\0of it\xff", 10);
  putFile("/tmp/file", text);
  putFile("/tmp/empty", "");
  std::optional<Error> error;
  EXPECT_EQ(platform.files.contentsAtPath("/tmp/file", &error), toBytes(text));
  EXPECT_EQ(platform.files.contentsAtPath("/tmp/empty", &error), Bytes{});
  EXPECT_FALSE(error);
  EXPECT_FALSE(platform.files.contentsAtPath("/tmp/missing", &error));
  EXPECT_EQ(posixCode(error), ENOENT);
  error.reset();
  EXPECT_FALSE(platform.files.contentsAtPath("/tmp", &error));
  EXPECT_NE(posixCode(error), 0);
}

TEST_P(FileManagerContract, WritesAFileAnewAndOverAnOldOneButNeedsTheDirectory) {
  std::optional<Error> error;
  EXPECT_TRUE(platform.files.writeAtomically("/tmp/file", asBytes("a long first text"), &error));
  EXPECT_TRUE(platform.files.writeAtomically("/tmp/file", asBytes("short"), &error));
  EXPECT_EQ(textAt("/tmp/file"), "short");
  EXPECT_FALSE(error);
  EXPECT_FALSE(platform.files.writeAtomically("/tmp/no/file", asBytes("text"), &error));
  EXPECT_EQ(posixCode(error), ENOENT);
  EXPECT_FALSE(platform.files.directoryExists("/tmp/no"));
  EXPECT_FALSE(platform.files.writeAtomically("/tmp", asBytes("text")));
  EXPECT_TRUE(platform.files.directoryExists("/tmp"));
}

TEST_P(FileManagerContract, AReaderSeesTheOldBytesOrTheNewOnes) {
  const std::string one(20000, '1');
  const std::string two(30000, '2');
  putFile("/tmp/file", one);
  std::atomic<bool> writing = true;
  std::thread writer([&] {
    for (int round = 0; round < 20; ++round) {
      platform.files.writeAtomically("/tmp/file", asBytes(round % 2 ? one : two));
    }
    writing = false;
  });
  bool whole = true;
  while (writing && whole) {
    const std::optional<std::string> text = textAt("/tmp/file");
    whole = text == one || text == two;
  }
  writer.join();
  EXPECT_TRUE(whole);
}

TEST_P(FileManagerContract, CreatesAFileWithItsAttributesOrReplacesOne) {
  EXPECT_TRUE(platform.files.createFile("/tmp/file", asBytes("a long first text"), mobile));
  EXPECT_TRUE(platform.files.createFile("/tmp/file", asBytes("second"), mobile));
  EXPECT_EQ(textAt("/tmp/file"), "second");
  const auto attributes = platform.files.attributesOfItem("/tmp/file");
  ASSERT_TRUE(attributes);
  EXPECT_EQ(attributes->owner, "mobile");
  EXPECT_EQ(attributes->group, "mobile");
  EXPECT_FALSE(platform.files.createFile("/tmp/no/file", asBytes("text"), mobile));
  EXPECT_FALSE(platform.files.createFile("/tmp", asBytes("text"), mobile));
}

TEST_P(FileManagerContract, MakesADirectoryWithItsParents) {
  EXPECT_TRUE(platform.files.createDirectory("/tmp/a/b/c", true, mobile));
  for (const char* path : {"/tmp/a", "/tmp/a/b", "/tmp/a/b/c"}) {
    const auto attributes = platform.files.attributesOfItem(path);
    ASSERT_TRUE(attributes) << path;
    EXPECT_TRUE(attributes->isDirectory);
    EXPECT_EQ(attributes->owner, "mobile");
    EXPECT_EQ(attributes->group, "mobile");
  }
  putFile("/tmp/a/b/c/file", "kept");
  EXPECT_TRUE(platform.files.createDirectory("/tmp/a/b/c", true, mobile));
  EXPECT_EQ(textAt("/tmp/a/b/c/file"), "kept");
}

TEST_P(FileManagerContract, MakesOneDirectoryWhereNothingStands) {
  std::optional<Error> error;
  EXPECT_FALSE(platform.files.createDirectory("/tmp/a/b", false, {}, &error));
  EXPECT_EQ(posixCode(error), ENOENT);
  EXPECT_TRUE(platform.files.createDirectory("/tmp/a", false, {}));
  EXPECT_FALSE(platform.files.createDirectory("/tmp/a", false, {}, &error));
  EXPECT_EQ(posixCode(error), EEXIST);
}

TEST_P(FileManagerContract, MakesNoDirectoryWhereAFileStands) {
  putFile("/tmp/file", "text");
  std::optional<Error> error;
  EXPECT_FALSE(platform.files.createDirectory("/tmp/file", true, {}, &error));
  EXPECT_EQ(posixCode(error), EEXIST);
  EXPECT_FALSE(platform.files.createDirectory("/tmp/file/below", true, {}, &error));
  EXPECT_NE(posixCode(error), 0);
  EXPECT_EQ(textAt("/tmp/file"), "text");
}

TEST_P(FileManagerContract, RemovesAFileOrADirectoryWithAllInIt) {
  putFile("/tmp/file", "text");
  putFile("/tmp/a/b/file", "text");
  putFile("/tmp/a-neighbour", "text");
  EXPECT_TRUE(platform.files.removeItem("/tmp/file"));
  EXPECT_TRUE(platform.files.removeItem("/tmp/a"));
  EXPECT_FALSE(platform.files.fileExists("/tmp/file"));
  EXPECT_FALSE(platform.files.directoryExists("/tmp/a"));
  EXPECT_EQ(textAt("/tmp/a-neighbour"), "text");
  std::optional<Error> error;
  EXPECT_FALSE(platform.files.removeItem("/tmp/file", &error));
  EXPECT_EQ(posixCode(error), ENOENT);
}

TEST_P(FileManagerContract, MovesAFileOrADirectoryWithAllInIt) {
  putFile("/tmp/a/b/file", "text");
  EXPECT_TRUE(platform.files.moveItem("/tmp/a", "/var/mobile/moved"));
  EXPECT_FALSE(platform.files.directoryExists("/tmp/a"));
  EXPECT_TRUE(platform.files.moveItem("/var/mobile/moved/b/file", "/tmp/file"));
  EXPECT_EQ(textAt("/tmp/file"), "text");
  EXPECT_FALSE(platform.files.fileExists("/var/mobile/moved/b/file"));
}

TEST_P(FileManagerContract, CopiesAFileOrADirectoryWithAllInIt) {
  putFile("/tmp/a/b/file", "text");
  EXPECT_TRUE(platform.files.createDirectory("/tmp/a/empty", false, {}));
  EXPECT_TRUE(platform.files.copyItem("/tmp/a", "/tmp/copy"));
  EXPECT_TRUE(platform.files.copyItem("/tmp/a/b/file", "/tmp/file"));
  EXPECT_EQ(textAt("/tmp/copy/b/file"), "text");
  EXPECT_TRUE(platform.files.directoryExists("/tmp/copy/empty"));
  EXPECT_EQ(textAt("/tmp/file"), "text");
  EXPECT_EQ(textAt("/tmp/a/b/file"), "text");
}

TEST_P(FileManagerContract, MovesAndCopiesOntoNothingThatIsThere) {
  FileManager& files = platform.files;
  putFile("/tmp/one", "1");
  putFile("/tmp/two", "2");
  EXPECT_TRUE(files.createDirectory("/tmp/empty", false, {}));
  const auto code = [](auto call) {
    std::optional<Error> error;
    EXPECT_FALSE(call(&error));
    return posixCode(error);
  };
  for (const char* target : {"/tmp/two", "/tmp/empty"}) {
    EXPECT_EQ(code([&](auto* error) { return files.moveItem("/tmp/one", target, error); }), EEXIST);
    EXPECT_EQ(code([&](auto* error) { return files.copyItem("/tmp/one", target, error); }), EEXIST);
  }
  for (const char* from : {"/tmp/missing", "/tmp/missing/too"}) {
    EXPECT_EQ(code([&](auto* error) { return files.moveItem(from, "/tmp/new", error); }), ENOENT);
    EXPECT_EQ(code([&](auto* error) { return files.copyItem(from, "/tmp/new", error); }), ENOENT);
  }
  EXPECT_EQ(code([&](auto* error) { return files.moveItem("/tmp/one", "/tmp/no/1", error); }),
            ENOENT);
  EXPECT_EQ(code([&](auto* error) { return files.copyItem("/tmp/one", "/tmp/no/1", error); }),
            ENOENT);
  EXPECT_EQ(textAt("/tmp/one"), "1");
  EXPECT_EQ(textAt("/tmp/two"), "2");
  EXPECT_FALSE(files.fileExists("/tmp/new"));
}

TEST_P(FileManagerContract, MovesAndCopiesNoDirectoryIntoItself) {
  putFile("/tmp/a/file", "text");
  EXPECT_FALSE(platform.files.moveItem("/tmp/a", "/tmp/a/b"));
  EXPECT_FALSE(platform.files.copyItem("/tmp/a", "/tmp/a/b"));
  EXPECT_EQ(textAt("/tmp/a/file"), "text");
  EXPECT_FALSE(platform.files.fileExists("/tmp/a/b"));
}

TEST_P(FileManagerContract, TellsFilesAndDirectoriesThatExist) {
  putFile("/tmp/a/file", "text");
  EXPECT_TRUE(platform.files.fileExists("/tmp/a/file"));
  EXPECT_TRUE(platform.files.fileExists("/tmp/a"));
  EXPECT_FALSE(platform.files.fileExists("/tmp/b"));
  EXPECT_TRUE(platform.files.directoryExists("/tmp/a"));
  EXPECT_FALSE(platform.files.directoryExists("/tmp/a/file"));
  EXPECT_FALSE(platform.files.directoryExists("/tmp/b"));
}

TEST_P(FileManagerContract, GivesSizeKindAndTimesOfAnItem) {
  const double before = phone->now();
  putFile("/tmp/a/file", "12345");
  const auto file = platform.files.attributesOfItem("/tmp/a/file");
  ASSERT_TRUE(file);
  EXPECT_EQ(file->size, 5U);
  EXPECT_FALSE(file->isDirectory);
  EXPECT_FALSE(file->owner.empty());
  EXPECT_FALSE(file->group.empty());
  EXPECT_NEAR(file->modificationTime, before, 60);
  const auto directory = platform.files.attributesOfItem("/tmp/a");
  ASSERT_TRUE(directory);
  EXPECT_TRUE(directory->isDirectory);
  std::optional<Error> error;
  EXPECT_FALSE(platform.files.attributesOfItem("/tmp/missing", &error));
  EXPECT_EQ(posixCode(error), ENOENT);
}

TEST_P(FileManagerContract, TouchSetsBothTimesToNow) {
  putFile("/tmp/a/file", "text");
  for (const char* path : {"/tmp/a/file", "/tmp/a"}) {
    phone->setTimes(path, 1'000'000'000);
    ASSERT_EQ(platform.files.attributesOfItem(path)->modificationTime, 1'000'000'000);
    EXPECT_TRUE(platform.files.touch(path));
    const auto attributes = platform.files.attributesOfItem(path);
    ASSERT_TRUE(attributes);
    EXPECT_NEAR(attributes->modificationTime, phone->now(), 60);
    EXPECT_NEAR(attributes->accessTime, phone->now(), 60);
  }
  EXPECT_EQ(textAt("/tmp/a/file"), "text");
  std::optional<Error> error;
  EXPECT_FALSE(platform.files.touch("/tmp/missing", &error));
  EXPECT_EQ(posixCode(error), ENOENT);
}

TEST_P(FileManagerContract, TheTemporaryDirectoryIsThereAndEndsInNoSlash) {
  const std::string path = platform.files.temporaryDirectory();
  EXPECT_TRUE(path.starts_with('/'));
  EXPECT_FALSE(path.ends_with('/'));
  EXPECT_TRUE(platform.files.directoryExists(path));
}

TEST_P(FileManagerContract, WritesTheErrorOnlyOnFailure) {
  putFile("/tmp/file", "text");
  const Error earlier = Error::withDescription(TWErrorDomain, 1, "earlier");
  std::optional<Error> error = earlier;
  EXPECT_TRUE(platform.files.contentsAtPath("/tmp/file", &error));
  EXPECT_TRUE(platform.files.writeAtomically("/tmp/file", asBytes("new"), &error));
  EXPECT_TRUE(platform.files.createDirectory("/tmp/a", true, {}, &error));
  EXPECT_TRUE(platform.files.copyItem("/tmp/file", "/tmp/copy", &error));
  EXPECT_TRUE(platform.files.moveItem("/tmp/copy", "/tmp/moved", &error));
  EXPECT_TRUE(platform.files.attributesOfItem("/tmp/moved", &error));
  EXPECT_TRUE(platform.files.touch("/tmp/moved", &error));
  EXPECT_TRUE(platform.files.removeItem("/tmp/moved", &error));
  EXPECT_EQ(error, earlier);
}

TEST_P(FileManagerContract, WorksFromManyThreadsAtOnce) {
  std::vector<std::thread> threads;
  std::atomic<int> good = 0;
  for (int number = 0; number < 8; ++number) {
    threads.emplace_back([&, number] {
      const std::string directory = "/tmp/shared/" + std::to_string(number % 2);
      const std::string file = directory + "/" + std::to_string(number);
      good += platform.files.createDirectory(directory, true, {}) &&
              platform.files.writeAtomically(file, asBytes(file)) && textAt(file) == file;
    });
  }
  for (std::thread& thread : threads) thread.join();
  EXPECT_EQ(good, 8);
}

}  // namespace
}  // namespace appsync::contract
