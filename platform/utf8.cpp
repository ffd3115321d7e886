#include "platform/utf8.h"

#include <cstdint>
#include <cstring>

namespace appsync {
namespace {

struct Lead {
  std::size_t length;  ///< of the whole sequence; 0 when no sequence starts so
  unsigned char low;   ///< smallest and
  unsigned char high;  ///< largest second byte
};

Lead leadOf(unsigned char byte) {
  if (byte < 0x80) return {1, 0, 0};
  if (byte < 0xc2) return {0, 0, 0};
  if (byte < 0xe0) return {2, 0x80, 0xbf};
  if (byte == 0xe0) return {3, 0xa0, 0xbf};
  if (byte == 0xed) return {3, 0x80, 0x9f};
  if (byte < 0xf0) return {3, 0x80, 0xbf};
  if (byte == 0xf0) return {4, 0x90, 0xbf};
  if (byte < 0xf4) return {4, 0x80, 0xbf};
  if (byte == 0xf4) return {4, 0x80, 0x8f};
  return {0, 0, 0};
}

/// Most text is ASCII, so it is passed over in words.
std::size_t skipAscii(std::string_view text, std::size_t at) {
  std::uint64_t word;
  while (text.size() - at >= sizeof word) {
    std::memcpy(&word, text.data() + at, sizeof word);
    if (word & 0x8080808080808080) break;
    at += sizeof word;
  }
  return at;
}

/// Bytes of the character at the beginning of a text that is not empty; 0 where none is well
/// formed.
std::size_t lengthOfFirst(std::string_view text) {
  const auto byte = [&](std::size_t i) { return static_cast<unsigned char>(text[i]); };
  const Lead lead = leadOf(byte(0));
  if (lead.length > text.size()) return 0;
  if (lead.length > 1 && (byte(1) < lead.low || byte(1) > lead.high)) return 0;
  for (std::size_t i = 2; i < lead.length; ++i)
    if ((byte(i) & 0xc0) != 0x80) return 0;
  return lead.length;
}

}  // namespace

bool isUtf8(std::string_view text) {
  for (std::size_t at = skipAscii(text, 0); at < text.size(); at = skipAscii(text, at)) {
    const std::size_t length = lengthOfFirst(text.substr(at));
    if (length == 0) return false;
    at += length;
  }
  return true;
}

std::optional<char32_t> takeCharacter(std::string_view& text) {
  const std::size_t length = lengthOfFirst(text);
  if (length == 0) return std::nullopt;
  const auto first = static_cast<unsigned char>(text.front());
  char32_t character = length == 1 ? first : first & (0x7fU >> length);
  for (const char next : text.substr(1, length - 1))
    character = character << 6 | (static_cast<unsigned char>(next) & 0x3fU);
  text.remove_prefix(length);
  return character;
}

void appendUtf8(std::string& out, char32_t character) {
  const auto tail = [&](int shift) {
    out += static_cast<char>(0x80 | ((character >> shift) & 0x3f));
  };
  if (character < 0x80) {
    out += static_cast<char>(character);
  } else if (character < 0x800) {
    out += static_cast<char>(0xc0 | (character >> 6));
    tail(0);
  } else if (character < 0x10000) {
    out += static_cast<char>(0xe0 | (character >> 12));
    tail(6), tail(0);
  } else {
    out += static_cast<char>(0xf0 | (character >> 18));
    tail(12), tail(6), tail(0);
  }
}

}  // namespace appsync
