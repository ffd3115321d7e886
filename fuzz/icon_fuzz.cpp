// Decodes arbitrary bytes as each kind of icon. Checksums of PNG chunks are mended first, or hardly
// any input would get past them.

#include <zlib.h>

#include <cstdint>
#include <cstdlib>

#include "icons/icon_decoder.h"

namespace {

using appsync::Bytes;

std::uint32_t bigEndianAt(const Bytes& bytes, std::size_t at) {
  std::uint32_t value = 0;
  for (std::size_t i = 0; i < 4; ++i)
    value = value << 8 | std::to_integer<std::uint32_t>(bytes[at + i]);
  return value;
}

void mendChecksums(Bytes& file) {
  constexpr std::size_t signature = 8, frame = 12;
  for (std::size_t at = signature; file.size() >= at + frame;) {
    const std::size_t length = bigEndianAt(file, at);
    if (length > file.size() - at - frame) return;
    const auto* chunk = reinterpret_cast<const Bytef*>(&file[at + 4]);
    const uLong crc = crc32_z(0, chunk, length + 4);
    for (std::size_t i = 0; i < 4; ++i)
      file[at + 8 + length + i] = static_cast<std::byte>(crc >> (24 - 8 * i) & 0xff);
    at += frame + length;
  }
}

void check(const std::optional<appsync::Image>& image, std::uint32_t side) {
  if (image && (image->width != side || image->pixels.size() != std::size_t{side} * side * 4))
    std::abort();
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  constexpr std::uint32_t side = 16;
  const auto* begin = reinterpret_cast<const std::byte*>(data);
  Bytes file(begin, begin + size);
  check(appsync::decodeJpegIcon(file, side), side);
  mendChecksums(file);
  check(appsync::decodePngIcon(file, side), side);
  return 0;
}
