#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string_view>

#include "base/data_stream.h"
#include "platform/error.h"

namespace appsync {

// An application's data as a tar archive whose bytes depend only on what the data is: sorted by
// name, owned by nobody, times in whole seconds. It holds files, folders and symbolic links, the
// latter as the text they are; no link is ever followed. Each folder comes before what is in it.

/// Deeper or longer names are neither saved nor restored.
inline constexpr std::size_t DeepestData = 200;       ///< components
inline constexpr std::size_t LongestDataName = 4000;  ///< bytes

/// Hands the archive of what lies in an open directory to `sink`; nothing at all for one that is
/// empty. Sockets and the like are left out and named to `skipped`. An error of POSIX 125 when the
/// sink ended it.
[[nodiscard]] std::optional<Error> writeDataArchive(
    int directory, const DataSink& sink, const std::function<void(std::string_view path)>& skipped);

/// Lays out what the archive holds in an open and empty directory, beneath which everything stays,
/// and counts the entries. On failure some of it may lie there. An error of POSIX 125 when the
/// source failed, which it may do up to its end, and of POSIX 74 for a damaged archive.
[[nodiscard]] std::optional<Error> readDataArchive(const DataSource& source, int directory,
                                                   std::uint64_t& entries);

}  // namespace appsync
