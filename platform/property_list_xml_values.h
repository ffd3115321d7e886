#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace appsync {

// The texts inside the elements of an XML property list. Each `canonical` function rewrites a text
// into the one form that every parser reads alike, or returns false when it is malformed or out of
// range; blanks around the text are gone already where they mean nothing.

/// Decimal without leading zeros, from -2^63 to 2^64-1; hexadecimal is read too.
[[nodiscard]] bool canonicalXmlInteger(std::string& text);
/// A decimal number, or an infinity or NaN by its usual names.
[[nodiscard]] bool canonicalXmlReal(std::string& text);
/// Base64 in whole groups, without blanks.
[[nodiscard]] bool canonicalXmlData(std::string& text);
/// "2026-01-31T12:00:00Z", a moment that exists, in the years 1000 to 9999.
bool isXmlDate(std::string_view text);
/// No NUL or other control character but tab, line feed and carriage return.
bool isXmlText(std::string_view text);
/// The character that "&name;" stands for ("amp", "#65", "#x41", ...).
std::optional<char32_t> xmlReference(std::string_view name);

}  // namespace appsync
