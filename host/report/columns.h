#pragma once

#include <string>
#include <string_view>

namespace appsync::host {

/// Columns that printable text takes on a terminal.
std::size_t displayWidth(std::string_view text);

/// Printable text cut or filled with blanks to exactly this many columns.
std::string fitted(std::string_view text, std::size_t columns);

}  // namespace appsync::host
