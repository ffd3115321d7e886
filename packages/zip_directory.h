#pragma once

#include <cstdint>
#include <optional>
#include <vector>

#include "platform/error.h"

namespace appsync {

/// Whether the file begins as a zip archive does.
bool looksLikeZip(int packageFd) noexcept;

/// A file or folder as a zip archive's central directory announces it.
struct ZipMember {
  std::uint64_t offset = 0;  ///< of the header in front of its data
  // As far as four bytes tell them.
  std::uint64_t packed = 0;
  std::uint64_t size = 0;
  std::uint32_t checksum = 0;
  std::uint16_t flags = 0;
  std::uint16_t method = 0;
};

/// Looks through a zip archive's central directory, before the archive library reads it, for what
/// that library passes over: a directory that is cut off, does not end the file, counts other
/// entries than it holds, lists one twice or spans several disks; names that hold a NUL or differ
/// from the ones in front of the data; encryption; more entries than `maximumEntries`, for which it
/// would take memory. The error is a refusal; without one, `members` are all there are, in the
/// order in which they stand in the file. Leaves the file's offset as it is.
[[nodiscard]] std::optional<Error> readZipDirectory(int packageFd, std::uint64_t maximumEntries,
                                                    std::vector<ZipMember>& members);

}  // namespace appsync
