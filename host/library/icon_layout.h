#pragma once

#include <filesystem>
#include <optional>
#include <string>

#include "platform/bytes.h"

namespace appsync::host {

/// Reads an icon layout: a property list, which is passed on as it is, or a JSON array or plain
/// text with one identifier per line (blank lines and lines that begin with "#" are passed over),
/// which become one. nullopt with one line for people when it is none of these.
[[nodiscard]] std::optional<Bytes> readIconLayout(const std::filesystem::path& file,
                                                  std::string& problem);

}  // namespace appsync::host
