#include "client/log_message.h"

#include <algorithm>

namespace appsync {
namespace {

template <typename Range, typename Describe>
std::string listed(const Range& range, Describe describeItem) {
  std::string text = "(";
  for (const auto& item : range) {
    if (text.size() > 1) text += ", ";
    text += describeItem(item);
  }
  return text + ")";
}

void append(std::string& text, std::string_view conversion, const LogArgument& argument) {
  if (const auto* flag = std::get_if<bool>(&argument)) {
    text += conversion == "%c" ? (*flag ? "y" : "n") : (*flag ? "1" : "0");
  } else if (const auto* whole = std::get_if<std::int64_t>(&argument)) {
    text += std::to_string(*whole);
  } else if (const auto* count = std::get_if<std::uint64_t>(&argument)) {
    text += std::to_string(*count);
  } else if (const auto* real = std::get_if<double>(&argument)) {
    text += std::to_string(*real);
  } else {
    text += std::get<std::string>(argument);
  }
}

}  // namespace

std::string describe(const std::vector<std::string>& list) {
  return listed(list, [](const std::string& item) { return item; });
}

std::string describe(const std::set<std::string>& set) {
  return listed(set, [](const std::string& item) { return item; });
}

std::string describe(const std::vector<AppRecord>& records) {
  return listed(records, [](const AppRecord& record) { return description(record); });
}

std::string formatLogMessage(std::string_view format, std::span<const LogArgument> arguments) {
  std::string text;
  std::size_t used = 0;
  while (!format.empty()) {
    const std::size_t literal = std::min(format.find('%'), format.size());
    text += format.substr(0, literal);
    format.remove_prefix(literal);
    if (format.empty()) break;
    const std::string_view conversion = conversionAt(format)->spelling;
    append(text, conversion, arguments[used++]);
    format.remove_prefix(conversion.size());
  }
  return text;
}

}  // namespace appsync
