#pragma once

#include <optional>

#include "platform/bytes.h"
#include "platform/icon_renderer.h"

namespace appsync {

/// The largest pictures that are decoded; larger ones are refused before memory is taken.
inline constexpr std::uint32_t MaximumIconSide = 8192;
inline constexpr std::size_t MaximumIconBytes = std::size_t{32} << 20;

// Each decodes a picture and fits it into a square of `side` pixels, holding one row of it at a
// time. nullopt for anything but a whole, undamaged file. They throw nothing but for memory.

std::optional<Image> decodePngIcon(ByteView file, std::uint32_t side);
std::optional<Image> decodeJpegIcon(ByteView file, std::uint32_t side);

}  // namespace appsync
