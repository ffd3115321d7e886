#include "platform/property_list.h"

#include <array>
#include <charconv>
#include <chrono>
#include <cmath>
#include <cstdio>
#include <limits>

namespace appsync {
namespace {

constexpr std::size_t ShownDataBytes = 16;

template <class Number>
void appendNumber(std::string& out, Number number) {
  std::array<char, 32> buffer;
  const auto end = std::to_chars(buffer.data(), buffer.data() + buffer.size(), number).ptr;
  out.append(buffer.data(), end);
}

void appendHex(std::string& out, unsigned byte) {
  constexpr std::string_view digits = "0123456789abcdef";
  out += digits[byte >> 4];
  out += digits[byte & 15];
}

/// Control characters are escaped: a line end from outside must not make a second log line.
void appendText(std::string& out, std::string_view text) {
  for (const char c : text) {
    const auto byte = static_cast<unsigned char>(c);
    if (byte >= 0x20 && byte != 0x7f) {
      out += c;
    } else if (c == '\n') {
      out += "\\n";
    } else if (c == '\t') {
      out += "\\t";
    } else {
      out += "\\x";
      appendHex(out, byte);
    }
  }
}

void appendData(std::string& out, const PropertyList::Data& data) {
  out += '<';
  for (std::size_t i = 0; i < std::min(data.size(), ShownDataBytes); ++i)
    appendHex(out, std::to_integer<unsigned>(data[i]));
  if (data.size() > ShownDataBytes) {
    out += "... ";
    appendNumber(out, data.size());
    out += " bytes";
  }
  out += '>';
}

void appendDate(std::string& out, PropertyList::Date date) {
  using namespace std::chrono;
  constexpr sys_days epoch = 2001y / January / 1;
  constexpr double earliest = double((sys_days(0y / January / 1) - epoch).count()) * 86400;
  constexpr double end = double((sys_days(10000y / January / 1) - epoch).count()) * 86400;
  if (!(date.secondsSince2001 >= earliest && date.secondsSince2001 < end)) {
    appendNumber(out, date.secondsSince2001);
    out += " seconds since 2001";
    return;
  }
  const sys_seconds moment =
      epoch + seconds(static_cast<std::int64_t>(std::floor(date.secondsSince2001)));
  const auto midnight = floor<days>(moment);
  const year_month_day day(midnight);
  const hh_mm_ss time(moment - midnight);
  std::array<char, 48> text;
  std::snprintf(text.data(), text.size(), "%04d-%02u-%02uT%02d:%02d:%02dZ", int(day.year()),
                unsigned(day.month()), unsigned(day.day()), int(time.hours().count()),
                int(time.minutes().count()), int(time.seconds().count()));
  out += text.data();
}

void append(std::string& out, const PropertyList& value);

void append(std::string& out, const PropertyList::Array& array) {
  out += '(';
  const char* separator = "";
  for (const PropertyList& element : array) {
    out += separator;
    append(out, element);
    separator = ", ";
  }
  out += ')';
}

void append(std::string& out, const PropertyList::Dictionary& dictionary) {
  out += '{';
  const char* separator = "";
  for (const auto& [key, value] : dictionary) {
    out += separator;
    appendText(out, key);
    out += " = ";
    append(out, value);
    separator = "; ";
  }
  out += '}';
}

void append(std::string& out, const PropertyList& value) {
  switch (value.type()) {
    case PropertyList::Type::Null:
      out += "(null)";
      break;
    case PropertyList::Type::Boolean:
      out += *value.asBoolean() ? '1' : '0';
      break;
    case PropertyList::Type::Integer:
      if (const auto number = value.asInteger()) {
        appendNumber(out, *number);
      } else {
        appendNumber(out, *value.asUnsigned());
      }
      break;
    case PropertyList::Type::Real:
      appendNumber(out, *value.asReal());
      break;
    case PropertyList::Type::String:
      appendText(out, *value.asString());
      break;
    case PropertyList::Type::Data:
      appendData(out, *value.asData());
      break;
    case PropertyList::Type::Date:
      appendDate(out, *value.asDate());
      break;
    case PropertyList::Type::Array:
      append(out, *value.asArray());
      break;
    case PropertyList::Type::Dictionary:
      append(out, *value.asDictionary());
      break;
  }
}

bool textIsTrue(std::string_view text) {
  text.remove_prefix(std::min(text.find_first_not_of(" \t\r\n\v\f"), text.size()));
  if (!text.empty() && (text.front() == '+' || text.front() == '-')) text.remove_prefix(1);
  text.remove_prefix(std::min(text.find_first_not_of('0'), text.size()));
  return !text.empty() && std::string_view("YyTt123456789").find(text.front()) != text.npos;
}

}  // namespace

PropertyList::PropertyList(const PropertyList& other) = default;
PropertyList::PropertyList(PropertyList&& other) noexcept = default;
PropertyList& PropertyList::operator=(const PropertyList& other) = default;
PropertyList& PropertyList::operator=(PropertyList&& other) noexcept = default;
PropertyList::~PropertyList() = default;
bool PropertyList::operator==(const PropertyList& other) const { return value_ == other.value_; }

PropertyList::PropertyList(std::uint64_t value) {
  // One representation per number, so that equality compares numbers.
  if (value <= std::uint64_t{std::numeric_limits<std::int64_t>::max()}) {
    value_ = static_cast<std::int64_t>(value);
  } else {
    value_ = value;
  }
}

PropertyList::Type PropertyList::type() const {
  // In the order of the variant, which has two alternatives for integers.
  static constexpr std::array types = {Type::Null,  Type::Boolean,   Type::Integer, Type::Integer,
                                       Type::Real,  Type::String,    Type::Data,    Type::Date,
                                       Type::Array, Type::Dictionary};
  static_assert(types.size() == std::variant_size_v<decltype(value_)>);
  return types[value_.index()];
}

std::optional<bool> PropertyList::asBoolean() const {
  const bool* value = std::get_if<bool>(&value_);
  return value ? std::optional(*value) : std::nullopt;
}

std::optional<std::int64_t> PropertyList::asInteger() const {
  const std::int64_t* value = std::get_if<std::int64_t>(&value_);
  return value ? std::optional(*value) : std::nullopt;
}

std::optional<std::uint64_t> PropertyList::asUnsigned() const {
  if (const std::uint64_t* value = std::get_if<std::uint64_t>(&value_)) return *value;
  const std::int64_t* value = std::get_if<std::int64_t>(&value_);
  if (!value || *value < 0) return std::nullopt;
  return static_cast<std::uint64_t>(*value);
}

std::optional<double> PropertyList::asReal() const {
  if (const double* value = std::get_if<double>(&value_)) return *value;
  if (const auto value = asInteger()) return static_cast<double>(*value);
  if (const auto value = asUnsigned()) return static_cast<double>(*value);
  return std::nullopt;
}

std::optional<PropertyList::Date> PropertyList::asDate() const {
  const Date* value = std::get_if<Date>(&value_);
  return value ? std::optional(*value) : std::nullopt;
}

bool PropertyList::booleanValue() const {
  if (const auto value = asBoolean()) return *value;
  if (const auto value = asReal()) return *value != 0;
  const std::string* text = asString();
  return text && textIsTrue(*text);
}

const PropertyList* PropertyList::find(std::string_view key) const {
  const Dictionary* dictionary = asDictionary();
  return dictionary ? appsync::find(*dictionary, key) : nullptr;
}

const PropertyList* find(const PropertyList::Dictionary& dictionary, std::string_view key) {
  const auto found = dictionary.find(key);
  return found == dictionary.end() ? nullptr : &found->second;
}

const std::string* findString(const PropertyList::Dictionary& dictionary, std::string_view key) {
  const PropertyList* value = find(dictionary, key);
  return value ? value->asString() : nullptr;
}

const PropertyList::Dictionary* findDictionary(const PropertyList::Dictionary& dictionary,
                                               std::string_view key) {
  const PropertyList* value = find(dictionary, key);
  return value ? value->asDictionary() : nullptr;
}

std::optional<PropertyList::Data> findData(const PropertyList::Dictionary& dictionary,
                                           std::string_view key) {
  const PropertyList* value = find(dictionary, key);
  const PropertyList::Data* data = value ? value->asData() : nullptr;
  return data ? std::optional(*data) : std::nullopt;
}

std::vector<std::string> findStrings(const PropertyList::Dictionary& dictionary,
                                     std::string_view key) {
  std::vector<std::string> strings;
  const PropertyList* value = find(dictionary, key);
  const PropertyList::Array* array = value ? value->asArray() : nullptr;
  if (!array) return strings;
  for (const PropertyList& item : *array) {
    if (const std::string* text = item.asString()) strings.push_back(*text);
  }
  return strings;
}

bool findFlag(const PropertyList::Dictionary& dictionary, std::string_view key) {
  const PropertyList* value = find(dictionary, key);
  return value && value->booleanValue();
}

std::string description(const PropertyList& value) {
  std::string out;
  append(out, value);
  return out;
}

std::string description(const PropertyList::Array& array) {
  std::string out;
  append(out, array);
  return out;
}

std::string description(const PropertyList::Dictionary& dictionary) {
  std::string out;
  append(out, dictionary);
  return out;
}

}  // namespace appsync
