#include "host/library/icon_layout.h"

#include <fmt/format.h>

#include <cerrno>
#include <fstream>
#include <nlohmann/json.hpp>
#include <sstream>

#include "base/text.h"
#include "platform/property_list_codec.h"

namespace appsync::host {
namespace {

constexpr std::size_t MaximumBytes = std::size_t{4} << 20;

std::optional<PropertyList> fromJson(const std::string& text) {
  const auto json = nlohmann::json::parse(text, nullptr, false);
  if (!json.is_array()) return std::nullopt;
  PropertyList::Array layout;
  for (const auto& item : json) {
    if (!item.is_string()) return std::nullopt;
    layout.emplace_back(item.get<std::string>());
  }
  return layout;
}

std::optional<PropertyList> fromLines(const std::string& text) {
  PropertyList::Array layout;
  std::istringstream lines(text);
  for (std::string line; std::getline(lines, line);) {
    const std::size_t begin = line.find_first_not_of(" \t\r");
    if (begin == std::string::npos || line[begin] == '#') continue;
    line = line.substr(begin, line.find_last_not_of(" \t\r") - begin + 1);
    if (printable(line) != line || line.find_first_of(" \t<>[]{}\"") != std::string::npos) {
      return std::nullopt;
    }
    layout.emplace_back(std::move(line));
  }
  return layout;
}

}  // namespace

std::optional<Bytes> readIconLayout(const std::filesystem::path& file, std::string& problem) {
  errno = 0;
  std::ifstream stream(file, std::ios::binary);
  std::string text(MaximumBytes + 1, '\0');
  stream.read(text.data(), static_cast<std::streamsize>(text.size()));
  text.resize(static_cast<std::size_t>(stream.gcount()));
  const std::string shown = printable(file.string());
  if (!stream.eof() && text.empty()) {
    problem = fmt::format("cannot read the icon layout {}: {}", shown,
                          systemText(errno == 0 ? EIO : errno));
    return std::nullopt;
  }
  if (text.size() > MaximumBytes) {
    problem = fmt::format("the icon layout {} is larger than {}", shown, byteCount(MaximumBytes));
    return std::nullopt;
  }
  if (parsePropertyList(asBytes(text))) return toBytes(text);
  auto layout = fromJson(text);
  if (!layout) layout = fromLines(text);
  auto bytes = layout ? serializePropertyList(*layout, PropertyListFormat::Binary) : std::nullopt;
  if (!bytes) {
    problem = fmt::format(
        "the icon layout {} is neither a property list, nor a JSON array of "
        "identifiers, nor one identifier per line",
        shown);
  }
  return bytes;
}

}  // namespace appsync::host
