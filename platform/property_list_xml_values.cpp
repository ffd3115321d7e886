#include "platform/property_list_xml_values.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <chrono>
#include <cstdint>

namespace appsync {
namespace {

/// The whole text as a number.
template <class Number>
std::optional<Number> wholeNumber(std::string_view digits, int base) {
  Number value{};
  const char* end = digits.data() + digits.size();
  const auto [stop, error] = std::from_chars(digits.data(), end, value, base);
  return error == std::errc() && stop == end ? std::optional(value) : std::nullopt;
}

bool isDigit(char c) { return c >= '0' && c <= '9'; }

/// Takes a sign away; true for a minus.
bool takeSign(std::string_view& text) {
  const bool minus = text.starts_with('-');
  if (minus || text.starts_with('+')) text.remove_prefix(1);
  return minus;
}

std::string lowerCase(std::string_view text) {
  std::string out(text);
  std::transform(out.begin(), out.end(), out.begin(),
                 [](char c) { return c >= 'A' && c <= 'Z' ? char(c - 'A' + 'a') : c; });
  return out;
}

}  // namespace

bool canonicalXmlInteger(std::string& text) {
  std::string_view digits = text;
  const bool minus = takeSign(digits);
  const bool hexadecimal = digits.starts_with("0x") || digits.starts_with("0X");
  if (hexadecimal) digits.remove_prefix(2);
  const auto magnitude = wholeNumber<std::uint64_t>(digits, hexadecimal ? 16 : 10);
  if (!magnitude || (minus && *magnitude > std::uint64_t{1} << 63)) return false;
  text = (minus && *magnitude != 0 ? "-" : "") + std::to_string(*magnitude);
  return true;
}

bool canonicalXmlReal(std::string& text) {
  std::string_view number = text;
  const bool minus = takeSign(number);
  const std::string name = lowerCase(number);
  if (name == "nan" || name == "inf" || name == "infinity") {
    text = (minus ? "-" : "") + name;
    return true;
  }
  if (number.empty() || !(isDigit(number.front()) || number.front() == '.')) return false;
  double value = 0;
  const char* end = number.data() + number.size();
  const auto [stop, error] = std::from_chars(number.data(), end, value);
  return error == std::errc() && stop == end;
}

bool canonicalXmlData(std::string& text) {
  std::erase_if(text, [](char c) { return c == ' ' || c == '\t' || c == '\r' || c == '\n'; });
  if (text.size() % 4 != 0) return false;
  std::string_view letters = text;
  for (int i = 0; i < 2 && letters.ends_with('='); ++i) letters.remove_suffix(1);
  return std::all_of(letters.begin(), letters.end(), [](char c) {
    return isDigit(c) || (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || c == '+' || c == '/';
  });
}

bool isXmlDate(std::string_view text) {
  constexpr std::string_view form = "0000-00-00T00:00:00Z";
  if (text.size() != form.size()) return false;
  for (std::size_t i = 0; i < form.size(); ++i)
    if (form[i] == '0' ? !isDigit(text[i]) : text[i] != form[i]) return false;
  const auto field = [&](std::size_t at, std::size_t size) {
    return wholeNumber<unsigned>(text.substr(at, size), 10).value_or(0);
  };
  using namespace std::chrono;
  const year_month_day day(year(int(field(0, 4))), month(field(5, 2)),
                           std::chrono::day(field(8, 2)));
  return field(0, 4) >= 1000 && day.ok() && field(11, 2) < 24 && field(14, 2) < 60 &&
         field(17, 2) < 60;
}

bool isXmlText(std::string_view text) {
  return std::none_of(text.begin(), text.end(), [](char c) {
    return static_cast<unsigned char>(c) < 0x20 && c != '\t' && c != '\n' && c != '\r';
  });
}

std::optional<char32_t> xmlReference(std::string_view name) {
  struct Entity {
    std::string_view name;
    char32_t character;
  };
  static constexpr std::array<Entity, 5> entities = {
      {{"amp", U'&'}, {"lt", U'<'}, {"gt", U'>'}, {"quot", U'"'}, {"apos", U'\''}}};
  for (const Entity& entity : entities)
    if (name == entity.name) return entity.character;
  if (!name.starts_with('#')) return std::nullopt;
  name.remove_prefix(1);
  const bool hexadecimal = name.starts_with('x');
  if (hexadecimal) name.remove_prefix(1);
  const auto code = wholeNumber<std::uint32_t>(name, hexadecimal ? 16 : 10);
  const bool isCharacter =
      code && (*code < 0x20 ? *code == '\t' || *code == '\n' || *code == '\r'
                            : *code < 0xd800 || (*code > 0xdfff && *code <= 0x10ffff));
  return isCharacter ? std::optional(char32_t{*code}) : std::nullopt;
}

}  // namespace appsync
