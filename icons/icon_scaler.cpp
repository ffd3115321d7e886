#include "icons/icon_scaler.h"

#include <algorithm>

namespace appsync {
namespace {

std::uint32_t fitted(std::uint32_t length, std::uint32_t longer, std::uint32_t side) {
  const std::uint64_t rounded = (std::uint64_t{length} * side + longer / 2) / longer;
  return static_cast<std::uint32_t>(std::max<std::uint64_t>(rounded, 1));
}

std::byte rounded(std::uint64_t sum, std::uint64_t weight) {
  return static_cast<std::byte>((sum + weight / 2) / weight);
}

}  // namespace

IconScaler::Axis::Axis(std::uint32_t sourceLength, std::uint32_t targetLength, std::uint32_t side)
    : source(sourceLength), target(targetLength), offset((side - targetLength) / 2) {
  begins_.push_back(0);
  for (std::uint64_t at = 0, pixel = 1; pixel <= source; ++pixel) {
    while (at < pixel * target) {
      const std::uint64_t touched = at / source;
      const std::uint64_t stop = std::min(pixel * target, (touched + 1) * source);
      parts_.push_back(
          {static_cast<std::uint32_t>(touched), static_cast<std::uint32_t>(stop - at)});
      at = stop;
    }
    begins_.push_back(static_cast<std::uint32_t>(parts_.size()));
  }
}

IconScaler::IconScaler(std::uint32_t sourceWidth, std::uint32_t sourceHeight, std::uint32_t side)
    : side_(side),
      columns_(sourceWidth, fitted(sourceWidth, std::max(sourceWidth, sourceHeight), side), side),
      rows_(sourceHeight, fitted(sourceHeight, std::max(sourceWidth, sourceHeight), side), side),
      rowSums_(columns_.target),
      sums_(columns_.target * rows_.target) {}

void IconScaler::addRow(std::uint32_t row, std::uint32_t firstColumn, std::uint32_t columnStep,
                        const std::uint8_t* pixels, std::uint32_t count) {
  std::ranges::fill(rowSums_, Sum<std::uint32_t>{});
  for (std::uint32_t i = 0; i < count; ++i, pixels += 4) {
    const std::uint32_t alpha = pixels[3];
    if (alpha == 0) continue;
    const Sum<std::uint32_t> pixel{pixels[0] * alpha, pixels[1] * alpha, pixels[2] * alpha, alpha};
    for (const Axis::Part& part : columns_.partsOf(firstColumn + columnStep * i))
      rowSums_[part.target].add(pixel, part.overlap);
  }
  for (const Axis::Part& part : rows_.partsOf(row)) {
    auto* sum = &sums_[part.target * rowSums_.size()];
    for (const Sum<std::uint32_t>& add : rowSums_) sum++->add(add, part.overlap);
  }
}

Image IconScaler::finish() const {
  Image image{side_, side_, Bytes(std::size_t{side_} * side_ * 4)};
  const std::uint64_t area = columns_.source * rows_.source;
  const Sum<std::uint64_t>* sum = sums_.data();
  for (std::size_t y = 0; y < rows_.target; ++y) {
    std::byte* out =
        image.pixels.data() + ((y + rows_.offset) * side_ + columns_.offset) * std::size_t{4};
    for (std::size_t x = 0; x < columns_.target; ++x, ++sum, out += 4) {
      out[3] = rounded(sum->alpha, area);
      if (out[3] == std::byte{0}) continue;
      out[0] = rounded(sum->red, sum->alpha);
      out[1] = rounded(sum->green, sum->alpha);
      out[2] = rounded(sum->blue, sum->alpha);
    }
  }
  return image;
}

}  // namespace appsync
