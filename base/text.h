#pragma once

#include <cstdint>
#include <string>
#include <string_view>

namespace appsync {

/// Text from outside made safe for a terminal and for one line: control characters, escape
/// sequences, direction overrides and bytes that are no UTF-8 become U+FFFD.
std::string printable(std::string_view text);

/// A message without blank space at its end and with its line breaks as blanks.
std::string oneLine(std::string_view text);

/// Columns that printable text takes on a terminal.
std::size_t displayWidth(std::string_view text);

/// Printable text cut or filled with blanks to exactly this many columns.
std::string fitted(std::string_view text, std::size_t columns);

/// "999 B", "1.4 MB": decimal units, three significant digits at most.
std::string byteCount(std::uint64_t bytes);

/// Seconds since 1970 as "2026-01-31T12:00:00.250Z".
std::string isoTime(double secondsSince1970);

}  // namespace appsync
