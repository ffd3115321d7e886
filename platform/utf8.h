#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace appsync {

/// True for well-formed UTF-8: no overlong forms, no surrogates, nothing above U+10FFFF.
bool isUtf8(std::string_view text);

/// Takes the first character off a text that is not empty; nullopt, and nothing taken, where none
/// is well formed.
std::optional<char32_t> takeCharacter(std::string_view& text);

/// Appends a Unicode scalar value as UTF-8.
void appendUtf8(std::string& out, char32_t character);

}  // namespace appsync
