// What finding and changing an operation costs, counted: trees parsed and built by the library,
// files read and written, memory taken.
#include <cstdint>

#include "platform/property_list_codec.h"
#include "tests/client/allocations.h"
#include "tests/client/client_test.h"

namespace {
int trees = 0;
}  // namespace

// The library's own calls, which the linker gives other names: see tests/CMakeLists.txt.
extern "C" {
void __real_plist_from_bin(const char* bytes, std::uint32_t size, void** tree);
void __real_plist_from_xml(const char* bytes, std::uint32_t size, void** tree);
void __real_plist_to_bin(void* tree, char** bytes, std::uint32_t* size);

void __wrap_plist_from_bin(const char* bytes, std::uint32_t size, void** tree) {
  ++trees;
  __real_plist_from_bin(bytes, size, tree);
}
void __wrap_plist_from_xml(const char* bytes, std::uint32_t size, void** tree) {
  ++trees;
  __real_plist_from_xml(bytes, size, tree);
}
void __wrap_plist_to_bin(void* tree, char** bytes, std::uint32_t* size) {
  ++trees;
  __real_plist_to_bin(tree, bytes, size);
}
}

namespace appsync {
namespace {

class TodoListWork : public ClientTest {
 protected:
  static constexpr std::size_t Entries = 1000;
  /// Trace lines, log texts, and what else does not grow with the list.
  static constexpr std::size_t Small = 4096;

  void SetUp() override {
    Array list;
    for (std::size_t i = 0; i < Entries; ++i) {
      const std::string identifier = "com." + std::to_string(i);
      list.push_back(Dictionary{{"identifier", identifier},
                                {"operation", "install"},
                                {"version", "1.0"},
                                {"name", "Application " + identifier}});
    }
    phone.files.putPlist(TodoListPath, list, PropertyListFormat::Binary);
    client();
    trees = 0;
  }

  std::size_t fileSize() const { return phone.files.bytesAt(TodoListPath)->size(); }

  /// What this thread takes of memory meanwhile, all together.
  template <typename Work>
  static std::size_t memoryFor(const Work& work) {
    const std::size_t before = allocatedBytes;
    work();
    return allocatedBytes - before;
  }
};

TEST_F(TodoListWork, NoTreeIsBuiltForOneOperationAndTheFileIsReadAndWrittenOnce) {
  const std::string reading = "FileManager.contentsAtPath(" + TodoListPath + ")";
  std::string before = "install";
  for (const std::string operation : {"DOWNLOADED", "INSTALLED", "DOWNLOADED"}) {
    client().changeAssetID("com.500", operation);
    expectTrace(
        {reading, "log default SyncBundle|Changing com.500 from " + before + " to " + operation,
         "FileManager.writeAtomically(" + TodoListPath + ")"},
        fakes::TraceAll);
    EXPECT_EQ(client()._operationStateForIdentifier("com.500"), operation);
    client().changeAssetID("com.none", operation);
    expectTrace({reading, reading}, fakes::TraceAll);
    before = operation;
  }
  EXPECT_EQ(trees, 0);
}

TEST_F(TodoListWork, AnOperationThatTheFileHasNoRoomForIsWrittenByTheParser) {
  const std::string operation(300, 'x');
  client().changeAssetID("com.500", operation);
  expectTrace({"log default SyncBundle|Changing com.500 from install to " + operation,
               "FileManager.writeAtomically(" + TodoListPath + ")"});
  EXPECT_EQ(todoOperation("com.500"), operation);
}

TEST_F(TodoListWork, AListThatIsKnownIsComparedAndNeverCheckedAgain) {
  const auto read = [this] { client()._operationStateForIdentifier("com.500"); };
  read();
  EXPECT_LE(memoryFor(read), fileSize() + Small);
}

TEST_F(TodoListWork, AnotherChangeTakesTheFileAsReadAndAsWritten) {
  const auto change = [this](const char* operation) {
    return memoryFor([&] { client().changeAssetID("com.500", operation); });
  };
  // The phone's own copy of what is written counts here, too.
  change("SENT");
  EXPECT_LE(change("DOWNLOADED"), 3 * fileSize() + Small);  // grows by a text
  EXPECT_LE(change("SENT"), 2 * fileSize() + Small);
}

TEST_F(TodoListWork, AListOfAnotherFormIsParsedOnceAndThenKnown) {
  const auto list = phone.files.plistAt(TodoListPath);
  phone.files.putPlist(TodoListPath, *list, PropertyListFormat::Xml);
  trees = 0;
  client().changeAssetID("com.1", "SENT");
  EXPECT_EQ(trees, 2);  // read and written
  client().changeAssetID("com.1", "INSTALLED");
  EXPECT_EQ(trees, 2);
  EXPECT_EQ(todoOperation("com.1"), "INSTALLED");
}

TEST_F(TodoListWork, WhatTheHostPutsInItsPlaceIsReadAnew) {
  client().changeAssetID("com.1", "SENT");
  phone.files.putPlist(TodoListPath,
                       Array{Dictionary{{"identifier", "com.1"}, {"operation", "remove"}}},
                       PropertyListFormat::Binary);
  EXPECT_EQ(client()._operationStateForIdentifier("com.1"), "remove");
  client().changeAssetID("com.1", "FAILED");
  EXPECT_EQ(phone.files.plistAt(TodoListPath),
            PropertyList(Array{Dictionary{{"identifier", "com.1"}, {"operation", "FAILED"}}}));
}

TEST_F(TodoListWork, AWriteThatFailedIsNotTakenForDone) {
  phone.faults.failEvery("FileManager.writeAtomically", Error::posix(28));
  client().changeAssetID("com.1", "SENT");
  EXPECT_EQ(client()._operationStateForIdentifier("com.1"), "install");
}

}  // namespace
}  // namespace appsync
