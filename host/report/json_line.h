#pragma once

#include <nlohmann/json.hpp>

#include "host/report/output.h"

namespace appsync::host {

/// Members keep the order in which they were added.
using Json = nlohmann::ordered_json;

/// Writes one object as one line. Bytes that are no UTF-8 become U+FFFD.
void writeJsonLine(Output& output, const Json& object);

/// The text, or null when it is empty.
Json textOrNull(const std::string& text);

}  // namespace appsync::host
