#pragma once

#include <cstddef>
#include <cstdint>
#include <string_view>

namespace appsync::zip {

// How a zip archive is laid out, as far as it is read here.

inline constexpr std::uint32_t LocalSignature = 0x04034b50;
inline constexpr std::uint32_t DescriptorSignature = 0x08074b50;
inline constexpr std::uint32_t CentralSignature = 0x02014b50;
inline constexpr std::uint32_t EndSignature = 0x06054b50;
inline constexpr std::uint32_t LargeEndSignature = 0x06064b50;
inline constexpr std::uint32_t LocatorSignature = 0x07064b50;
inline constexpr std::size_t LocalSize = 30;
inline constexpr std::size_t DescriptorSize = 16;
inline constexpr std::size_t CentralSize = 46;
inline constexpr std::size_t EndSize = 22;
inline constexpr std::size_t LargeEndSize = 56;
inline constexpr std::size_t LocatorSize = 20;
inline constexpr std::uint16_t Encrypted = 1;             ///< flag
inline constexpr std::uint16_t CompressionLevel = 2 | 4;  ///< flags
inline constexpr std::uint16_t DescriptorFollows =
    8;  ///< flag: sizes and checksum stand behind the data
inline constexpr std::uint16_t Utf8Name = 0x800;  ///< flag
inline constexpr std::uint16_t Stored = 0;        ///< method
inline constexpr std::uint16_t Deflated = 8;      ///< method

/// Little-endian number of `size` bytes; the caller has checked that they are there.
inline std::uint64_t number(std::string_view bytes, std::size_t at, std::size_t size) {
  std::uint64_t value = 0;
  for (std::size_t i = size; i-- > 0;)
    value = value << 8 | static_cast<unsigned char>(bytes[at + i]);
  return value;
}

}  // namespace appsync::zip
