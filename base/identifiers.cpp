#include "base/identifiers.h"

#include <algorithm>
#include <array>

#include "base/temporary_file.h"
#include "platform/sync_files.h"

namespace appsync {
namespace {

constexpr std::size_t MaximumLength = 200;  // leaves room for a suffix within NAME_MAX

/// Names that stand beside the applications' own folders in the staging area.
constexpr std::array ReservedNames = {exchange::TodoListName, exchange::IconLayoutName};

bool isAlphanumeric(char c) {
  return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9');
}

bool isAllowed(char c) { return isAlphanumeric(c) || c == '.' || c == '_' || c == '-'; }

}  // namespace

bool isUsableIdentifier(std::string_view identifier) {
  return identifier.size() <= MaximumLength && std::ranges::all_of(identifier, isAllowed) &&
         std::ranges::any_of(identifier, isAlphanumeric) && !isTemporaryName(identifier);
}

bool isSendableIdentifier(std::string_view identifier) {
  return isUsableIdentifier(identifier) && identifier.front() != '.' &&
         std::ranges::find(ReservedNames, identifier) == ReservedNames.end();
}

}  // namespace appsync
