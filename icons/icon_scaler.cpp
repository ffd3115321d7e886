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

IconScaler::IconScaler(std::uint32_t sourceWidth, std::uint32_t sourceHeight, std::uint32_t side)
    : side_(side) {
  const std::uint32_t longer = std::max(sourceWidth, sourceHeight);
  const std::uint32_t width = fitted(sourceWidth, longer, side);
  const std::uint32_t height = fitted(sourceHeight, longer, side);
  columns_ = {sourceWidth, width, (side - width) / 2};
  rows_ = {sourceHeight, height, (side - height) / 2};
  rowSums_.resize(width);
  sums_.resize(std::size_t{width} * height);
}

void IconScaler::addRow(std::uint32_t row, std::uint32_t firstColumn, std::uint32_t columnStep,
                        const std::uint8_t* pixels, std::uint32_t count) {
  std::fill(rowSums_.begin(), rowSums_.end(), Sum{});
  for (std::uint32_t i = 0; i < count; ++i, pixels += 4) {
    const std::uint64_t alpha = pixels[3];
    if (alpha == 0) continue;
    const std::uint64_t column = firstColumn + std::uint64_t{columnStep} * i;
    columns_.spread(column, [&](std::size_t target, std::uint64_t overlap) {
      const std::uint64_t weight = overlap * alpha;
      Sum& sum = rowSums_[target];
      sum.red += weight * pixels[0];
      sum.green += weight * pixels[1];
      sum.blue += weight * pixels[2];
      sum.alpha += weight;
    });
  }
  rows_.spread(row, [&](std::size_t target, std::uint64_t overlap) {
    Sum* sum = &sums_[target * rowSums_.size()];
    for (const Sum& add : rowSums_) {
      sum->red += overlap * add.red;
      sum->green += overlap * add.green;
      sum->blue += overlap * add.blue;
      sum->alpha += overlap * add.alpha;
      ++sum;
    }
  });
}

Image IconScaler::finish() const {
  Image image{side_, side_, Bytes(std::size_t{side_} * side_ * 4)};
  const std::uint64_t area = columns_.source * rows_.source;
  const Sum* sum = sums_.data();
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
