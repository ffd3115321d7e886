#pragma once

#include <concepts>
#include <cstdint>
#include <memory>
#include <optional>
#include <set>
#include <span>
#include <string>
#include <string_view>
#include <type_traits>
#include <variant>
#include <vector>

#include "platform/app_registry.h"
#include "platform/error.h"
#include "platform/install_coordination.h"
#include "platform/log.h"
#include "platform/property_list.h"
#include "platform/sync_asset.h"

namespace appsync {

// describe(): the text that a value prints as an object. Nothing at all prints "(null)".
inline std::string describe(std::string_view text) { return std::string(text); }
inline std::string describe(const FileLocation& location) { return location.path; }
std::string describe(const std::vector<std::string>& list);
std::string describe(const std::set<std::string>& set);
std::string describe(const std::vector<AppRecord>& records);

template <typename T>
requires requires(const T& value) { description(value); }
std::string describe(const T& value) { return description(value); }

/// A handle to a live object that describes itself.
template <typename T>
requires requires(const T& object) { object.description(); }
std::string describe(const std::shared_ptr<T>& object) {
  return object ? object->description() : "(null)";
}

template <typename T>
std::string describe(const std::optional<T>& value) {
  return value ? describe(*value) : "(null)";
}

/// What one argument of a log message is, for the check of its conversion.
enum class LogArgumentKind { Boolean, Signed, Unsigned, Real, Text, Object };

template <typename T>
consteval LogArgumentKind logArgumentKind() {
  if constexpr (std::same_as<T, bool>) {
    return LogArgumentKind::Boolean;
  } else if constexpr (std::signed_integral<T>) {
    return LogArgumentKind::Signed;
  } else if constexpr (std::unsigned_integral<T>) {
    return LogArgumentKind::Unsigned;
  } else if constexpr (std::floating_point<T>) {
    return LogArgumentKind::Real;
  } else if constexpr (std::convertible_to<const T&, std::string_view>) {
    return LogArgumentKind::Text;
  } else {
    return LogArgumentKind::Object;
  }
}

/// One conversion of a format: its letters between "%" and the end, and the kinds it takes.
struct LogConversion {
  std::string_view spelling;
  bool (*takes)(LogArgumentKind kind);
};

inline constexpr LogConversion LogConversions[] = {
    {"%{public}@",
     [](LogArgumentKind kind) {
       return kind == LogArgumentKind::Text || kind == LogArgumentKind::Object;
     }},
    {"%c", [](LogArgumentKind kind) { return kind == LogArgumentKind::Boolean; }},
    {"%d",
     [](LogArgumentKind kind) {
       return kind == LogArgumentKind::Boolean || kind == LogArgumentKind::Signed;
     }},
    {"%lu", [](LogArgumentKind kind) { return kind == LogArgumentKind::Unsigned; }},
    {"%llu", [](LogArgumentKind kind) { return kind == LogArgumentKind::Unsigned; }},
    {"%ld", [](LogArgumentKind kind) { return kind == LogArgumentKind::Signed; }},
    {"%lld", [](LogArgumentKind kind) { return kind == LogArgumentKind::Signed; }},
    {"%lf", [](LogArgumentKind kind) { return kind == LogArgumentKind::Real; }},
    {"%f", [](LogArgumentKind kind) { return kind == LogArgumentKind::Real; }},
    {"%s", [](LogArgumentKind kind) { return kind == LogArgumentKind::Text; }},
};

/// The conversion at the start of `rest`, if there is one.
constexpr std::optional<LogConversion> conversionAt(std::string_view rest) {
  for (const LogConversion& conversion : LogConversions) {
    if (rest.starts_with(conversion.spelling)) return conversion;
  }
  return std::nullopt;
}

/// A message format whose conversions are checked against the arguments when it is compiled.
template <typename... Args>
class CheckedLogFormat {
 public:
  // NOLINTNEXTLINE(google-explicit-constructor): written as a plain literal at every call.
  consteval CheckedLogFormat(const char* text) : text_(text) {
    constexpr LogArgumentKind none{};
    const LogArgumentKind kinds[] = {logArgumentKind<Args>()..., none};
    std::size_t used = 0;
    for (std::size_t at = text_.find('%'); at != std::string_view::npos; at = text_.find('%', at)) {
      const std::optional<LogConversion> conversion = conversionAt(text_.substr(at));
      if (!conversion) throw "unknown conversion in a log format";
      if (used == sizeof...(Args)) throw "more conversions than arguments in a log format";
      if (!conversion->takes(kinds[used++])) throw "argument of the wrong kind for its conversion";
      at += conversion->spelling.size();
    }
    if (used != sizeof...(Args)) throw "more arguments than conversions in a log format";
  }

  constexpr std::string_view text() const { return text_; }

 private:
  std::string_view text_;
};

template <typename... Args>
using LogFormat = CheckedLogFormat<std::type_identity_t<Args>...>;

using LogArgument = std::variant<bool, std::int64_t, std::uint64_t, double, std::string>;

template <typename T>
LogArgument logArgument(const T& value) {
  constexpr LogArgumentKind kind = logArgumentKind<T>();
  if constexpr (kind == LogArgumentKind::Boolean) {
    return value;
  } else if constexpr (kind == LogArgumentKind::Signed) {
    return std::int64_t{value};
  } else if constexpr (kind == LogArgumentKind::Unsigned) {
    return std::uint64_t{value};
  } else if constexpr (kind == LogArgumentKind::Real) {
    return double{value};
  } else {
    return describe(value);
  }
}

std::string formatLogMessage(std::string_view format, std::span<const LogArgument> arguments);

/// The finished text of a message: "%{public}@" prints objects, "%c" booleans as 'y' or 'n'.
template <typename... Args>
std::string logMessage(LogFormat<Args...> format, const Args&... args) {
  const LogArgument arguments[] = {logArgument(args)..., false};
  return formatLogMessage(format.text(), std::span(arguments, sizeof...(Args)));
}

/// The client's voice: puts the plug-in's identifier and "|" before every message.
class ClientLog {
 public:
  ClientLog(Log& log, std::string_view pluginIdentifier) : log_(log), prefix_(pluginIdentifier) {
    prefix_ += '|';
  }

  void write(LogLevel level, std::string_view message) const {
    log_.write(LogChannel::TWLogCategorySyncBundle, level, prefix_ + std::string(message));
  }

  template <typename... Args>
  void normal(LogFormat<Args...> format, const Args&... args) const {
    write(LogLevel::Default, logMessage<Args...>(format, args...));
  }

  template <typename... Args>
  void error(LogFormat<Args...> format, const Args&... args) const {
    write(LogLevel::Error, logMessage<Args...>(format, args...));
  }

  /// For lines that print whole lists.
  template <typename... Args>
  void oversize(LogFormat<Args...> format, const Args&... args) const {
    log_.write(LogChannel::TWLogCategorySyncBundle_Oversize, LogLevel::Default,
               prefix_ + logMessage<Args...>(format, args...));
  }

  /// An error line on the host's framework channel, which carries no prefix.
  template <typename... Args>
  void frameworkError(LogFormat<Args...> format, const Args&... args) const {
    log_.write(LogChannel::TWLogCategoryFramework, LogLevel::Error,
               logMessage<Args...>(format, args...));
  }

 private:
  Log& log_;
  std::string prefix_;
};

}  // namespace appsync
