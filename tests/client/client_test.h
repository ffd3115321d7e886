#pragma once

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <initializer_list>
#include <optional>
#include <ostream>
#include <string>
#include <utility>
#include <vector>

#include "client/apps_client.h"
#include "tests/fakes/fake_platform.h"

namespace appsync {

inline void PrintTo(const PropertyList& value, std::ostream* out) { *out << description(value); }
inline void PrintTo(const Error& error, std::ostream* out) { *out << description(error); }

// Places as the rest of the phone knows them.
inline const std::string SyncRootPath = "/var/mobile/Library/ApplicationSync";
inline const std::string WorkAreaPath = SyncRootPath + "/HalvoStuff";
inline const std::string TodoListPath = WorkAreaPath + "/ApplicationsSync.plist";
inline const std::string LastSyncStatePath = SyncRootPath + "/LastSyncAppState.plist";
inline const std::string RestoreStatePath = SyncRootPath + "/RestoreState.plist";
inline const std::string StagingRootPath = "/var/mobile/Media/PublicStaging";

/// A phone in memory with one client on it. A test prepares `phone`, acts through `client()` and
/// compares the trace.
class ClientTest : public testing::Test {
 protected:
  using Array = PropertyList::Array;
  using Dictionary = PropertyList::Dictionary;
  using Lines = std::vector<std::string>;

  ClientTest();
  ~ClientTest() override;

  /// Made by the first call; the trace begins after its construction.
  AppsClient& client();
  void destroyClient() { client_.reset(); }

  void forgetTrace();

  /// Compares everything of these kinds since the last comparison, and forgets it.
  void expectTrace(const Lines& expected, fakes::TraceKinds kinds = fakes::TraceEffects,
                   const char* file = __builtin_FILE(), int line = __builtin_LINE());

  /// Puts a todo list there: identifier and operation of each entry.
  void putTodo(std::initializer_list<std::pair<std::string, std::string>> entries);

  /// The operation of the identifier's first entry in the todo list as it stands in the file.
  std::optional<std::string> todoOperation(std::string_view identifier) const;

  fakes::FakePlatform phone;

 private:
  std::optional<AppsClient> client_;
};

}  // namespace appsync
