#pragma once

#include <array>
#include <cstdint>
#include <functional>

#include "platform/bytes.h"
#include "platform/icon_renderer.h"

namespace appsync {

using Pixel = std::array<std::uint8_t, 4>;  ///< red, green, blue, alpha

inline constexpr Pixel Black{0, 0, 0, 255}, White{255, 255, 255, 255}, Red{255, 0, 0, 255};

/// The colour at a column and row.
using Drawing = std::function<Pixel(std::uint32_t, std::uint32_t)>;

Drawing plain(Pixel pixel);
/// Two colours in turn, one pixel each.
Drawing checker(Pixel even, Pixel odd);

Pixel pixelAt(const Image& image, std::uint32_t column, std::uint32_t row);

enum class PngForm { Rgba, Rgb, Rgba16, Gray, GrayAlpha, Palette, PaletteTransparent, OneBit };
/// A PNG file. Forms without colour take the red channel, `OneBit` and the palettes its highest
/// bit (black and white; `PaletteTransparent`: black and see-through white).
Bytes pngFile(std::uint32_t width, std::uint32_t height, const Drawing& drawing,
              PngForm form = PngForm::Rgba, bool interlaced = false, std::size_t textBytes = 0);

enum class JpegForm { Rgb, Gray, Cmyk, Progressive };
Bytes jpegFile(std::uint32_t width, std::uint32_t height, const Drawing& drawing,
               JpegForm form = JpegForm::Rgb);

/// Overwrites width and height in a PNG file's header and mends its checksum.
void setPngSize(Bytes& file, std::uint32_t width, std::uint32_t height);

}  // namespace appsync
