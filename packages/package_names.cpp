#include "packages/package_names.h"

#include <array>
#include <optional>

#include "platform/utf8.h"

namespace appsync {

namespace {

/// Capital letters that stand a fixed way before their small ones, or alternate with them.
struct Range {
  char32_t first;
  char32_t last;
  char32_t distance;  ///< 0: a small letter follows each capital one of the same parity as `first`
};

constexpr std::array Ranges{
    Range{'A', 'Z', 32},     Range{0xc0, 0xd6, 32},     Range{0xd8, 0xde, 32},
    Range{0x100, 0x12e, 0},  Range{0x132, 0x136, 0},    Range{0x139, 0x147, 0},
    Range{0x14a, 0x176, 0},  Range{0x179, 0x17d, 0},    Range{0x388, 0x38a, 37},
    Range{0x38e, 0x38f, 63}, Range{0x391, 0x3a1, 32},   Range{0x3a3, 0x3ab, 32},
    Range{0x400, 0x40f, 80}, Range{0x410, 0x42f, 32},   Range{0x460, 0x480, 0},
    Range{0x48a, 0x4be, 0},  Range{0x4c1, 0x4cd, 0},    Range{0x4d0, 0x52e, 0},
    Range{0x531, 0x556, 48}, Range{0xff21, 0xff3a, 32},
};

constexpr std::array<std::pair<char32_t, char32_t>, 8> Singles{{
    {0x178, 0xff},   // Y with diaeresis
    {0x17f, 's'},    // long s
    {0x386, 0x3ac},  // alpha with tonos
    {0x38c, 0x3cc},  // omicron with tonos
    {0x3c2, 0x3c3},  // final sigma
    {0x212a, 'k'},   // Kelvin
    {0x212b, 0xe5},  // Angstrom
    {0xb5, 0x3bc},   // micro
}};

char32_t folded(char32_t c) {
  for (const Range& range : Ranges) {
    if (c < range.first || c > range.last) continue;
    if (range.distance != 0) return c + range.distance;
    return (c - range.first) % 2 == 0 ? c + 1 : c;
  }
  for (const auto& [from, to] : Singles)
    if (c == from) return to;
  return c;
}

}  // namespace

std::string foldCase(std::string_view name) {
  std::string result;
  result.reserve(name.size());
  while (!name.empty()) {
    const std::optional<char32_t> c = takeCharacter(name);
    if (!c) return result.append(name);
    appendUtf8(result, folded(*c));
  }
  return result;
}

}  // namespace appsync
