#pragma once

#include <chrono>
#include <optional>
#include <string>
#include <string_view>

#include "device/journal/records.h"

namespace appsync::device {

/// One line with its line end, whatever bytes `text` holds.
std::string formatLogLine(std::chrono::system_clock::time_point time, LogChannel channel,
                          LogLevel level, std::string_view text);

/// The record of a line without its line end; nullopt when it is no whole record.
std::optional<LogLine> parseLogLine(std::string_view line);

}  // namespace appsync::device
