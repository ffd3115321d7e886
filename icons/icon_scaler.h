#pragma once

#include <cstdint>
#include <span>
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
  /// Sums of area, weighted by opacity; `alpha` counts the opacity itself.
  template <class Number>
  struct Sum {
    Number red = 0, green = 0, blue = 0, alpha = 0;

    template <class Other>
    void add(const Sum<Other>& other, Number area) {
      red += area * other.red;
      green += area * other.green;
      blue += area * other.blue;
      alpha += area * other.alpha;
    }
  };
  /// Where one axis of the source lands.
  class Axis {
   public:
    /// A target pixel that a source pixel touches; the overlaps with one target pixel add up to the
    /// source's length.
    struct Part {
      std::uint32_t target;
      std::uint32_t overlap;
    };

    Axis(std::uint32_t source, std::uint32_t target, std::uint32_t side);

    std::span<const Part> partsOf(std::uint32_t sourcePixel) const {
      return std::span(parts_).subspan(begins_[sourcePixel],
                                       begins_[sourcePixel + 1] - begins_[sourcePixel]);
    }

    const std::uint64_t source, target;
    const std::uint32_t offset;  ///< of the picture in the square

   private:
    // Worked out once: for each pixel of a picture it would cost more than the rest.
    std::vector<Part> parts_;
    std::vector<std::uint32_t> begins_;  ///< where each source pixel's parts begin
  };

  std::uint32_t side_;
  Axis columns_, rows_;
  /// One row of the fitted picture. Areas add up to the source's width: no more than 8192 * 255 *
  /// 255.
  std::vector<Sum<std::uint32_t>> rowSums_;
  std::vector<Sum<std::uint64_t>> sums_;  ///< the fitted picture
};

}  // namespace appsync
