#include "tests/client/client_test.h"

namespace appsync {

ClientTest::ClientTest() = default;
ClientTest::~ClientTest() = default;

AppsClient& ClientTest::client() {
  if (!client_) {
    client_.emplace(phone.platform());
    forgetTrace();
  }
  return *client_;
}

void ClientTest::forgetTrace() {
  phone.trace.clear();
  phone.log.clear();
}

void ClientTest::expectTrace(const Lines& expected, fakes::TraceKinds kinds, const char* file,
                             int line) {
  const testing::ScopedTrace place(file, line, "trace");
  EXPECT_THAT(phone.trace.readable(kinds), testing::ElementsAreArray(expected));
  forgetTrace();
}

void ClientTest::putTodo(std::initializer_list<std::pair<std::string, std::string>> entries) {
  Array list;
  for (const auto& [identifier, operation] : entries) {
    list.push_back(Dictionary{{"identifier", identifier}, {"operation", operation}});
  }
  phone.files.putPlist(TodoListPath, list);
}

std::optional<std::string> ClientTest::todoOperation(std::string_view identifier) const {
  const std::optional<PropertyList> list = phone.files.plistAt(TodoListPath);
  if (!list || !list->asArray()) return std::nullopt;
  for (const PropertyList& entry : *list->asArray()) {
    if (!entry.asDictionary() || !entry.find("identifier")) continue;
    if (*entry.find("identifier") != PropertyList(identifier)) continue;
    const std::string* operation = findString(*entry.asDictionary(), "operation");
    return operation ? std::optional(*operation) : std::nullopt;
  }
  return std::nullopt;
}

}  // namespace appsync
