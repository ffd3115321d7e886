// A todo list whose operations are found and changed as bytes, beside the same as a tree.

#include <algorithm>
#include <cstdint>
#include <cstdlib>

#include "client/todo_file.h"
#include "platform/property_list_codec.h"
#include "platform/todo_entry.h"
#include "tests/platform/same_tree.h"

namespace {

using appsync::Bytes;
using appsync::PropertyList;
using appsync::TodoEntry;

void require(bool condition) {
  if (!condition) std::abort();
}

/// The first entry of the identifier.
PropertyList& entryOf(PropertyList& list, std::string_view identifier) {
  return *std::ranges::find_if(*list.asArray(), [&](const PropertyList& entry) {
    return TodoEntry(entry).isFor(identifier);
  });
}

void change(appsync::TodoFile& file, PropertyList& list, const std::string& identifier,
            const char* operation) {
  PropertyList& entry = entryOf(list, identifier);
  require(file.operationOf(identifier) == *TodoEntry(entry).operation());
  const Bytes before = file.bytes();
  if (!file.setOperation(identifier, operation)) return require(file.bytes() == before);
  (*entry.asDictionary())["operation"] = operation;
  const auto after = appsync::parsePropertyList(file.bytes());
  require(after && sameTree(*after, list));
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const auto input = std::as_bytes(std::span(data, size));
  Bytes bytes(input.begin(), input.end());
  appsync::TodoFile file;
  if (!file.take(bytes)) {
    require(std::ranges::equal(bytes, input));
    return 0;
  }
  auto list = appsync::parsePropertyList(input);
  require(list && list->asArray());
  std::size_t changes = 0;
  for (const PropertyList& entry : PropertyList::Array(*list->asArray())) {
    for (const char* operation : {"DOWNLOADED", "INSTALLED", ""})
      change(file, *list, *TodoEntry(entry).identifier(), operation);
    if (++changes == 10) break;
  }
  return 0;
}
