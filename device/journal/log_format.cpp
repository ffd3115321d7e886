#include "device/journal/log_format.h"

#include <array>
#include <charconv>
#include <cstdio>
#include <ctime>
#include <initializer_list>

namespace appsync::device {

namespace {

constexpr std::initializer_list<LogLevel> Levels{LogLevel::Default, LogLevel::Info, LogLevel::Debug,
                                                 LogLevel::Error, LogLevel::Fault};
constexpr std::initializer_list<LogChannel> Channels{LogChannel::TWLogCategorySyncBundle,
                                                     LogChannel::TWLogCategorySyncBundle_Oversize,
                                                     LogChannel::TWLogCategoryFramework};

template <typename T>
std::optional<T> named(std::initializer_list<T> values, std::string_view text) {
  for (const T value : values)
    if (name(value) == text) return value;
  return std::nullopt;
}

void appendEscaped(std::string& line, std::string_view text) {
  for (const char c : text) {
    const auto byte = static_cast<unsigned char>(c);
    if (c == '\\') {
      line += "\\\\";
    } else if (c == '\n') {
      line += "\\n";
    } else if (c == '\t') {
      line += "\\t";
    } else if (byte < 0x20 || byte == 0x7f) {
      std::array<char, 5> escape{};
      std::snprintf(escape.data(), escape.size(), "\\x%02x", byte);
      line += escape.data();
    } else {
      line += c;
    }
  }
}

/// The character that an escape stands for; `rest` is what follows its backslash and is moved on.
std::optional<char> unescape(std::string_view& rest) {
  if (rest.empty()) return std::nullopt;
  const char kind = rest.front();
  rest.remove_prefix(1);
  if (kind == '\\') return '\\';
  if (kind == 'n') return '\n';
  if (kind == 't') return '\t';
  unsigned value = 0;
  if (kind != 'x' || rest.size() < 2) return std::nullopt;
  const char* const end = rest.data() + 2;
  if (std::from_chars(rest.data(), end, value, 16).ptr != end) return std::nullopt;
  rest.remove_prefix(2);
  return static_cast<char>(value);
}

std::optional<std::string> withoutEscapes(std::string_view text) {
  std::string plain;
  while (!text.empty()) {
    const char c = text.front();
    text.remove_prefix(1);
    if (c != '\\') {
      plain += c;
    } else if (const std::optional<char> meant = unescape(text)) {
      plain += *meant;
    } else {
      return std::nullopt;
    }
  }
  return plain;
}

std::optional<double> parseTime(const std::string& text) {
  std::tm parts{};
  int microseconds = 0;
  int length = 0;
  if (std::sscanf(text.c_str(), "%4d-%2d-%2dT%2d:%2d:%2d.%6dZ%n", &parts.tm_year, &parts.tm_mon,
                  &parts.tm_mday, &parts.tm_hour, &parts.tm_min, &parts.tm_sec, &microseconds,
                  &length) != 7 ||
      static_cast<std::size_t>(length) != text.size())
    return std::nullopt;
  parts.tm_year -= 1900;
  parts.tm_mon -= 1;
  return static_cast<double>(::timegm(&parts)) + microseconds * 1e-6;
}

}  // namespace

std::string formatLogLine(std::chrono::system_clock::time_point time, LogChannel channel,
                          LogLevel level, std::string_view text) {
  using std::chrono::microseconds;
  const auto sinceEpoch = std::chrono::floor<microseconds>(time.time_since_epoch()).count();
  const std::time_t seconds = static_cast<std::time_t>(sinceEpoch / 1'000'000);
  std::tm parts{};
  ::gmtime_r(&seconds, &parts);
  std::array<char, 32> date{};
  const std::size_t length = std::strftime(date.data(), date.size(), "%Y-%m-%dT%H:%M:%S", &parts);
  std::array<char, 16> fraction{};
  std::snprintf(fraction.data(), fraction.size(), ".%06dZ",
                static_cast<int>(sinceEpoch % 1'000'000));

  std::string line(date.data(), length);
  line.reserve(text.size() + 96);
  line.append(fraction.data()).append("\t").append(name(level)).append("\t").append(name(channel));
  line += '\t';
  appendEscaped(line, text);
  line += '\n';
  return line;
}

std::optional<LogLine> parseLogLine(std::string_view line) {
  std::array<std::string_view, 3> fields;
  for (std::string_view& field : fields) {
    const std::size_t tab = line.find('\t');
    if (tab == std::string_view::npos) return std::nullopt;
    field = line.substr(0, tab);
    line.remove_prefix(tab + 1);
  }
  const std::optional<double> time = parseTime(std::string(fields[0]));
  const std::optional<LogLevel> level = named(Levels, fields[1]);
  const std::optional<LogChannel> channel = named(Channels, fields[2]);
  std::optional<std::string> text = withoutEscapes(line);
  if (!time || !level || !channel || !text) return std::nullopt;
  return LogLine{*time, *channel, *level, std::move(*text)};
}

}  // namespace appsync::device
