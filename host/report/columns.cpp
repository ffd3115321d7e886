#include "host/report/columns.h"

#include <cwchar>

#include "base/text.h"
#include "platform/utf8.h"

namespace appsync::host {
namespace {

/// Takes the next character; the columns that it takes on a terminal.
std::size_t takeColumns(std::string_view& text) {
  const std::optional<char32_t> character = takeCharacter(text);
  if (!character) text.remove_prefix(1);
  const int width = ::wcwidth(static_cast<wchar_t>(character.value_or(0xfffd)));
  return width < 0 ? 1 : static_cast<std::size_t>(width);
}

}  // namespace

std::size_t displayWidth(std::string_view text) {
  std::size_t columns = 0;
  while (!text.empty()) columns += takeColumns(text);
  return columns;
}

std::string fitted(std::string_view text, std::size_t columns) {
  std::string result = printable(text);
  std::size_t used = 0;
  for (std::string_view rest = result; !rest.empty();) {
    const std::size_t before = rest.size();
    const std::size_t width = takeColumns(rest);
    if (used + width > columns) {
      result.resize(result.size() - before);
      break;
    }
    used += width;
  }
  return result.append(columns - used, ' ');
}

}  // namespace appsync::host
