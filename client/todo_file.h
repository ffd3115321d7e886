#pragma once

#include <cstdint>
#include <optional>
#include <string_view>
#include <vector>

#include "platform/binary_property_list.h"

namespace appsync {

/// A todo list as the bytes of its file, in which an operation is found and changed without a tree
/// of all the others. Takes what common writers make of entries as they should be: a binary
/// property list, every entry a dictionary with a text as identifier and one as operation.
class TodoFile {
 public:
  /// Takes the bytes of a list and checks all of them, unless it holds the same already. False,
  /// with the bytes left where they are and nothing held, for a list of any other form.
  [[nodiscard]] bool take(Bytes& list);

  const Bytes& bytes() const { return bytes_; }

  /// The operation of the identifier's first entry, until the next change. nullopt without one.
  std::optional<std::string_view> operationOf(std::string_view identifier) const;

  /// Gives the identifier's first entry another operation. False, with nothing changed, when there
  /// is no entry, or no room for this operation in the file as it is.
  [[nodiscard]] bool setOperation(std::string_view identifier, std::string_view operation);

 private:
  BinaryPropertyList list() const;
  /// Where the entry's reference to its operation lies.
  std::optional<std::size_t> placeOfOperation(std::string_view identifier) const;

  Bytes bytes_;
  std::vector<std::uint32_t> byIdentifier_;  ///< places in the array, the first of equals first
};

}  // namespace appsync
