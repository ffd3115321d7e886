#pragma once

#include <string>
#include <string_view>

#include "platform/property_list.h"
#include "platform/sync_files.h"

namespace appsync {

/// One entry of a todo list, whatever it holds. Borrows the entry.
class TodoEntry {
 public:
  explicit TodoEntry(const PropertyList& entry) : entry_(entry) {}

  /// As it stands; nullptr when there is none.
  const PropertyList* value(std::string_view key) const { return entry_.find(key); }
  // nullptr when there is none, or one that is no string.
  const std::string* identifier() const { return text(exchange::TodoIdentifierKey); }
  const std::string* operation() const { return text(exchange::TodoOperationKey); }

  bool isFor(std::string_view identifier) const { return is(this->identifier(), identifier); }
  bool hasOperation(std::string_view operation) const { return is(this->operation(), operation); }

 private:
  const std::string* text(std::string_view key) const {
    const PropertyList* found = value(key);
    return found ? found->asString() : nullptr;
  }
  static bool is(const std::string* text, std::string_view wanted) {
    return text && *text == wanted;
  }

  const PropertyList& entry_;
};

}  // namespace appsync
