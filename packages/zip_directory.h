#pragma once

#include <cstdint>
#include <optional>

#include "platform/error.h"

namespace appsync {

/// Whether the file begins as a zip archive does.
bool looksLikeZip(int packageFd) noexcept;

/// Looks through a zip archive's central directory, before the archive library reads it, for what
/// that library passes over: a directory that is cut off, does not end the file, counts other
/// entries than it holds or spans several disks; names that hold a NUL or differ from the ones in
/// front of the data; encryption; more entries than `maximumEntries`, for which it would take
/// memory. The error is a refusal. Leaves the file's offset as it is.
[[nodiscard]] std::optional<Error> checkZipDirectory(int packageFd, std::uint64_t maximumEntries);

}  // namespace appsync
