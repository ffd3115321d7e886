#include "base/text.h"

#include <fmt/format.h>

#include <algorithm>
#include <array>
#include <cmath>
#include <ctime>
#include <cwchar>

namespace appsync {
namespace {

constexpr char32_t Bad = 0xFFFD;

struct Character {
  char32_t value = Bad;
  std::size_t length = 1;
};

std::size_t sequenceLength(unsigned char lead) {
  if (lead < 0x80) return 1;
  if (lead >= 0xC2 && lead <= 0xDF) return 2;
  if (lead >= 0xE0 && lead <= 0xEF) return 3;
  if (lead >= 0xF0 && lead <= 0xF4) return 4;
  return 0;
}

/// The character at the beginning of `text`; `Bad` of length 1 where none is well formed.
Character decode(std::string_view text) {
  static constexpr std::array<char32_t, 5> Smallest = {0, 0, 0x80, 0x800, 0x10000};
  const auto lead = static_cast<unsigned char>(text.front());
  const std::size_t length = sequenceLength(lead);
  if (length == 1) return {lead, 1};
  if (length == 0 || length > text.size()) return {};
  char32_t value = lead & (0x7Fu >> length);
  for (std::size_t i = 1; i < length; ++i) {
    const auto next = static_cast<unsigned char>(text[i]);
    if ((next & 0xC0) != 0x80) return {};
    value = (value << 6) | (next & 0x3Fu);
  }
  const bool surrogate = value >= 0xD800 && value <= 0xDFFF;
  if (value < Smallest[length] || value > 0x10FFFF || surrogate) return {};
  return {value, length};
}

bool isUnsafe(char32_t c) {
  const bool control = c < 0x20 || (c >= 0x7F && c < 0xA0);
  const bool lineBreak = c == 0x2028 || c == 0x2029;
  const bool direction = c == 0x200E || c == 0x200F || c == 0x061C ||
                         (c >= 0x202A && c <= 0x202E) || (c >= 0x2066 && c <= 0x2069);
  return control || lineBreak || direction;
}

std::size_t columnsOf(char32_t c) {
  const int width = ::wcwidth(static_cast<wchar_t>(c));
  return width < 0 ? 1 : static_cast<std::size_t>(width);
}

}  // namespace

std::string printable(std::string_view text) {
  std::string result;
  result.reserve(text.size());
  while (!text.empty()) {
    const Character c = decode(text);
    if (c.value == Bad || isUnsafe(c.value)) {
      result += "\xEF\xBF\xBD";
    } else {
      result += text.substr(0, c.length);
    }
    text.remove_prefix(c.length);
  }
  return result;
}

std::string oneLine(std::string_view text) {
  constexpr std::string_view Blanks = " \t\r\n";
  const std::size_t last = text.find_last_not_of(Blanks);
  std::string result(text.substr(0, last == std::string_view::npos ? 0 : last + 1));
  std::replace(result.begin(), result.end(), '\n', ' ');
  return result;
}

std::size_t displayWidth(std::string_view text) {
  std::size_t columns = 0;
  while (!text.empty()) {
    const Character c = decode(text);
    columns += columnsOf(c.value);
    text.remove_prefix(c.length);
  }
  return columns;
}

std::string fitted(std::string_view text, std::size_t columns) {
  const std::string safe = printable(text);
  std::string_view rest = safe;
  std::string result;
  std::size_t used = 0;
  while (!rest.empty()) {
    const Character c = decode(rest);
    const std::size_t width = columnsOf(c.value);
    if (used + width > columns) break;
    result += rest.substr(0, c.length);
    used += width;
    rest.remove_prefix(c.length);
  }
  return result.append(columns - used, ' ');
}

std::string byteCount(std::uint64_t bytes) {
  static constexpr std::array<std::string_view, 5> Units = {"kB", "MB", "GB", "TB", "PB"};
  if (bytes < 1000) return fmt::format("{} B", bytes);
  double value = static_cast<double>(bytes) / 1000;
  std::size_t unit = 0;
  // From 999.5 on, rounding would give four digits.
  while (value >= 999.5 && unit + 1 < Units.size()) {
    value /= 1000;
    ++unit;
  }
  return fmt::format("{:.{}f} {}", value, value < 9.95 ? 1 : 0, Units[unit]);
}

std::string isoTime(double secondsSince1970) {
  const double whole = std::floor(secondsSince1970);
  const auto milliseconds = static_cast<int>((secondsSince1970 - whole) * 1000);
  const auto time = static_cast<std::time_t>(whole);
  std::tm parts{};
  if (!::gmtime_r(&time, &parts)) return "?";
  std::array<char, 32> text{};
  const std::size_t length = std::strftime(text.data(), text.size(), "%Y-%m-%dT%H:%M:%S", &parts);
  return fmt::format("{}.{:03}Z", std::string_view(text.data(), length), milliseconds);
}

}  // namespace appsync
