#pragma once

#include <cstdint>
#include <vector>

#include "platform/icon_renderer.h"

namespace appsync {

/// Fits a picture that arrives row by row into a square, keeping its proportions and filling the
/// rest with transparency. Every source pixel counts by the area it covers and by its opacity, in
/// whole numbers, so that the result is exact and hidden colours do not bleed. It never holds the
/// source picture; memory grows with the square alone. Sources up to 8192 by 8192.
class IconScaler {
 public:
  IconScaler(std::uint32_t sourceWidth, std::uint32_t sourceHeight, std::uint32_t side);

  /// Adds pixels of a source row: `count` pixels of straight 8-bit RGBA that stand at
  /// `firstColumn` and every `columnStep` columns after it. Every pixel of the source must be added
  /// once, in any order.
  void addRow(std::uint32_t row, std::uint32_t firstColumn, std::uint32_t columnStep,
              const std::uint8_t* pixels, std::uint32_t count);

  Image finish() const;

 private:
  /// Sums of area, weighted by opacity; `alpha` also counts the opacity itself.
  struct Sum {
    std::uint64_t red = 0, green = 0, blue = 0, alpha = 0;
  };
  /// Where one axis of the source lands.
  struct Axis {
    std::uint64_t source;
    std::uint64_t target;
    std::uint32_t offset;  ///< of the picture in the square

    /// Calls `add(target, overlap)` for each target pixel that a source pixel touches; the overlaps
    /// with one target pixel add up to `source`.
    template <class Add>
    void spread(std::uint64_t sourcePixel, Add add) const {
      const std::uint64_t begin = sourcePixel * target, end = begin + target;
      for (std::uint64_t at = begin; at < end;) {
        const std::uint64_t pixel = at / source;
        const std::uint64_t stop = std::min(end, (pixel + 1) * source);
        add(static_cast<std::size_t>(pixel), stop - at);
        at = stop;
      }
    }
  };

  std::uint32_t side_;
  Axis columns_, rows_;
  std::vector<Sum> rowSums_;  ///< one row of the fitted picture
  std::vector<Sum> sums_;     ///< the fitted picture
};

}  // namespace appsync
