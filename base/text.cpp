#include "base/text.h"

#include <fmt/format.h>

#include <algorithm>
#include <array>
#include <cmath>
#include <ctime>
#include <iterator>
#include <optional>
#include <system_error>

#include "platform/utf8.h"

namespace appsync {
namespace {

constexpr char32_t Replacement = 0xfffd;

/// Takes the next character; nullopt, and one byte taken, where none is well formed or it is a
/// control.
std::optional<char32_t> takeVisible(std::string_view& text) {
  const std::optional<char32_t> character = takeCharacter(text);
  if (!character) text.remove_prefix(1);
  return character && isControl(*character) ? std::nullopt : character;
}

}  // namespace

bool isControl(char32_t character) {
  const bool coded = character < 0x20 || (character >= 0x7f && character < 0xa0);
  const bool lineEnd = character == 0x2028 || character == 0x2029;
  const bool direction =
      (character >= 0x202a && character <= 0x202e) || (character >= 0x2066 && character <= 0x2069);
  return coded || lineEnd || direction;
}

bool holdsControls(std::string_view text) {
  while (!text.empty())
    if (!takeVisible(text)) return true;
  return false;
}

std::string printable(std::string_view text) {
  std::string result;
  result.reserve(text.size());
  while (!text.empty()) appendUtf8(result, takeVisible(text).value_or(Replacement));
  return result;
}

std::string shown(std::string_view text) {
  constexpr std::size_t longest = 120;
  std::string result;
  while (!text.empty() && result.size() < longest) {
    const std::string_view before = text;
    const bool visible = takeVisible(text).has_value();
    const std::string_view taken = before.substr(0, before.size() - text.size());
    if (visible) {
      result += taken;
      continue;
    }
    for (const char byte : taken)
      fmt::format_to(std::back_inserter(result), "\\x{:02x}", static_cast<unsigned char>(byte));
  }
  return text.empty() ? result : result + "...";
}

std::string systemText(int errnoValue) { return std::generic_category().message(errnoValue); }

std::string oneLine(std::string_view text) {
  constexpr std::string_view Blanks = " \t\r\n";
  const std::size_t last = text.find_last_not_of(Blanks);
  std::string result(text.substr(0, last == std::string_view::npos ? 0 : last + 1));
  std::replace(result.begin(), result.end(), '\n', ' ');
  return result;
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
