#pragma once

#include <cstdint>
#include <string>
#include <string_view>

namespace appsync {

/// Whether people would not see the character but what it does to the text around it: the controls
/// of ASCII and Latin-1 (C0, DEL, C1), the line and paragraph separators, and what embeds,
/// overrides or isolates a reading direction. Not the plain direction marks: names in Hebrew and
/// Arabic need them, and they turn nothing but themselves.
bool isControl(char32_t character);

/// Whether the text holds controls or bytes that are no UTF-8.
bool holdsControls(std::string_view text);

/// Text from outside made safe for a terminal and for one line: controls and bytes that are no
/// UTF-8 become U+FFFD.
std::string printable(std::string_view text);

/// The text as a reason may quote it: controls and bytes that are no UTF-8 as "\xHH", cut off after
/// 120 bytes.
std::string shown(std::string_view text);

/// What the system says of an errno value.
std::string systemText(int errnoValue);

/// A message without blank space at its end and with its line breaks as blanks.
std::string oneLine(std::string_view text);

/// "999 B", "1.4 MB": decimal units, three significant digits at most.
std::string byteCount(std::uint64_t bytes);

/// Seconds since 1970 as "2026-01-31T12:00:00.250Z".
std::string isoTime(double secondsSince1970);

}  // namespace appsync
